# SPDX-License-Identifier: Apache-2.0
"""Families of sessions: combined IDs, states from the parent, copies to the client that aggregates."""
import concurrent.futures
import re
import time

from harness import Wire, storebag, wait_until
from test_https import Client, HTTPSTest, entry

ROOT, CHILD, GRANDCHILD = 7, 6, 8  # client types whose storebags give the levels 0, 1 and 2
BAGS = {ROOT: "quindle", CHILD: "ostvane", GRANDCHILD: "brevatto"}
UPLOAD = "uploadFileAtPath:extensionToken:completionHandler:"
DESCRIBE = "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:"
PROXY = "<3>sendMessageWithDictionary: Failed to get remote object proxy: "
END = {"timestamp": 0.0, "category": 0, "type": 0}


class Member(Client):
    """A session of the family that stores the copies it gets."""

    def __init__(self, root, client_type, aggregates=False, name="phone", service="ringer", batch=False):
        self.copies = []
        super().__init__(root, name, client_type, {"serviceName": service}, aggregates, batchEvent=batch)

    def frame(self):
        while (frame := super().frame()) and frame[0] == self.EVENT:
            self.copies.append(frame[2]["args"])
        return frame

    def copies_now(self):
        """The copies since the last call of this function. A call that was answered shows that all have arrived."""
        self.ask("fetchDisplayURL:")
        taken, self.copies = self.copies, []
        return taken


