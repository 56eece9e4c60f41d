# SPDX-License-Identifier: Apache-2.0
"""veltra-storebag as whoever writes a storebag uses it: files, standard input, exit statuses, an editor's schema."""
import json
import os
import pathlib
import random
import subprocess
import tempfile
import unittest
import xml.etree.ElementTree

from harness import DEVICE, SOURCE, START, SystemTest, Wire, program

try:
    import jsonschema
except ImportError:
    jsonschema = None

ENTRY = {"locale_whitelist": ["US"], "filters": [{"key": "peer", "action": "remove"}], "sampling_threshold": 0.5,
         "post_url": "https://c.example/e"}
UNTIDY = """// Ours.
{ /* all */ "release": { "httppost": {"clients": [
    {"post_url": "https://c.example/e", // there
     "filters": [], "locale_whitelist": ["US"],

     // Everyone.
     "sampling_threshold": 1, "surprise": 1}
  // No more.
  ]}}, "version": "1" } // end
"""
TIDY = """// Ours.
{
  "version": "1",
  /* all */
  "release": {
    "httppost": {
      "clients": [
        {
          "locale_whitelist": ["US"],
          "filters": [],

          // Everyone.
          "sampling_threshold": 1,
          "post_url": "https://c.example/e", // there
          "surprise": 1
        }
        // No more.
      ]
    }
  }
}
// end
"""


def run(*arguments, given=None):
    done = subprocess.run([program("veltra-storebag"), *map(str, arguments)], input=given, capture_output=True, text=True)
    return done.returncode, done.stdout, done.stderr


def bag(**entry):
    return {"version": "1", "release": {"httppost": {"clients": [{**ENTRY, **entry}]}}}


