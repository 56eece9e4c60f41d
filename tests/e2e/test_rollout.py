# SPDX-License-Identifier: Apache-2.0
"""The rules for storebags: all commands of docs/rollout.md, attacks on a daemon with all settings on, the record of seen
storebags, and open sessions that follow their storebag."""
import json
import os
import pathlib
import plistlib
import re
import subprocess
import tempfile

from harness import BUILD, DEADLINE, SOURCE, SystemTest, program, storebag, wait_until

SETTINGS = "etc/veltrad/settings.json"
SEEN = "var/lib/veltrad/seen-storebags.json"
RULES = {"rollback": "refuse", "expiry": "honour", "names": "check", "signature": "ed25519"}
NAME, TYPE = "ostvane", 6
REFUSED = f"Storebag '{NAME}' refused: "
FAILED = ("Unable to fetch storebag", "Could not fetch storebag", REFUSED)


class Rollout(SystemTest):
    def settle(self, keys=("lab",), **storebags):
        for name in keys:
            source = self.lab.path / "signing" / ("" if name == "lab" else name)
            for part in ("publicKey.der", "ed25519.der"):
                self.root.write(f"etc/veltrad/keys/{name}-{part}", (source / part).read_bytes())
        files = [f"{name}-{part}" for name in keys for part in ("publicKey.der", "ed25519.der")]
        self.root.write(SETTINGS, json.dumps({"keys": files, "storebags": storebags}).encode())

    def make_keys(self, name):
        directory = str(self.lab.path / "signing" / name)
        for option in ((), ("--ed25519",)):
            subprocess.run([program("veltra-storebag"), "keygen", directory, *option], check=True, capture_output=True)

    def serve(self, **bag):
        self.lab.reset()
        self.lab.control(path=f"/storebags/maple/{NAME}", bag={"serial": 5, "name": NAME, "validFor": 3600, **bag})

    def refresh(self, name=NAME):
        done = subprocess.run([program("veltractl"), "refresh", name, "--json"], capture_output=True, text=True,
                              env=self.root.environment(), timeout=2 * DEADLINE)
        answer = json.loads(done.stdout)["storebags"][0]
        self.assertEqual(done.returncode, 0 if answer["result"] == "fetched" else 1)
        return answer

    def fetched(self, **bag):
        self.serve(**bag)
        self.assertEqual(self.refresh()["result"], "fetched")

    def backends(self):
        session, backends = self.open(TYPE, session_id=43)
        session.close()
        return backends

    def advice(self):
        """The failed checks of the doctor: name, text and what to do."""
        done = subprocess.run([program("veltractl"), "doctor", "--json", "--client-type", str(TYPE)], capture_output=True,
                              text=True, env=self.root.environment(), timeout=2 * DEADLINE)
        return [(one["name"], one["text"] + " " + one["mend"]) for one in json.loads(done.stdout)["checks"]
                if one["result"] == "failure"]


