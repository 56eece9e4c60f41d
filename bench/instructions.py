# SPDX-License-Identifier: Apache-2.0
"""Counts the daemon's instructions with callgrind: for a start, and for each message of three kinds. Unlike times, the counts
do not depend on what else the machine does. Uses the programs in VELTRA_BUILD (by default build/release). With a file as its
argument, it compares with the figures there and fails if one has grown by more than 5 %; --record FILE writes them."""
import json
import os
import pathlib
import re
import sys

os.environ.setdefault("VELTRA_BUILD", str(pathlib.Path(__file__).resolve().parents[1] / "build" / "release"))
sys.path.insert(0, str(pathlib.Path(__file__).resolve().parents[1] / "tests" / "e2e"))
from harness import START, Daemon, Lab, Root, Wire, storebag, wait_until  # noqa: E402

FEW, MANY = 200, 1200
PATIENCE = 300  # seconds; callgrind is some fifty times slower
REPORTING = {"message in": (), "batched and posted": ("httppost",), "datagram": ("dashboard",)}
SEND = "sendMessageWithCategory:type:payload:reply:"
PAYLOAD = {"codec": "opus", "seconds": 12.5, "muted": False, "peer": "3c9f", "packets": 1200, "lost": 3, "route": "relay"}


def backends(kind, lab):
    """The storebag section in which a message is refused, batched and posted, or one datagram."""
    if kind == "datagram":
        return {"dashboard": {"ip": lab.dashboard[0], "port": lab.dashboard[1]}}
    entry = {"post_url": "${url}/events", "locale_whitelist": ["US" if kind == "batched and posted" else "FR"], "filters": [],
             "sampling_threshold": 1, "event_threshold": 49, "expedite": 0}
    return {"httppost": {"clients": [entry]}}


def instructions(root, messages, reporting=()):
    """Of a daemon that starts, takes so many messages in one session with these reporting back ends, and stops."""
    log = root.path / "callgrind.log"
    (root.path / "run/veltrad").mkdir(parents=True, exist_ok=True)  # callgrind opens its file before the daemon runs
    daemon = Daemon(root, serving=False, env={"VELTRA_LOG": "error"}, wrapper=(
        "valgrind", "--tool=callgrind", f"--callgrind-out-file={root.path}/run/veltrad/callgrind.out", f"--log-file={log}"))
    wait_until(lambda: pathlib.Path(root.socket).exists() or daemon.popen.poll() is not None, "the daemon's socket", PATIENCE)
    assert daemon.popen.poll() is None, log.read_text()
    if messages is not None:
        wire = Wire(root)
        wire.socket.settimeout(PATIENCE)
        wire.describe()
        started = wire.call(START)["results"]["backends"]
        assert started == list(reporting), f"{started} report instead of {reporting}"
        for _ in range(messages):
            wire.send(Wire.CALL, {"op": SEND, "args": {"category": 5, "type": 1, "payload": PAYLOAD}})
        wire.call("flushMessagesWithCompletion:")
        wire.close()
    daemon.popen.terminate()
    daemon.popen.wait(PATIENCE)
    return int(re.search(r"Collected : (\d+)", log.read_text()).group(1))


def keep_storebag(root):
    """Has a daemon at full speed keep the storebag, because a slow one may not get it within its time limit."""
    daemon = Daemon(root)
    wire = Wire(root)
    wire.describe()
    wire.call(START)
    wire.close()
    daemon.popen.terminate()
    daemon.popen.wait()


def measure():
    root, lab = Root(), Lab()
    try:
        root.use(lab)
        root.write("etc/veltrad/settings.json", b'{"storebags": {"persist": true}}')
        figures = {"start": instructions(root, None)}
        for kind in REPORTING:
            lab.put("quindle", storebag(backends=backends(kind, lab)))
            keep_storebag(root)
            few, many = (instructions(root, count, REPORTING[kind]) for count in (FEW, MANY))
            figures[kind] = round((many - few) / (MANY - FEW))
        return figures
    finally:
        lab.stop()
        Lab.forget_keys()
        root.remove()


def main(arguments):
    figures = measure()
    if arguments[:1] == ["--record"]:
        pathlib.Path(arguments[1]).write_text(json.dumps(figures, indent=2) + "\n")
    before = json.loads(pathlib.Path(arguments[0]).read_text()) if len(arguments) == 1 else {}
    grown = 0
    for name, count in figures.items():
        change = f" ({(count / before[name] - 1) * 100:+.1f} %)" if name in before else ""
        print(f"{count:>12,}  {name}{change}")
        grown += name in before and count > 1.05 * before[name]
    return 1 if grown else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
