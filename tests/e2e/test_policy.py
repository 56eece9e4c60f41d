# SPDX-License-Identifier: Apache-2.0
"""The owner's policy in policy.json, for open sessions and before anything leaves."""
import hmac
import json
import os
import shutil
import socket
import subprocess
import threading
import time

from harness import program, wait_until
from test_adaptor import BUNDLE, GOOD
from test_https import Client, HTTPSTest, entry

POLICY = "etc/veltrad/policy.json"
DAEMON_LINE = "hearOwner: The owner's word has changed: "
UPLOAD_LOG = "uploadLogData:completionHandler:"
BACKENDS = ["ampery", "dashboard", "httppost", "uploadserver"]
WHO = {"clientName": "phone", "serviceName": "phone"}


def peers(daemon):
    """The ports of the servers that the daemon has connections to."""
    sockets = {name[len("socket:["):-1] for name in daemon.descriptors() if name.startswith("socket:[")}
    rows = [line.split() for kind in ("tcp", "tcp6") for line in open(f"/proc/{daemon.popen.pid}/net/{kind}").readlines()[1:]]
    return {int(row[2].rsplit(":", 1)[1], 16) for row in rows if row[9] in sockets}


class Aggregator(Client):
    """Collects the copies that it gets."""

    def __init__(self, *arguments, **options):
        self.copies = []
        super().__init__(*arguments, **options)

    def frame(self):
        while (frame := super().frame()) and frame[0] == self.EVENT:
            self.copies.append(frame[2])
        return frame


class PolicyTest(HTTPSTest):
    def setUp(self):
        super().setUp()
        for name in ("quindle", "ostvane"):
            self.everything(name)

    def everything(self, name, *entries, reliable=250):
        """A storebag with each kind of back end that a test can watch."""
        self.lab.put(name, {"version": "v", "release": {
            "httppost": {"clients": list(entries) or [entry(client=None, override_dnu=1)]},
            "dashboard": {"ip": "127.0.0.1", "port": "${dashboardPort}", "post_url": "${url}/logdata", "reliable": reliable},
            "uploadserver": {"post_url": "${url}/upload"}, "ampery": {}}})

    def adaptor(self):
        self.addCleanup(os.umask, os.umask(0o022))
        bundle = self.root.path / BUNDLE
        bundle.parent.mkdir(parents=True)
        shutil.copy(GOOD, bundle)

    def say(self, **rules):
        self.root.write(POLICY, b"// as the owner writes it\n" + json.dumps(rules).encode())

    def forget(self):
        (self.root.path / POLICY).unlink()

    def arrived(self):
        return [len(self.lab.received(kind)) for kind in ("events", "dashboard", "uploads", "logdata")]

    def status(self):
        return json.loads(self.ctl("status", "--json")[0])


