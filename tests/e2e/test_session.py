# SPDX-License-Identifier: Apache-2.0
"""Sessions with several back ends or none: parts of a message, which answer is used, when a flush is answered; edge cases of
the HTTPS back end: consent, server errors, addresses, internal builds."""
import json

from harness import DEVICE, storebag
from test_https import HTTPSTest, entry

SEND = "sendMessageWithDictionary:reply:"


class Sessions(HTTPSTest):
    def serve_two(self, **more):
        """Back ends that each post to a path of their own."""
        posting = {"httppost": {"clients": [entry(post_url="${url}/events/one")]},
                   "httppost2": {"clients": [entry(post_url="${url}/events/two")], "display_url": ""}}
        self.lab.put("quindle", storebag(backends={**posting, **more}))

    def test_required_parts_of_a_message(self):
        self.serve_two()
        cases = [({"type": 1}, None), ({"category": 1}, None), ({"category": "5", "type": 1}, None),
                 ({"category": 65541, "type": -1}, (5, 65535)),
                 ({"category": 5.9, "type": True, "payload": 3, "flag": "x"}, (5, 1))]
        with self.serving("SESSION_TYPE_STOP message dictionary is nil"):
            client = self.client()
            for message, expected in cases:
                with self.subTest(message):
                    reply = client.ask(SEND, message=message).get("reply")
                    event = json.loads(reply)["events"][0] if reply else {}
                    self.assertEqual(event and (event["_method"], event["_status"]), expected or {})

    def test_a_flush_of_several_is_answered_at_the_first_error(self):
        self.serve_two(dashboard={"ip": "127.0.0.1", "port": 9, "display_url": "https://dash.example/1"})
        with self.serving():
            client = self.client(batchEvent=True)
            self.assertEqual(client.backends, ["dashboard", "httppost", "httppost2"])
            self.assertEqual(client.ask("fetchDisplayURL:")["reply"], "")  # the first back end's that has one
            client.message(number=1)
            self.lab.control(path="/events/one", stall=True)
            self.lab.control(path="/events/two", status=503)
            reply, code, _ = client.flush()
            self.assertEqual((json.loads(reply)["events"][-1]["number"], code), (1, 503))
            self.lab.reset()
            client.ask("fetchDisplayURL:")  # no second answer to the flush came before this one
            client.close()

    def test_without_back_ends_every_call_is_answered(self):
        self.lab.put("ostvane", storebag(backends={"carrierpigeon": {}}))
        with self.serving("VeltraBackend(newBackendWithName)", "Could not find storebag name for client type 2"):
            none, empty = self.client(client_type=2), self.client(client_type=6)
            self.assertEqual((none.backends, none.message()), (None, None))
            self.assertEqual(none.flush(), (None, -1, "No backends available to send message"))
            self.assertEqual((empty.backends, empty.message(), empty.flush()), ([], None, (None, None, None)))

    def test_an_internal_release_reports_the_whole_device(self):
        self.root.write("etc/veltrad/device.plist", {**DEVICE, "ReleaseType": "Internal", "SerialNumber": ""})
        self.root.write("var/lib/veltrad/preferences/com.florn.timed.plist", {"TMAutomaticTimeZoneEnabled": False})
        with self.serving(env={"LANG": "C"}):
            self.serve(entry())
            self.client().close()
            start, _ = self.lab.wait_for_events(2)
        expected = {"SerialNum": "Unknown", "Version": "12.1", "Build": "21B74", "Hardware": "E42", "Product": "Elm",
                    "ReportVers": "8.0", "AutomaticTimeSet": False, "Locale": None}
        self.assertEqual({key: start.get(key) for key in expected}, expected)


# The environment, consent, "forceEventLogging", whether a message is answered.
CONSENT = [(4, [(True, "no", True), (False, "  +01", False)]), (2, [(False, "no", False), (False, "  +01", True)]),
           (1, [(False, "  +01", True)])]


class Posts(HTTPSTest):
    def test_forced_logging_needs_the_environment(self):
        section = {"httppost": {"clients": [entry("True"), entry("False", override_dnu=1)]}}
        self.lab.put("quindle", {"version": "v", "release": section, "development": section, "florn_internal": section})
        for environment, rows in CONSENT:
            self.root.prefer(environmentType=environment)
            with self.serving():
                for consent, force, answered in rows:
                    with self.subTest((environment, consent, force)):
                        self.root.prefer(DiagnosticLogSubmissionEnabled=consent, forceEventLogging=force)
                        client = self.client(str(consent))
                        self.assertEqual(client.message() is not None, answered)
                        client.close()

    def test_which_statuses_are_server_errors(self):
        self.serve(entry())
        with self.serving():
            client = self.client(batchEvent=True)
            for status, code in ((499, None), (500, 500), (599, 599)):
                client.start()
                client.message()
                self.lab.control(path="/events", status=status)
                self.assertEqual(client.flush()[1], code)
                # The states are computed again only when the identity changes.
                for service, reports in (("phone", code is None), ("bell", True), ("phone", True)):
                    self.assertEqual(client.states(clientName="phone", serviceName=service), ["httppost"] * reports)
            self.lab.reset()
            client.close()

    def test_addresses(self):
        self.serve(entry("silent", post_url=None), entry("other"))
        with self.serving():
            silent = self.client("silent", batchEvent=True)
            self.assertEqual(silent.flush()[1:], (-1, "postURL is nil"))
            self.root.prefer(httpsPostURL=self.lab.url + "/events/mine")
            self.client("other").message()
            self.posts("mine", 2)
            self.assertEqual(self.posts("other"), [])

    def test_internal_builds_of_three_types_report_the_number(self):
        self.root.write("etc/veltrad/device.plist", {**DEVICE, "ReleaseType": "Internal"})
        for name in ("quindle", "crovish", "yarrowin"):
            self.serve(entry(), entry("extras", extras_on_internal=1, custom_clientId=1), name=name)
        with self.serving():
            for name, identifier in (("phone", None), ("extras", DEVICE["UniqueDeviceID"])):
                self.client(name).close()
                post, *_ = self.posts(name, 2)
                self.assertEqual(post["headers"]["X-VLT-Internal-Build"], "1")
                self.assertEqual(post["body"]["clientId"], identifier or self.preferences()["uuidRespectDNU"])
            for client_type, number in ((7, True), (11, True), (13, True), (12, False), (17, False)):
                client = self.client(client_type=client_type)
                self.assertEqual(client.event()["_sessionID"] == client.number, number, client_type)