class Family(HTTPSTest):
    def setUp(self):
        super().setUp()
        for level, client_type in enumerate(BAGS):
            self.bag(client_type, entry(hierarchy=level, post_url="${url}/events/" + str(level)))

    def bag(self, client_type, *entries, **more):
        self.lab.put(BAGS[client_type], storebag(backends={"httppost": {"clients": list(entries)}, **more}))

    def join(self, client_type, **options):
        member = Member(self.root, client_type, **options)
        self.addCleanup(member.close)
        return member

    def ids(self, level, events):
        """The "_sessionID" of the newest event of a level, after at least `events` events."""
        def found():
            came = [event["_sessionID"] for post in self.posts(str(level)) for event in post["body"]["events"]]
            return came[-1] if len(came) >= events else None
        return wait_until(found, f"{events} events of level {level}")

    def leave(self, daemon, member):
        member.close()
        daemon.wait_for_line(f"dealloc: VeltradSession dealloc: {member.number}")

    def test_one_family_of_three_levels(self):
        with self.serving():
            root = self.join(ROOT, aggregates=True)
            child = self.join(CHILD, aggregates=True, name="PHONE", service="Ringer")
            self.assertEqual(child.copies_now(), [END])  # an ancestor aggregates, so this one's copies end
            grandchild = self.join(GRANDCHILD, name="Phone")
            root.copies_now()
            members, sent = (root, child, grandchild), 100

            def send(member):
                for number in range(sent):
                    member.message(number=number)
            with concurrent.futures.ThreadPoolExecutor() as at_once:
                list(at_once.map(send, members))
            copies = root.copies_now()
            for member in members:
                mine = [copy["payload"] for copy in copies if copy["sessionInfo"]["sessionID"] == member.number]
                self.assertEqual([payload["number"] for payload in mine], list(range(sent)))
                self.assertEqual(mine[0]["clientName"], {child: "PHONE", grandchild: "Phone"}.get(member, "phone"))
            self.assertEqual((len(copies), child.copies_now(), grandchild.copies_now()), (3 * sent, [], []))
            ids = [self.ids(level, 1 + sent).split(".") for level in range(3)]
            self.assertEqual([len(each) for each in ids], [1, 2, 3])
            self.assertEqual((ids[2][:2], ids[1][:1]), (ids[1], ids[0]))
            # A second session with the same number: the first one stays the root. A stranger belongs to no family.
            late, stranger = self.join(ROOT, aggregates=True), self.join(GRANDCHILD, name="tablet")
            late.copies_now(), root.copies_now()
            child.message(number=9), stranger.message(number=9)
            self.assertEqual([len(member.copies_now()) for member in (root, late, stranger)], [1, 0, 0])

    def test_members_join_late_and_leave(self):
        with self.serving(PROXY + "The client has gone.") as daemon:  # the root's own last message
            grandchild = self.join(GRANDCHILD, batch=True)
            daemon.wait_for_line(f"<6>syncReportingStates: child session {grandchild.number} (backend httppost) with "
                                 "hierarchy 2 is missing its parent")
            grandchild.message(number=1)
            child, root = self.join(CHILD), self.join(ROOT, aggregates=True)
            daemon.wait_for_line("<6>parentSessionIDStringForSession: Found a gap in hierarchy (one of parents "
                                 "missing): incomplete parentSessionID is ''")
            self.assertEqual(grandchild.flush()[1:], (None, None))
            self.assertEqual(self.ids(2, 2).count("."), 2)  # batched before the family was whole
            root.copies_now()
            child.states(clientName="tablet", serviceName="ringer")  # another identity, so it leaves the family
            child.message(number=2)
            self.assertEqual(root.copies_now(), [])
            grandchild.message(number=3)  # its root is found although a level is missing
            self.assertEqual([copy["payload"]["number"] for copy in root.copies_now()], [3])
            self.leave(daemon, root)
            grandchild.message(number=4)
            child.states(clientName="PHONE", serviceName="ringer")  # it is back, and only the root is missing
            grandchild.message(number=5)
            self.assertEqual(grandchild.flush()[1:], (None, None))
            self.assertEqual(self.ids(2, 5).count("."), 1)

    def test_a_session_without_user_info_any_more_leaves_its_family(self):
        with self.serving("user info provided without requiring it") as daemon:
            member = self.join(ROOT)
            member.ask(DESCRIBE, sessionInfo={"clientType": ROOT, "sessionID": member.number}, userInfo={},
                       frameworksToCheck=[], hasAggregationBlock=False)
            self.leave(daemon, member)
            child = self.join(CHILD)
            daemon.wait_for_line(f"syncReportingStates: child session {child.number} (backend httppost) with hierarchy 1 is "
                                 "missing its parent")

    def test_states_come_from_the_parent(self):
        """Of a back end of the same name; every combination is in tests/daemon/families_test.cpp."""
        out = {"sampling_threshold": 0, "override_sampling": 0}
        self.bag(ROOT, *(entry(name, hierarchy=0, **more) for name, more in (("in", {}), ("out", out), ("broken", {}))))
        self.bag(CHILD, *(entry(name, hierarchy=1, **more) for name, more in (("in", out), ("out", {}), ("broken", {}))),
                 httppost2={"clients": [entry(client=None, hierarchy=1)]})
        self.lab.control(path="/events/broken", status=503)
        with self.serving() as daemon:
            for name, code, backends in (("in", None, ["httppost"]), ("out", -1, []), ("broken", 503, [])):
                self.assertEqual(self.join(ROOT, name=name, batch=True).flush()[1], code)
                self.assertEqual(self.join(CHILD, name=name).backends, backends)
            daemon.wait_for_line("<7>HTTPSPostBackend(syncReportingStates): httppost: state and sampling rate updated to 1")

    def test_a_client_that_does_not_read_delays_nobody(self):
        with self.serving(PROXY) as daemon:
            root, child = self.join(ROOT, aggregates=True, batch=True), self.join(CHILD, batch=True)
            root.message(text="x" * 100_000)
            root.copies_now()
            self.lab.control(path="/events/0", stall=True)
            root.begin("flushMessagesWithCompletion:")  # answered after the copies have filled its queue
            self.posts("0", 1)
            begin, sent, text = time.monotonic(), 4000, "x" * 1000
            for number in range(sent):
                child.message(number=number, text=text)
            took = time.monotonic() - begin
            self.lab.reset()
            daemon.wait_for_line("internalFlushMessagesWithCompletion: httppost")
            self.assertGreater(len(root.expect()["reply"]), 100_000)
            numbers = [copy["payload"]["number"] for copy in root.copies_now()]
            self.assertEqual(numbers, list(range(len(numbers))))
            self.assertLess(len(numbers), sent)
            child.message(number=-1)
            self.assertEqual([copy["payload"]["number"] for copy in root.copies_now()], [-1])
            self.leave(daemon, root)
        lines = [line for line in daemon.text if line.startswith(PROXY)]
        self.assertTrue(1 <= len(lines) <= took + 3, lines)
        counts = self.counts()
        self.assertEqual(counts["event dropped: the client does not read"], sent - len(numbers))
        # The lines account for every lost copy, including the last two at the end of the session.
        said = [int(re.search(r"(?:\((\d+) copies since the last such line\))?$", line)[1] or 1) for line in lines]
        self.assertEqual(sum(said), sent - len(numbers) + counts["event dropped: the client has gone"])

    def test_the_removal_of_an_uploaded_file_finds_room_where_copies_do_not(self):
        self.bag(ROOT, entry(hierarchy=0), uploadserver={"post_url": "${url}/upload"})
        self.lab.control(path="/upload", stall=True)
        with self.serving(PROXY), open(self.root.path / "file", "w+b") as file:
            file.write(b"lent")
            file.flush()
            root, child = self.join(ROOT, aggregates=True), self.join(CHILD, batch=True)
            root.send(Wire.CALL, {"op": UPLOAD, "args": {"path": "/lent"}}, 777, 1, [file.fileno()])
            self.lab.received("uploads", 1)
            for length in (*[1000] * 1300, *range(1000, -1, -1)):  # until none of any size is taken
                child.message(text="x" * length)
            self.lab.reset()
            self.assertEqual(root.frame()[1:], (777, {"results": {"uploaded": True}}))
            self.assertIn({"call": 777}, root.copies)
        self.assertGreater(self.counts()["event dropped: the client does not read"], 1000)
