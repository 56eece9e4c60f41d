# SPDX-License-Identifier: Apache-2.0
"""The path of a message from a client to the collector, and the commands of veltractl."""
import json
import subprocess
import time

from harness import IDENTITY, SOURCE, SystemTest, program, storebag, wait_until


class Road(SystemTest):
    def test_event_with_its_headers_and_fields(self):
        self.root.write("usr/share/veltra/package.plist", {"version": "8.2"})
        with self.serving():
            session, backends = self.open()
            self.assertEqual(backends, ["httppost"])
            reply = session.send(type=2, codec="opus", seconds=12.5, tags=3)["reply"]
            self.assertEqual(json.loads(reply)["events"][0]["codec"], "opus")
            self.lab.received("events", 2)
            self.assertEqual(session.close(), 0)
            start, event, stop = self.lab.wait_for_events(3)
        self.assertEqual((start["_method"], start["_status"], start["AutomaticTimeSet"], start["Locale"]),
                         (0, 0, True, "US"))
        self.assertEqual((stop["_method"], stop["_status"], stop["StorebagVersion"], stop["Opt"]), (0, 1, "v1", 0))
        expected = {"codec": "opus", "seconds": 12.5, "tags": 3, "_sender": "JY", "_clientVersion": 3,
                    "_eventNumber": 2, "_method": 5, "_status": 2, "_productFamily": "Elm", "_productModel": "Elm4,2",
                    "_osVersion": "12.1", "_build": "21B74", "_internal": 3, "_reportVers": "8.2",
                    "_timezoneOffset": 0, "clientName": "phone", "serviceName": "ringer"}
        self.assertEqual({key: event[key] for key in expected}, expected)
        self.assertEqual(set(event) - set(expected), {"_startTS", "_sessionID", "_clientTS", "eventTime"})
        self.assertEqual(event["_startTS"] % 60, 0)
        self.assertEqual(event["eventTime"], event["_clientTS"])
        self.assertAlmostEqual(event["eventTime"], time.time(), delta=120)
        self.assertEqual(len(event["_sessionID"]), 24)
        self.assertEqual({e["_sessionID"] for e in (start, event, stop)}, {event["_sessionID"]})
        post = next(p for p in self.lab.received("events") if p["body"]["events"][0] == event)
        self.assertEqual(set(post["body"]), {"postTime", "clientId", "events"})
        self.assertAlmostEqual(post["body"]["postTime"], time.time(), delta=120)
        self.assertRegex(post["body"]["clientId"], "^[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}$")
        headers = {"X-VLT-Client-Name": "phone", "X-VLT-Service-Name": "ringer", "X-VLT-Client-Version": "3",
                   "X-VLT-Sender": "JY", "X-VLT-Event-Map": "5 2", "User-Agent": "Veltra/8.2 (Elm4,2; 12.1)",
                   "Accept": "application/json", "Content-Type": "application/json",
                   "Content-Length": str(post["bytes"])}
        self.assertEqual({key: post["headers"].get(key) for key in headers}, headers)
        self.assertNotIn("X-VLT-Internal-Build", post["headers"])
        self.assertEqual((post["method"], post["path"]), ("POST", "/events"))
        self.assertEqual(post["compressed"], post["headers"].get("Content-Encoding") == "gzip")
        logs = list((self.root.path / "var/mobile/Library/Logs/Zentrel/Retired").iterdir())
        self.assertEqual(sum(log.read_text().count("[httppost -> sendMessageWithDictionary]") for log in logs), 3)

    def test_examples(self):
        """The example clients in C and Python work."""
        with self.serving("user info provided without requiring it"):
            commands = [program("veltra-example-hello")], ["python3", str(SOURCE / "examples/hello.py")]
            for number, command in enumerate(commands, 1):
                done = subprocess.run(command, env=self.root.environment(), capture_output=True, timeout=30)
                self.assertEqual(done.returncode, 0, (command, done.stderr.decode()))
                wait_until(lambda: len([e for e in self.lab.events() if e["_method"] != 0]) >= number,
                           f"an event of {command}")


