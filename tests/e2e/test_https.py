# SPDX-License-Identifier: Apache-2.0
"""The HTTPS back end: client entries, filters, batches, collectors that fail on request, hostile texts, the message log."""
import collections
import contextlib
import datetime
import hashlib
import http.server
import itertools
import json
import plistlib
import re
import ssl
import threading

from harness import SystemTest, Wire, closed_port, storebag, wait_until

LOGS = "var/mobile/Library/Logs/Zentrel/Retired"
COUNTRY = "the country is not in locale_whitelist"
POST_ERROR = "<3>HTTPSPostBackend(postJsonMessage): post error: "


def entry(name="phone", **more):
    """A client entry for one client, with its own path at the collector. None removes a key."""
    keys = {"client": name, "post_url": "${url}/events/" + name, "locale_whitelist": ["US"], "filters": [],
            "sampling_threshold": 1, "event_threshold": 49, **more}
    return {key: value for key, value in keys.items() if value is not None}


class Client(Wire):
    """A started session. Checks that every reply belongs to the call that was made last."""
    numbers = itertools.count(1)

    def __init__(self, root, name="phone", client_type=7, user_info={}, aggregates=False, **session_info):
        super().__init__(root)
        self.number = next(self.numbers)
        self.describe(client_type, aggregates, {"clientName": name, "serviceName": name, **user_info},
                      sessionID=self.number, **session_info)
        self.backends = self.start()

    def expect(self):
        kind, call, body = self.frame()
        assert (kind, call) == (self.REPLY, self._call), (kind, call, body)
        return body["results"]

    def ask(self, op, **args):
        self.begin(op, **args)
        return self.expect()

    def start(self):
        return self.ask("startConfigWithCompletionHandler:").get("backends")

    def message(self, category=5, type=2, flag=0, **payload):
        message = {"category": category, "type": type, "flag": flag, "payload": payload}
        return self.ask("sendMessageWithDictionary:reply:", message=message).get("reply")

    def event(self, **message):
        return json.loads(self.message(**message))["events"][-1]

    def flush(self):
        """Flushes and returns (reply, error code, error description)."""
        answer = self.ask("flushMessagesWithCompletion:")
        error = answer.get("error", {})
        return answer.get("reply"), error.get("code"), error.get("description")

    def states(self, **user_info):
        return self.ask("fetchStatesWithUserInfo:completionHandler:", userInfo=user_info).get("backends")

    def mark(self, daemon):
        """The daemon's log lines about this session so far."""
        self.ask("fetchDisplayURL:")
        daemon.wait_for_line(f"fetchDisplayURL: Fetching display URL for session {self.number}")
        lines = daemon.text
        begin = next(i for i, line in enumerate(lines) if line.endswith(f"Configuring session {self.number}"))
        return lines[begin:]


class HTTPSTest(SystemTest):
    def serve(self, *entries, name="quindle", **section):
        self.lab.put(name, storebag(backends={"httppost": {"clients": list(entries), **section}}))

    def client(self, *arguments, **options):
        client = Client(self.root, *arguments, **options)
        self.addCleanup(client.close)
        return client

    def posts(self, name, count=0):
        """Waits for at least `count` posts to the client entry's path and returns them."""
        def found():
            hits = [post for post in self.lab.received("events") if post["path"] == "/events/" + name]
            return (hits, ) if len(hits) >= count else None
        return wait_until(found, f"{count} posts of {name}")[0]

    def preferences(self):
        path = self.root.path / "var/lib/veltrad/preferences/com.florn.veltra.plist"
        self.root.preferences = plistlib.loads(path.read_bytes())
        return self.root.preferences

    def stats(self):
        written = (self.root.path / "run/veltrad/counters.json").exists()
        return json.loads(self.ctl("stats", "--json")[0])["counts"] if written else {}