class Workshop(unittest.TestCase):
    def setUp(self):
        directory = tempfile.TemporaryDirectory(prefix="veltra-")
        self.addCleanup(directory.cleanup)
        self.path = pathlib.Path(directory.name)

    def file(self, name, content):
        path = self.path / name
        path.write_text(content if isinstance(content, str) else json.dumps(content))
        return path

    def test_lint(self):
        good, noted = self.file("good", bag()), self.file("noted", bag(filters=[{"key": "ip", "action": "sha256"}]))
        wrong = self.file("wrong", '{"version": "1",\n "release": {"mivo": {"aktive": 1}}}')
        self.assertEqual(run("lint", good), (0, "nothing found\n", ""))
        self.assertEqual(run("lint", "-", given=good.read_text())[0], 0)
        self.assertEqual(run("lint", noted)[0], 0)
        status, text, _ = run("lint", good, noted, wrong)
        self.assertEqual(status, 1)
        self.assertRegex(text, rf"{noted}:1:\d+: note: .* \[guessable-hash\]\n{wrong}:2:23: error: .*did you mean \"active\"")
        self.assertEqual(run("lint", "--allow", "unknown-key", wrong)[:2], (0, "nothing found\n"))
        self.assertEqual(run("lint", "--allow", "unknown-kez", wrong)[0], 2)
        status, text, _ = run("lint", "--json", wrong)
        self.assertEqual(status, 1)
        self.assertEqual(json.loads(text), [{
            "file": str(wrong), "line": 2, "column": 23, "severity": "error", "name": "unknown-key",
            "path": "release.mivo.aktive", "message": 'unknown key "aktive": did you mean "active"?', "mend": 'Write "active".'}])
        self.assertEqual(run("lint", self.path / "nowhere")[0], 1)
        self.assertEqual(run("lint", "--lab", SOURCE / "examples/storebag.json")[0], 0)
        self.assertEqual(run("lint", SOURCE / "examples/storebag.json")[0], 1)

    def test_format(self):
        untidy = self.file("untidy", UNTIDY)
        self.assertEqual(run("fmt", untidy), (0, TIDY, ""))
        self.assertEqual(run("fmt", "-", given=TIDY), (0, TIDY, ""))
        self.assertEqual(run("fmt", "--check", untidy)[0], 1)
        untidy.chmod(0o640)
        self.assertEqual(run("fmt", "--write", untidy), (0, "", ""))
        self.assertEqual((untidy.read_text(), untidy.stat().st_mode & 0o777), (TIDY, 0o640))
        self.assertEqual(run("fmt", "--check", untidy)[0], 0)
        self.assertEqual(run("fmt", "--check", SOURCE / "examples/storebag.json")[0], 0)
        self.assertEqual(run("fmt", self.file("list", "<plist><dict/></plist>"))[0], 1)

    @unittest.skipUnless(jsonschema, "python3-jsonschema is not installed")
    def test_schema(self):
        schema = json.loads(run("schema")[1])
        jsonschema.Draft7Validator.check_schema(schema)
        validator = jsonschema.Draft7Validator(schema)
        good = (bag(), bag(client="a,b c", override_dnu=True, per_country_sampling_thresholds=[{"country": ["US"], "threshold": 1}]),
                {"version": "1", "release": {"dashboard": {"ip": "10.0.0.1", "port": 1, "reliable": 50}, "ampery": {}}})
        bad = (bag(sampling_threshold=2), bag(client="a, b"), bag(filters=[{"key": "a"}]), bag(post_url="http://a"), bag(surprise=1),
               bag(locale_whitelist=[]), {"release": {}}, {"version": "1", "release": {"dashboard": {"ip": "name", "port": 1}}})
        for content in good + bad:  # the schema says what lint says
            errors = [e.message for e in validator.iter_errors(content)]
            findings = json.loads(run("lint", "--json", "-", given=json.dumps(content))[1])
            self.assertEqual(not errors, content in good, (content, errors))
            self.assertEqual(any(f["severity"] == "error" for f in findings), content in bad, (content, findings))

    def test_suites(self):
        example = SOURCE / "examples/storebag.test.json"
        self.assertEqual(run("test", example)[0], 0)
        suite = json.loads(json.dumps({"storebag": "bag", "cases": [
            {"name": "right", "given": {"clientType": 7, "messages": [{"category": 1, "type": 2, "payload": {"peer": "x", "n": 1}}]},
             "expect": {"httppost": {"state": 2, "reason": "no_user_info_required", "present": ["n"], "equal": {"n": 1.0}}}},
            {"name": "<wrong>", "given": {"clientType": 7, "client": "x", "requireUserInfo": True, "country": "DE"},
             "expect": {"httppost": {"state": 2, "present": ["n"]}, "mivo": {"state": None}}}]}))
        self.file("bag", bag())
        path, report = self.file("suite", suite), self.path / "report.xml"
        status, text, _ = run("test", "--json", "--junit", report, path)
        told = json.loads(text)
        self.assertEqual((status, told["passed"], told["failed"]), (1, 1, 1))
        self.assertEqual(told["suites"][0]["cases"][1]["failures"], [
            {"backend": "httppost", "what": "state", "expected": 2, "got": 1},
            {"backend": "httppost", "what": "present", "expected": "n", "got": "no event leaves"}])
        cases = xml.etree.ElementTree.parse(report).getroot().findall("testsuite/testcase")
        self.assertEqual([(c.get("name"), len(c)) for c in cases], [("right", 0), ("<wrong>", 1)])
        suite["cases"][0]["given"]["clientTyp"] = 7
        status, _, error = run("test", self.file("suite", suite))
        self.assertEqual(status, 1)
        self.assertRegex(error, r'suite:1:\d+: unknown key "clientTyp" in "given": did you mean "clientType"')


def draws():
    """The daemon's sampling factors after a start: drand48 without a seed."""
    state = 0
    while True:
        state = (0x5DEECE66D * state + 0xB) % 2**48
        yield state / 2**48


RUN = {"_startTS", "_clientTS", "eventTime", "_sessionID", "_timezoneOffset", "_reportVers"}


