# SPDX-License-Identifier: Apache-2.0
"""A figure beside its floor and its target, and tables of figures."""
import dataclasses
import statistics


@dataclasses.dataclass
class Figure:
    """Holds one value for each round and, if there is a floor, the floor of that round. The target applies to the ratio to the
    floor if there is one."""
    name: str
    unit: str
    values: list
    floor: str = ""
    floors: list = dataclasses.field(default_factory=list)
    most: float = None
    least: float = None

    def ratios(self):
        return [value / floor for value, floor in zip(self.values, self.floors)]

    def judged(self):
        return statistics.median(self.ratios() if self.floors else self.values)

    def holds(self):
        """None without a target."""
        if self.most is None and self.least is None:
            return None
        return (self.most is None or self.judged() <= self.most) and (self.least is None or self.judged() >= self.least)

    def target(self):
        bound = self.most if self.most is not None else self.least
        if bound is None:
            return ""
        return f"{'at most' if self.most is not None else 'at least'} {bound:,g}{' times the floor' if self.floors else ''}"

    def cells(self):
        holds = {None: "", True: "yes", False: "no"}[self.holds()]
        floor = f"{self.floor}: {number(statistics.median(self.floors))}" if self.floors else ""
        return [self.name, f"{number(statistics.median(self.values))} {self.unit}".rstrip(), spread(self.values), floor,
                f"{statistics.median(self.ratios()):.2f}" if self.floors else "", spread(self.ratios()), self.target(), holds]


HEADINGS = ["figure", "median", "from … to", "floor, median", "ratio", "from … to", "target", "holds"]


def number(value):
    return f"{value:,.0f}" if abs(value) >= 1000 else f"{value:.1f}" if abs(value) >= 100 else f"{value:.3g}"


def spread(values):
    return f"{number(min(values))} … {number(max(values))}" if len(values) > 1 else ""


def text_table(rows, headings=HEADINGS):
    rows = [headings, *rows]
    widths = [max(len(row[column]) for row in rows) for column in range(len(headings))]
    return "\n".join("  ".join(cell.ljust(width) for cell, width in zip(row, widths)).rstrip() for row in rows)


def markdown_table(rows, headings=HEADINGS):
    lines = [headings, ["---"] * len(headings), *rows]
    return "\n".join("| " + " | ".join(cell.replace("|", "\\|") for cell in line) + " |" for line in lines)
