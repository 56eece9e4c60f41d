# SPDX-License-Identifier: Apache-2.0
"""veltra-storebag as whoever writes a storebag uses it: files, standard input, exit statuses, an editor's schema."""
import json
import pathlib
import subprocess
import tempfile
import unittest

from harness import SOURCE, program

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


if __name__ == "__main__":
    unittest.main()