class Entries(HTTPSTest):
    # For each consent and LANG: changes to the entry; reports, held or the reason why not; a part of the log line.
    DECISIONS = {(True, "en_US.UTF-8"): [
        ({}, "reports", "state=2"), ({"locale_whitelist": ["DE", "us"]}, "reports", "state=2"),
        ({"locale_whitelist": ["DE"]}, COUNTRY, '(US) isn\'t in country code list ["DE"]'),
        ({"locale_whitelist": None}, COUNTRY, "(US) isn't in country code list (null)"),
        ({"device_whitelist": ["Oak", "eL"]}, "reports", "state=2"),
        ({"device_whitelist": ["Oak"]}, "the device is not in device_whitelist",
         '(Elm) isn\'t in device whitelist ["Oak"]'),
        ({"device_blacklist": ["ELM4"]}, "the device is in device_blacklist",
         '(Elm4,2) is in device blacklist ["ELM4"]'),
        ({"filters": None}, "the client entry has no filters", "<4>HTTPSPostBackend(updateBackendState): filters are"),
        ({"sampling_threshold": None}, "the client entry has no sampling threshold", "state=1"),
        ({"sampling_threshold": -1}, "held", "state=3"),
        ({"sampling_threshold": -1, "override_sampling": 1}, "held", "state=3"),
        ({"sampling_threshold": -1, "override_sampling": -1}, "sampled out", "state=1"),
        ({"sampling_threshold": -1, "per_country_sampling_thresholds": [{"country": ["us"], "threshold": -2}, {
            "country": ["DE", "US"], "threshold": 1}]}, "reports", "threshold for US changed from -1.00 to 1.00"),
        ({"client": "desk,{NAME}"}, "reports", "state=2"), ({"client": "desk, {NAME}"}, "no client entry fits", ""),
        ({"service": "lamp,{NAME}"}, "reports", "state=2"), ({"service": "{NAME}x"}, "no client entry fits", ""),
        ({"override_dnu": 1}, "reports", "state=2"),
        # A value of the wrong type counts as absent.
        ({"locale_whitelist": "US"}, COUNTRY, "(US) isn't in country code list"),
        ({"filters": {"key": "x"}}, "the client entry has no filters", "filters are"),
        ({"sampling_threshold": "1"}, "the client entry has no sampling threshold", "state=1"),
        ({"client": 7, "service": "{NAME}"}, "reports", "state=2"),
        ({"sampling_threshold": -1, "override_sampling": "-1"}, "held", "state=3"),
        ({"service": ["x"], "device_whitelist": "Oak", "device_blacklist": "Elm", "override_dnu": "1",
          "per_country_sampling_thresholds": [{"country": "US", "threshold": -2}]}, "reports", "state=2"),
    ], (True, "de_CH.UTF-8"): [
        ({"locale_whitelist": ["CH"], "sampling_threshold": None, "per_country_sampling_thresholds": [
            {"country": ["CH"], "threshold": 1}]}, "reports", "threshold for CH changed from 0.00 to 1.00"),
    ], (True, "C"): [
        ({}, "reports", "state=2"),
        ({"locale_whitelist": []}, COUNTRY, "((null)) isn't in country code list []"),
    ], (False, "en_US.UTF-8"): [
        ({}, "no consent to diagnostic submission", "reporting disabled by DNU: 0."),
        ({"override_dnu": 2}, "no consent to diagnostic submission", "reporting disabled by DNU: 2."),
        ({"override_dnu": 1}, "reports", "state=2"),
    ]}

    def decide(self, daemon, name, changes, outcome, line, consent):
        client = self.client(name)
        self.assertEqual(client.backends, ["httppost"] if outcome in ("reports", "held") else [])
        self.assertTrue(any(line in said for said in client.mark(daemon)), line)
        client.message(9, 9)
        self.assertEqual(client.flush()[1:], (-1, "Nothing to flush"))
        client.close()
        # Start, message, stop; held events are never posted.
        expected = 3 if outcome == "reports" else 0
        posts = self.posts(name, expected)
        self.assertEqual(len(posts), expected)
        overridden = changes.get("override_dnu") == 1
        identifier = self.preferences()["uuidOverrideDNU" if overridden else "uuidRespectDNU"]
        self.assertEqual({post["body"]["clientId"] for post in posts}, {identifier} if posts else set())
        self.assertEqual([e["Opt"] for p in posts for e in p["body"]["events"] if e["_status"] == 1],
                         [(1 + consent) * overridden] if posts else [])

    def test_decisions(self):
        names = (f"case{number:03}" for number in itertools.count())
        cases = [(facts, next(names), *row) for facts, rows in self.DECISIONS.items() for row in rows]
        self.serve(*(entry(name, **{key: value.replace("{NAME}", name) if isinstance(value, str) else value
                                    for key, value in changes.items()}) for _, name, changes, *_ in cases))
        for consent, lang in self.DECISIONS:
            self.root.prefer(DiagnosticLogSubmissionEnabled=consent)
            mine = [case for facts, *case in cases if facts == (consent, lang)]
            with self.serving("filters are required.", env={"LANG": lang}) as daemon:
                for case in mine:
                    with self.subTest(case, consent=consent, lang=lang):
                        self.decide(daemon, *case, consent)
            reasons = collections.Counter("back end disabled: " + case[2] for case in mine
                                          if case[2] not in ("reports", "held"))
            self.assertEqual({key: n for key, n in self.counts().items() if "disabled: " in key}, reasons)

    def test_custom_identifier_outlives_the_daemon(self):
        name = 'phone "x"\n\0'
        self.serve(entry(client=None, custom_clientId=False, post_url="${url}/events/phone"))
        for _ in range(2):
            with self.serving():
                self.client(name, user_info={"serviceName": "ringer"}).close()
                self.posts("phone", 2)
        identifier, = {post["body"]["clientId"] for post in self.posts("phone", 4)}
        self.assertEqual(self.preferences()[f"uuid:{name}:ringer"], identifier)

    def test_wrong_sections(self):
        for client_type, name, section, backends in (
                (5, "pellmarch", {"clients": {"client": "phone"}}, []), (6, "ostvane", "clients", []),
                (8, "brevatto", {"clients": [7, "phone", [], entry()], "display_url": 7}, ["httppost"]),
                (9, "sollwick", {"clients": []}, [])):
            self.lab.put(name, storebag(backends={"httppost": section}))
            with self.subTest(section), self.serving("can't find the client list."):
                client = self.client(client_type=client_type)
                self.assertEqual(client.backends, backends)
                self.assertEqual(client.ask("fetchDisplayURL:")["reply"], "URL not available")


