# SPDX-License-Identifier: Apache-2.0
"""Measures the dashboard with the programs in VELTRA_BUILD (by default build/release): 10,000 messages a second from 100
sessions for five seconds, with acknowledgements; and the CPU time of 1,000 idle sessions with reliable UDP."""
import json
import os
import plistlib
import struct
import subprocess
import time

from family import SET, Daemon, Wire, cpu_seconds, lab_and_root, storebag
from harness import program, wait_until

SESSIONS, RATE, SECONDS, IDLE = 100, 10_000, 5, 1_000


def join(root, number):
    wire = Wire(root)
    wire.call(SET, sessionInfo={"clientType": 7, "sessionID": number}, frameworksToCheck=[], hasAggregationBlock=False)
    wire.call("startConfigWithCompletionHandler:")
    return wire


def frame(number):
    message = {"category": 5, "type": 10, "payload": {"number": number, "codec": "opus", "seconds": 12.5}}
    body = plistlib.dumps({"op": "sendMessageWithDictionary:reply:", "args": {"message": message}},
                          fmt=plistlib.FMT_BINARY)
    return struct.pack(">IBBHI", len(body), Wire.CALL, 0, 0, 0) + body


def busy(root, pid):
    sessions = [join(root, number) for number in range(SESSIONS)]
    rounds, burst = SECONDS * 100, RATE // 100 // SESSIONS
    begin, used = time.monotonic(), cpu_seconds(pid)
    for round in range(rounds):
        for wire in sessions:
            wire.socket.sendall(b"".join(frame(round * burst + i) for i in range(burst)))
        time.sleep(max(0, begin + (round + 1) / 100 - time.monotonic()))
    took = time.monotonic() - begin
    for wire in sessions:
        wire.call("fetchDisplayURL:")
    return sessions, rounds * burst * SESSIONS, took, cpu_seconds(pid) - used


def main():
    figures = json.loads(subprocess.run([program("dashboard_bench")], capture_output=True, check=True).stdout)
    with lab_and_root() as (lab, root):
        lab.put("quindle", storebag(backends={"dashboard": {"ip": "127.0.0.1", "port": "${dashboardPort}",
                                                            "reliable": 500}}))
        daemon = Daemon(root, env={"VELTRA_LOG": "error"}, serving=False)
        wait_until(lambda: os.path.exists(root.socket), "the socket")
        pid = daemon.popen.pid
        sessions, sent, took, used = busy(root, pid)
        path = root.path / "run/veltrad/counters.json"

        def acknowledged():
            return json.loads(path.read_text())["counts"].get("datagram acknowledged", 0) if path.exists() else 0
        wait_until(lambda: acknowledged() >= sent + SESSIONS, "every acknowledgement")
        arrived = {(line["sessionID"], line["eventID"]) for line in lab.received("dashboard") if line["method"] == 5}
        counts = json.loads(path.read_text())["counts"]
        figures.update(sent=sent, aSecond=round(sent / took), missing=sent - len(arrived),
                       daemonUsAMessage=round(used / sent * 1e6, 1),
                       sentAgain=counts.get("datagram sent again: not acknowledged", 0))
        for wire in sessions:
            wire.close()
        idle = [join(root, number) for number in range(IDLE)]
        wait_until(lambda: acknowledged() >= sent + 2 * SESSIONS + IDLE, "every acknowledgement")
        time.sleep(1)  # until the counters have been written
        used, begin = cpu_seconds(pid), time.monotonic()
        time.sleep(5)
        share = (cpu_seconds(pid) - used) / (time.monotonic() - begin)
        figures["idleSessionsPercentOfACore"] = round(share * 100, 3)
        print(json.dumps(figures, indent=2))
        for wire in idle:
            wire.close()
        daemon.kill()


if __name__ == "__main__":
    main()
