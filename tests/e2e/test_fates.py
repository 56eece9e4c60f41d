# SPDX-License-Identifier: Apache-2.0
"""Compares the output of `veltractl why` and `watch` with what servers and logs have seen of each message.

VELTRA_FATES is the number of random messages (300), VELTRA_SEED the seed."""
import json
import os
import plistlib
import random
import re
import signal
import subprocess
import tempfile

from harness import Process, Wire, program, storebag, wait_until
from test_family import Member
from test_https import HTTPSTest, entry

MESSAGES = int(os.environ.get("VELTRA_FATES", "300"))
SEED = int(os.environ.get("VELTRA_SEED", str(random.SystemRandom().randrange(1 << 32))))
HTTPS = ("httppost", "httppost2")
FIELDS = ("mac", "Number", "serial", "plain", "clientName")
UPLOADS = ("uploadFileAtPath:extensionToken:completionHandler:", "uploadLogData:completionHandler:")
SEND, ONE_SHOT = "sendMessageWithDictionary:reply:", "sendMessageWithSessionInfo:userInfo:category:type:payload:reply:"
LEFT = {"sent", "waiting", "acknowledged", "given_up"}


def lend(client, name, content):
    """Uploads a file and skips the call to remove it."""
    with tempfile.TemporaryFile() as file:
        file.write(content)
        file.flush()
        client._call += 1
        client.send(Wire.CALL, {"op": UPLOADS[0], "args": {"path": "/x/" + name}}, client._call, 1, [file.fileno()])
        while client.frame()[0] != Wire.REPLY:
            pass


class FatesTest(HTTPSTest):
    def why(self, *arguments):
        return [json.loads(line) for line in self.ctl("why", "--json", *arguments)[0].splitlines()]

    def watch(self, *arguments):
        watch = Process([program("veltractl"), "watch", "--json", *arguments], self.root.environment(), "stdout")
        self.addCleanup(watch.kill)
        return watch

    @staticmethod
    def lines(watch, event):
        return [line for line in map(json.loads, list(watch.text)) if line["event"] == event]


