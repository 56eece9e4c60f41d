# SPDX-License-Identifier: Apache-2.0
"""Publishes the examples' storebags for the fleet, plays the examples and shows what the views answer."""
import json
import re
import signal
import subprocess

import side

EXAMPLES = side.SOURCE / "examples"
BAGS = {"ostvane": "storebag", "tamberlin": "family-root", "brevatto": "family-child", "sollwick": "family-child"}
VIEWS = ["events_by_hour", "sessions", "sampled", "gaps", "storebag_versions"]
PHONE = ["--client-type", "6", "--session-id", "42", "--client-version", "3", "--client", "phone", "--service", "ringer",
         "--user-info", "line=2", "--require-user-info"]
FAMILY = ["--client", "phone", "--service", "call", "--require-user-info"]
COUNTED = {"events": "events", "datagrams": "datagrams", "files": "files", "log data": "log_data"}


def publish(fleet):
    for name, example in BAGS.items():
        text = (EXAMPLES / f"{example}.json").read_text()
        # The lab takes events under any path, a gateway under /events and a label.
        text = re.sub(r"\$\{url\}/(?!upload)(?:\w+/)*(\w+)", r"${url}/events/\1", text)
        bag = json.loads(text)
        dashboard = bag["release"].get("dashboard")
        if dashboard:
            dashboard["post_url"] = "${url}/logdata"
        fleet.publish(name, json.dumps(bag))


def control(fleet, *arguments, input=None):
    done = subprocess.run([side.program("veltractl"), "--root", str(fleet.path / "root"), *arguments], input=input,
                          capture_output=True, text=True, timeout=60, start_new_session=True)
    if done.returncode != 0:
        raise AssertionError(f"veltractl {' '.join(arguments)}: {done.stderr}{done.stdout}")
    return done.stdout


def play(fleet):
    control(fleet, "session", *PHONE, "--batch-events", "--input", str(EXAMPLES / "call.jsonl"))
    control(fleet, "session", "--client-type", "6", "--session-id", "43", "--client", "lamp", "--service", "hall",
            "--require-user-info", "--input", str(EXAMPLES / "lamp.jsonl"))
    command = [side.program("veltractl"), "--root", str(fleet.path / "root"), "session", "--client-type", "10", "--session-id", "1",
               "--aggregate", *FAMILY]
    with subprocess.Popen(command, stdin=subprocess.PIPE, stdout=subprocess.PIPE, start_new_session=True, text=True) as parent:
        try:
            parent.stdout.readline()  # it has started
            for number, kind in ((2, "8"), (3, "9")):
                lines = [{"op": "send", "category": 5, "type": 10, "payload": {"round": at}} for at in range(2)]
                control(fleet, "session", "--client-type", kind, "--session-id", str(number), *FAMILY,
                        input="".join(json.dumps(line) + "\n" for line in lines))
            parent.communicate()
        finally:
            parent.kill()
    report = fleet.path / "report.log"
    report.write_text("the call was fine\n" * 100)
    control(fleet, "upload", *PHONE, str(report))
    data = fleet.path / "log-data.json"
    data.write_text(json.dumps(["a line", {"level": 3}]))
    control(fleet, "upload-log-data", *PHONE, str(data))


def counts(fleet):
    found = {words: int(fleet.query(f"SELECT count(*) FROM veltra.{table}")[0][0]) for words, table in COUNTED.items()}
    return {**found, "sessions": int(fleet.query("SELECT count(*) FROM veltra.sessions")[0][0])}


def once(fleet):
    """Returns the exit status."""
    play(fleet)
    # A daemon waits for the answers to its posts and the acknowledgements of its datagrams before it ends.
    fleet.kill("daemon", signal.SIGTERM)
    side.wait_until(lambda: not side.alive(fleet.facts["pids"]["daemon"]), "the daemon's end")
    side.wait_until(fleet.is_carried, "the examples are in the tables")
    for view in VIEWS:
        print(f"veltra.{view}\n{fleet.table(f'SELECT * FROM veltra.{view} ORDER BY 1, 2')}")
    print(", ".join(f"{count} {words}" for words, count in counts(fleet).items()) + " in the tables", flush=True)
    return 0
