# SPDX-License-Identifier: Apache-2.0
"""A call that is reported to the collector and to the dashboard. Publishes examples/storebag.json, runs examples/call.jsonl
and examples/lamp.jsonl, and shows what was sent and what arrived."""
import collections
import contextlib
import json
import re
import subprocess
import sys

from stage import EXAMPLES, heading, program, wait_until

PHONE = ["session", "--client-type", "6", "--session-id", "42", "--client-version", "3", "--client", "phone",
         "--service", "ringer", "--user-info", "line=2", "--require-user-info", "--batch-events"]
LAMP = ["session", "--client-type", "6", "--session-id", "43", "--client", "lamp", "--service", "hall",
        "--require-user-info"]


def messages(name):
    """Counts the (category, type) of every message of a client, with those that the session sends at its start and end."""
    lines = [json.loads(line) for line in (EXAMPLES / name).read_text().splitlines()]
    own = [(0, 0), (0, 1)] + [(0, 2) for line in lines if line["op"] == "finish"]
    return collections.Counter(own + [(line["category"], line["type"]) for line in lines if line["op"] == "send"])


def kind(event):
    return event["_method"], event["_status"]


def short(text, length):
    return text if len(text) <= length else text[:length - 1] + "…"


def posted(reply):
    """The events in a reply: one JSON text, or two, each with a heading."""
    texts = re.split(r"^(?:Flushed events|Standalone event):$", reply, flags=re.M)
    return [event for text in texts if text.strip() for event in json.loads(text)["events"]]


def show_answers(output):
    for line in output.splitlines():
        answer = json.loads(line)
        operation, reply = answer.pop("op"), answer.get("reply")
        if isinstance(reply, str) and "{" in reply:
            events = posted(reply)
            answer = f"{len(events)} event{'s'[:len(events) - 1]} posted, number {events[0]['_eventNumber']}"
            answer += f" to {events[-1]['_eventNumber']}" if len(events) > 1 else ""
        elif isinstance(reply, str) and " 127.0.0.1 " in reply:
            answer = "the dashboard's line: " + short("… " + reply.split(" 127.0.0.1 ")[1], 80)
        print(f"  {operation:<11} {answer if isinstance(answer, str) else json.dumps(answer)}")


def play(root, name, session):
    """Runs a client and returns its answers."""
    command = [program("veltractl"), "--root", str(root.path), *session, "--input", str(EXAMPLES / name)]
    done = subprocess.run(command, capture_output=True, text=True, timeout=60)
    sys.stderr.write(done.stderr)
    assert done.returncode == 0, f"veltractl ended with status {done.returncode}"
    return done.stdout


def line_of(event):
    own = {"eventTime", "clientName", "serviceName"}
    fields = [f"{key}={short(str(value), 24)}" for key, value in event.items()
              if key[0] != "_" and key not in own]
    return f"{event['_eventNumber']:>3}  {event['_method']:>2}/{event['_status']:<3} {' '.join(fields)}"


def show_posts(posts):
    heading("What arrived at the collector: number, category/type, the client's own fields\n"
            "(filters have removed the field \"peer\" and hashed the field \"number\")")
    for post in posts:
        print(f"  POST {post['path']}  {post['bytes']} bytes{', gzip' if post['compressed'] else ''}")
        for name, value in sorted(post["headers"].items()):
            print(f"    {name}: {value}")
        for event in post["body"]["events"]:
            print(f"    {line_of(event)}")


def show_message_log(root):
    heading("The message log, which the owner of the device can read")
    for path in sorted((root.path / "var/mobile/Library/Logs/Zentrel/Retired").glob("*.diag")):
        entries = re.split(r"^(?=\(\d{4}-)", path.read_text(), flags=re.M)[1:]
        for entry in entries:
            first, *rest = entry.splitlines()
            print(f"  {short(first, 110)}{f' … and {len(rest)} lines' if rest else ''}")


def check(posts):
    """Compares what arrived with what should arrive and returns the problems."""
    events = [event for post in posts for event in post["body"]["events"]]
    arrived, expected = collections.Counter(map(kind, events)), messages("call.jsonl")
    problems = [f"category {c}, type {t}: {arrived[c, t]} of {expected[c, t]} arrived"
                for c, t in sorted(arrived | expected) if arrived[c, t] != expected[c, t]]
    problems += ["a field that should be removed arrived" for event in events if "peer" in event]
    problems += ["a field that should be hashed arrived unchanged" for event in events
                 if not re.fullmatch("[0-9a-f]{64}", event.get("number", "0" * 64))]
    problems += [f"unexpected post to {post['path']}" for post in posts
                 if (post["path"] == "/collect/realtime") != (kind(post["body"]["events"][0]) == (6, 20))]
    return problems


def datagrams(lab):
    return {(line["sessionID"], line["eventID"]): line for line in lab.received("dashboard")}


def check_dashboard(lab):
    with contextlib.suppress(AssertionError):
        wait_until(lambda: len(datagrams(lab)) >= taken(), "the dashboard's datagrams")
    heard = len(datagrams(lab))
    return [f"the dashboard got {heard} of {taken()} messages"] if heard != taken() else []


def show_dashboard(lab):
    heading("What the dashboard got over UDP: number, category/type, text (all datagrams were acknowledged)")
    for (session, number), line in sorted(datagrams(lab).items()):
        print(f"  session {session} {number:>3}  {line['method']:>2}/{line['respCode']:<3}{short(line['text'], 80)}")


def taken():
    """The number of messages that the daemon takes in."""
    return messages("call.jsonl").total() + messages("lamp.jsonl").total()


def show(root, lab, daemon):
    """Runs the example, prints the results and returns the problems."""
    (lab.path / "storebags/ostvane.json").write_bytes((EXAMPLES / "storebag.json").read_bytes())
    print("running examples/call.jsonl, then examples/lamp.jsonl, with veltractl session", file=sys.stderr)
    answers = play(root, "call.jsonl", PHONE)
    lamp = play(root, "lamp.jsonl", LAMP)
    heading("The phone's answers (its events are batched)")
    show_answers(answers)
    heading("The lamp's answers (it is sampled out at the collector)")
    show_answers(lamp)
    expected = messages("call.jsonl").total()
    with contextlib.suppress(AssertionError):  # if not, check() says which are missing
        wait_until(lambda: len(lab.events()) >= expected, "the events")
    daemon.wait_for_line("dealloc: VeltradSession dealloc: 43")
    posts = lab.received("events")
    show_posts(posts)
    problems = check(posts) + check_dashboard(lab)
    show_dashboard(lab)
    show_message_log(root)
    if "httppost" in json.loads(lamp.splitlines()[0])["backends"]:
        problems.append("the lamp was told that it reports to the collector")
    if not problems:
        heading(f"{expected} of {expected} events of the phone arrived, none of the lamp; the dashboard got {taken()} messages")
    return problems