class Fates(FatesTest):
    def test_a_message_that_stays_says_which_entry_threshold_or_list_kept_it(self):
        self.serve(entry("other", service="phone"), entry("lamp", sampling_threshold=-1, override_sampling=-1),
                   entry("bell", filters=[{"key": "mac", "action": "remove"}, {"key": "number", "action": "sha256"}]))
        with self.serving():
            for name in ("phone", "lamp", "bell"):
                self.client(name, requireUserInfo=True).message(mac="m", number="n", kept=1)
            self.lab.wait_for_events(1, kept=1)
            wait_until(lambda: self.why("--client", "bell", "--category", "5")[0]["backends"]["httppost"]["status"], "an answer")
            told = {line["client"]: line["backends"]["httppost"] for line in self.why("--category", "5")}
            self.assertEqual({name: (told[name]["state"], told[name]["reason"], told[name]["fate"], told[name]["fateReason"])
                              for name in told},
                             {"phone": (1, "no_entry", "dropped", "no_entry"),
                              "lamp": (1, "sampled_out", "dropped", "sampled_out"),
                              "bell": (2, "reports", "posted", None)})
            self.assertEqual(told["phone"]["nearest"], {"entry": 0, "differs": ["client"]})
            self.assertGreater(told["lamp"]["draw"], told["lamp"]["threshold"])
            self.assertEqual((told["lamp"]["entry"], told["bell"]["removed"], told["bell"]["hashed"]), (1, ["mac"], ["number"]))
            self.assertEqual([step["step"] for step in told["bell"]["road"]],
                             ["taken", "removed", "hashed", "posted", "answered"])
            self.assertEqual(told["bell"]["url"], self.lab.url + "/events/bell")
            text = self.ctl("why", "--client", "bell", "--category", "5")[0]
            for part in ("httppost: posted, status 200", "left without mac", "left with hashed number", "client entry 2"):
                self.assertIn(part, text)
            self.assertEqual(self.ctl("why", "--client", "nobody", "--json")[0], "")

    def test_a_field_that_the_user_info_has_lost_leaves_the_messages_own_hashed(self):
        self.root.write("etc/veltrad/policy.json", b'{"hash": ["room"]}')
        self.serve(entry())
        with self.serving():
            self.client(requireUserInfo=True, user_info={"room": [1]}).message(room="r")
            self.assertRegex(self.lab.wait_for_events(1, _method=5)[0]["room"], "^[0-9a-f]{64}$")
            told = [line["backends"]["httppost"] for line in self.why()]
            self.assertEqual([(one["removed"], one["hashed"]) for one in told], [(["room"], []), ([], ["room"])])

    def test_what_the_ring_has_overwritten_is_said_and_all_are_accounted_for(self):
        self.root.write("etc/veltrad/settings.json", b'{"fates": {"bytes": 65536}}')
        self.serve(entry(sampling_threshold=-1, override_sampling=-1))
        with self.serving():
            sessions = [self.client(requireUserInfo=True) for _ in range(3)]
            for number in range(500):
                sessions[number % 3].message(category=number)
            first, *told = self.why("--last", "10000")
            self.assertEqual(first["gone"]["messages"] + len(told), 503)
            self.assertGreater(len(told), 150)
            self.assertEqual([line["category"] for line in told], list(range(500))[-len(told):])
            self.assertEqual({line["client"] for line in told}, {"phone"})
            self.assertLessEqual(first["gone"]["before"], told[0]["time"])

    def test_watch_tells_each_message_and_step_as_it_happens(self):
        self.serve(entry())
        with self.serving("The client has gone."):
            session = Member(self.root, 7, aggregates=True, service="phone")
            self.addCleanup(session.close)
            watch = self.watch("--category", "7")
            def told():
                """The steps of a message that was told of and answered."""
                session.message(category=7)
                for first in self.lines(watch, "message"):
                    self.assertEqual((first["client"], first["aggregatedTo"], "backends" in first, "payload" in first),
                                     ("phone", first["session"], False, False))
                    steps = [line["step"] for line in self.lines(watch, "step") if line["message"] == first["message"]]
                    if "answered" in steps:
                        return steps
                return None
            self.assertEqual(wait_until(told, "a message and its answer"), ["aggregated", "posted", "answered"])
            self.assertTrue(all(line["aggregatedTo"] == line["session"] for line in self.why("--category", "7")))
            watch.popen.send_signal(signal.SIGTERM)
            self.assertEqual(watch.end(), 0)

    def test_files_and_log_data_are_told_with_address_bytes_and_answer(self):
        self.lab.put("quindle", storebag(backends={"uploadserver": {"post_url": "${url}/upload"}, "dashboard": {
            "ip": "127.0.0.1", "port": "${dashboardPort}", "post_url": "${url}/logdata"}}))
        with self.serving("upload failed", "post ", "Error uploading", "stays: the owner", "Input file is empty"):
            session = self.client()
            watch = self.watch("--uploads")
            wait_until(lambda: session.ask(UPLOADS[1], data=[1]) and self.lines(watch, "message"), "log data")
            began = len(self.why("--uploads", "--last", "1000"))
            lend(session, "a.log", b"x" * 5000)
            session.ask(UPLOADS[1], data=["text"])
            self.lab.control(path="/", status=503, body="no")
            lend(session, "b.log", b"x")
            session.ask(UPLOADS[1], data=[2])
            self.lab.reset()
            self.lab.control(path="/", cut=True)
            lend(session, "c.log", b"x")
            session.ask(UPLOADS[1], data=[3])
            lend(session, "d.log", b"")
            self.ctl("privacy", "off")
            lend(session, "e.log", b"x")
            session.ask(UPLOADS[1], data=[4])
            self.lab.reset()
            told = self.why("--uploads", "--last", "1000")[began:]
            text = self.ctl("why", "--uploads", "--last", "2")[0]
            wait_until(lambda: any(line.get("reason") == "log_data_refused_by_owner" for line in self.lines(watch, "step")), "the last step")
            bytes = [self.lab.received("uploads")[0]["bytes"], self.lab.received("logdata")[began]["bytes"]]
        names = {"file": "uploadserver", "logData": "dashboard"}
        rows = [(line["kind"], *(line["backends"][names[line["kind"]]][key] for key in ("fate", "status", "fateReason"))) for line in told]
        self.assertEqual(rows, [
            ("file", "posted", 200, None), ("logData", "posted", 200, None),
            ("file", "posted", 503, "file_not_confirmed"), ("logData", "posted", 503, None),
            ("file", "lost", None, "file_exchange_failed"), ("logData", "lost", None, "log_data_failed"),
            ("file", "dropped", None, "file_empty"),
            ("file", "dropped", None, "file_refused_by_owner"), ("logData", "dropped", None, "log_data_refused_by_owner")])
        for line, path, size in zip(told, ("/upload?", "/logdata"), bytes):
            backend = line["backends"][names[line["kind"]]]
            self.assertTrue(backend["url"].startswith(self.lab.url + path), backend["url"])
            self.assertEqual(([step["step"] for step in backend["road"]], backend["events"]), (["taken", "posted", "answered"], 1))
            self.assertEqual(backend["bytes"], size)
        self.assertIn("log data", text)

    def test_an_acknowledgement_settles_its_own_one_shot_message(self):
        self.lab.put("quindle", storebag(backends={"dashboard": {"ip": "127.0.0.1", "port": "${dashboardPort}", "reliable": 60_000}}))
        with self.serving():
            wire = Wire(self.root)
            self.addCleanup(wire.close)
            def shot(number):
                wire.call(ONE_SHOT, category=number, type=1, payload={}, userInfo={"clientName": "phone"},
                          sessionInfo={"clientType": 7, "sessionID": number, "requireUserInfo": True})
            def fates():
                told = [line["backends"]["dashboard"] for line in self.why("--last", "1000")]
                return [(one["fate"], one["fateReason"]) for one in told]
            self.lab.control(path="/dashboard", ack="drop", times=1)
            shot(1), shot(2)
            wait_until(lambda: fates()[1][0] == "acknowledged", "the second one's acknowledgement")
            self.assertEqual(fates(), [("waiting", None), ("acknowledged", None)])
            self.lab.control(path="/dashboard", ack="drop")
            for number in range(3, 30):  # more than there are sockets
                shot(number)
            self.lab.received("dashboard", 29)  # what the lab reads after its reset is acknowledged
            self.lab.reset()
            shot(30)
            unsure = ("acknowledged", "acknowledged_by_number")
            wait_until(lambda: unsure in fates(), "an acknowledgement")
            self.assertEqual(sorted(set(fates()[2:])), [unsure, ("waiting", None)])
            self.ctl("privacy", "off")  # does not wait for the others

    def test_watch_shows_contents_as_the_policy_leaves_them(self):
        self.root.write("etc/veltrad/policy.json", b'{"remove": ["mac", "serviceName"], "hash": ["number"]}')
        self.serve(entry(override_dnu=1))
        values = {"mac": "hidden-mac", "number": "hidden-number", "kept": 2.5}
        with self.serving():
            session, nowhere = self.client(requireUserInfo=True), Wire(self.root)
            self.addCleanup(nowhere.close)
            watch = self.watch("--contents", "--category", "7")
            def told():
                session.message(category=7, **values)
                return self.lines(watch, "message")
            wait_until(told, "a message")
            session.ask(SEND, message={"category": 7, "payload": values})  # no type
            nowhere.call(SEND, message={"category": 7, "type": 9, "payload": values})  # no back ends
            nowhere.call(ONE_SHOT, category=7, type=8, payload=values, userInfo={"clientName": "lamp", "serviceName": "hidden-service"},
                         sessionInfo={"clientType": 7, "sessionID": 5, "requireUserInfo": True})
            lines = wait_until(lambda: (found := self.lines(watch, "message"))[-1]["type"] == 8 and found, "the last message")
            shown = [one for one in json.loads(self.ctl("status", "--json")[0])["sessions"] if one["clientType"] == 7]
            self.assertIn(("phone", None), [(one["clientName"], one["serviceName"]) for one in shown])
            self.assertNotIn("hidden", str(shown))
        for line in lines:
            self.assertRegex(line["payload"].pop("number"), "^[0-9a-f]{64}$")
            self.assertEqual(line["payload"], {"kept": values["kept"]})
        self.assertEqual([(line["type"], line["userInfo"]) for line in lines[-4:]],
                         [(2, {"clientName": "phone"}), (None, {"clientName": "phone"}), (9, None), (8, {"clientName": "lamp"})])
        self.assertNotIn("hidden", "".join(watch.text))
        messages, bag = self.root.path / "messages.jsonl", self.root.path / "bag.plist"
        messages.write_text("\n".join(watch.text))
        bag.write_bytes(plistlib.dumps({"version": "v", "release": {"httppost": {"clients": [entry(post_url="https://a.example/e")]}}}))
        explained = subprocess.run([program("veltra-storebag"), "explain", bag, "--client-type", "7", "--client", "phone", "--service", "phone",
                                    "--require-user-info", "--consent", "yes", "--country", "US", "--messages", messages, "--json"],
                                   capture_output=True, check=True)
        events = json.loads(explained.stdout)["backends"]["httppost"]["events"]
        self.assertEqual(len([event for event in events if event.get("kept")]), len(lines) - 1)  # one had no type

    def test_a_reader_too_slow_for_contents_is_told_what_it_lost(self):
        self.root.write("etc/veltrad/settings.json", b'{"fates": {"bytes": 16777216}}')
        self.serve(entry("nobody"))
        with self.serving():
            session = self.client()
            watch = self.watch("--contents", "--category", "7")
            wait_until(lambda: session.message(category=7) or self.lines(watch, "message"), "a message")
            session.message(category=7, last=1)
            wait_until(lambda: "last" in (self.lines(watch, "message")[-1]["payload"] or {}), "all of them")
            watch.popen.send_signal(signal.SIGSTOP)
            for number in range(1500):
                session.message(category=7, number=number, text="x" * 4000)
            watch.popen.send_signal(signal.SIGCONT)
            wait_until(lambda: self.lines(watch, "lost"), "what was lost")
            messages = self.lines(watch, "message")
        lost = [line for line in messages if line.get("contentsLost")]
        self.assertEqual(len(lost), sum(line["contents"] for line in self.lines(watch, "lost")))
        self.assertGreater(len(lost), 300)
        self.assertEqual({line["entries"] for line in self.lines(watch, "lost")}, {0})
        kept = [line["payload"]["number"] for line in messages if "number" in (line["payload"] or {})]
        self.assertEqual(kept, list(range(1500))[-len(kept):])
        self.assertEqual(len(kept) + len(lost), 1500)


