"""The HTTPS post back end: client entries, filters, batches, collectors with moods, hostile texts, the message log."""
import collections
import datetime
import itertools
import json
import plistlib
import re
import shutil
import time

from harness import Lab, SystemTest, Wire, closed_port, storebag, wait_until

NAMES = "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:"
LOGS = "var/mobile/Library/Logs/Zentrel/Retired"
POST_ERROR = "<3>HTTPSPostBackend(postJsonMessage): post error: "


def entry(name="phone", **more):
    """A client entry for one client that posts to a path of its own; None leaves a key out."""
    keys = {"client": name, "post_url": "${url}/events/" + name, "locale_whitelist": ["US"], "filters": [],
            "sampling_threshold": 1, "event_threshold": 49, **more}
    return {key: value for key, value in keys.items() if value is not None}


class Client(Wire):
    """A started session. Every reply must be the one to the call that was made last."""
    numbers = itertools.count(1)

    def __init__(self, root, name="phone", client_type=7, user_info={}, **session_info):
        super().__init__(root)
        self.number = next(self.numbers)
        self.ask(NAMES, frameworksToCheck=[], hasAggregationBlock=False,
                 sessionInfo={"clientType": client_type, "sessionID": self.number, "requireUserInfo": True,
                              **session_info}, userInfo={"clientName": name, "serviceName": name, **user_info})
        self.backends = self.start()

    def expect(self):
        kind, call, body = self.frame()
        assert (kind, call) == (self.REPLY, self._call), (kind, call, body)
        return body["results"]

    def ask(self, op, **args):
        self._call += 1
        self.send(self.CALL, {"op": op, "args": args}, self._call)
        return self.expect()

    def start(self):
        return self.ask("startConfigWithCompletionHandler:").get("backends")

    def message(self, category=5, type=2, flag=0, **payload):
        message = {"category": category, "type": type, "flag": flag, "payload": payload}
        return self.ask("sendMessageWithDictionary:reply:", message=message).get("reply")

    def event(self, **message):
        return json.loads(self.message(**message))["events"][-1]

    def flush(self):
        """(reply, error's code, its description)."""
        answer = self.ask("flushMessagesWithCompletion:")
        error = answer.get("error", {})
        return answer.get("reply"), error.get("code"), error.get("description")

    def states(self, **user_info):
        return self.ask("fetchStatesWithUserInfo:completionHandler:", userInfo=user_info).get("backends")

    def mark(self, daemon):
        """The daemon's lines about this session so far."""
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
        """At least `count` posts to the client entry's own path."""
        def found():
            hits = [post for post in self.lab.received("events") if post["path"] == "/events/" + name]
            return (hits, ) if len(hits) >= count else None
        return wait_until(found, f"{count} posts of {name}")[0]

    def preferences(self):
        path = self.root.path / "var/lib/veltrad/preferences/com.florn.veltra.plist"
        self.root.preferences = plistlib.loads(path.read_bytes())
        return self.root.preferences

    def counts(self):
        return json.loads((self.root.path / "run/veltrad/counters.json").read_text())["counts"]


