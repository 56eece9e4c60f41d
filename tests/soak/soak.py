# SPDX-License-Identifier: Apache-2.0
"""Clients that send for a long time while their daemon is restarted or killed every second. Prints the figures as JSON; the
exit status is 1 if a message arrived twice, if what a client sent is not what arrived and was counted (a kill may count what was
under way as well), or if a client grew.
Usage: python3 tests/soak/soak.py [SECONDS] [--kill] [--microseconds N]   (VELTRA_BUILD: the build folder)"""
import argparse
import json
import pathlib
import sys
import time

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parents[1] / "e2e"))
from harness import BUILD, Daemon, Lab, Root, storebag  # noqa: E402
from test_comeback import Ledger, Sender, arrived  # noqa: E402

LANGUAGES = ("C", "C++", "Python") * 2 + ("C++", "Python")  # of the clients
KIB_OF_GROWTH = 2560  # a full queue takes 1,900: 1 MiB and what holds it
UNDER_WAY = 2  # messages of a client that a kill finds posted, but not yet taken off what the daemon would have lost


def figures(sender):
    descriptors = len(list(pathlib.Path(f"/proc/{sender.popen.pid}/fd").iterdir()))
    return {"KiB": sender.status("VmRSS"), "descriptors": descriptors}


def soak(root, lab, seconds, kill, microseconds):
    def start():
        daemon = Daemon(root, env={"VELTRA_LOG": "info"})
        daemon.allow("")  # what it says is not what is measured here
        return daemon

    daemon, ledger = start(), Ledger(root)
    senders = [Sender(root, f"client{i} in {language}", microseconds, "reply" if i % 2 else "post", language)
               for i, language in enumerate(LANGUAGES)]
    for sender in senders:
        lab.wait_for_events(1, sender=sender.name)
    before = {sender.name: figures(sender) for sender in senders}
    end, restarts = time.monotonic() + seconds, 0
    while time.monotonic() < end:
        time.sleep(1)
        if kill:
            daemon.kill()
        else:
            daemon.stop()
        ledger.add()
        daemon = start()
        restarts += 1
    after = {sender.name: figures(sender) for sender in senders}
    said = {sender.name: sender.finish() for sender in senders}
    daemon.stop()
    ledger.add()
    return restarts, before, after, said, ledger.total()


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("seconds", type=float, nargs="?", default=300)
    parser.add_argument("--kill", action="store_true")
    parser.add_argument("--microseconds", type=int, default=10_000, help="between two messages of a client, on average")
    options = parser.parse_args()
    root, lab = Root(), Lab()
    try:
        root.use(lab)
        lab.put("quindle", storebag())
        restarts, before, after, said, by_daemon = soak(root, lab, options.seconds, options.kill, options.microseconds)
        came = arrived(lab)
    finally:
        lab.stop()
        root.remove()
    problems, clients, missing = [], [], 0
    for name, one in said.items():
        row = {**one, "arrived": len(came[name]), "twice": sum(n > 1 for n in came[name].values()),
               "before": before[name], "after": after[name]}
        clients.append(row)
        difference = row["arrived"] + row["lost"] + row["closed"] - row["sent"]
        missing -= difference
        if row["twice"]:
            problems.append(f"{name}: {row['twice']} messages arrived twice")
        if not options.kill and difference > 0:
            problems.append(f"{name}: arrived and counted exceed sent by {difference}")
        if BUILD.name not in ("asan", "tsan") and after[name]["KiB"] > before[name]["KiB"] + KIB_OF_GROWTH:
            problems.append(f"{name} has grown: {before[name]}, {after[name]}")
        if after[name]["descriptors"] > before[name]["descriptors"]:
            problems.append(f"{name} has more descriptors: {before[name]}, {after[name]}")
    # What a killed daemon held is counted by the next one.
    if missing > by_daemon:
        problems.append(f"{missing} messages were lost, of which the daemons counted {by_daemon}")
    if by_daemon - missing > UNDER_WAY * restarts * len(said):
        problems.append(f"the daemons counted {by_daemon} messages as lost, but only {missing} were")
    print(json.dumps({"restarts": restarts, "clients": clients, "lostByDaemons": by_daemon, "problems": problems}, indent=1))
    return 1 if problems else 0


if __name__ == "__main__":
    sys.exit(main())
