# SPDX-License-Identifier: Apache-2.0
"""Measures the path of a message with the programs in VELTRA_BUILD (by default build/release): sends of one client
compared with a bare socket ping-pong, the daemon's CPU time per message, its memory, and its start time. Ratios can be
compared; single figures depend on the machine. With VELTRA_PIN=1 everything runs on one core."""
import json
import os
import pathlib
import subprocess
import time

from family import Daemon, lab_and_root
from harness import program, wait_until

SESSIONS = 100


def memory_kib(pid):
    status = pathlib.Path(f"/proc/{pid}/status").read_text()
    return int(next(line.split()[1] for line in status.splitlines() if line.startswith("VmRSS")))


def cpu_seconds(pid):
    """CPU time of all threads, including those that have ended."""
    fields = pathlib.Path(f"/proc/{pid}/stat").read_text().rsplit(")", 1)[1].split()
    return (int(fields[11]) + int(fields[12])) / os.sysconf("SC_CLK_TCK")


def start_milliseconds(root):
    """Starts the daemon; returns it and the time from exec until it says that it serves."""
    begin = time.monotonic()
    daemon = Daemon(root, env={"VELTRA_LOG": "info"})
    ready = (time.monotonic() - begin) * 1000
    return daemon, ready


def memory_of_sessions(root):
    """The memory of a new daemon after its first posts, and the memory of each further session with one back end."""
    daemon = Daemon(root, env={"VELTRA_LOG": "info"})
    command = [program("veltractl"), "--root", str(root.path), "session", "--client-type", "6"]
    clients = []
    for _ in range(1 + SESSIONS):
        clients.append(subprocess.Popen(command, stdin=subprocess.PIPE, stdout=subprocess.PIPE))
        clients[-1].stdout.readline()
        if len(clients) == 1:
            wait_until(lambda: "event posted" in (root.path / "run/veltrad/counters.json").read_text(), "a first post")
            first = memory_kib(daemon.popen.pid)
    grown = memory_kib(daemon.popen.pid) - first
    for client in clients:
        client.communicate()
    daemon.stop()
    return {"afterFirstPostKiB": first, "kibASession": round(grown / SESSIONS, 1)}


def main():
    if os.environ.get("VELTRA_PIN"):
        os.sched_setaffinity(0, {0})
    with lab_and_root() as (lab, root):
        entry = {"post_url": lab.url + "/collect/events", "filters": [], "event_threshold": 1000}
        lab.put("ostvane", {"release": {"httppost": {"clients": [entry]}}, "version": "1"})
        daemon, ready = start_milliseconds(root)
        figures = {"startToAcceptingMs": round(ready, 1), "restKiB": memory_kib(daemon.popen.pid)}
        before = cpu_seconds(daemon.popen.pid)
        done = subprocess.run([program("send_bench"), str(root.path)], capture_output=True, text=True, check=True)
        figures.update(json.loads(done.stdout))
        messages = figures["roundTrips"] + figures["oneWay"]
        figures["daemonMicrosecondsAMessage"] = round((cpu_seconds(daemon.popen.pid) - before) / messages * 1e6, 2)
        daemon.stop()
        figures.update(memory_of_sessions(root))
        print(json.dumps(figures, indent=2))


main()