class Policy(PolicyTest):
    def test_consent_always_holds_against_storebag_and_client(self):
        self.say(consent="always")
        self.root.prefer(DiagnosticLogSubmissionEnabled=False)
        with self.serving("without requiring it", "stays: the owner", "upload failed") as daemon:
            for required in (False, True):
                session = self.client(requireUserInfo=required)
                self.assertEqual(session.backends, [])
                session.message(number=1)
                session.flush()
            self.ctl("upload", "--client-type", "7", "--session-id", "9", str(self.root.path / "etc/veltrad/device.plist"), status=1)
            self.assertEqual(self.arrived(), [0, 0, 0, 0])
            self.root.prefer(DiagnosticLogSubmissionEnabled=True)
            daemon.wait_for_line(DAEMON_LINE + "back ends may report")
            wait_until(lambda: session.states(**WHO) == BACKENDS, "the back ends")
            session.message(number=2)
            self.lab.wait_for_events(1, number=2)

    def test_consent_that_comes_and_goes_reaches_open_sessions(self):
        self.everything("quindle", entry("phone"), entry("free", override_dnu=1))
        self.lab.control(path="/dashboard", ack="drop")
        self.say(consent="always")
        with self.serving() as daemon:
            sessions = [self.client("phone", requireUserInfo=True, batchEvent=True), self.client("free", batchEvent=True)]
            for turn in range(1, 3):
                for session in sessions:
                    session.message(number=-turn)
                self.root.prefer(DiagnosticLogSubmissionEnabled=False)
                daemon.wait_for_line(DAEMON_LINE + "policy_consent", turn)
                before = self.arrived()
                for session, name in zip(sessions, ("phone", "free")):
                    self.assertEqual(session.states(clientName=name, serviceName=name), [])
                    session.message(number=-turn)
                    session.flush()
                self.assertEqual(self.arrived(), before)
                self.root.prefer(DiagnosticLogSubmissionEnabled=True)
                daemon.wait_for_line(DAEMON_LINE + "back ends may report", turn)
                for session, name in zip(sessions, ("phone", "free")):
                    wait_until(lambda: session.states(clientName=name, serviceName=name) == BACKENDS, "the back ends again")
                    session.message(number=turn)
                    session.flush()
                self.lab.wait_for_events(2, number=turn)
            # What waited when the consent went is gone: batched events, and datagrams that nobody acknowledged.
            self.assertFalse([event for event in self.lab.events() if event.get("number", 0) < 0])
            wait_until(lambda: self.stats().get("datagram dropped: the owner of the device does not let it leave", 0) >= 4, "dropped datagrams")

    def test_back_ends_and_hosts_that_are_not_listed_are_not_made_or_reached(self):
        with self.serving("Unable to fetch storebag", "No storebag", "Could not fetch") as daemon:
            self.say(backends=["httppost", "later"])
            daemon.wait_for_line(DAEMON_LINE, 1)
            self.assertEqual(self.client().backends, ["httppost"])
            self.say(hosts=["LOCALHOST"])
            daemon.wait_for_line(DAEMON_LINE, 2)
            session = self.client()
            self.assertEqual(session.backends, ["ampery", "httppost", "uploadserver"])  # the dashboard is 127.0.0.1
            self.say(hosts=["*.example"])
            daemon.wait_for_line(DAEMON_LINE, 3)
            wait_until(lambda: session.states(**WHO) == ["ampery"], "back ends without a host")
            before, asked = self.arrived(), len(self.lab.received("storebags"))
            session.message(number=1)
            self.assertIsNone(self.client(client_type=6).backends)
            self.assertEqual((self.arrived(), len(self.lab.received("storebags"))), (before, asked))

    def test_fields_are_taken_out_of_everything_and_hashed_everywhere(self):
        self.root.prefer(forceEventLogging=True, environmentType=1)
        self.adaptor()
        self.lab.put("quindle", {"version": "v", "development": {
            "httppost": {"clients": [entry()]}, "ampery": {}, "mivo": {},
            "dashboard": {"ip": "127.0.0.1", "port": "${dashboardPort}", "post_url": "${url}/logdata"}}})
        self.say(remove=["SECRET", "serviceName"], hash=["number"], history={})
        with self.serving("unable to handle key: deep") as daemon:
            session = Aggregator(self.root, "phone", aggregates=True, user_info={"serviceName": "hidden-service", "number": "hidden-info"})
            self.addCleanup(session.close)
            reply = session.message(secret="hidden-text", number="hidden-number", deep={"list": [{"Secret": "hidden-deep"}]}, kept=1)
            session.ask(UPLOAD_LOG, data=[{"secret": "hidden-log", "kept": 2}])
            event = self.lab.wait_for_events(1, kept=1)[0]
            self.lab.received("dashboard", 2)
            session.ask("flushMessagesWithCompletion:")
            items = [json.loads(line) for line in self.ctl("history", "--json")[0].splitlines()]
            shown = "".join(self.ctl("history", "show", item["id"])[0] for item in items)
        self.assertEqual({name for item in items for name in item["removed"]}, {"secret", "Secret", "serviceName"})
        self.assertEqual({name for item in items for name in item["hashed"]}, {"number"})
        secret = (self.root.path / "var/lib/veltrad/secret").read_bytes()
        digest = {text: hmac.new(secret, text.encode(), "sha256").hexdigest() for text in ("hidden-info", "hidden-number")}
        self.assertEqual(event["number"], digest["hidden-info"])
        self.assertNotIn("secret", event)
        seen = json.dumps([self.lab.received(kind) for kind in ("events", "dashboard", "logdata")]) + "\n".join(daemon.text) + shown
        logs = {path.name: path.read_bytes().decode("latin-1") for path in self.root.path.rglob("*")
                if path.is_file() and "etc" not in path.parts and path.suffix != ".so"}
        for text in [seen, str(reply), str(session.copies), *logs.values()]:
            self.assertNotIn("hidden", text)
        message_log = next(name for name in logs if name.endswith(".diag"))
        for text in (shown, logs["energy.jsonl"], logs["example-adaptor.jsonl"], logs[message_log]):
            self.assertIn(digest["hidden-number"], text)
        self.assertIn(digest["hidden-info"], str(session.copies))

    def test_closed_gates_bring_not_one_packet_to_any_server_but_the_storebags(self):
        self.adaptor()
        local = [self.root.path / "var/log/veltrad" / name for name in ("energy.jsonl", "example-adaptor.jsonl")]
        gates = (({"consent": "always"}, False), ({"reporting": "off"}, True), ({"hosts": ["localhost"]}, True))
        for rules, consent in gates:
            with socket.create_server(("127.0.0.1", 0)) as server, socket.socket(socket.AF_INET, socket.SOCK_DGRAM) as dashboard:
                dashboard.bind(("127.0.0.1", 0))
                url = f"https://127.0.0.1:{server.getsockname()[1]}"
                self.lab.put("quindle", {"version": "v", "release": {
                    "httppost": {"clients": [entry(client=None, override_dnu=1, post_url=url, realtime_post_url=url)]},
                    "dashboard": {"ip": "127.0.0.1", "port": dashboard.getsockname()[1], "post_url": url, "reliable": 50},
                    "uploadserver": {"post_url": url}, "ampery": {}, "mivo": {}}})
                self.say(**rules)
                self.root.prefer(DiagnosticLogSubmissionEnabled=consent)
                with self.serving("without requiring it", "user info provided", "stays: the owner", "upload failed", "Only upload") as daemon:
                    for required in (False, True):
                        session = self.client(requireUserInfo=required, batchEvent=required)
                        for flag in range(4):
                            session.message(number=1, flag=flag)
                        session.flush()
                        session.states(clientName="other", serviceName="other")
                        session.ask(UPLOAD_LOG, data=[1])
                    self.ctl("one-shot", "--client-type", "7", "--session-id", "9", "--category", "5", "--type", "1", "a=b")
                    log = self.root.path / "some.log"
                    log.write_text("x")
                    self.ctl("upload", "--client-type", "7", "--session-id", "9", str(log), status=1)
                    self.assertLessEqual(peers(daemon), {self.lab.port})
                # What stays on the device has no host.
                self.assertEqual([path.exists() for path in local], ["hosts" in rules] * 2, rules)
                for watched in (server, dashboard):
                    watched.setblocking(False)
                with self.assertRaises(BlockingIOError, msg=rules):
                    server.accept()
                with self.assertRaises(BlockingIOError, msg=rules):
                    dashboard.recv(2000)
            self.assertTrue(self.lab.received("storebags"))

    def test_a_broken_policy_closes_everything_and_says_where(self):
        with self.serving("Policy could not be read") as daemon:
            session = self.client()
            self.root.write(POLICY, b'{"reporting": "on",\n "host": []}')
            daemon.wait_for_line(f'Policy could not be read, nothing leaves: {self.root.path}/{POLICY}:2:2: unknown key "host"')
            wait_until(lambda: session.states(**WHO) == [], "no back ends")
            self.forget()
            wait_until(lambda: session.states(**WHO) == BACKENDS, "the back ends again")

    def test_a_days_limits_hold_over_a_restart_and_for_all_destinations(self):
        self.say(dailyEvents=6)  # each message: a post and a datagram; the session's own messages too
        with self.serving("The owner of the device does not let it leave (over_daily_limit)"):
            session = self.client()
            for number in range(4):
                session.message(number=number)
            session.close()
            wait_until(lambda: self.stats().get("event dropped: the owner's limit for the day is used up"), "a drop")
        counts = self.counts()
        left = counts["event posted"] + counts["datagram sent"]
        self.assertEqual(left, 6)
        self.assertEqual(json.loads((self.root.path / "var/lib/veltrad/daily.json").read_text())["events"], 6)
        before = self.arrived()
        with self.serving("The owner of the device does not let it leave (over_daily_limit)"):
            self.client().message(number=5)
            self.assertEqual(self.arrived(), before)
            self.say(dailyEvents=6, dailyBytes=10**6)
        self.say(dailyBytes=1)
        with self.serving("The owner of the device does not let it leave (over_daily_limit)"):
            self.client().message(number=6)
        self.assertEqual(self.arrived(), before)