class World:
    """A random storebag, policy and set of clients."""

    def __init__(self, dice):
        self.dice = dice

    def filters(self):
        return [{key: value for key, value in {
            "key": self.dice.choice(FIELDS).upper(), "action": self.dice.choice(["remove", "sha256", "keep"]),
            "method": self.dice.choice([None, None, 5]), "status": self.dice.choice([None, 1])}.items() if value is not None}
            for _ in range(self.dice.randrange(4))]

    def entry(self, backend):
        pick = self.dice.choice
        return entry(client=pick(["phone", "lamp", "phone,lamp", None]), post_url="${url}/events/" + backend,
                     realtime_post_url="${url}/events/" + backend, service=pick([None, None, "bell"]), filters=self.filters(),
                     locale_whitelist=pick([["US"]] * 5 + [["FR"]]), expedite=pick([None, 0, 1]),
                     event_threshold=pick([0, 2, 49]), override_dnu=pick([None, 1]),
                     sampling_threshold=pick([1, 1, .5, -1]), override_sampling=pick([None, -1, 1]))

    def storebag(self):
        pick = self.dice.choice
        backends = {name: {"clients": [self.entry(name) for _ in range(self.dice.randrange(4))]} for name in HTTPS}
        backends["dashboard"] = {"ip": "127.0.0.1", "port": "${dashboardPort}", **pick([{}, {"reliable": 50}]),
                                 **pick([{}, {"post_url": "${url}/logdata"}])}
        backends.update({"ampery": {}, "uploadserver": {"post_url": "${url}/upload"}, "unheard": {}})
        kept = {name: section for name, section in backends.items() if pick([1, 1, 1, 0])}
        return {"version": f"v{self.dice.randrange(9)}", "release": kept}

    def policy(self):
        pick = self.dice.choice
        rules = {"remove": self.dice.sample(FIELDS, self.dice.randrange(3)), "hash": self.dice.sample(FIELDS, self.dice.randrange(3)),
                 "backends": self.dice.sample([*HTTPS, "dashboard", "ampery"], 3), "hosts": ["localhost", pick(["127.0.0.1", "::1"])],
                 "reporting": pick(["on", "on", "on", "off"]), "consent": pick(["storebag", "always"]), "history": {},
                 "dailyEvents": pick([10**6, 40]), "dailyBytes": pick([10**9, 20_000])}
        return {key: value for key, value in rules.items() if pick([1, 0, 0])}

    def payload(self, marker):
        return {"n": marker, **{name: self.dice.choice(["x", 7, True, ["l"]]) for name in FIELDS[:4] if self.dice.choice([0, 1])}}