class Events(HTTPSTest):
    def test_batches_thresholds_and_order(self):
        self.serve(entry(event_threshold=2, realtime_post_url="${url}/events/urgent"), entry("slow", expedite=0),
                   entry("fast", expedite=1))
        with self.serving() as daemon:
            client = self.client(batchEvent=True)
            self.assertEqual([client.message(number=n) for n in range(3)], [None] * 3)
            self.assertEqual([e.get("number") for e in json.loads(client.message(number=3))["events"]], [None, 0, 1, 2])
            daemon.wait_for_line("Flushing all batched events as we reached event threshold for method 5")
            flushed, alone = client.message(flag=1, number=4).removeprefix("Flushed events:\n").split(
                "\nStandalone event:\n")
            self.assertEqual([e["number"] for text in (flushed, alone) for e in json.loads(text)["events"]], [3, 4])
            self.assertEqual(client.flush(), (None, -1, "Nothing to flush"))
            client.message(number=5)
            client.states(clientName="phone", serviceName="phone", room="new")  # is merged into what waits, too
            client.message(number=6)
            reply, *error = client.flush()
            self.assertEqual(([(e["number"], e["room"]) for e in json.loads(reply)["events"]], error),
                             ([(5, "new"), (6, "new")], [None, None]))
            slow, fast = self.client("slow"), self.client("fast", batchEvent=True)
            self.assertEqual((slow.message(), fast.event()["_eventNumber"]), (None, 2))
            for each in (client, slow, fast):
                each.close()
            sizes = {name: sorted(len(post["body"]["events"]) for post in self.posts(name, count))
                     for name, count in (("phone", 4), ("urgent", 1), ("slow", 1), ("fast", 3))}
        self.assertEqual(sizes, {"phone": [1, 1, 2, 4], "urgent": [1], "slow": [3], "fast": [1, 1, 1]})
        self.assertEqual([{post["headers"].get("X-VLT-Event-Map") for post in self.posts(name)}
                          for name in ("phone", "slow", "urgent")], [{None}, {None}, {"5 2"}])
        self.assertEqual(self.counts()["event posted"], 15)

    def test_sampled_out_messages_are_held_until_one_overrides_it(self):
        self.serve(entry(sampling_threshold=-1, override_sampling=0.5))
        with self.serving():
            silent, heard = self.client(batchEvent=True), self.client()
            for client in (silent, heard):
                self.assertEqual((client.backends, client.message(number=1)), (["httppost"], None))
            self.assertEqual(heard.event(flag=2, number=2)["number"], 2)
            self.assertEqual([e.get("number") for e in json.loads(heard.flush()[0])["events"]], [None, 1])
            silent.close()
            heard.close()
            self.posts("phone", 3)
        self.assertEqual(len(self.lab.events()), 4)
        stop, = self.lab.wait_for_events(1, _method=0, _status=1)
        expected = {"Opt": 0, "SamplingThreshold": -1, "OverrideSampling": 0.5, "Batch": 0, "StorebagVersion": "v1"}
        self.assertEqual({key: stop[key] for key in expected}, expected)
        self.assertEqual(self.counts()["event dropped: flushed while the back end does not report"], 3)

    def test_filters(self):
        self.serve(entry(filters=[
            {"key": "PEER", "action": "remove"}, {"key": "line", "status": 3, "action": "keep"},
            {"key": "line", "action": "sha256"}, {"key": "codec", "method": 6, "action": "sha256"},
            {"key": "number", "action": "sha256"}, {"key": "list", "action": "sha256"},
            {"key": "kept", "action": "Remove"}]))
        payload = {"peer": "secret", "line": "secret", "codec": "opus", "number": 1, "list": ["secret"], "kept": 1}
        secret, opus, one = (hashlib.sha256(text).hexdigest() for text in (b"secret", b"opus", b"1"))
        with self.serving():
            client = self.client(batchEvent=True, user_info={"line": "secret", "peer": "secret"})
            for category, type in ((5, 2), (5, 3), (6, 2)):
                client.message(category, type, **payload)
            client.flush()
            post, = self.posts("phone", 1)
            client.close()
        seen = [[event.get(key) for key in payload] for event in post["body"]["events"][1:]]
        # For the flush the user info is filtered again, with method 0 and status 0.
        self.assertEqual(seen, [[None, secret, "opus", one, None, 1], [None, secret, "opus", one, None, 1],
                                [None, secret, opus, one, None, 1]])
        self.assertNotIn('"secret"', json.dumps(post))

    def test_the_threshold_is_not_affected_by_a_filter_on_the_method(self):
        self.serve(entry(event_threshold=2, filters=[{"key": "_method", "action": "remove"}]))
        with self.serving():
            client = self.client(batchEvent=True)
            self.assertEqual([client.message(category) is None for category in (5, 6, 7)], [True, True, False])


