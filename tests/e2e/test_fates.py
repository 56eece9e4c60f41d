# SPDX-License-Identifier: Apache-2.0
"""What `veltractl why` and `watch` tell, compared with what the servers and logs have seen of each message.

VELTRA_FATES says how many random messages there are (300), VELTRA_SEED which."""
import json
import os
import random
import re
import signal

from harness import Process, Wire, program, wait_until
from test_https import HTTPSTest, entry

MESSAGES = int(os.environ.get("VELTRA_FATES", "300"))
SEED = int(os.environ.get("VELTRA_SEED", str(random.SystemRandom().randrange(1 << 32))))
HTTPS = ("httppost", "httppost2")
FIELDS = ("mac", "Number", "serial", "plain", "clientName")
SEND, ONE_SHOT = "sendMessageWithDictionary:reply:", "sendMessageWithSessionInfo:userInfo:category:type:payload:reply:"
LEFT = {"sent", "waiting", "acknowledged", "given_up"}


class FatesTest(HTTPSTest):
    def why(self, *arguments):
        return [json.loads(line) for line in self.ctl("why", "--json", *arguments)[0].splitlines()]


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
        with self.serving():
            session = self.client(requireUserInfo=True)
            watch = Process([program("veltractl"), "watch", "--json", "--category", "7"], self.root.environment(), "stdout")
            self.addCleanup(watch.kill)
            def told():
                """The steps of a message that was told of and answered."""
                session.message(category=7)
                lines = [json.loads(line) for line in watch.text]
                for first in (line for line in lines if line["event"] == "message"):
                    self.assertEqual((first["client"], "backends" in first), ("phone", False))
                    steps = [line["step"] for line in lines if line["event"] == "step" and line["message"] == first["message"]]
                    if "answered" in steps:
                        return steps
                return None
            self.assertEqual(wait_until(told, "a message and its answer"), ["posted", "answered"])
            watch.popen.send_signal(signal.SIGTERM)
            self.assertEqual(watch.end(), 0)


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
        backends["dashboard"] = {"ip": "127.0.0.1", "port": "${dashboardPort}", **pick([{}, {"reliable": 50}])}
        backends.update({"ampery": {}, "uploadserver": {"post_url": "${url}/upload"}, "unheard": {}})
        kept = {name: section for name, section in backends.items() if pick([1, 1, 1, 0])}
        return {"version": f"v{self.dice.randrange(9)}", "release": kept}

    def policy(self):
        pick = self.dice.choice
        rules = {"remove": self.dice.sample(FIELDS, self.dice.randrange(3)), "hash": self.dice.sample(FIELDS, self.dice.randrange(3)),
                 "backends": self.dice.sample([*HTTPS, "dashboard", "ampery"], 3), "hosts": ["localhost", pick(["127.0.0.1", "::1"])],
                 "reporting": pick(["on", "on", "on", "off"]), "dailyEvents": pick([1000000, 5])}
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
        energy.unlink(missing_ok=True)
        for name in ("quindle", "ostvane"):
            self.lab.put(name, world.storebag())
        self.root.write("etc/veltrad/policy.json", json.dumps(world.policy()).encode())
        self.root.prefer(DiagnosticLogSubmissionEnabled=world.dice.choice([True, True, False]))
        self.lab.reset()
        for rule in ({"path": "/events", "status": world.dice.choice([404, 503, 302]), "share": 10},
                     {"path": "/events", "cut": True, "share": 5}, {"path": "/dashboard", "ack": "drop", "share": 20}):
            if world.dice.choice([0, 1]):
                self.lab.control(**rule)
        daemon = self.daemon(env={"VELTRA_LOG": "info"})
        try:
            self.sent = {}  # by marker: the payload
            clients = [self.newcomer(world, number) for number in range(1, 7)]
            for _ in range(messages):
                self.send(world, world.dice.choice(clients))
            for client in clients:
                client.flush()
            wait_until(self.settled, "the last answers and acknowledgements", 60)
            self.compare(self.why("--last", "1000000"), energy)
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
        if (how := world.dice.random()) < .05:
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
        """Nothing is under way any more."""
        return not any(backend["fate"] == "waiting" or backend["fate"] == "posted" and backend["status"] is None
                       for line in self.why("--last", "1000000") for backend in line["backends"].values())

    def compare(self, told, energy):
        numbers = {payload["n"] for payload in self.sent.values()}
        events = {(post["path"].rsplit("/", 1)[1], event["n"]): event for post in self.lab.received("events")
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
                fate = backend["fate"]
                self.seen[f"{name} {fate}"] = self.seen.get(f"{name} {fate}", 0) + 1
                about = (name, backend, line)
                self.assertTrue(fate != "dropped" or backend["fateReason"], about)
                if name in HTTPS:
                    names = [key + "Name" for key in ("client", "service") if line[key]]
                    self.compare_event(events.pop((name, given["n"]), None), given, names, backend, about)
                elif name == "dashboard":
                    came = datagrams.get((line["sessionID"], line["category"], backend["eventNumber"]), [])
                    self.assertEqual(bool(came), fate in LEFT, (came, *about))
                    # One-shots of one connection share a socket, and all have the number 1: the answer may be another's.
                    if line["from"] != "oneShot":
                        self.assertEqual(fate == "acknowledged", "acknowledged" in came, (came, *about))
                    self.assertGreaterEqual(backend["transmissions"], len(came), about)
                elif name == "ampery":
                    self.assertEqual(written.count(given["n"]), int(fate == "written"), about)
                else:
                    self.assertIn((name, fate), [("uploadserver", "none"), ("uploadserver", "dropped"), ("unheard", "dropped"),
                                                 ("mivo", "dropped")], about)
        self.assertFalse(events, "events that nobody tells of")

    def compare_event(self, event, given, names, backend, about):
        if backend["fate"] == "lost":  # it may have arrived
            return
        self.assertEqual(event is not None, backend["fate"] == "posted", about)
        if event is None:
            return
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
