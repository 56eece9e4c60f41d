# SPDX-License-Identifier: Apache-2.0
"""The command line of scripts/bench."""
import argparse
import os
import subprocess
import sys

import counts
import latency
import many
import measures
import peers
import report
import uploads
from place import SOURCE, Place

MEASURES = (measures.RoundTrip, measures.Intake, measures.Batches, measures.SinglePosts, measures.Datagrams, measures.Start,
            measures.Memory, many.Idle, many.Attack, uploads.Uploads, latency.Latency)
SLOW = (many.Attack, uploads.Uploads)  # left out of a quick run
TARGETS = ("veltrad", "veltractl", "veltra-lab", "bench_floors", "bench_load")


def arguments():
    parser = argparse.ArgumentParser(prog="scripts/bench", description="Measures the daemon of the release preset beside its floors, "
                                     "prints a table and rewrites docs/performance.md. Needs nginx, valgrind and strace.")
    parser.add_argument("--quick", action="store_true", help="less than a minute: fewer messages, one round; writes no page")
    parser.add_argument("--rounds", type=int, default=5, help="interleaved rounds (default: 5)")
    parser.add_argument("--only", metavar="NAME", help=f"one measurement, and no page: {', '.join(map(name, MEASURES))}")
    parser.add_argument("--check", action="store_true",
                        help="compares the counts with bench/counts.json; status 1 if one has grown by more than 5 %%")
    parser.add_argument("--record", action="store_true", help="rewrites bench/counts.json")
    parser.add_argument("--peers", action="store_true", help="also measures syslog-ng and rsyslog (Debian's packages, unpacked into "
                        "build/peers)")
    parser.add_argument("--fluent-bit", metavar="PATH", help="a Fluent Bit to measure as well")
    parser.add_argument("--pin", action="store_true", help="everything on one core, as on a small device; writes no page")
    parser.add_argument("--no-build", action="store_true", help="takes the programs in VELTRA_BUILD as they are")
    return parser.parse_args()


def name(measure):
    return measure.__name__.lower()


def build():
    for command in (["cmake", "--preset", "release", "-DVELTRA_BENCH=ON"],
                    ["cmake", "--build", "--preset", "release", "--target", *TARGETS]):
        done = subprocess.run(command, cwd=SOURCE, capture_output=True, text=True)
        if done.returncode != 0:
            sys.exit(done.stdout + done.stderr)


def measured(place, chosen, given):
    rounds = 1 if given.quick else given.rounds
    run = report.Run(rounds, given.quick)
    taken = [measure(place, given.quick) for measure in chosen]
    for number in range(rounds):
        for measure in taken:
            print(f"scripts/bench: round {number + 1} of {rounds}: {name(type(measure))}", file=sys.stderr)
            measure.round()
    run.figures = [figure for measure in taken for figure in measure.figures()]
    run.latency = next((measure.medians() for measure in taken if isinstance(measure, latency.Latency)), {})
    return run


def main():
    given = arguments()
    chosen = [measure for measure in MEASURES if (not given.only or name(measure) == given.only)
              and not (given.quick and not given.only and measure in SLOW)]
    if not chosen:
        sys.exit(f"scripts/bench: unknown measurement {given.only}; expected one of {', '.join(map(name, MEASURES))}")
    if not given.no_build:
        build()
    if given.pin:
        os.sched_setaffinity(0, {0})
    place = Place()
    try:
        place.capture()
        if given.check:
            return counts.check(place)
        if given.record:
            print(report.text_table(counts.rows(now := counts.record(place)), ["", *now]))
            return 0
        run = measured(place, chosen, given)
        if not given.quick and not given.only:
            run.counts = counts.measure(place)
        whole = not given.quick and not given.only and not given.pin
        if whole:
            run.write()  # a peer that fails does not end the run
        if given.peers or given.fluent_bit:
            run.peers = peers.measure(place, given)
        print(run.terminal())
        if whole:
            run.write()
        return 0
    finally:
        place.close()
