# SPDX-License-Identifier: Apache-2.0
"""Counts the cost of a message independently of the load of the machine: instructions of the daemon (callgrind), page
faults, waits and system calls (strace), the last three of clients that wait for each reply. counts.json holds the last record."""
import contextlib
import json
import pathlib
import re
import subprocess
import sys

from figures import number
from place import (BATCHES_OF_50, DATAGRAMS, REFUSED, SOURCE, context_switches, found, page_faults, program)

RECORD = SOURCE / "bench" / "counts.json"
KINDS = {"message in state 1": ("waits", REFUSED), "event in a post of 50": ("waits", BATCHES_OF_50),
         "event that is flushed": ("posts", BATCHES_OF_50), "datagram": ("waits", DATAGRAMS)}
MESSAGES = 1000
WARM = 9  # runs until the ring of fates is full, whose pages are touched once
PATIENCE = 300  # seconds
GROWTH = 1.05
# What may come and go without a change of the code. Where threads pass work on, a busy machine decides who finds it before it
# waits, and how many lines the message log takes at a time.
NOISE = {"instructions": 0, "page faults": 0.02, "waits": 0.5, "system calls": 0.1}
NOISE_OF_THREADS = {"waits": 2, "system calls": 3}
MANY_THREADS = ("event that is flushed", "datagram")


def noise(kind, name):
    return NOISE_OF_THREADS.get(kind, NOISE[kind]) if name in MANY_THREADS else NOISE[kind]


class NothingPosted(Exception):
    """Under callgrind on a busy machine a handshake can take longer than the daemon waits."""


def run(place, client, posted):
    """Sends messages. With `posted`, waits for the answer to the last post."""
    before = place.sink.requests()
    client.run()
    if posted and place.sink.requests() == before:
        raise NothingPosted()


@contextlib.contextmanager
def under_callgrind(place, counted, *more):
    """Runs a daemon and adds its instructions to `counted`; without `more`, only those of its start."""
    (place.root.path / "run/veltrad").mkdir(parents=True, exist_ok=True)  # callgrind opens its file before the daemon runs
    log = place.root.path / "callgrind.log"
    wrapper = (found("valgrind"), "--tool=callgrind", f"--callgrind-out-file={place.root.path}/run/veltrad/callgrind.out",
               f"--log-file={log}", *more)
    with place.daemon(wrapper, PATIENCE) as daemon:
        yield daemon.popen.pid
    counted.append(int(re.search(r"Collected : (\d+)", log.read_text()).group(1)))


def instructions_of_messages(place, way, client_type, tries=5):
    """Instructions for a message whose reply is awaited, without those of the session's start and end."""
    try:
        return count_messages(place, way, client_type)
    except NothingPosted:
        if tries == 1:
            raise
        return instructions_of_messages(place, way, client_type, tries - 1)


def keep_storebag(place, way, client_type):
    """Makes a daemon at full speed keep the storebag, because a slow one may exceed the time limit of the fetch."""
    place.root.write("etc/veltrad/settings.json", json.dumps({"storebags": {"persist": True}}).encode())
    with place.daemon(), place.client(way, client_type, 1, 1) as client:
        client.run()


def count_messages(place, way, client_type):
    counted = []
    keep_storebag(place, way, client_type)
    with under_callgrind(place, counted, "--instr-atstart=no") as pid:
        with place.client(way, client_type, 1, MESSAGES) as client:
            run(place, client, client_type == BATCHES_OF_50)
            for state in ("on", "off"):
                subprocess.run([found("callgrind_control"), "-i", state, str(pid)], stdout=subprocess.DEVNULL,
                               stderr=subprocess.DEVNULL, check=True)
                if state == "on":
                    run(place, client, client_type == BATCHES_OF_50)
    return round(counted[0] / MESSAGES)


def instructions(place):
    start = []
    with under_callgrind(place, start):
        pass
    return {"start and stop": start[0], **{name: instructions_of_messages(place, *kind) for name, kind in KINDS.items()}}


