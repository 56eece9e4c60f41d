# SPDX-License-Identifier: Apache-2.0
"""veltra-storebag for writing storebags: files, standard input, exit statuses, an editor's schema."""
import functools
import json
import os
import pathlib
import re
import shutil
import subprocess
import tempfile
import unittest
import xml.etree.ElementTree

from harness import SOURCE, program

# An existing validator of JSON Schema. Prints the errors of each storebag.
VALIDATOR = """const {schema, bags} = JSON.parse(require('fs').readFileSync(0)), Ajv = require('ajv');
const ajv = new Ajv({allErrors: true, schemaId: '$id'});
if (!ajv.validateSchema(schema)) throw new Error(ajv.errorsText());
const check = ajv.compile(schema);
console.log(JSON.stringify(bags.map(bag => check(bag) ? [] : check.errors)));"""
NODE = {**os.environ, "NODE_PATH": "/usr/share/nodejs"}
HAS_VALIDATOR = shutil.which("node") and subprocess.run(["node", "-e", "require('ajv')"], env=NODE, capture_output=True).returncode == 0

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
        nowhere = self.path / "nowhere"
        status, found, error = run("lint", "--json", nowhere, wrong, self.path)
        self.assertEqual((status, json.loads(found)), (1, json.loads(text)))
        self.assertRegex(error, rf"^veltra-storebag: .*{nowhere}.*\nveltra-storebag: .*{self.path}.*\n$")
        self.assertEqual(run("lint", nowhere, good), (1, "", error.splitlines(keepends=True)[0]))
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

    @unittest.skipUnless(HAS_VALIDATOR, "there is no node-ajv")
    def test_schema(self):
        schema = json.loads(run("schema")[1])
        good = (bag(), bag(client="a,b c", override_dnu=True, per_country_sampling_thresholds=[{"country": ["US"], "threshold": 1}]),
                {"version": "1", "release": {"dashboard": {"ip": "10.0.0.1", "port": 1, "reliable": 50}, "ampery": {"active": True}}})
        bad = (bag(sampling_threshold=2), bag(client="a, b"), bag(filters=[{"key": "a"}]), bag(post_url="http://a"), bag(surprise=1),
               bag(locale_whitelist=[]), {"release": {}}, {"version": "1", "release": {"dashboard": {"ip": "name", "port": 1}}},
               bag(filters=[{"key": "a ", "action": "remove"}]), {"version": "1", "release": {"ampery": {"surprise": 1}}})
        done = subprocess.run(["node", "-e", VALIDATOR], env=NODE, input=json.dumps({"schema": schema, "bags": good + bad}),
                              capture_output=True, text=True)
        self.assertEqual((done.returncode, done.stderr), (0, ""))
        for content, errors in zip(good + bad, json.loads(done.stdout)):  # the schema says what lint says
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
        suite["cases"] = [{"given": {"clientType": 7}, "expect": {"htppost": {"absent": ["peer"]}}}]
        self.assertIn('unknown back end "htppost": did you mean "httppost"?', run("test", self.file("suite", suite))[2])


    def test_what_is_played_is_checked(self):
        bare, files = self.file("bag", bag()), {
            "device": '{"DeviceNam": "Elm"}', "policy.json": '{\n  "hosts": "a.example"}', "messages": '\n{"op": "send", "category": 7}\n'}
        files = {name: self.file(name, content) for name, content in files.items()}
        for options, status, said in (
                (("--draw", "httppst=0.5"), 2, 'unknown back end "httppst": did you mean "httppost"?'),
                (("--draw", "1.5"), 2, "1.5 is no sampling factor: expected a number from 0 to 1"),
                (("--country", "USA"), 2, '"USA" is no country: expected two letters like US'),
                (("--environment", "relase"), 2, 'did you mean "release"?'), (("--user-info", "room"), 2, "expected KEY=VALUE"),
                (("--category", "5"), 1, "a message needs --category and --type"),
                (("--device", files["device"]), 1, f'{files["device"]}: unknown key "DeviceNam": did you mean "DeviceName"?'),
                (("--policy", files["policy.json"]), 1, f'{files["policy.json"]}:2:3: "hosts" is "a.example": expected an array of texts'),
                (("--messages", files["messages"]), 1, f'{files["messages"]}:2:1: "type" is missing: expected an integer')):
            told = run("explain", bare, *options)
            self.assertEqual((told[0], told[1]), (status, ""), options)
            self.assertIn(said, told[2])
        told = json.loads(run("explain", "--json", bare, "--client-type", 7, "--country", "us", "--require-user-info", "--client", "x")[1])
        self.assertEqual(told["backends"]["httppost"]["reason"], "reports")

    def test_what_was_removed_or_hashed(self):
        """As each event leaves: the user info takes the place of the message's fields, and filters come last."""
        for policy, key, action, given, info, removed, hashed in (
                ({}, "a", "sha256", "x", 7, [], ["a"]), ({}, "a", "sha256", [1], None, ["a"], []),
                ({"hash": ["A"]}, "a", "keep", [1], None, ["a"], []), ({"hash": ["A"]}, "a", "keep", [1], 7, [], ["a"]),
                ({"hash": ["A"]}, "a", "remove", "x", None, ["a"], []), ({"hash": ["A"]}, "a", "sha256", "x", None, [], ["a"]),
                ({}, "_sender", "sha256", [1], None, [], ["_sender"]),
                ({"remove": ["_sender"]}, "_sender", "sha256", "x", None, [], ["_sender"])):
            with self.subTest(policy=policy, key=key, action=action, given=given, info=info):
                played = self.file("bag", bag(filters=[{"key": key, "action": action}])), self.file("policy.json", policy)
                told = json.loads(run("explain", "--json", played[0], "--policy", played[1], "--client-type", 7, "--country", "US",
                                      "--require-user-info", "--client", "x", *(("--user-info", f"a={info}") if info else ()),
                                      "--category", 5, "--type", 2, "--payload", self.file("payload", {key: given}))[1])
                post = told["backends"]["httppost"]
                self.assertEqual((post["removed"], post["hashed"], key in post["events"][1]), (removed, hashed, bool(hashed)))

    def edited(self, storebag, edits):
        """The storebag with other values; numbers among "clients" stand for its entries."""
        entries = storebag["release"]["httppost"]["clients"]

        def resolved(value):
            if isinstance(value, dict):
                return {key: [entries[one] if isinstance(one, int) else one for one in item] if key == "clients" else resolved(item)
                        for key, item in value.items()}
            return value
        made = json.loads(json.dumps(storebag))
        for path, value in edits.items():
            *way, last = [int(step) if step.isdigit() else step for step in path.split("/")]
            place = functools.reduce(lambda at, step: at[step], way, made)
            place[last] = resolved({last: value})[last]
            if value is None:
                del place[last]
        return made

    def test_differences(self):
        text = (SOURCE / "tests/tools/storebag/diffs.json").read_text()
        prepared = json.loads(re.sub("^//.*", "", text, flags=re.MULTILINE))
        for pair in prepared["pairs"]:
            with self.subTest(edit=pair["edit"]):
                before = self.edited(prepared["storebag"], pair.get("given", {}))
                old, new = self.file("old", before), self.file("new", self.edited(before, pair["edit"]))
                status, text, error = run("diff", "--json", old, new)
                told = [[change[key] for key in ("effect", "kind", "section", "backend", "client", "key", "text")]
                        for change in json.loads(text)["changes"]]
                self.assertEqual((told, error), (pair["expect"], ""))
                self.assertEqual(status, int(any(row[0] == "more" for row in pair["expect"])))
                text = run("diff", old, new)[1]
                self.assertEqual([row[6] for row in pair["expect"] if row[6] not in text], [])

    def test_differences_in_a_long_list(self):
        entries = [{**ENTRY, "service": f"s{n}."} for n in range(50)]
        old, new = (self.file(name, {"release": {"httppost": {"clients": clients}}})
                    for name, clients in (("old", entries), ("new", entries[::-1])))
        status, text, _ = run("diff", "--json", old, new)
        changes = json.loads(text)["changes"]
        self.assertEqual((status, [one["text"] for one in changes if one["effect"] != "other"]), (1, [
            'texts in "service" have other places: of names that hold two of them, only 1000 pairs were compared, and more may leave']))
        self.assertEqual(run("diff", old, old)[0], 0)

    def test_differences_of_messages(self):
        lines = [{"event": "message", "message": 4, "from": "client", "clientType": 7, "client": "phone", "category": 5, "type": 1,
                  "payload": {"peer": "x", "number": "1"}, "userInfo": {"clientName": "phone"}, "storebag": {"section": "release"}},
                 {"event": "step", "message": 4, "backend": "httppost", "step": "posted"},
                 {"event": "message", "message": 5, "clientType": 7, "client": "lamp", "category": 5, "type": 1, "payload": {}},
                 {"op": "send", "category": 6, "type": 1, "payload": {"number": "1"}}]
        recorded = self.file("recorded", "".join(json.dumps(line) + "\n" for line in lines))
        old = self.file("old", bag(client="phone", filters=[{"key": "peer", "action": "remove"}, {"key": "number", "action": "sha256"}]))
        new = self.file("new", bag(client="phone", post_url="https://d.example/e"))
        options = ("--messages", recorded, "--client-type", 7, "--country", "US", "--consent", "yes", "--draw", "0.4")
        status, text, _ = run("diff", "--json", *options, old, new)
        self.assertEqual((status, json.loads(text)["messages"]), (1, {"total": 3, "changed": 2, "list": [
            {"line": 1, "was": "httppost: posted to https://c.example/e, without peer, with hashed number",
             "is": "httppost: posted to https://d.example/e, without peer"},
            {"line": 4, "was": "httppost: posted to https://c.example/e", "is": "httppost: posted to https://d.example/e"}]}))
        self.assertIn("2 of 3 messages have another fate", run("diff", *options, old, new)[1])
        status, text, _ = run("diff", "--json", "--messages", recorded, old, "-", given=old.read_text())
        self.assertEqual((status, json.loads(text)), (0, {"changes": [], "messages": {"total": 3, "changed": 0, "list": []}}))


if __name__ == "__main__":
    unittest.main()