class RandomFates(FatesTest):
    def setUp(self):
        super().setUp()
        self.root.write("etc/veltrad/settings.json", b'{"fates": {"bytes": 67108864}}')
        self.dice = random.Random(SEED)
        self.marker = 0
        self.seen = {}  # how often each fate of each back end was told

    def test_the_last_word_equals_what_servers_and_logs_have_seen(self):
        worlds = max(6, MESSAGES // 250)
        for number in range(worlds):
            with self.subTest(seed=SEED, world=number):
                self.play(World(self.dice), MESSAGES // worlds)
        print(f"{self.marker} messages of seed {SEED}: {dict(sorted(self.seen.items()))}", flush=True)
        self.assertGreaterEqual(len(self.seen), 10)

    def play(self, world, messages):
        energy = self.root.path / "var/log/veltrad/energy.jsonl"
        for path in (energy, self.root.path / "var/lib/veltrad/daily.json", self.root.path / "run/veltrad/counts"):
            path.unlink(missing_ok=True)
        for name in ("quindle", "ostvane"):
            self.lab.put(name, world.storebag())
        self.root.write("etc/veltrad/policy.json", json.dumps(world.policy()).encode())
        self.root.prefer(DiagnosticLogSubmissionEnabled=world.dice.choice([True, True, False]))
        self.lab.reset()
        ends = [{"status": 404}, {"status": 503}, {"status": 302}, {"cut": True}]
        for rule in (*({"path": path, "share": share, **world.dice.choice(ends)} for path, share in
                       (("/events", 10), ("/upload", 30), ("/logdata", 30))), {"path": "/dashboard", "ack": "drop", "share": 20}):
            if world.dice.choice([0, 1]):
                self.lab.control(**rule)
        daemon = self.daemon(env={"VELTRA_LOG": "info"})
        try:
            self.sent = {}  # by marker: the payload
            self.lent = {}  # by session: kind and marker of each file and log data
            clients = [self.newcomer(world, number) for number in range(1, 7)]
            for _ in range(messages):
                self.send(world, world.dice.choice(clients))
            for client in clients:
                client.flush()
            wait_until(self.settled, "the last answers and acknowledgements", 60)
            self.compare(self.why("--last", "1000000"), energy)
            self.compare_uploads(self.why("--uploads", "--last", "1000000"))
            for client in clients:
                client.close()
            daemon.popen.send_signal(signal.SIGTERM)
            self.assertEqual(daemon.end(15), 0)
        finally:
            daemon.kill()

    def newcomer(self, world, number):
        pick = world.dice.choice
        client = Wire(self.root)
        self.addCleanup(client.close)
        client.number, client.name = number, pick(["phone", "lamp", "nobody"])
        client.describe(pick([6, 7]), pick([0, 0, 1]), {"clientName": client.name, "serviceName": pick(["bell", "ringer"])},
                        sessionID=number, requireUserInfo=pick([True, True, False]), batchEvents=pick([True, False]))
        client.call("startConfigWithCompletionHandler:")
        client.flush = lambda: client.call("flushMessagesWithCompletion:")
        return client

    def send(self, world, client):
        self.marker += 1
        pick = world.dice.choice
        payload = world.payload(self.marker)
        category, kind = self.marker % 65536, pick([1, 2, 3])
        if (how := world.dice.random()) > .9 and how < .93:
            item = pick(["file", "logData"])
            self.lent.setdefault(client.number, []).append((item, self.marker))
            return lend(client, f"{self.marker}.log", b"x" * pick([1, 1, 0])) if item == "file" else client.call(UPLOADS[1], data=[self.marker])
        if how < .05:
            client.call(ONE_SHOT, category=category, type=kind, payload=payload, userInfo={"clientName": client.name},
                        sessionInfo={"clientType": 7, "sessionID": 1000 + self.marker, "requireUserInfo": True})
        else:
            message = {"category": category, "type": kind, "flag": pick([0, 0, 0, 1, 2, 3]), "payload": payload}
            if how < .08:
                message.pop("type")
            client.call(SEND, message=message)
        self.sent[category] = payload
        if how > .97:
            client.flush()

    def settled(self):
        """True if nothing is open any more."""
        return not any(backend["fate"] == "waiting" or backend["fate"] == "posted" and backend["status"] is None
                       for line in self.why("--last", "1000000") for backend in line["backends"].values())

    def compare(self, told, energy):
        numbers = {payload["n"] for payload in self.sent.values()}
        events = {(post["path"].rsplit("/", 1)[1], event["n"]): (event, post) for post in self.lab.received("events")
                  for event in post["body"]["events"] if event.get("n") in numbers}
        datagrams = {}
        for line in self.lab.received("dashboard"):
            datagrams.setdefault((line["sessionID"], line["method"], line["eventID"]), []).append(line["outcome"])
        written = [json.loads(line)["event"].get("n") for line in energy.read_text().splitlines()] if energy.exists() else []
        self.assertFalse([line for line in told if "gone" in line])
        messages = [line for line in told if line["from"] != "session" and line["category"] in self.sent]
        self.assertEqual(sorted(line["category"] for line in messages), sorted(self.sent))
        for line in messages:
            given = self.sent[line["category"]]
            for name, backend in line["backends"].items():
                fate, about = self.count(name, backend), (name, backend, line)
                self.assertTrue(fate != "dropped" or backend["fateReason"], about)
                if name in HTTPS:
                    names = [key + "Name" for key in ("client", "service") if line[key]]
                    event, post = events.pop((name, given["n"]), (None, None))
                    self.compare_post(post, backend, about)
                    if event:
                        self.compare_event(event, given, names, backend, about)
                elif name == "dashboard":
                    came = datagrams.get((line["sessionID"], line["category"], backend["eventNumber"]), [])
                    self.assertEqual(bool(came), fate in LEFT, (came, *about))
                    # One-shot messages that share a socket have the same number; who reads is told so.
                    if backend["fateReason"] != "acknowledged_by_number":
                        self.assertEqual(fate == "acknowledged", "acknowledged" in came, (came, *about))
                    self.assertGreaterEqual(backend["transmissions"], len(came), about)
                elif name == "ampery":
                    self.assertEqual(written.count(given["n"]), int(fate == "written"), about)
                else:
                    self.assertIn((name, fate), [("uploadserver", "none"), ("uploadserver", "dropped"), ("unheard", "dropped"),
                                                 ("mivo", "dropped")], about)
        self.assertFalse(events, "events that nobody tells of")

    def count(self, name, backend):
        fate = backend["fate"]
        self.seen[f"{name} {fate}"] = self.seen.get(f"{name} {fate}", 0) + 1
        return fate

    def compare_uploads(self, told):
        arrived = {int(line["query"]["filename"].split(".")[0]): line for line in self.lab.received("uploads")}
        arrived.update({line["body"][0]: line for line in self.lab.received("logdata")})
        markers = {marker for lent in self.lent.values() for _, marker in lent}
        arrived = {marker: line for marker, line in arrived.items() if marker in markers}
        for session, lent in self.lent.items():
            lines = [line for line in told if line["sessionID"] == session]
            self.assertEqual([line["kind"] for line in lines], [item for item, _ in lent])
            for line, (item, marker) in zip(lines, lent):
                for name, backend in line["backends"].items():
                    about = (name, backend, line)
                    if (item, name) in (("file", "uploadserver"), ("logData", "dashboard")) and backend["state"] is not None:
                        self.count(f"{item} {name}", backend)
                        self.compare_post(arrived.pop(marker, None), backend, about)
                    else:
                        self.assertEqual((backend["fate"], backend["state"]), ("dropped", None), about)
        self.assertFalse(arrived, "files and log data that nobody tells of")

    def compare_post(self, post, backend, about):
        """With the request as the server has seen it, or None."""
        if post is None:
            self.assertNotEqual(backend["fate"], "posted", about)
        else:
            ended = {"cut": ("lost", None)}.get(post["outcome"]) or ("posted", int(post["outcome"]))
            self.assertEqual((backend["fate"], backend["status"], backend["bytes"]), (*ended, post["bytes"]), about)

    def compare_event(self, event, given, names, backend, about):
        self.assertEqual(event["_eventNumber"], backend["eventNumber"], about)
        for name, value in given.items():
            if name == "clientName" or isinstance(value, list):
                continue
            if name in backend["removed"]:
                self.assertNotIn(name, event, about)
            elif name in backend["hashed"]:
                self.assertRegex(event[name], "^[0-9a-f]{64}$", about)
            else:
                self.assertEqual(event[name], value, about)
        for name in names:  # which the user info adds
            self.assertEqual(name in event, name not in backend["removed"], about)
            if name in event:
                self.assertEqual(bool(re.fullmatch("[0-9a-f]{64}", event[name])), name in backend["hashed"], about)