class Attacks(Rollout):
    def container(self, **bag):
        self.serve(**bag)
        return plistlib.loads(self.lab.request("GET", f"/storebags/maple/{NAME}")[1])

    def mix(self):
        """The bag and RSA signature of one state, the Ed25519 signature of another."""
        older, newer = self.container(serial=6), self.container(serial=7)
        self.lab.reset()
        path = self.lab.path / "storebags" / NAME
        path.write_bytes(plistlib.dumps({**newer, "signatures": older["signatures"]}))
        self.addCleanup(path.unlink, missing_ok=True)

    def misbehave(self, **rule):
        self.lab.reset()
        self.lab.control(path="/storebags", **rule)

    def without_serial(self):
        self.lab.reset()
        self.lab.control(path=f"/storebags/maple/{NAME}", bag={"name": NAME, "validFor": 3600})

    def test_each_is_refused_with_its_line_and_its_advice(self):
        self.make_keys("stranger")
        self.make_keys("stolen")
        self.settle(("lab", "stolen"), openSessions="follow", persist=True, **RULES)
        past = "2025-06-01T00:00:00Z"
        # Each row: the attack, how it is done, what the log says, the check that finds it, what it advises.
        rows = (
            ("any bag", lambda: self.serve(key="stranger", ed25519=["stranger"]), "Signature can not be verified",
             "signature", "private key"),
            ("a forged first signature alone", lambda: self.serve(ed25519=[]),
             REFUSED + "it has no Ed25519 signature of a known key", "signature", "sign --ed25519 KEY"),
            ("a second signature by a stranger", lambda: self.serve(ed25519=["stranger"]),
             REFUSED + "it has no Ed25519 signature of a known key", "signature", '"keys"'),
            ("mix", self.mix, REFUSED + "it has no Ed25519 signature of a known key", "signature", "sign --ed25519 KEY"),
            ("rollback", lambda: self.serve(serial=4), REFUSED + "serial 4 is lower than 5", "storebag", "--serial N"),
            ("rollback to before serials", self.without_serial, REFUSED + "it has no serial, the last one had 5", "storebag",
             "--serial N"),
            ("freeze", lambda: self.serve(clock=past), REFUSED + "expired on 2025-06-01T01:00:00Z", "storebag",
             "--expires DATE"),
            ("wrong name", lambda: self.serve(name="quindle"), REFUSED + "its name is 'quindle'", "storebag", "--name NAME"),
            ("its only key revoked", lambda: self.serve(revoked=["signing"]), " is revoked", "signature", "not revoked"),
            ("endless data", lambda: self.misbehave(endless=True), "propertyListWithData error", "storebag", "publish"),
            ("slow retrieval", lambda: self.misbehave(stall=True), "Error resolving with lookup server", "storebag",
             "storebag server runs and answers"))
        with self.serving("fetchStorebag", *FAILED) as daemon:
            self.fetched()
            for attack, begin, line, check, words in rows:
                with self.subTest(attack):
                    begin()
                    before = len(daemon.text)
                    if attack != "slow retrieval":  # the doctor waits 15 s for it, too
                        answer = self.refresh()
                        self.assertIn(answer["result"], ("refused", "failed"))
                    if line.startswith(REFUSED):
                        self.assertEqual(answer["reason"], line[len(REFUSED):])
                    (name, advice), = self.advice()
                    daemon.wait_for(lambda lines: any(line in one for one in lines[before:]), line)
                    self.assertEqual(name, check)
                    self.assertIn(words, advice)
                    (self.lab.path / "storebags" / NAME).unlink(missing_ok=True)
            # The twelfth attack: a stolen key uses a very high serial, until the owner's storebag revokes the key.
            self.fetched(serial=2**53 - 1, key="stolen", ed25519=["stolen"])
            self.serve(serial=6)
            self.assertEqual(self.refresh()["reason"], f"serial 6 is lower than {2**53 - 1}")
            self.fetched(serial=6, revoked=["stolen"])
            self.serve(serial=7, key="stolen", ed25519=["stolen"])
            self.assertRegex(self.refresh()["reason"], "^key [0-9a-f]{16} is revoked$")
            self.assertIn("not revoked", self.advice()[0][1])
            # Meanwhile the last good one stays in use.
            self.assertEqual(self.open(TYPE)[1], ["httppost"])
            shown = json.loads(self.ctl("status", "--json")[0])["storebags"]
            self.assertRegex(next(one["refusal"] for one in shown if one["name"] == NAME), "is revoked")
        counts = self.counts()
        for reason in ("its serial is lower than the highest seen, or missing", "it has expired", "its key is revoked",
                       "its name is not the one asked for", "it has no Ed25519 signature of a known key"):
            self.assertGreaterEqual(counts["storebag refused: " + reason], 2, reason)  # refresh and doctor