def per_message(place, way, client_type):
    """Page faults and waits of the daemon for a message whose reply is awaited; the first ones do not count."""
    with place.daemon() as daemon, place.client(way, client_type, 1, MESSAGES) as client:
        pid = daemon.popen.pid
        for _ in range(WARM):
            run(place, client, client_type == BATCHES_OF_50)
        before = page_faults(pid), context_switches(pid)
        run(place, client, client_type == BATCHES_OF_50)
        return [(late - early) / MESSAGES for early, late in zip(before, (page_faults(pid), context_switches(pid)))]


def system_calls(place, way, client_type):
    """System calls of the daemon for a message whose reply is awaited."""
    with place.daemon() as daemon, place.client(way, client_type, 1, MESSAGES) as client:
        run(place, client, client_type == BATCHES_OF_50)
        table = place.root.path / "strace.txt"
        tracer = subprocess.Popen([found("strace"), "-f", "-c", "-U", "name,calls", "-o", str(table), "-p", str(daemon.popen.pid)],
                                  stderr=subprocess.PIPE, text=True)
        lines = iter(tracer.stderr.readline, "")
        assert any("attached" in line for line in lines), "strace cannot attach"
        run(place, client, client_type == BATCHES_OF_50)
        tracer.terminate()
        tracer.communicate()
    calls = {name: int(count) for name, count in re.findall(r"^(\w+)\s+(\d+)$", table.read_text(), re.M) if name != "total"}
    return sum(calls.values()) / MESSAGES


def measure(place):
    counts = {"instructions": instructions(place), "page faults": {}, "waits": {}, "system calls": {}}
    for name, kind in KINDS.items():
        faults, waits = per_message(place, *kind)
        counts["page faults"][name] = round(faults, 4)
        counts["waits"][name] = round(waits, 3)
        counts["system calls"][name] = round(system_calls(place, *kind), 3)
    return counts


def libraries():
    """The compiler and the linked libraries, which also affect the counts."""
    compiler = subprocess.run([found("gcc"), "-dumpfullversion"], capture_output=True, text=True, check=True).stdout.strip()
    linked = subprocess.run(["ldd", program("veltrad")], capture_output=True, text=True, check=True).stdout
    paths = [pathlib.Path(path).resolve().name for path in re.findall(r"=> (\S+)", linked)]
    kept = [name for name in paths if re.match(r"lib(c|z|curl|crypto|ssl|stdc\+\+)[.-]", name)]
    return ", ".join([f"gcc {compiler}", *sorted(kept)])


def compare(before, now):
    """A line for each count that has grown by more than a twentieth."""
    grown = []
    for kind, counts in now.items():
        for name, count in counts.items():
            was = before.get(kind, {}).get(name)
            if was is not None and count > was * GROWTH + noise(kind, name):
                change = f"{(count / was - 1) * 100:+.1f} %" if was else "none before"
                grown.append(f"{kind}, {name}: {number(was)} before, {number(count)} now ({change})")
    return grown


def rows(counts):
    names = list(dict.fromkeys(name for kind in counts.values() for name in kind))
    return [[name, *(number(kind[name]) if name in kind else "" for kind in counts.values())] for name in names]


def check(place):
    """The exit status."""
    if not RECORD.exists():
        sys.exit(f"scripts/bench: {RECORD.relative_to(SOURCE)} is missing; scripts/bench --record makes it")
    record = json.loads(RECORD.read_text())
    now = measure(place)
    if record["with"] != libraries():
        print(f"The record was made with {record['with']}; these are {libraries()}.", file=sys.stderr)
    grown = compare(record["counts"], now)
    for line in grown:
        print(f"grown: {line}")
    print(f"{sum(map(len, now.values())) - len(grown)} counts hold, {len(grown)} have grown")
    return 1 if grown else 0


def record(place):
    now = measure(place)
    RECORD.write_text(json.dumps({"with": libraries(), "counts": now}, indent=2) + "\n")
    return now