class Hostile(HTTPSTest):
    TEXTS = ['"quoted\\"', "line\r\nX-Evil: 1\r\n\r\n", "nul\0after", "\u202ereversed\u2066", "\u2028\u2029\x85",
             "\x1b[31mred\x7f", "ünïcödé 🦉", "%s%n%@", "x" * (200 << 10)]

    def test_hostile_texts(self):
        self.serve(entry(client=None))
        payload = {f"key{n} {text[:30]}": text for n, text in enumerate(self.TEXTS)}
        removed = {"list": [["a\nb"]], "more": {"a\n": "b"}, "raw": b"\0", "nan": float("nan"), "\n<3>faked": [1]}
        with self.serving("Quillfen unable to handle key: "):
            for name in self.TEXTS[:-1]:
                client = self.client(name, user_info={"serviceName": name[::-1]})
                event = client.event(**payload, **removed, at=datetime.datetime(2014, 11, 16, 20, 13, 54))
                expected = {**payload, "at": 1416168834, "clientName": name, "serviceName": name[::-1]}
                self.assertEqual({key: event[key] for key in expected}, expected)
                self.assertFalse(removed.keys() & event.keys())
                client.close()
            posts = self.posts("phone", 3 * len(self.TEXTS[:-1]))
        for post in posts:
            self.assertNotIn("X-Evil", post["headers"])
            name = post["body"]["events"][0]["clientName"]
            sent = "".join(c for c in name if c >= " " and c != "\x7f").strip(" ")
            self.assertEqual(post["headers"]["X-VLT-Client-Name"], sent)
        self.assertEqual(self.counts()["event field removed: JSON cannot carry it"], 5 * len(self.TEXTS[:-1]))


