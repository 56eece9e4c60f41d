# SPDX-License-Identifier: Apache-2.0
"""Measures the cost of families with the programs in VELTRA_BUILD (by default build/release): the daemon's CPU time for a
message of a root, and of a child with and without an aggregating root, and the time of a refresh of 1,000 sessions."""
import contextlib
import json
import os
import pathlib
import plistlib
import statistics
import struct
import sys
import threading
import time

SOURCE = pathlib.Path(__file__).resolve().parent.parent
os.environ.setdefault("VELTRA_BUILD", str(SOURCE / "build" / "release"))
sys.path.insert(0, str(SOURCE / "tests" / "e2e"))
from harness import Daemon, Lab, Root, Wire, storebag  # noqa: E402

MESSAGES, ROUNDS, FAMILY, REFRESHES = 100_000, 5, 1_000, 40
ROOT, CHILD = 7, 6  # client types
SET = "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:"


@contextlib.contextmanager
def lab_and_root():
    root, lab = Root(), Lab()
    try:
        root.use(lab)
        yield lab, root
    finally:
        lab.stop()
        root.remove()


def cpu_seconds(pid):
    """CPU time of all threads, with nanosecond resolution."""
    tasks = pathlib.Path(f"/proc/{pid}/task").glob("*/schedstat")
    return sum(int(task.read_text().split()[0]) for task in tasks) / 1e9


def join(root, client_type, name, aggregates=False):
    wire = Wire(root)
    wire.call(SET, sessionInfo={"clientType": client_type, "sessionID": 1, "requireUserInfo": True},
              userInfo={"clientName": name, "serviceName": "bench"}, frameworksToCheck=[],
              hasAggregationBlock=aggregates)
    wire.call("startConfigWithCompletionHandler:")
    return wire


def frames(count):
    message = {"category": 5, "type": 10, "payload": {f"key{i}": f"value {i}" * 2 for i in range(10)}}
    body = plistlib.dumps({"op": "sendMessageWithDictionary:reply:", "args": {"message": message}},
                          fmt=plistlib.FMT_BINARY)
    return (struct.pack(">IBBHI", len(body), Wire.CALL, 0, 0, 0) + body) * count


def cpu_a_message(pid, wire):
    burst = frames(1000)
    wire.call("fetchDisplayURL:")
    begin = cpu_seconds(pid)
    for _ in range(MESSAGES // 1000):
        wire.socket.sendall(burst)
        wire.call("fetchDisplayURL:")
    return (cpu_seconds(pid) - begin) / MESSAGES * 1e6


def drain(wire):
    """Reads and discards the copies."""
    def read():
        wire.socket.settimeout(None)
        while wire.socket.recv(1 << 20):
            pass
    threading.Thread(target=read, daemon=True).start()


def refresh_milliseconds(root, name):
    """The root leaves and returns, which refreshes all sessions below it. Returns the median time of the return."""
    wire = join(root, ROOT, "elsewhere")
    took = []
    for _ in range(REFRESHES):
        for names in (name, "elsewhere"):
            begin = time.perf_counter()
            wire.call("fetchStatesWithUserInfo:completionHandler:",
                      userInfo={"clientName": names, "serviceName": "bench"})
            if names == name:
                took.append((time.perf_counter() - begin) * 1000)
    return statistics.median(took)


def main():
    with lab_and_root() as (lab, root):
        for kind, name, level in ((ROOT, "quindle", 0), (CHILD, "ostvane", 1)):
            # The back ends are sampled out, so nothing is posted.
            entry = {"client": "alone,lonely,family,thousand,elsewhere", "locale_whitelist": ["US"], "filters": [],
                     "sampling_threshold": -1, "override_sampling": -1, "hierarchy": level}
            lab.put(name, storebag(backends={"httppost": {"clients": [entry]}}))
        daemon = Daemon(root, env={"VELTRA_LOG": "info"})
        pid = daemon.popen.pid
        aggregating = join(root, ROOT, "family", aggregates=True)
        drain(aggregating)
        quiet = join(root, ROOT, "lonely")
        cases = {"root": join(root, ROOT, "alone"), "childOfAQuietRoot": join(root, CHILD, "lonely"),
                 "childOfAnAggregatingRoot": join(root, CHILD, "family")}
        figures = {name: [] for name in cases}
        for _ in range(ROUNDS):
            for name, wire in cases.items():
                figures[name].append(cpu_a_message(pid, wire))
        figures = {f"{name}Us": round(statistics.median(taken), 2) for name, taken in figures.items()}
        members = [join(root, CHILD, "thousand") for _ in range(FAMILY - 1)]
        figures["refreshOfOneMs"] = round(refresh_milliseconds(root, "alone"), 2)
        figures["refreshOfAThousandMs"] = round(refresh_milliseconds(root, "thousand"), 2)
        inside = join(root, CHILD, "thousand")
        figures["childInAThousandUs"] = round(cpu_a_message(pid, inside), 2)
        print(json.dumps(figures, indent=2))
        for wire in (*members, *cases.values(), inside, quiet):
            wire.close()
        daemon.kill()


if __name__ == "__main__":
    main()
