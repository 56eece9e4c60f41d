"""Edge cases of the HTTPS back end: consent, server errors, addresses, internal builds."""
from harness import DEVICE
from test_https import HTTPSTest, entry

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