class DaemonAndExplain(SystemTest):
    """What explain says equals what the daemon does, for random storebags, sessions and messages."""

    def entry(self, chance, name, i):
        pick = chance.choice
        entry = {"client": pick(["phone", "lamp", "phone,lamp", "Clock"]), "locale_whitelist": pick([["US"], ["US", "DE"], ["FR"]]),
                 "filters": [{"key": key, "action": pick(["remove", "sha256", "keep"]), **pick([{}, {}, {"method": 5}, {"status": 2}])}
                             for key in chance.sample(["a", "B", "c", "list", "room", "clientName"], chance.randrange(5))],
                 "sampling_threshold": pick([1, 0.6, 0.3, 0]), "override_sampling": pick([1, 0.5, 0]),
                 "event_threshold": pick([0, 1, 49]), "post_url": f"{self.lab.url}/events/{name}/{i}"}
        more = {"service": "ring", "expedite": pick([0, 1]), "override_dnu": pick([0, 1]), "device_blacklist": [pick(["Elm", "Oak"])],
                "realtime_post_url": f"{self.lab.url}/events/{name}/fast", "custom_clientId": 1, "hierarchy": 0,
                "per_country_sampling_thresholds": [{"country": ["US"], "threshold": pick([0.2, 1])}]}
        return {**entry, **{key: more[key] for key in more if chance.random() < 0.25}}

    def session(self, chance, number):
        names = {"clientName": chance.choice(["phone", "LAMP", "clock", "door"]), "serviceName": chance.choice(["ringer", "x"])}
        info = chance.choice([names, {**names, "room": "r", "a": "u"}, None])
        messages = [{"category": chance.choice([5, 6]), "type": chance.choice([2, 3]), "flag": chance.choice([0, 0, 0, 1, 2, 3]),
                     "payload": {key: chance.choice(["text", 7, 0.5, True, [1], {"b": 1}])
                                 for key in chance.sample(["a", "b", "c", "list", "d"], chance.randrange(5))}}
                    for _ in range(chance.randrange(4))]
        return {"number": number, "info": info, "messages": messages, "required": chance.random() < 0.8, "batch": chance.random() < 0.5}

    def explained(self, bag, session, factors, consent):
        lines = self.root.path / "messages.jsonl"
        lines.write_text("".join(json.dumps({"op": "send", **message}) + "\n" for message in session["messages"]))
        options = [x for k, v in (session["info"] or {}).items() for x in ("--user-info", f"{k}={v}")]
        options += ["--require-user-info"] * session["required"] + ["--batch-events"] * session["batch"]
        options += [x for k, v in factors.items() for x in ("--draw", f"{k}={v!r}")]
        status, text, error = run("explain", bag, "--client-type", 7, "--client-version", session["number"], "--country", "US",
                                  "--consent", "yes" if consent else "no", "--device", self.root.path / "device.json",
                                  "--messages", lines, "--json", *options)
        self.assertEqual(status, 0, error)
        return json.loads(text)["backends"]

    def play(self, session):
        wire = Wire(self.root)
        wire.call("setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:", hasAggregationBlock=False, frameworksToCheck=[],
                  sessionInfo={"clientType": 7, "sessionID": 1, "clientVersion": session["number"],
                               "requireUserInfo": session["required"], "batchEvent": session["batch"]},
                  **({"userInfo": session["info"]} if session["info"] else {}))
        backends = wire.call(START)["results"].get("backends")
        for message in session["messages"]:
            wire.call("sendMessageWithDictionary:reply:", message=message)
        wire.call("flushMessagesWithCompletion:")
        wire.close()
        return backends

    def test_random_storebags(self):
        seed = int(os.environ.get("VELTRA_SEED", "18"))
        bags, sessions = (int(os.environ.get(f"VELTRA_{what}", count)) for what, count in (("BAGS", "4"), ("SESSIONS", "12")))
        (self.root.path / "device.json").write_text(json.dumps(DEVICE))
        events = 0
        for i in range(bags):
            chance, factors, explained, consent = random.Random(seed + i), draws(), {}, i % 4 != 3
            content = {"version": f"v{i}", "release": {
                name: {"clients": [self.entry(chance, name, k) for k in range(chance.randrange(1, 5))]} for name in ("httppost", "httppost2")}}
            self.lab.put("quindle", content)
            (self.root.path / "bag.json").write_text(json.dumps(content))
            self.root.prefer(DiagnosticLogSubmissionEnabled=consent)
            seen = len(self.lab.received("events"))
            with self.serving("Quillfen", "user info provided without requiring it", "filters"):
                for number in range(sessions):
                    session = self.session(chance, number)
                    told = self.explained(self.root.path / "bag.json", session, {n: next(factors) for n in ("httppost", "httppost2")}, consent)
                    reporting = self.play(session)
                    self.assertEqual(reporting, [n for n in told if told[n]["state"] in (2, 3)], (seed, i, session, told))
                    for name, backend in told.items():
                        explained[name, str(number)] = (backend["events"], session)
            left = {}
            for post in self.lab.received("events")[seen:]:
                key = post["path"].split("/")[2], post["headers"]["X-VLT-Client-Version"]
                left.setdefault(key, []).extend(e for e in post["body"]["events"] if (e["_method"], e["_status"]) != (0, 1))
            for key, (expected, session) in explained.items():
                got = sorted(left.get(key, []), key=lambda e: e["_eventNumber"])
                bare = [[{k: v for k, v in e.items() if k not in RUN} for e in those] for those in (expected, got)]
                self.assertEqual(*bare, (seed, i, key, session))
                self.assertEqual([{k for k in e if e[k] is None} for e in expected], [RUN & set(e) for e in got])
                events += len(got)
        self.assertGreater(events, bags * sessions / 4)


if __name__ == "__main__":
    unittest.main()