class MessageLog(HTTPSTest):
    def test_a_line_for_each_answer_and_none_without_consent(self):
        for consent in (True, False):
            self.serve(entry(override_dnu=int(not consent)))
            self.root.prefer(DiagnosticLogSubmissionEnabled=consent)
            with self.serving():
                client = self.client(batchEvent=True)
                client.message()
                self.assertEqual((client.flush()[0] is not None, client.message(flag=1) is not None), (consent, consent))
                client.close()
                self.posts("phone", 3)
            file, = (self.root.path / LOGS).iterdir()
            self.assertRegex(file.name, r"^veltrad_\d+_messageLog\.diag$")
            date = r"\d{4}-\d\d-\d\d \d\d:\d\d:\d\d \+0000"
            self.assertEqual(re.findall(rf"^\({date}\) \[httppost -> (\w+)\] \{{$", file.read_text(), re.M),
                             ["flushMessages", "sendMessageWithDictionary", "flushMessages"])


class Failures(HTTPSTest):
    URLS = {"refused": f"https://localhost:{closed_port()}/events", "nowhere": "https://collector.invalid/"}
    # Name, how the collector fails, code and text of the error that the flush reports, how many posts arrive.
    FAILURES = [
        ("well", {}, (None, None), 1), ("missing", {"status": 404}, (None, None), 1),
        ("redirect", {"status": 302, "headers": {"Location": "/events/elsewhere"}}, (None, None), 1),
        ("dripping", {"dripMs": 10, "body": "x" * 20}, (None, None), 1), ("stalled", {"stall": True}, (None, None), 1),
        ("broken", {"status": 503}, (503, "backend httppost disabled by server 503 return code"), 1),
        ("brokenoff", {"status": 503, "cutHalfway": True, "body": "xxxx"},
         (503, "backend httppost disabled by server 503 return code"), 1),
        ("cut", {"cut": True}, (-1, "Empty reply from server"), 1),
        ("halfway", {"cutHalfway": True, "body": "xxxx"}, (-1, "transfer closed with 2 bytes remaining to read"), 1),
        ("endless", {"endless": True}, (None, None), 1),  # the body is not read; the status counts
        ("refused", {}, (-1, "Failed to connect to localhost port "), 0),
        ("nowhere", {}, (-1, "Could not resolve host: collector.invalid"), 0)]

    def flush_at_a_failure(self, daemon, name, rule, expected, arrived):
        client = self.client(name, batchEvent=True)
        client.message(number=1)
        self.lab.control(path="/events/" + name, **rule)
        client.begin("flushMessagesWithCompletion:")
        if "stall" in rule:
            self.posts(name, 1)
            self.lab.reset()
        answer = client.expect()
        error = answer.get("error", {})
        self.assertEqual(json.loads(answer["reply"])["events"][1]["number"], 1)
        self.assertEqual((error.get("code"), error.get("description", "")[:len(expected[1] or "")] or None), expected)
        if expected[0] == 503:
            daemon.wait_for_line("<6>postJSONMessage: " + error["description"])
        self.assertEqual(client.states(clientName=name, serviceName=name), ["httppost"] * (expected[0] != 503))
        self.assertEqual(client.start(), ["httppost"])
        self.assertLessEqual(len(self.posts(name, min(arrived, 1))), arrived)
        self.lab.reset()
        client.close()

    def test_each_flush_is_answered_once(self):
        self.serve(*(entry(name, post_url=self.URLS.get(name, "${url}/events/" + name)) for name, *_ in self.FAILURES))
        with self.serving(POST_ERROR) as daemon:
            for failure in self.FAILURES:
                with self.subTest(failure[0]):
                    self.flush_at_a_failure(daemon, *failure)
            # Each row: start and message; then the second start and the stop, which succeed if the lab is the collector.
            counts = {"event posted": 4 * 2 + 10 * 2, "event lost: the server answered 5xx": 4,
                      "event lost: the server answered 4xx": 2,
                      "event lost: the server answered 3xx, and no post follows a redirect": 2,
                      "event lost: the post failed": 2 * 2 + 2 * 4, "event held: batched": 12 * 4}
            wait_until(lambda: counts.items() <= self.stats().items(), counts)
        # At most one line a second; with the last one, at the stop, the lines account for every post that failed.
        lines = [line for line in daemon.text if line.startswith(POST_ERROR)]
        self.assertEqual(lines[0], POST_ERROR + "transfer closed with 2 bytes remaining to read")
        said = (re.search(r" \((\d+) posts since the last such line\)$", line) for line in lines)
        self.assertEqual(sum(int(more[1]) if more else 1 for more in said), 3 + 2 * 2)
        self.assertEqual(self.posts("elsewhere"), [])