class Memory(Rollout):
    def test_what_was_seen_outlives_the_daemon_and_is_not_guessed(self):
        self.make_keys("old")
        self.settle(("lab", "old"), **RULES)
        seen = self.root.path / SEEN
        with self.serving(*FAILED):
            self.fetched(serial=5, key="old", ed25519=["old"])
            self.fetched(serial=8, revoked=["old"])
        self.assertEqual(seen.stat().st_mode & 0o777, 0o600)
        good = seen.read_bytes()
        with self.serving(*FAILED):
            self.serve(serial=7)
            self.assertEqual(self.refresh()["reason"], "serial 7 is lower than 8")
            self.serve(serial=9, key="old", ed25519=["old"])
            self.assertIn("is revoked", self.refresh()["reason"])
            session, backends = self.open(TYPE)
            self.assertIsNone(backends)
            session.send(number=1)
            self.assertIn('"storebag_key_revoked"', self.ctl("why", "--json", "--last", "1")[0])
        seen.write_bytes(good[:len(good) // 2])
        with self.serving(*FAILED):
            self.serve(serial=8)
            self.assertIn(f"{seen}: torn", self.refresh()["reason"])
            (name, advice), = self.advice()
            self.assertEqual(name, "storebag")
            self.assertIn(f"remove {seen}", advice)
            seen.unlink()
            self.assertEqual(self.refresh()["result"], "fetched")
        # Without the settings nothing is checked.
        (self.root.path / SETTINGS).unlink()
        before = seen.read_bytes()
        with self.serving():
            self.serve(serial=1, key="signing", ed25519=[], name="else", clock="2025-06-01T00:00:00Z")
            self.assertEqual(self.refresh()["result"], "fetched")
            self.assertEqual(self.open(TYPE)[1], ["httppost"])
        self.assertEqual(seen.read_bytes(), before)

    def test_what_has_expired_is_not_used_any_more(self):
        self.settle(expiry="honour", persist=True)
        with self.serving("fetchStorebag", *FAILED) as daemon:
            self.fetched(validFor=3)
            self.assertEqual(self.open(TYPE)[1], ["httppost"])
            self.lab.reset()
            self.lab.control(path="/storebags", cut=True)  # so that nothing newer comes
            daemon.allow("Error resolving")
            wait_until(lambda: self.backends() is None, "a session without back ends")
            daemon.wait_for_line(REFUSED + "expired on ")
        with self.serving("fetchStorebag", "is not used and removed", *FAILED) as daemon:  # nor what was kept
            self.assertIsNone(self.open(TYPE)[1])
            daemon.wait_for_line("is not used and removed: expired on ")


class Following(Rollout):
    BATCH = ("--client", "phone", "--service", "ringer", "--require-user-info", "--batch-events")

    age = 100

    def put(self, version, path="events", bag=None, **more):
        """Each one is newer than those before."""
        self.age -= 10
        bag = bag or storebag(version, post_url="${url}/" + path, **more)
        self.lab.put(NAME, {"refresh_cycle": 1, **bag, "version": version}, self.age)

    def factors(self, daemon):
        return [line.split("samplingFactor=")[1].split(",")[0] for line in daemon.text if "samplingFactor=" in line]

    def test_an_open_session_goes_on_with_the_new_section(self):
        self.put("v1")
        self.root.write(SETTINGS, b'{"storebags": {"openSessions": "follow"}}')
        with self.serving() as daemon:
            session, backends = self.open(TYPE, identity=self.BATCH)
            idle, _ = self.open(TYPE, identity=self.BATCH, session_id=43)
            self.assertEqual(backends, ["httppost"])
            session.send(number=1)
            self.put("v2", "elsewhere", filters=[{"key": "secret", "action": "remove"}])
            daemon.wait_for_line(f"takeNews: Session 42 goes on with storebag '{NAME}', version v2")
            daemon.wait_for_line(f"takeNews: Session 43 goes on with storebag '{NAME}', version v2")
            session.send(number=2, secret="s")
            session.ask("flush")
            post = wait_until(lambda: [one for one in self.lab.received("events") if one["path"] == "/elsewhere"], "the post")[0]
            events = post["body"]["events"]
            self.assertEqual([event["_eventNumber"] for event in events], [1, 2, 3])
            self.assertEqual([event.get("number") for event in events], [None, 1, 2])
            self.assertNotIn("secret", events[2])
            factors = self.factors(daemon)
            self.assertEqual(len(set(factors)), 2, factors)  # one of each session
            # The kill switch, also for one that is silent.
            session.send(number=3)
            self.put("off", bag={"release": {}})
            daemon.wait_for_line(f"takeNews: Session 43 goes on with storebag '{NAME}', version off")
            daemon.wait_for_line(f"takeNews: Session 42 goes on with storebag '{NAME}', version off")
            self.assertEqual(session.ask("states", userInfo={"clientName": "phone", "serviceName": "ringer"})["backends"], [])
            self.assertIsNone(session.send(number=4)["reply"])
            shown = json.loads(self.ctl("status", "--json")[0])["sessions"]
            self.assertEqual([one["backends"] for one in shown], [[], []])
            self.put("v3")  # and on again
            daemon.wait_for_line(f"takeNews: Session 42 goes on with storebag '{NAME}', version v3")
            session.send(number=5)
            session.ask("flush")
            self.lab.wait_for_events(1, number=5)
            self.assertEqual(session.close(), 0)
            self.assertEqual(self.lab.wait_for_events(1, _method=0, _status=1)[0]["StorebagVersion"], "v3")
            idle.close()
        self.assertEqual([event["number"] for event in self.lab.events() if "number" in event], [1, 2, 5])


class Page(Rollout):
    def test_the_commands_of_the_page(self):
        page = (SOURCE / "docs/rollout.md").read_text()
        blocks = re.findall(r"^( *)```sh\n(.*?)^ *```$", page, re.M | re.S)
        directory = tempfile.TemporaryDirectory()
        self.addCleanup(directory.cleanup)
        where = pathlib.Path(directory.name)
        bag = json.loads(json.dumps({"refresh_cycle": 1, **storebag("v1")}).replace("${url}", self.lab.url))
        (where / "quindle.json").write_text(json.dumps(bag, indent=1))
        env = {**self.root.environment(), "PATH": f"{BUILD}/bin:{os.environ['PATH']}"}
        (self.lab.path / "storebags/quindle.plist").unlink()
        self.root.path.joinpath("usr/share/veltra/publicKey.der").unlink()
        ran = 0

        def run(command):
            for path in ("/etc/veltrad", "/usr/share/veltra"):
                command = command.replace(path, str(self.root.path) + path)
            command = command.replace("/srv/storebags", str(self.lab.path / "storebags"))
            done = subprocess.run(["bash", "-euc", command], cwd=where, env=env, capture_output=True, text=True, timeout=DEADLINE)
            return done.returncode, done.stdout + done.stderr

        with self.serving("fetchStorebag", "Unable to fetch storebag", "Storebag 'quindle' refused: ") as daemon:
            session = None
            for indent, block in blocks:
                block = "\n".join(line.removeprefix(indent) for line in block.split("\n"))
                quiet = []  # commands of which nothing is said
                for line in block.split("\n"):
                    told = re.fullmatch(r"(.*?)  # (prints|fails:) (.*)", line)
                    if not told:
                        quiet.append(line)
                        continue
                    status, output = run("\n".join(quiet))
                    self.assertEqual(status, 0, (quiet, output))
                    status, output = run(told[1])
                    self.assertEqual(status, 0 if told[2] == "prints" else 1, (line, output))
                    self.assertIn(told[3], output, line)
                    quiet, ran = [], ran + 1
                    if not session:
                        session, backends = self.open(7)
                        self.assertEqual(backends, ["httppost"])
                status, output = run("\n".join(quiet))
                self.assertEqual(status, 0, (quiet, output))
                if "off.json" in block:
                    daemon.wait_for_line("takeNews: Session 42 goes on with storebag 'quindle', version off")
            daemon.wait_for_line("takeNews: Session 42 goes on with storebag 'quindle', version v1")
        self.assertGreaterEqual(ran, 11)
        self.assertEqual(len(json.loads((self.root.path / SEEN).read_text())["revoked"]), 2)