class Withdrawal(PolicyTest):
    alone = True  # it measures time

    def test_reporting_off_stops_open_sessions_within_a_second_and_on_lets_them_go_on(self):
        self.lab.control(path="/dashboard", ack="drop")
        with self.serving() as daemon:
            session = self.client(batchEvent=True)
            session.message(number=1)
            self.lab.received("dashboard", 2)
            self.say(reporting="off")
            began = time.monotonic()
            daemon.wait_for_line(DAEMON_LINE + "policy_reporting")
            self.assertLess(time.monotonic() - began, 1)
            wait_until(lambda: self.stats().get("datagram dropped: the owner of the device does not let it leave"),
                       "datagrams dropped")
            self.assertLess(time.monotonic() - began, 2)  # the counts are written once a second
            before = self.arrived()
            self.assertEqual(session.states(**WHO), [])
            session.message(number=2)
            session.flush()
            self.assertEqual(self.client().backends, [])
            self.assertEqual(self.arrived(), before)
            self.say(reporting="on")
            wait_until(lambda: session.states(**WHO) == BACKENDS, "the back ends again")
            session.message(number=3)
            session.flush()
            self.lab.wait_for_events(1, number=3)
            self.assertEqual([event["number"] for event in self.lab.events() if "number" in event], [3])
        self.assertGreaterEqual(self.counts()["event dropped: the owner of the device does not let it leave"], 2)

    def test_a_withdrawal_under_load_stops_the_last_packet_within_a_second(self):
        self.say(consent="always")
        log = self.root.path / "some.log"
        # A post that had not begun when the consent was withdrawn.
        with self.serving("The owner of the device does not let it leave (policy_consent)", "upload failed", "stays: the owner",
                          "Error uploading log data array"):
            clients = [self.client(batchEvent=batched) for batched in (False, False, True)]
            stop = threading.Event()

            def load(client):
                while not stop.is_set():
                    client.message(text="x" * 200)
                    client.flush()

            def log_data(client):
                while not stop.is_set():
                    client.ask(UPLOAD_LOG, data=["x" * 1000])

            def files():
                while not stop.is_set():
                    log.write_text("x" * 1000)
                    subprocess.run([program("veltractl"), "upload", "--client-type", "7", "--session-id", "9", str(log)],
                                   env=self.root.environment(), capture_output=True)
            threads = [threading.Thread(target=load, args=(client,)) for client in clients]
            threads += [threading.Thread(target=log_data, args=(self.client(),)), threading.Thread(target=files)]
            for thread in threads:
                thread.start()
            for kind, count in (("events", 100), ("logdata", 10), ("uploads", 3)):
                self.lab.received(kind, count)
            withdrawn = time.time()
            self.root.prefer(DiagnosticLogSubmissionEnabled=False)
            wait_until(lambda: time.time() > withdrawn + 1.5, "what may still come")
            stop.set()
            for thread in threads:
                thread.join()
        for kind in ("events", "dashboard", "logdata", "uploads"):
            last = max(line["time"] for line in self.lab.received(kind))
            self.assertLess(last, withdrawn + 1, kind)