class ClosingCollector(http.server.BaseHTTPRequestHandler):
    """Answers one post per connection with 200 and then closes it without notice, as a server does when a kept connection
    has been idle for too long."""
    protocol_version = "HTTP/1.1"
    closed = threading.Semaphore(0)

    def do_POST(self):
        self.rfile.read(int(self.headers["Content-Length"]))
        self.wfile.write(b"HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n")
        self.close_connection = True

    def finish(self):
        super().finish()
        self.connection.setblocking(False)
        with contextlib.suppress(ssl.SSLWantReadError):
            self.connection.unwrap()  # sends the closing alert and does not wait for the client's
        self.connection.close()
        self.closed.release()

    @classmethod
    def start(cls, lab):
        tls = ssl.SSLContext(ssl.PROTOCOL_TLS_SERVER)
        tls.load_cert_chain(lab.certificate, lab.certificate.replace("certificate.pem", "certificate-key.pem"))
        server = http.server.HTTPServer(("localhost", 0), cls)
        server.socket = tls.wrap_socket(server.socket, server_side=True)
        threading.Thread(target=server.serve_forever, daemon=True).start()
        return server


class KeptConnections(HTTPSTest):
    def test_no_post_is_lost_to_a_connection_that_its_server_closed(self):
        collector = ClosingCollector.start(self.lab)
        self.addCleanup(collector.server_close)
        self.addCleanup(collector.shutdown)
        self.serve(entry(post_url=f"https://localhost:{collector.server_port}/events"))
        with self.serving():
            client = self.client(batchEvent=True)
            for _ in range(4):
                client.message()
                self.assertEqual(client.flush()[1:], (None, None))
                self.assertTrue(ClosingCollector.closed.acquire(timeout=20))
            client.close()
        self.assertEqual(self.counts()["event posted"], 6)
