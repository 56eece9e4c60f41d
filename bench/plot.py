# SPDX-License-Identifier: Apache-2.0
"""Draws latencies as an SVG that can be read on a phone: a panel for each load, a bar for each quantile, and one logarithmic axis
for all."""
import math

from figures import number
from latency import QUANTILES
from svg import STYLE, text

WIDTH, LEFT, RIGHT, TOP, PANEL, GROUP, BAR = 460, 58, 62, 74, 132, 34, 13
COLOURS = {"send with reply": "#2f6fbf", "bare socket": "#8a8f98"}


def drawing(medians):
    values = [got[key] for shares in medians.values() for got in shares.values() for key in QUANTILES]
    low, high = math.floor(math.log10(min(values))), math.ceil(math.log10(max(values)))
    high = max(high, low + 1)
    shares = sorted(next(iter(medians.values())))
    floor = TOP + PANEL * len(shares)
    height = floor + 30

    def across(value):
        return LEFT + (math.log10(value) - low) / (high - low) * (WIDTH - RIGHT - LEFT)

    parts = [f'<svg xmlns="http://www.w3.org/2000/svg" width="{WIDTH}" height="{height}" viewBox="0 0 {WIDTH} {height}" role="img" '
             f'aria-label="Latency of a send with reply beside the bare socket">', f"<style>{STYLE}</style>",
             f'<rect class="back" width="{WIDTH}" height="{height}"/>', text(10, 24, "Latency of a send, microseconds", "title")]
    for place, (name, colour) in enumerate(COLOURS.items()):
        x = 10 + place * 150
        parts += [f'<rect x="{x}" y="37" width="12" height="12" fill="{colour}"/>', text(x + 18, 48, name)]
    for power in range(low, high + 1):
        x = across(10 ** power)
        parts += [f'<line class="grid" x1="{x:.1f}" x2="{x:.1f}" y1="{TOP}" y2="{floor}"/>',
                  text(x, floor + 18, f"{10 ** power:,}", "small", "middle")]
    for place, share in enumerate(shares):
        top = TOP + place * PANEL
        parts.append(text(10, top + 12, f"at {share} % of the throughput"))
        for group, (key, shown) in enumerate(QUANTILES.items()):
            y = top + 22 + group * GROUP
            parts.append(text(LEFT - 8, y + BAR + 4, shown, "small", "end"))
            for beside, (name, found) in enumerate(medians.items()):
                value, bar = found[share][key], y + beside * BAR
                parts += [f'<rect x="{LEFT}" y="{bar}" width="{max(across(value) - LEFT, 1):.1f}" height="{BAR - 1}" '
                          f'fill="{COLOURS[name]}"/>', text(across(value) + 5, bar + BAR - 3, number(value), "small")]
    return "\n".join([*parts, "</svg>"]) + "\n"
