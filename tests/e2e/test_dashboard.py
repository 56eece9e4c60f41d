# SPDX-License-Identifier: Apache-2.0
"""The dashboard: datagrams, lost and wrong acknowledgements, a missing server, the end of a session."""
import collections
import json
import pathlib
import socket

from harness import DEADLINE, Wire, closed_port, wait_until
from test_https import HTTPSTest, entry

PERIOD = 250  # ms
ONE_SHOT = "sendMessageWithSessionInfo:userInfo:category:type:payload:reply:"


class Dashboard(HTTPSTest):
    def report_to(self, *entries, port="${dashboardPort}", **more):
        backends = {"dashboard": {"ip": "127.0.0.1", "port": port, "display_url": "https://dash.example/1", **more}}
        if entries:
            backends["httppost"] = {"clients": list(entries)}
        self.lab.put("quindle", {"version": "v", "release": backends})

    def dashboard(self, count, **like):
        def found():
            lines = [line for line in self.lab.received("dashboard")
                     if all(line.get(key) == value for key, value in like.items())]
            return lines if len(lines) >= count else None
        return wait_until(found, f"{count} datagrams like {like}")

    def test_every_event_arrives_when_acknowledgements_are_lost(self):
        self.report_to(reliable=PERIOD)
        self.lab.control(path="/dashboard", share=30, ack="drop")
        with self.serving():
            client, sent = self.client(), 40
            for number in range(sent):
                client.message(number=number)

            def settled():
                lines = self.dashboard(sent, method=5)
                done = {line["eventID"] for line in lines if line["outcome"] == "acknowledged"}
                return lines if len(done) == sent else None
            lines = wait_until(settled, "an acknowledgement of each")
            client.close()
        arrivals = collections.Counter(line["payload"]["number"] for line in lines)
        self.assertEqual(sorted(map(int, arrivals)), list(range(sent)))
        self.assertGreater(len(lines), sent)
        self.assertLessEqual(max(arrivals.values()), 5)

    # How one acknowledgement is changed, how often that event then arrives, what is counted.
    WRONG = [({"ack": "duplicate"}, 1, "no such datagram waits"), ({"ack": "short"}, 2, "shorter than 62 bytes"),
             ({"ack": "long"}, 1, None), ({"ack": "foreign"}, 2, "no such datagram waits"),
             ({"ack": "stranger"}, 2, None), ({"delayMs": 100}, 1, None)]

    def test_wrong_acknowledgements(self):
        self.report_to(reliable=PERIOD)
        with self.serving():
            client = self.client()
            for number, (mood, arrives, counted) in enumerate(self.WRONG):
                with self.subTest(mood):
                    self.dashboard(1, method=0, outcome="acknowledged")
                    before = self.stats().get(f"acknowledgement ignored: {counted}", 0)
                    self.lab.control(path="/dashboard", times=1, **mood)
                    client.message(case=number)
                    self.assertEqual(len(self.dashboard(arrives, payload={"case": str(number)})), arrives)
                    if counted:
                        wait_until(lambda: self.stats().get(f"acknowledgement ignored: {counted}", 0) > before, counted)
            client.close()

    def test_a_server_that_comes_late(self):
        port = closed_port()
        self.report_to(port=port)
        with self.serving(), socket.socket(socket.AF_INET, socket.SOCK_DGRAM) as server:
            client = self.client()
            for number in range(80):  # a refused datagram fails the next send, which is kept and tried again
                client.message(number=number)
            server.bind(("127.0.0.1", port))
            server.settimeout(DEADLINE)
            self.assertIn(b" number=", server.recv(4096))
            client.message(number="last")
            wait_until(lambda: b" number=last" in server.recv(4096), "the last message")
            client.close()
            wait_until(lambda: b"StorebagVersion" in server.recv(4096), "the stop message")
        self.assertGreater(self.counts()["datagram held: the socket did not take it"], 10)

    def test_what_the_socket_does_not_take_does_not_count_for_the_day(self):
        """Each refused datagram fails the next send, whether that is a first one or, on a tick, another."""
        self.report_to(port=closed_port(), reliable=PERIOD)
        with self.serving():
            client = self.client()
            for number in range(60):  # some of them are dropped without having left
                client.message(number=number)
            wait_until(lambda: self.stats().get("datagram sent again: not acknowledged", 0) > 40, "retransmissions")
            client.close()
        counts = self.counts()
        day = json.loads((self.root.path / "var/lib/veltrad/daily.json").read_text())
        hours = json.loads((self.root.path / "var/lib/veltrad/destinations.json").read_text())
        left = [sum(column) for column in zip(*(row for hour in hours.values() for row in hour.values()))]
        self.assertEqual((day["events"], day["bytes"]), (left[1], left[4]))
        self.assertEqual(day["events"], counts["datagram sent"])

    def test_both_reports_of_one_call(self):
        self.report_to(entry(), reliable=PERIOD)
        with self.serving():
            client = self.client()
            self.assertEqual(client.backends, ["dashboard", "httppost"])
            self.assertEqual(client.ask("fetchDisplayURL:")["reply"], "https://dash.example/1")
            posted = json.loads(client.message(b="long value", a=1))  # the reply is the post's, not the dashboard's
            line = self.dashboard(1, method=5)[0]
            expected = {"versionMajor": 8, "componentType": 7, "kind": 1, "sessionID": client.number,
                        "method": 5, "respCode": 2, "deviceID": "ab" * 20, "reliable": True, "length": line["bytes"],
                        "eventID": posted["events"][0]["_eventNumber"], "text": " a=1 b=long value",
                        "payload": {"a": "1", "b": "long value"}, "outcome": "acknowledged"}
            self.assertEqual({key: line.get(key) for key in expected}, expected)
            self.assertAlmostEqual(line["seconds"], line["time"], delta=60)
            self.root.prefer(DiagnosticLogSubmissionEnabled=False)
            quiet = self.client()
            self.assertRegex(quiet.message(a=1),
                             rf"^\d+\.\d{{3}} {'ab' * 20} 127.0.0.1 \w\w +0 +{quiet.number} +2 +5 +2  a=1$")
            client.close(), quiet.close()
        log = "".join(path.read_text() for path in pathlib.Path(self.root.path).glob("var/mobile/**/*.diag"))
        self.assertIn("[dashboard -> sendMessageWithDictionary] ", log)

    def test_one_shot_messages_of_a_user_share_a_few_sockets(self):
        self.report_to(reliable=500)
        self.lab.control(path="/dashboard", ack="drop")
        with self.serving() as daemon:
            wire, sent, sockets = Wire(self.root), 200, []
            for number in range(sent):
                answer = wire.call(ONE_SHOT, category=5, type=2, payload={"number": number},
                                   sessionInfo={"clientType": 7, "sessionID": number, "requireUserInfo": True},
                                   userInfo={"clientName": "phone"})
                self.assertEqual(answer["results"]["reply"], "finished")
                sockets.append(sum(name.startswith("socket:") for name in daemon.descriptors()))
            self.assertLess(sockets[-1], sockets[0] + 16)
            wire.close()
            self.lab.reset()
            lines = self.dashboard(sent, method=5)
        self.assertEqual({int(line["payload"]["number"]) for line in lines}, set(range(sent)))
        self.assertEqual({line["eventID"] for line in lines}, {1})

    def test_the_end_waits_for_acknowledgements_for_a_limited_time(self):
        self.report_to(reliable=PERIOD)
        with self.serving():
            client = self.client()
            self.lab.control(path="/dashboard", ack="drop")
            client.message(number=1)
        counts = self.counts()
        # Start, message, stop: each was acknowledged, given up or logged as lost.
        self.assertEqual(counts["datagram sent"], 3)
        ended = "datagram acknowledged", "datagram given up: never acknowledged", \
            "datagram given up: not acknowledged before its back end ended"
        self.assertEqual(sum(counts.get(how, 0) for how in ended), 3)
