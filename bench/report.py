# SPDX-License-Identifier: Apache-2.0
"""The figures of one run on the terminal and in docs/performance.md."""
import datetime
import os
import pathlib
import platform
import subprocess

import counts
import latency
import peers
import plot
from figures import HEADINGS, markdown_table, text_table
from place import SOURCE, cores

PAGE, PLOT = SOURCE / "docs" / "performance.md", SOURCE / "docs" / "latency.svg"


def machine():
    """Lines of what the figures were taken on."""
    processor = next((line.split(":")[1].strip() for line in pathlib.Path("/proc/cpuinfo").read_text().splitlines()
                      if line.startswith("model name")), platform.machine())
    changed = git("status", "--porcelain", "--", "src", "include", "bench") != ""
    return [f"{cores()} of {os.cpu_count()} cores of {processor}, Linux {platform.release()}",
            f"commit {git('rev-parse', '--short=12', 'HEAD')}{' with changes' if changed else ''}",
            f"{datetime.datetime.now(datetime.UTC):%Y-%m-%d %H:%M} UTC"]


def git(*words):
    return subprocess.run(["git", *words], cwd=SOURCE, capture_output=True, text=True).stdout.strip()


class Run:
    """The results of one run. The load is that of the machine when the run began and when it ended, its own included."""

    def __init__(self, rounds, quick):
        self.rounds, self.quick, self.began = rounds, quick, os.getloadavg()[0]
        self.figures, self.latency, self.counts, self.peers = [], {}, {}, []

    def facts(self):
        return [*machine(), f"load average {self.began:.2f} at the beginning, {os.getloadavg()[0]:.2f} at the end",
                f"rounds, interleaved: {self.rounds}{', of a quick run' if self.quick else ''}"]

    def _tables(self):
        """(title, headings, rows) of each."""
        if self.figures:
            yield "Figures", HEADINGS, [figure.cells() for figure in self.figures]
        if self.latency:
            yield "Latency", latency.HEADINGS, latency.rows(self.latency)
        if self.counts:
            yield "Counts", ["", *self.counts], counts.rows(self.counts)
        if self.peers:
            yield "Beside others", peers.HEADINGS, peers.rows(self.peers)

    def terminal(self):
        return "\n\n".join(["\n".join(self.facts()), *(f"{title}\n{text_table(rows, headings)}"
                                                       for title, headings, rows in self._tables())])

    def write(self):
        text = [INTRODUCTION, "## The run", "\n".join(f"- {fact}" for fact in self.facts())]
        for title, headings, rows in self._tables():
            text += [f"## {title}", TEXTS[title], markdown_table(rows, headings)]
            if title == "Latency":
                text.append(f"![Latency of a send with reply beside the bare socket]({PLOT.name})")
                PLOT.write_text(plot.drawing(self.latency))
        PAGE.write_text("\n\n".join(text) + "\n")


INTRODUCTION = """# Performance

`scripts/bench` writes this page. Every figure stands beside its floor: what the parts of the work cost when nothing is around
them, measured in the same round, on the same machine and the same bytes. Compare ratios, not times: those depend on the machine
and on what else it does, which its load average tells. `scripts/bench --check` compares the counts below with `bench/counts.json`
and fails when one has grown by more than 5 %; it can run on a busy machine."""
TEXTS = {
    "Figures": """CPU is that of all threads of the daemon, so libraries and kernel are in it. The sum of the parts of an event is
receiving its frame from a bare socket, reading its property list without any check, writing its JSON, compressing its share
of a body and posting its share with libcurl alone. No readable copies are made, except where a line says so.""",
    "Latency": """One client on one core, the other end on another. The throughput is what a client reaches that sends the next
message when it has the reply to the one before. A message that was due while the one before was under way counts from when it
was due.""",
    "Counts": """Of the daemon, for one message whose client waits for each reply. Instructions are counted by callgrind; a wait is
a voluntary context switch. An event that is flushed has a post of its own, whose answer is waited for.""",
    "Beside others": """The same events, the same collector (nginx with TLS), the same number of events in a post. Each program is
configured to read messages from a Unix socket, to parse them, to add the same eleven fields and to post JSON on one
connection at a time, as far as it can; the others get each message as a line of syslog whose text is JSON. Under overload the
collector answers 20 posts of 50 in a second, each program may keep 51,200 events, and what has arrived is counted there.""",
}