class Ctl(SystemTest):
    def test_every_operation_of_a_session(self):
        lines = ["", '{"op":"displayURL"}', "no json", '{"op":"dance"}', '{"op":"send"}', '{"op":"send","category":1}',
                 '{"op":"sleep","ms":1}', '{"op":"flush"}', '{"op":"restart"}',
                 '{"op":"states","userInfo":{"clientName":"phone","serviceName":"ringer"}}', '{"op":"finish"}']
        with self.serving() as daemon:
            out, _ = self.ctl("session", "--client-type", "7", "--client", "phone", "--service", "ringer",
                              "--require-user-info", input="\n".join(lines) + "\n")
            daemon.wait_for_line("sendMessageWithDictionary: Missing mandatory parameter 'category'")
            daemon.wait_for_line("sendMessageWithDictionary: Missing mandatory parameter 'type'")
            self.lab.wait_for_events(1, _method=0, _status=2)
        answers = [json.loads(line) for line in out.splitlines()]
        self.assertIn("dance", answers[3].pop("description"))
        self.assertIn("events", json.loads(answers[10].pop("reply")))
        answers[2].pop("description")
        self.assertEqual(answers, [
            {"op": "start", "backends": ["httppost"]}, {"op": "displayURL", "reply": "https://display.example/phone"},
            {"op": "error", "line": 3}, {"op": "error", "line": 4}, {"op": "send", "reply": None},
            {"op": "send", "reply": None}, {"op": "sleep"}, {"op": "flush", "reply": None, "error": {
                "domain": "com.florn.veltra.error", "code": -1, "description": "Nothing to flush"}},
            {"op": "restart", "backends": ["httppost"]}, {"op": "states", "backends": ["httppost"]}, {"op": "finish"}])

    def test_copies_between_answers(self):
        send = '{"op":"send","category":5,"type":2,"payload":{"text":"a\\nb"}}\n'
        with self.serving("Failed to get remote object proxy: "):  # for copies at the end of the session
            out, _ = self.ctl("session", "--client-type", "7", "--session-id", "9", *IDENTITY, "--aggregate",
                              input=send * 20 + '{"op":"finish"}\n')
        printed = [json.loads(line) for line in out.splitlines()]
        self.assertEqual([line["op"] for line in printed],
                         ["aggregated", "start", *["aggregated", "send"] * 20, "aggregated", "finish"])
        for copy in printed[2:-2:2]:
            self.assertEqual(copy["payload"], {"text": "a\nb", "clientName": "phone", "serviceName": "ringer"})
            self.assertEqual((copy["category"], copy["type"], copy["sessionInfo"]["sessionID"]), (5, 2, 9))
        self.assertEqual((printed[-2]["category"], printed[-2]["type"], printed[-2]["payload"]), (0, 2, None))

    def test_single_calls(self):
        with self.serving() as daemon:
            identity = ["--client-type", "7", "--client", "phone", "--require-user-info"]
            self.ctl("send", *identity, "--category", "9", "--type", "4", "--flag", "1", "codec=opus")
            self.lab.wait_for_events(1, _method=9, _status=4, codec="opus")
            self.assertIn("/realtime", [post["path"] for post in self.lab.received("events")])
            for command, answer in (("states", "httppost"), ("display-url", "https://display.example/phone")):
                self.assertIn(answer, self.ctl(command, *identity)[0])
            daemon.wait_for_line("was invalidated", 3)

    def test_what_became_of_a_message(self):
        """The answer to a send shows the outcome in each back end, and the reason."""
        identity = ["--client-type", "7", "--client", "phone", "--require-user-info"]
        others = {"dashboard": {"ip": "127.0.0.1", "port": self.lab.dashboard[1], "reliable": 100}, "ampery": {},
                  "uploadserver": {"post_url": "${url}/upload"}}
        cases = [  # consent, entry, flag: what became of it in httppost
            (True, {}, "1", ("posted", "reports", "its client entry lets it")),
            (True, {"expedite": 0}, "0", ("batched", "reports", "its client entry lets it")),
            (False, {}, "1", ("dropped", "no_consent", "no consent to diagnostic submission")),
            (True, {"sampling_threshold": -1, "override_sampling": -1}, "1", ("dropped", "sampled_out", "sampled out")),
            (True, {"sampling_threshold": -1}, "1", ("held", "held_by_sampling", "sampled out, may be overridden"))]
        for consent, entry, flag, (outcome, reason, text) in cases:
            with self.subTest(reason=reason, outcome=outcome):
                self.root.prefer(DiagnosticLogSubmissionEnabled=consent)
                bag = storebag("v2", **entry)
                self.lab.put("quindle", {**bag, "release": {**bag["release"], **others}})
                with self.serving("filters are required."):
                    out, said = self.ctl("send", *identity, "--category", "9", "--type", "4", "--flag", flag, "a=b")
                self.assertEqual(json.loads(out)["outcomes"], [
                    {"backend": name, "outcome": outcome, "reason": reason, "text": text}
                    for name, outcome, reason, text in (
                        ("ampery", "written", "always", "its kind always does"),
                        ("dashboard", "waiting", "always", "its kind always does"),
                        ("httppost", outcome, reason, text),
                        ("uploadserver", "none", "takes_no_messages", "it takes none"))])
                self.assertIn(f"httppost: {outcome}: {text} ({reason})\n", said)
        with self.serving("Could not find storebag name for client type 2"):
            self.ctl("send", "--expect", "reported", *identity, "--category", "9", "--type", "4", "a=b")  # by others
            self.lab.put("ostvane", storebag(sampling_threshold=-1, override_sampling=-1))
            for client_type in ("2", "14"):
                out, said = self.ctl("send", "--expect", "reported", "--client-type", client_type, *identity[2:],
                                     "--category", "9", "--type", "4", status=1)
                self.assertIn("No back end reports the message.", said)
            self.assertIn("0 to 17", self.ctl("send", "--client-type", "18", "--category", "9", "--type", "4", status=1)[1])
            self.assertIn("0 to 3", self.ctl("send", "--category", "9", "--type", "4", "--flag", "4", status=2)[1])

    def test_what_a_killed_daemon_had_taken_in_is_counted_by_the_next(self):
        daemon = self.daemon()
        session, _ = self.open(7, "--batch-events")
        for _ in range(4):
            session.send(codec="opus")
        daemon.kill()
        session.kill()
        with self.serving():
            pass
        # The session's start message and the four.
        self.assertEqual(self.counts()["event lost: the daemon before this one ended"], 5)
        with self.serving():
            pass
        self.assertNotIn("event lost: the daemon before this one ended", self.counts())

    def test_one_shot(self):
        """One message without a session; a call that the daemon does not answer ends immediately."""
        def one_shot(*options, status=0):
            out, said = self.ctl("one-shot", *options, "--category", "9", "--type", "4", "codec=opus", status=status)
            return json.loads(out), said

        with self.serving("user info provided without requiring it", "Could not retrieve identifiers",
                          "Could not find storebag name for client type 2") as daemon:
            identity = ["--client-type", "7", "--session-id", "77"]
            for info in (["--client", "phone", "--require-user-info"], ["--client", "lamp"], []):
                self.assertEqual(one_shot(*identity, *info)[0], {"op": "oneShot", "reply": "finished"})
            daemon.wait_for_line("sendMessageWithSessionInfo: Sending single message with sessionID 77", 3)
            self.assertEqual(one_shot("--client-type", "2", "--session-id", "1")[0]["reply"],
                             "storebag not available")
            for missing in (identity[:2], identity[2:]):
                answer, said = one_shot(*missing, status=1)
                self.assertIsNone(answer["reply"])
                self.assertIn("The daemon gave no reply.", said)
            self.lab.wait_for_events(3)
            self.assertFalse([line for line in daemon.text if "setSessionInfo" in line or "startConfig" in line])
        events = self.lab.events()
        self.assertEqual([(e["_method"], e["_status"], e["codec"]) for e in events], [(9, 4, "opus")] * 3)
        self.assertEqual(sorted(e.get("clientName", "") for e in events), ["", "lamp", "phone"])
        self.assertEqual(self.lab.received("events", 3)[0]["headers"]["X-VLT-Event-Map"], "9 4")

    def test_stats(self):
        with self.serving("Could not find storebag name for client type 2"):
            self.ctl("send", "--client-type", "2", "--category", "1", "--type", "1")
            reason = "message dropped: the session has no back ends"
            path = self.root.path / "run/veltrad/counters.json"
            wait_until(lambda: path.exists() and reason in self.ctl("stats")[0], "a counted drop")
            self.assertEqual(json.loads(self.ctl("stats", "--json")[0])["counts"][reason], 1)
        # The session's own stop message is counted too.
        self.assertEqual(self.counts()[reason], 1)
        self.assertIn("not running", self.ctl("stats", status=1)[1])