class Entries(HTTPSTest):
    OFF = "back end disabled: "
    # consent, LANG, the entry's changes, reports / held / why it is disabled, the line that says it
    DECISIONS = [
        (True, "en_US.UTF-8", {}, "reports", "state=2"),
        (True, "en_US.UTF-8", {"locale_whitelist": ["DE", "us"]}, "reports", "state=2"),
        (True, "en_US.UTF-8", {"locale_whitelist": ["DE"]}, "the country is not in locale_whitelist",
         '(US) isn\'t in country code list ["DE"]'),
        (True, "en_US.UTF-8", {"locale_whitelist": None}, "the country is not in locale_whitelist",
         "(US) isn't in country code list (null)"),
        (True, "en_US.UTF-8", {"device_whitelist": ["Oak", "eL"]}, "reports", "state=2"),
        (True, "en_US.UTF-8", {"device_whitelist": ["Oak"]}, "the device is not in device_whitelist",
         '(Elm) isn\'t in device whitelist ["Oak"]'),
        (True, "en_US.UTF-8", {"device_blacklist": ["ELM4"]}, "the device is in device_blacklist",
         '(Elm4,2) is in device blacklist ["ELM4"]'),
        (True, "en_US.UTF-8", {"filters": None}, "the client entry has no filters", "filters are required."),
        (True, "en_US.UTF-8", {"sampling_threshold": None}, "the client entry has no sampling threshold", "state=1"),
        (True, "en_US.UTF-8", {"sampling_threshold": -1}, "held", "state=3"),
        (True, "en_US.UTF-8", {"sampling_threshold": -1, "override_sampling": 1}, "held", "state=3"),
        (True, "en_US.UTF-8", {"sampling_threshold": -1, "override_sampling": -1}, "sampled out", "state=1"),
        (True, "en_US.UTF-8", {"sampling_threshold": -1, "per_country_sampling_thresholds": [
            {"country": ["us"], "threshold": -2}, {"country": ["DE", "US"], "threshold": 1}]}, "reports",
         "sampling threshold for US changed from -1.00 to 1.00"),
        (True, "en_US.UTF-8", {"client": "desk,{NAME}"}, "reports", "state=2"),
        (True, "en_US.UTF-8", {"client": "desk, {NAME}"}, "no client entry fits", ""),
        (True, "en_US.UTF-8", {"service": "lamp,{NAME}"}, "reports", "state=2"),
        (True, "en_US.UTF-8", {"service": "{NAME}x"}, "no client entry fits", ""),
        (True, "en_US.UTF-8", {"override_dnu": 1}, "reports", "state=2"),
        (True, "de_CH.UTF-8", {"locale_whitelist": ["CH"], "sampling_threshold": None,
                               "per_country_sampling_thresholds": [{"country": ["CH"], "threshold": 1}]}, "reports",
         "sampling threshold for CH changed from 0.00 to 1.00"),
        (True, "C", {}, "reports", "state=2"),
        (True, "C", {"locale_whitelist": []}, "the country is not in locale_whitelist", "((null)) isn't in country"),
        (False, "en_US.UTF-8", {}, "no consent to diagnostic submission", "reporting disabled by DNU: 0."),
        (False, "en_US.UTF-8", {"override_dnu": 2}, "no consent to diagnostic submission",
         "reporting disabled by DNU: 2."),
        (False, "en_US.UTF-8", {"override_dnu": 1}, "reports", "state=2"),
    ]

    def test_decisions(self):
        cases = [(f"case{number:03}", *case) for number, case in enumerate(self.DECISIONS)]
        changed = [{key: value.replace("{NAME}", name) if isinstance(value, str) else value
                    for key, value in case[2].items()} for name, *case in cases]
        self.serve(*(entry(name, **changes) for (name, *_), changes in zip(cases, changed)))
        for consent, lang in dict.fromkeys(case[1:3] for case in cases):
            self.root.prefer(DiagnosticLogSubmissionEnabled=consent)
            reasons = collections.Counter()
            with self.serving("filters are required.", env={"LANG": lang}) as daemon:
                for name, *case, changes, outcome, line in [c for c in cases if c[1:3] == (consent, lang)]:
                    with self.subTest(changes, consent=consent, lang=lang):
                        client = self.client(name)
                        self.assertEqual(client.backends, ["httppost"] if outcome in ("reports", "held") else [])
                        self.assertTrue(any(line in said for said in client.mark(daemon)), line)
                        client.message(9, 9)
                        self.assertEqual(client.flush()[1:], (-1, "Nothing to flush"))
                        client.close()
                        # Start, message, stop; what is held is never posted.
                        posts = self.posts(name, 3 if outcome == "reports" else 0)
                        self.assertEqual(len(posts), 3 if outcome == "reports" else 0)
                        overridden = changes.get("override_dnu") == 1
                        preferences = self.preferences()
                        for post in posts:
                            self.assertEqual(post["body"]["clientId"],
                                             preferences["uuidOverrideDNU" if overridden else "uuidRespectDNU"])
                        if posts:
                            stop = next(e for p in posts for e in p["body"]["events"] if e["_status"] == 1)
                            self.assertEqual(stop["Opt"], (1 + consent) * overridden)
                        reasons[self.OFF + outcome] += outcome not in ("reports", "held")
            counted = {key: n for key, n in self.counts().items() if key.startswith(self.OFF)}
            self.assertEqual(counted, dict(+reasons))

    def test_custom_identifier_outlives_the_daemon(self):
        name = 'phone "x"\n\0'
        self.serve(entry(client=None, custom_clientId=False, post_url="${url}/events/phone"))
        for _ in range(2):
            with self.serving():
                self.client(name, user_info={"serviceName": "ringer"}).close()
                self.posts("phone", 2)
        identifier, = {post["body"]["clientId"] for post in self.posts("phone", 4)}
        self.assertEqual(self.preferences()[f"uuid:{name}:ringer"], identifier)

    # Every documented key: values of a wrong type, and what the entry holds besides.
    NO_TEXT = (7, True, ["x"], {"x": "y"}, b"x", datetime.datetime(2020, 1, 1))
    NO_NUMBER = ("1", [1], {"x": 1}, b"1", datetime.datetime(2020, 1, 1))
    NO_ARRAY = ("US", 1, {"US": 1}, b"US", [7, True, {"US": "US"}, [["US"]], b"US"])
    WRONG = [
        ("client", NO_TEXT, {}), ("service", NO_TEXT, {}), ("post_url", NO_TEXT, {}),
        ("realtime_post_url", NO_TEXT, {}), ("expedite", NO_NUMBER, {}), ("hierarchy", NO_NUMBER, {}),
        ("override_dnu", NO_NUMBER, {}), ("locale_whitelist", NO_ARRAY, {}), ("device_whitelist", NO_ARRAY, {}),
        ("device_blacklist", NO_ARRAY, {}), ("filters", NO_ARRAY[:4], {}), ("sampling_threshold", NO_NUMBER, {}),
        ("per_country_sampling_thresholds", NO_ARRAY, {}),
        ("override_sampling", NO_NUMBER, {"sampling_threshold": -1}), ("event_threshold", NO_NUMBER, {}),
        ("extras_on_internal", NO_NUMBER, {}),
    ]
    # Dictionaries inside an entry: around the key, the key, values of a wrong type.
    WRONG_INSIDE = [
        ("filters", {"action": "remove"}, "key", NO_TEXT),
        ("filters", {"key": "codec", "action": "remove", "status": 2}, "method", NO_NUMBER),
        ("filters", {"key": "codec", "action": "remove", "method": 5}, "status", NO_NUMBER),
        ("filters", {"key": "codec"}, "action", NO_TEXT),
        ("per_country_sampling_thresholds", {"threshold": -1}, "country", ("US", 7, {"US": "US"}, [7, ["US"]])),
        ("per_country_sampling_thresholds", {"country": ["US"]}, "threshold", NO_NUMBER),
    ]

    def outcome(self, daemon, name):
        """All that tells one entry from another: the names reported, the event, the lines."""
        client = self.client(name)
        reply = client.message(codec="opus", flag=1)
        event = json.loads(reply)["events"][-1] if reply else {}
        changing = {"_clientTS", "eventTime", "_startTS", "_sessionID", "clientName", "serviceName"}
        said = [re.sub(r"samplingFactor=[\d.]+| list .*|case\d+|session \d+", "", line)
                for line in client.mark(daemon) if "Backend" in line and not line.startswith("<6>")]
        return client.backends, {key: event[key] for key in event.keys() - changing}, said

    def test_wrong_types_are_as_if_absent(self):
        pairs = [({**more, key: None}, {**more, key: value}) for key, values, more in self.WRONG for value in values]
        pairs += [({outer: [around]}, {outer: [{**around, key: value}]})
                  for outer, around, key, values in self.WRONG_INSIDE for value in values]
        names = (f"case{number:03}" for number in itertools.count())
        entries, cases = [], []
        for pair in pairs:
            cases.append((pair[1], next(names), next(names)))
            for name, changes in zip(cases[-1][1:], pair):
                # Found by the service where the test is about the client's name.
                own = {"service": name} if "client" in changes else {}
                entries.append(entry(name, **{**own, **changes}))
        self.serve(*entries)
        with self.serving("filters are required.") as daemon:
            for changes, absent, wrong in cases:
                with self.subTest(changes):
                    self.assertEqual(self.outcome(daemon, wrong), self.outcome(daemon, absent))

    def test_wrong_sections(self):
        for client_type, name, section, backends in (
                (5, "pellmarch", {"clients": {"client": "phone"}}, []), (6, "ostvane", "clients", []),
                (8, "brevatto", {"clients": [7, "phone", [], entry()], "display_url": 7}, ["httppost"]),
                (9, "sollwick", {"clients": []}, [])):
            self.lab.put(name, storebag(backends={"httppost": section}))
            with self.subTest(section), self.serving("can't find the client list.", "Backend") as daemon:
                client = self.client(client_type=client_type)
                self.assertEqual(client.backends, backends)
                self.assertEqual(client.ask("fetchDisplayURL:")["reply"], "URL not available")

    def test_thousand_entries_and_filters(self):
        filters = [{"key": f"field{n}", "action": ("remove", "sha256", "keep")[n % 3], "method": 5} for n in range(1000)]
        self.serve(*(entry(f"client{n:03}") for n in range(999)), entry("phone", filters=filters))
        with self.serving():
            begin = time.monotonic()
            client = self.client()
            self.assertLess(time.monotonic() - begin, 1)
            event = client.event(**{f"field{n}": "x" for n in range(0, 1000, 10)})
        kept = {key: value for key, value in event.items() if key.startswith("field")}
        self.assertEqual({key: len(value) for key, value in kept.items()},
                         {f"field{n}": 64 if n % 3 == 1 else 1 for n in range(0, 1000, 10) if n % 3})
