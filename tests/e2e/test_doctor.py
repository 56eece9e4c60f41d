# SPDX-License-Identifier: Apache-2.0
"""veltractl doctor: set-ups with one fault each, the check that finds it, and its advice."""
import json
import os
import pathlib
import subprocess
import tempfile
import unittest

from harness import DEADLINE, ENTITLEMENT, SystemTest, closed_port, program, storebag

NAMES = ["daemon", "entitlement", "storebagAddress", "nameResolution", "trust", "storebag", "signature", "environment",
         "clientTypes", "consent", "messageLog", "sandbox", "descriptors", "clock"]
ON_THE_WAY = NAMES[3:8]
OBSERVE, NOBODY = "com.florn.veltrad.observe", 65534
RETIRED = "var/mobile/Library/Logs/Zentrel/Retired"
PREFERENCES = {"environmentType": 4, "DiagnosticLogSubmissionEnabled": True}
# Log lines of the daemon about the faults.
LOGGED = ("fetchStorebag", "Entitlements", "storebagServerURL", "userDefaults", "ca.pem", "certificate")


class Doctor(SystemTest):
    def doctor(self, *arguments, **options):
        """Returns the checks by name; verifies the exit status, "ok" and the form."""
        veltractl = self.root.copy_of("veltractl") if "user" in options else program("veltractl")
        done = subprocess.run([veltractl, "doctor", "--json", *arguments], capture_output=True, text=True,
                              env=self.root.environment(), timeout=DEADLINE, **options)
        answer = json.loads(done.stdout)
        self.assertEqual([check["name"] for check in answer["checks"]], NAMES)
        failed = any(check["result"] == "failure" for check in answer["checks"])
        self.assertEqual((answer["ok"], done.returncode), (not failed, int(failed)))
        for check in answer["checks"]:
            self.assertEqual(sorted(check), ["mend", "name", "result", "text"])
            self.assertEqual(bool(check["mend"]), check["result"] in ("warning", "failure"), check)
        return {check["name"]: check for check in answer["checks"]}

    def finds(self, name, result, words, types=(7,), skipped=None):
        """One check has the result, and the words stand in its text or mend; no other check fails."""
        checks = self.doctor(*(word for number in types for word in ("--client-type", str(number))))
        found = checks[name]
        self.assertEqual(found["result"], result, found)
        for word in words:
            self.assertIn(word, found["text"] + " " + found["mend"])
        self.assertEqual([n for n in NAMES if checks[n]["result"] == "failure" and n != name], [], checks)
        if skipped is not None:
            self.assertEqual([n for n in NAMES if checks[n]["result"] == "skipped"], skipped)
        return found

    def repair(self):
        self.root.preferences = dict(PREFERENCES)
        self.root.grant([{"uid": os.getuid(), "entitlements": {ENTITLEMENT: True}}])
        self.root.use(self.lab)
        self.lab.reset()
        self.lab.put("quindle", storebag())
        retired = self.root.path / RETIRED
        if retired.is_file():
            retired.unlink()

    def prefer_without(self, key, **preferences):
        self.root.preferences.pop(key)
        self.root.prefer(**preferences)

    def other_key(self):
        with tempfile.TemporaryDirectory() as directory:
            subprocess.run([program("veltra-storebag"), "keygen", directory], check=True, capture_output=True)
            return pathlib.Path(directory, "publicKey.der").read_bytes()

    def misbehave(self, **rule):
        self.lab.control(path="/storebags", **rule)

    def test_a_sound_device(self):
        with self.serving(*LOGGED) as daemon:
            checks = self.doctor("--client-type", "7", "--client-type", "13")
            self.assertEqual({n for n in NAMES if checks[n]["result"] != "ok"} - {"sandbox", "descriptors"}, set(), checks)
            self.assertIn(f"process {daemon.popen.pid}", checks["daemon"]["text"])
            self.assertEqual(len(self.lab.received("storebags")), 1)
            # Nobody has asked for a storebag yet, so all are looked at; a fleet need not have them all.
            self.finds("storebag", "warning", ("HTTP 404", "pellmarch"), ())
            self.started(6)
            found = self.finds("clientTypes", "ok", ("ostvane",), (), [])
            self.assertNotIn("quindle", found["text"])
            self.misbehave(status=503, body="busy")
            lines = self.ctl("doctor", status=1)[0].splitlines()
            at = next(i for i, line in enumerate(lines) if line.startswith("failure storebag "))
            self.assertIn("HTTP 503", lines[at])
            self.assertTrue(lines[at + 1].startswith("        to do: "), lines[at + 1])

    def test_what_can_be_mended_while_the_daemon_runs(self):
        root, lab, key = self.root, self.lab, "DiagnosticLogSubmissionEnabled"
        gone = lambda name: (root.path / name).unlink()
        rule = lambda **more: [{"entitlements": {ENTITLEMENT: True}, **more}]

        def block():
            (root.path / RETIRED).rmdir()
            root.write(RETIRED, b"")
        rows = [
            (lambda: gone("etc/veltrad/entitlements.plist"), "entitlement", "failure", ("entitlements.plist", ENTITLEMENT)),
            (lambda: root.write("etc/veltrad/entitlements.plist", b"<plist><array>"), "entitlement", "failure",
             ("entitlements.plist: ", "array of rules")),
            (lambda: root.grant({"uid": 0}), "entitlement", "failure", ("array of rules",)),
            (lambda: root.grant([]), "entitlement", "failure", ("anybody", "add a rule")),
            (lambda: root.grant(rule(uid="root")), "entitlement", "failure", ('"uid" is no user id',)),
            (lambda: root.grant([{"uid": os.getuid(), "entitlements": {ENTITLEMENT: 1}}]), "entitlement", "failure", ("add",)),
            (lambda: root.grant(rule(uid=os.getuid() + 1)), "entitlement", "warning", (f"uid {os.getuid()}", "add a rule")),
            (lambda: self.prefer_without(key), "consent", "failure", (f"veltractl config set {key} true",)),
            (lambda: root.prefer(**{key: "yes"}), "consent", "failure", ("not a boolean", key)),
            (lambda: root.prefer(**{key: False}), "consent", "warning", ("refused", key)),
            (lambda: gone("etc/veltrad/ca.pem"), "trust", "failure", ("etc/veltrad/ca.pem",)),
            (lambda: root.write("etc/veltrad/ca.pem", b"no certificate"), "trust", "failure", ("etc/veltrad/ca.pem",)),
            (lambda: gone("usr/share/veltra/publicKey.der"), "signature", "failure", ("publicKey.der", "install")),
            (lambda: root.write("usr/share/veltra/publicKey.der", b"no key"), "signature", "failure", ("publicKey.der",)),
            (lambda: root.write("usr/share/veltra/publicKey.der", self.other_key()), "signature", "failure",
             ("publicKey.der", "SHA-256", '"quindle"')),
            (lambda: self.misbehave(sign="wrong"), "signature", "failure", ("publicKey.der", '"quindle"')),
            (lambda: self.misbehave(sign="missing"), "signature", "failure", ("not signed", '"quindle"')),
            (lambda: self.misbehave(status=404, body="Not found"), "storebag", "failure", ("HTTP 404", '"quindle"', "sign")),
            (lambda: self.misbehave(body="<html>Welcome</html>"), "storebag", "failure", ("no property list", "publish")),
            (lambda: self.misbehave(cut=True), "storebag", "failure", ('"quindle"', lab.url)),
            (lambda: lab.put("quindle", {"version": "v1", "development": {}}), "environment", "failure",
             ("release", "environmentType")),
            (block, "messageLog", "failure", ("Retired", "directory")),
        ]
        with self.serving(*LOGGED):
            for number, (broken, name, result, words) in enumerate(rows):
                with self.subTest(row=number, check=name):
                    self.repair()
                    broken()
                    self.finds(name, result, words)
            self.repair()
            self.finds("clientTypes", "warning", ("3, 99",), (3, 7, 99), [])
            self.finds("clientTypes", "warning", ("5 to 17",), (0,), ON_THE_WAY)

    def test_what_takes_a_start(self):
        """Each row: the preferences, deployment.plist, the check and its words, what it makes moot."""
        https = f"https://localhost:{closed_port()}/bags"
        example, address = ("veltra_storebag_url", "deployment"), "storebagAddress"
        rows = [({}, None, address, (*example, "built-in example"), ON_THE_WAY),
                ({}, b"<plist>", address, (*example, "deployment.plist:1:"), ON_THE_WAY),
                ({}, {"publicStorebagHost": "a/b"}, address, (*example, "host name"), ON_THE_WAY),
                ({"veltra_storebag_url": "https://storebags.example/bags/maple"}, None, address, example, ON_THE_WAY),
                ({"veltra_storebag_url": https.replace("https", "http")}, None, address, ("https://",), ON_THE_WAY),
                ({"veltra_storebag_url": "https://no-such-host.invalid/bags"}, None, "nameResolution",
                 ("no-such-host.invalid", "veltra_storebag_url"), ON_THE_WAY[1:]),
                ({"veltra_storebag_url": https}, None, "storebag", (https, '"quindle"'), ["trust", *ON_THE_WAY[3:]]),
                ({"environmentType": 0}, None, "environment", ("config set environmentType",), [])]
        for preferences, deployment, name, words, skipped in rows:
            with self.subTest(preferences=preferences, deployment=deployment):
                self.repair()
                if name == address:
                    self.root.preferences.pop("veltra_storebag_url")
                self.root.prefer(**preferences)
                if deployment is not None:
                    self.root.write("etc/veltrad/deployment.plist", deployment)
                with self.serving(*LOGGED):
                    self.finds(name, "failure", words, skipped=skipped)
                    if not preferences and deployment is None:
                        self.repair()
                        self.finds(address, "failure", ("veltra_storebag_url", "systemctl restart veltrad"))
                (self.root.path / "etc/veltrad/deployment.plist").unlink(missing_ok=True)

    def test_few_descriptors(self):
        for limit, result in ((80, "failure"), (300, "warning")):
            with self.subTest(limit), self.serving(*LOGGED, wrapper=("prlimit", f"--nofile={limit}")):
                self.finds("descriptors", result, (str(limit), "LimitNOFILE="))

    def test_without_a_daemon(self):
        self.finds("daemon", "failure", ("systemctl start veltrad",), skipped=NAMES[1:])

    @unittest.skipIf(os.getuid() != 0, "only root can be another user")
    def test_who_may_not_ask(self):
        """Each row: what uid 65534 is granted, what it is told of itself."""
        with self.serving(*LOGGED):
            for granted, result in (({}, "failure"), ({ENTITLEMENT: True}, "ok")):
                self.root.grant([{"uid": NOBODY, "entitlements": granted}])
                checks = self.doctor(user=NOBODY)
                self.assertEqual((checks["daemon"]["result"], checks["entitlement"]["result"]), ("ok", result))
                self.assertEqual({checks[name]["result"] for name in NAMES[2:]}, {"skipped"})
                self.assertIn(OBSERVE, checks["storebag"]["text"])
            self.root.grant([{"uid": NOBODY, "entitlements": {OBSERVE: True}}])
            checks = self.doctor("--client-type", "7", user=NOBODY)
            self.assertEqual((checks["entitlement"]["result"], checks["environment"]["result"]), ("failure", "ok"))
