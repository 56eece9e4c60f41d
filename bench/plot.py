# SPDX-License-Identifier: Apache-2.0
"""Draws latencies as an SVG: a panel for each load, a bar for each quantile, a logarithmic axis that all panels share."""
import math

from figures import number
from latency import QUANTILES

WIDTH, HEIGHT, LEFT, TOP, BOTTOM, GAP = 720, 360, 62, 74, 62, 22
COLOURS = {"send with reply": "#1f5fa8", "bare socket": "#8a8f98"}
STYLE = """text { font: 13px system-ui, sans-serif; fill: #222 } .title { font-size: 16px; font-weight: 600 }
.small { font-size: 11px } .grid { stroke: #d8dbe0 } .back { fill: #fff }
@media (prefers-color-scheme: dark) { text { fill: #e6e6e6 } .grid { stroke: #3a3f47 } .back { fill: #16191d } }"""


def drawing(medians):
    values = [got[key] for shares in medians.values() for got in shares.values() for key in QUANTILES]
    low, high = math.floor(math.log10(min(values))), math.ceil(math.log10(max(values)))
    high = max(high, low + 1)
    floor, shares = HEIGHT - BOTTOM, sorted(next(iter(medians.values())))

    def y(value):
        return floor - (math.log10(value) - low) / (high - low) * (floor - TOP)

    parts = [f'<svg xmlns="http://www.w3.org/2000/svg" viewBox="0 0 {WIDTH} {HEIGHT}" role="img" aria-label="Latency of a send">',
             f"<style>{STYLE}</style>", f'<rect class="back" width="{WIDTH}" height="{HEIGHT}"/>',
             f'<text class="title" x="{LEFT}" y="24">Latency of a send with reply, microseconds</text>']
    for place, (name, colour) in enumerate(COLOURS.items()):
        x = LEFT + place * 170
        parts.append(f'<rect x="{x}" y="37" width="12" height="12" fill="{colour}"/><text x="{x + 18}" y="48">{name}</text>')
    for power in range(low, high + 1):
        parts.append(f'<line class="grid" x1="{LEFT}" x2="{WIDTH - 14}" y1="{y(10 ** power):.1f}" y2="{y(10 ** power):.1f}"/>'
                     f'<text class="small" x="{LEFT - 8}" y="{y(10 ** power) + 4:.1f}" text-anchor="end">{10 ** power:,g}</text>')
    panel = (WIDTH - 14 - LEFT - GAP * len(shares)) / len(shares)
    bar = panel / (len(QUANTILES) * (len(medians) + 0.6))
    for place, share in enumerate(shares):
        x = LEFT + GAP / 2 + place * (panel + GAP)
        parts.append(f'<text x="{x + panel / 2:.1f}" y="{HEIGHT - 14}" text-anchor="middle">at {share} % of the throughput</text>')
        for number_of, (key, shown) in enumerate(QUANTILES.items()):
            left = x + number_of * panel / len(QUANTILES)
            parts.append(f'<text class="small" x="{left + bar * len(medians) / 2:.1f}" y="{floor + 18}" text-anchor="middle">{shown}'
                         "</text>")
            for beside, (name, found) in enumerate(medians.items()):
                value = found[share][key]
                parts.append(f'<rect x="{left + beside * bar:.1f}" y="{y(value):.1f}" width="{bar - 2:.1f}" '
                             f'height="{floor - y(value):.1f}" fill="{COLOURS[name]}"><title>{name}, {share} %, {shown}: '
                             f"{number(value)} µs</title></rect>"
                             f'<text class="small" x="{left + beside * bar + bar / 2 - 1:.1f}" y="{y(value) - 4:.1f}" '
                             f'text-anchor="middle">{number(value)}</text>')
    return "\n".join([*parts, "</svg>"]) + "\n"
