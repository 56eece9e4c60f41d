# SPDX-License-Identifier: Apache-2.0
"""A family: a root that aggregates and two children with the same identity. Each is a separate client."""
import contextlib
import json
import sys

from stage import EXAMPLES, Ctl, heading, wait_until

# Client types with their storebags, which give each session its place in the family.
ROOT, VOICE, VIDEO = (10, "tamberlin"), (8, "brevatto"), (9, "sollwick")
IDENTITY = ("--client", "phone", "--service", "call", "--require-user-info")


def publish(lab):
    for name, example in ((ROOT[1], "root"), (VOICE[1], "child"), (VIDEO[1], "child")):
        (lab.path / f"storebags/{name}.json").write_bytes((EXAMPLES / f"family-{example}.json").read_bytes())


def play(root):
    """Runs the family and returns the lines that the root's client printed."""
    parent = Ctl(root, ROOT[0], "--aggregate", identity=IDENTITY, session_id=1)
    parent.wait_for(lambda lines: any('"start"' in line for line in lines), "the root's start")
    children = [Ctl(root, kind, identity=IDENTITY, session_id=number) for number, (kind, _) in ((2, VOICE), (3, VIDEO))]
    for child in children:
        child.answer()
    for round in range(2):
        for child, payload in zip(children, ({"codec": "opus"}, {"resolution": "720p"})):
            child.send(category=5, type=10, round=round, **payload)
    copies = 2 * 3  # each child's start and its two messages
    parent.wait_for(lambda lines: sum('"sessionID":2' in l or '"sessionID":3' in l for l in lines) >= copies,
                    "the root's copies")
    for client in (*children, parent):
        client.close()
    return [json.loads(line) for line in parent.text]


def show_copies(lines):
    heading("The copies that the root's client got, including those of its own messages")
    for line in lines:
        if line["op"] != "aggregated" or not line["sessionInfo"]:
            continue
        own = {key: value for key, value in (line["payload"] or {}).items() if key not in ("clientName", "serviceName")}
        print(f"  session {line['sessionInfo']['sessionID']}: {line['category']}/{line['type']:<3} {json.dumps(own)}")


def show_ids(posts):
    heading("The session IDs at the collector: a child's ID is the root's ID followed by its own")
    ids = {}
    for post in posts:
        for event in post["body"]["events"]:
            ids.setdefault(event["_sessionID"], []).append(event)
    for name in sorted(ids, key=lambda name: (name.count("."), name)):
        print(f"  {name}  {len(ids[name])} events")
    return list(ids)


def taken():
    """The number of messages that the daemon takes in: start and stop of each session, and two more of each child."""
    return 2 + 4 + 4


def show(root, lab, daemon):
    """Runs the example, prints the results and returns the problems."""
    publish(lab)
    print("running a family of three sessions: a root that aggregates, and two children", file=sys.stderr)
    daemon.allow("Failed to get remote object proxy: The client has gone.")  # for the root's own last message
    lines = play(root)
    for number in (1, 2, 3):
        daemon.wait_for_line(f"dealloc: VeltradSession dealloc: {number}")

    def posts():
        return [post for post in lab.received("events") if post["path"] == "/family"]
    with contextlib.suppress(AssertionError):  # if not, the IDs are incomplete
        wait_until(lambda: sum(len(post["body"]["events"]) for post in posts()) >= taken(), "the family's events")
    show_copies(lines)
    ids = show_ids(posts())
    roots = [name for name in ids if "." not in name]
    if len(ids) != 3 or len(roots) != 1 or not all(name.startswith(roots[0]) for name in ids):
        return [f"wrong combined IDs: {ids}"]
    return []
