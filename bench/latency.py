# SPDX-License-Identifier: Apache-2.0
"""send with its reply awaited at 10, 50 and 90 % of what one client reaches, beside the bare socket at the same shares of what it
reaches."""
import statistics

from figures import number
from measures import Measure
from place import BATCHES_OF_1000, cores, pin

SHARES = (10, 50, 90)
QUANTILES = {"p50": "p50", "p99": "p99", "p999": "p99.9"}


class Latency(Measure):
    def round(self):
        seconds = 0.5 if self.quick else 3
        apart = 1 if cores() > 1 else 0
        with self.place.daemon() as daemon:
            pin(daemon.popen.pid, {apart})
            ways = {"send with reply": ("latency", self.place.root.path, BATCHES_OF_1000), "bare socket": ("bare", apart, 0)}
            most = {name: self.place.load(*way, 0, seconds)["rate"] for name, way in ways.items()}
            for share in SHARES:
                for name, way in ways.items():
                    got = self.place.load(*way, most[name] * share / 100, seconds)
                    self.take(**{f"{name}:{share}:{key}": got[key] for key in ("rate", *QUANTILES)})

    def figures(self):
        return ()

    def medians(self):
        """{name: {share: {"rate", "p50", "p99", "p999"}}}, microseconds and a second."""
        found = {}
        for key, values in self.taken.items():
            name, share, what = key.split(":")
            found.setdefault(name, {}).setdefault(int(share), {})[what] = statistics.median(values)
        return found


HEADINGS = ["", "load", "messages a second", *(f"{shown}, µs" for shown in QUANTILES.values())]


def rows(medians):
    return [[name, f"{share} %", number(got["rate"]), *(number(got[key]) for key in QUANTILES)]
            for name, shares in medians.items() for share, got in shares.items()]
