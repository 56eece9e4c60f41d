# SPDX-License-Identifier: Apache-2.0
"""Draws the results of a simulation: panels one below the other, over one axis of hours, for a page and for a phone."""
import math
import pathlib
import sys

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parents[1] / "bench"))
from svg import STYLE, text  # noqa: E402

WIDTH, LEFT, RIGHT, TOP, PANEL, PLOT = 460, 62, 12, 44, 150, 92
COLOURS = ("#2f6fbf", "#c8782a")
OWN = """.area { fill-opacity: .25; stroke-width: 1.2 } .shade { fill: #c33; fill-opacity: .13 }
.mean { stroke: #888; stroke-dasharray: 4 3 }"""


def nice(value):
    """The next round number at which an axis may end."""
    if value <= 0:
        return 1
    power = 10 ** math.floor(math.log10(value))
    return next(step * power for step in (1, 1.5, 2, 3, 4, 5, 6, 8, 10) if step * power >= value * 0.999)


def shown(value):
    return f"{value:,.0f}" if value >= 10 or value == int(value) else f"{value:.2g}"


def columns(values, count):
    """The greatest of the values that fall into each column."""
    size = len(values) / count
    return [max(values[int(at * size):max(int((at + 1) * size), int(at * size) + 1)]) for at in range(count)]


def curve(values, top, floor, colour):
    across = WIDTH - LEFT - RIGHT
    taken = columns(values, min(len(values), across))
    step = across / len(taken)
    points = " ".join(f"{LEFT + (at + 0.5) * step:.1f},{floor - min(value / top, 1) * PLOT:.1f}" for at, value in enumerate(taken))
    return (f'<polygon class="area" fill="{colour}" stroke="{colour}" '
            f'points="{LEFT},{floor} {points} {WIDTH - RIGHT},{floor}"/>')


def panel(one, y, hours, shades, top):
    """`one`: title, curves (a list of values each), names of the curves, mean (of the first curve; may be missing)."""
    floor = y + 28 + PLOT
    parts = [text(10, y + 16, one["title"])]
    for begin, end in shades:
        x = LEFT + begin / hours * (WIDTH - LEFT - RIGHT)
        width = max((end - begin) / hours * (WIDTH - LEFT - RIGHT), 2)
        parts.append(f'<rect class="shade" x="{x:.1f}" y="{floor - PLOT}" width="{width:.1f}" height="{PLOT}"/>')
    for share in (0, 0.5, 1):
        at = floor - share * PLOT
        parts += [f'<line class="grid" x1="{LEFT}" x2="{WIDTH - RIGHT}" y1="{at}" y2="{at}"/>',
                  text(LEFT - 6, at + 4, shown(share * top), "small", "end")]
    parts += [curve(values, top, floor, colour) for values, colour in zip(one["curves"], COLOURS)]
    if one.get("mean"):
        at = floor - one["mean"] / top * PLOT
        parts.append(f'<line class="mean" x1="{LEFT}" x2="{WIDTH - RIGHT}" y1="{at:.1f}" y2="{at:.1f}"/>')
    for place, name in enumerate(one.get("names", ())):
        x = WIDTH - RIGHT - 96 * (len(one["names"]) - place)
        parts += [f'<rect x="{x}" y="{y + 7}" width="10" height="10" fill="{COLOURS[place]}"/>', text(x + 15, y + 16, name, "small")]
    return parts


def drawing(title, panels, hours, shades):
    """Panels with the same "scale" have the same axis. `shades`: begin and end, in hours, of the disturbances."""
    tops = {}
    for one in panels:
        most = max(max(values) for values in one["curves"])
        tops[one["scale"]] = max(tops.get(one["scale"], 0), most)
    floor = TOP + PANEL * len(panels)
    height = floor + 26
    parts = [f'<svg xmlns="http://www.w3.org/2000/svg" width="{WIDTH}" height="{height}" viewBox="0 0 {WIDTH} {height}" role="img" '
             f'aria-label="{title}">', f"<style>{STYLE} {OWN}</style>", f'<rect class="back" width="{WIDTH}" height="{height}"/>',
             text(10, 26, title, "title")]
    for place, one in enumerate(panels):
        parts += panel(one, TOP + place * PANEL, hours, shades, nice(tops[one["scale"]]))
    for hour in range(0, int(hours) + 1, max(1, int(hours) // 8)):
        parts.append(text(LEFT + hour / hours * (WIDTH - LEFT - RIGHT), floor + 4, f"{hour} h", "small", "middle"))
    return "\n".join([*parts, "</svg>"]) + "\n"
