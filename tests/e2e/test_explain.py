# SPDX-License-Identifier: Apache-2.0
"""`veltra-storebag explain` agrees with the daemon for the same storebag, device, consent and sampling factor.

Tries random storebags for a minute. VELTRA_BAGS gives their number instead, VELTRA_SESSIONS the number of sessions for each,
VELTRA_SEED the seed. A difference names the number of its storebag; VELTRA_FIRST begins with this number."""
import base64
import concurrent.futures
import contextlib
import datetime
import json
import os
import pathlib
import random
import re
import subprocess
import tempfile
import time
import types
import unittest

from harness import BUILD, DEVICE, START, SystemTest, Wire, program, wait_until

SEED, SESSIONS, FIRST = (int(os.environ.get(f"VELTRA_{what}", usual)) for what, usual in (("SEED", 18), ("SESSIONS", 6), ("FIRST", 0)))
BAGS = int(os.environ["VELTRA_BAGS"]) if "VELTRA_BAGS" in os.environ else None
SECONDS = 15 if BUILD.name in ("asan", "tsan") else 60  # a sanitizer looks for other faults than differences
BAGS_A_DAEMON, MOST_SHOWN = 25, 5
HTTPS = ("httppost", "httppost2")
CLIENT_TYPES = {"quindle": (7, 11, 13), "ostvane": (6, 14, 15)}
FIELDS = ("a", "B", "c", "list", "room", "clientName", "Zürich", "_sender", "AutomaticTimeSet")
# What only a run knows.
RUN = {"_startTS", "_clientTS", "eventTime", "_sessionID", "_timezoneOffset", "_reportVers"}
SENT = ("sent", "waiting", "acknowledged", "given_up")
LATER = {"acknowledged": "waiting", "given_up": "waiting"}
VALUES = ["text", "é\u2028\\\"", "", 7, -3, 2**53, 0.5, 1e300, True, False, [1], [], {"b": 1}, b"\x00\xff",
          datetime.datetime(2026, 1, 2, 3, 4, 5)]


def as_json(value):
    """As the tools read bytes and dates."""
    if isinstance(value, bytes):
        return {"$data": base64.b64encode(value).decode()}
    return {"$date": value.replace(tzinfo=datetime.timezone.utc).timestamp()}


def kept(dictionary):
    return {key: value for key, value in dictionary.items() if value is not None}


class Group:
    """The settings that several storebags share, because a daemon reads them only once."""

    def __init__(self, number):
        dice = random.Random(f"{SEED} group {number}")
        self.environment = dice.choice([1, 2, 3, 4, 4])
        self.section = ("development", "florn_internal", "seed", "release")[self.environment - 1]
        self.release, self.country = dice.choice(["Customer", "Internal"]), dice.choice(["US", "US", "DE", None])
        rules = {"remove": dice.sample(FIELDS, 2), "hash": dice.sample(FIELDS, 2), "consent": "always", "reporting": "off",
                 "backends": dice.sample([*HTTPS, "dashboard", "ampery"], 3),
                 "hosts": dice.choice([["localhost"], ["LocalHost", "127.0.0.1"]])}  # storebags come from there
        self.policy = {key: value for key, value in rules.items() if dice.random() < (0.05 if key == "reporting" else 0.25)}
        # The daemon notices within a second.
        self.consent = dice.choice([True, False]) if "consent" in self.policy else None


class World:
    """One random storebag, its device and sessions."""

    def __init__(self, number, group, lab):
        self.number, self.section, self.lab = number, group.section, lab
        self.dice = random.Random(f"{SEED} {number}")
        pick = self.dice.choice
        self.name = pick(list(CLIENT_TYPES))
        self.consent, self.country = pick([True, True, False]) if group.consent is None else group.consent, group.country
        self.device = {**DEVICE, "DeviceName": pick(["Elm", "Oak"]), "ReleaseType": group.release}
        self.bag = kept({"version": pick([f"v{number}", None]), "refresh_cycle": 86400, **self.sections()})
        self.sessions = [self.session(i) for i in range(SESSIONS)]

    def sections(self):
        sections = {self.section: self.backends(), "seed" if self.section == "release" else "release": self.backends()}
        if self.section == "seed" and self.dice.random() < 0.5:
            del sections["seed"]  # that of "release" stands in
        return sections

    def backends(self):
        pick = self.dice.choice
        made = {name: pick([{"clients": [self.entry(name, i) for i in range(self.dice.randrange(5))]}] * 9 + [{}]) for name in HTTPS}
        made.update({"dashboard": {"ip": pick(["127.0.0.1"] * 4 + ["localhost"]), "port": self.lab.dashboard[1],
                                   **pick([{}, {"reliable": 50}])},
                     "uploadserver": pick([{"post_url": self.lab.url + "/upload"}, {}]), "ampery": {}, "mivo": {}, "unheard": {}})
        return {name: section for name, section in made.items() if name in HTTPS or pick([0, 0, 1])}

    def entry(self, name, i):
        pick, rare = self.dice.choice, lambda value: value if self.dice.random() < 0.25 else None
        host = pick([self.lab.url] * 3 + [self.lab.url.replace("localhost", "127.0.0.1")])
        share = lambda: pick([0, 0.3, 0.6, 1, 1])
        return kept({
            "client": pick(["phone", "lamp", "phone,lamp", "Clock", None]), "service": rare(pick(["ring", "RINGER,x", "bell"])),
            "locale_whitelist": pick([["US"], ["US", "de"], ["FR"], ["U", "D"], None]), "event_threshold": pick([0, 1, 49, None]),
            "filters": pick([self.filters()] * 9 + [None]),
            "sampling_threshold": pick([share()] * 9 + [None]), "override_sampling": rare(share()),
            "expedite": rare(pick([0, 1])), "override_dnu": rare(pick([0, 1, 2])), "device_blacklist": rare([pick(["elm4", "Oak"])]),
            "device_whitelist": rare([pick(["elm", "Oak", ""])]), "custom_clientId": rare(1), "extras_on_internal": rare(1),
            "per_country_sampling_thresholds": rare([{"country": pick([["US"], ["us"], ["CA", "DE"]]), "threshold": share()}]),
            "post_url": pick([f"{host}/events/{name}/{i}"] * 9 + [None]), "realtime_post_url": rare(f"{host}/events/{name}/fast")})

    def filters(self):
        pick = self.dice.choice
        return [{"key": key, **pick([{"action": "remove"}, {"action": "sha256"}, {"action": "keep"}, {}]),
                 **pick([{}, {}, {"method": 5}, {"status": 2}, {"method": 0, "status": -1}])}
                for key in self.dice.choices(FIELDS, k=self.dice.randrange(6))]

    def session(self, place):
        pick = self.dice.choice
        names = {"clientName": pick(["phone", "LAMP", "clock", "door"]), "serviceName": pick(["ringer", "x", ""])}
        info = pick([names, names, {"clientName": "lamp"}, {**names, "room": "r", "a": pick([7, -0.5, "é", ""]), "b": True}, None])
        messages = [kept({"category": pick([5, 6, 65535]), "type": pick([2, 3]), "flag": pick([0, 0, 0, 1, 2, 3]),
                          "payload": pick([self.payload()] * 9 + [None])}) for _ in range(self.dice.randrange(5))]
        return types.SimpleNamespace(number=(self.number * SESSIONS + place) % 65536, type=pick(CLIENT_TYPES[self.name]), info=info,
                                     messages=messages, required=self.dice.random() < 0.8, batch=self.dice.random() < 0.5)

    def payload(self):
        return {key: self.dice.choice(VALUES) for key in self.dice.sample(FIELDS[:5] + FIELDS[6:], self.dice.randrange(5))}


def explain(directory, world, session, draws, bag="bag.json"):
    lines = directory / f"messages-{session.number}.jsonl"
    lines.write_text("".join(json.dumps({"op": "send", **message}, default=as_json) + "\n" for message in session.messages))
    options = ["--country", world.country] if world.country else []
    options += [x for key, value in (session.info or {}).items()
                for x in ("--user-info", f"{key}={value if isinstance(value, str) else json.dumps(value)}")]
    options += ["--require-user-info"] * session.required + ["--batch-events"] * session.batch
    options += [x for name, draw in draws.items() for x in ("--draw", f"{name}={draw!r}")]
    done = subprocess.run([
        program("veltra-storebag"), "explain", directory / bag, "--json", "--client-type", str(session.type),
        "--session-id", str(session.number), "--client-version", str(session.number), "--environment", world.section,
        "--consent", "yes" if world.consent else "no", "--device", directory / "device.json",
        "--policy", directory / "policy.json", "--messages", lines, *options], capture_output=True, text=True)
    lines.unlink()
    assert (done.returncode, done.stderr) == (0, ""), (done.returncode, done.stderr)
    return json.loads(done.stdout)


class ExplainedAndDone(SystemTest):
    def setUp(self):
        super().setUp()
        self.places, self.differences, self.seen = {"events": 0, "dashboard": 0}, [], {}

    def control(self, operation, **arguments):
        """Asks the daemon as veltractl does."""
        observer = Wire(types.SimpleNamespace(socket=str(self.root.path / "run/veltrad/control.sock")))
        answer = observer.call(operation, **arguments)
        observer.close()
        return answer["results"]

    def test_random_storebags(self):
        begin, tried = time.monotonic(), 0
        over = lambda: len(self.differences) >= MOST_SHOWN or (tried >= BAGS if BAGS else time.monotonic() > begin + SECONDS)
        while not over():
            with self.serving_group(Group((FIRST + tried) // BAGS_A_DAEMON)) as group:
                while not over():
                    self.try_world(World(FIRST + tried, group, self.lab))
                    tried += 1
                    if (FIRST + tried) % BAGS_A_DAEMON == 0:
                        break
        print(f"{tried} storebags, {tried * SESSIONS} sessions of seed {SEED}: {dict(sorted(self.seen.items()))}", flush=True)
        self.assertFalse(self.differences, "\n".join(self.differences))
        if tried >= BAGS_A_DAEMON:
            self.assertGreater(len(self.seen), 12)

    @contextlib.contextmanager
    def serving_group(self, group):
        (self.root.path / "policy.json").write_text(json.dumps(group.policy))
        self.root.write("etc/veltrad/policy.json", json.dumps(group.policy).encode())
        self.root.prefer(environmentType=group.environment, DiagnosticLogSubmissionEnabled=bool(group.consent))
        daemon = self.daemon(env={"LANG": f"xx_{group.country}" if group.country else "C", "VELTRA_LOG": "error"}, serving=False)
        wait_until(self.serves, "the daemon")
        yield group
        daemon.popen.terminate()
        self.assertEqual(daemon.end(15), 0)

    def serves(self):
        try:
            Wire(self.root).close()
            return True
        except OSError:
            return False

    def try_world(self, world):
        self.lab.put(world.name, world.bag)
        self.root.prefer(DiagnosticLogSubmissionEnabled=world.consent)
        self.root.write("etc/veltrad/device.plist", world.device)
        (self.root.path / "bag.json").write_text(json.dumps(world.bag))
        (self.root.path / "device.json").write_text(json.dumps(world.device))
        self.assertEqual(self.control("refresh", name=world.name)["result"], "fetched")
        for session in world.sessions:
            self.play(session)
        told = self.told(world)
        left, texts = self.left(), self.datagrams(told)
        with concurrent.futures.ThreadPoolExecutor(2) as pool:
            all_explained = pool.map(lambda session: self.explained(world, session, told[session.number]), world.sessions)
            for session, explained in zip(world.sessions, all_explained):
                self.compare(world, session, explained, told[session.number], left, texts)
        for session in world.sessions:
            session.wire.close()

    def play(self, session):
        session.wire = wire = Wire(self.root)
        wire.call("setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:", hasAggregationBlock=False, frameworksToCheck=[],
                  sessionInfo={"clientType": session.type, "sessionID": session.number, "clientVersion": session.number,
                               "requireUserInfo": session.required, "batchEvent": session.batch},
                  **({"userInfo": session.info} if session.info else {}))
        session.reporting = wire.call(START)["results"].get("backends")
        for message in session.messages:
            wire.call("sendMessageWithDictionary:reply:", message=message)
        wire.call("flushMessagesWithCompletion:")

    def told(self, world):
        """By session: what became of its messages, the start message first, once all posts are answered."""
        count = sum(1 + len(session.messages) for session in world.sessions) + SESSIONS

        def settled():
            lines = [json.loads(line) for line in self.ctl("why", "--json", "--last", str(count))[0].splitlines()]
            mine = {session.number: [] for session in world.sessions}
            for line in lines:
                if line.get("clientVersion") in mine:
                    mine[line["clientVersion"]].append(line)
            waits = any(backend["fate"] == "posted" and backend["status"] is None
                        for told in mine.values() for line in told for backend in line["backends"].values())
            return not waits and all(len(mine[s.number]) == 1 + len(s.messages) for s in world.sessions) and mine
        return wait_until(settled, "what became of the messages")

    def arrivals(self, kind):
        """What has come to the lab since the last call."""
        path = self.lab.path / "received" / f"{kind}.jsonl"
        if not path.exists():
            return
        with open(path, "rb") as received:
            received.seek(self.places[kind])
            for line in received:
                if line.endswith(b"\n"):
                    self.places[kind] += len(line)
                    yield json.loads(line)

    def left(self):
        """By back end and session: the events that have come."""
        events = {}
        for post in self.arrivals("events"):
            key = post["path"].split("/")[2], int(post["headers"]["X-VLT-Client-Version"])
            events.setdefault(key, []).extend(post["body"]["events"])
        return events

    def datagrams(self, told):
        """By session and event number: the texts of the datagrams that were sent."""
        sent = {(number, line["backends"]["dashboard"]["eventNumber"]) for number, lines in told.items() for line in lines
                if line["backends"].get("dashboard", {}).get("fate") in SENT}
        texts = {}

        def have_come():
            texts.update({(one["sessionID"], one["eventID"]): one["text"] for one in self.arrivals("dashboard")})
            return sent <= set(texts)
        wait_until(have_come, "the datagrams")
        return texts

    def explained(self, world, session, told):
        draws = {name: of["draw"] for name, of in told[0]["backends"].items() if of["draw"] is not None}
        return explain(self.root.path, world, session, draws)

    def compare(self, world, session, explained, told, left, texts):
        def same(what, says, does):
            if says != does:
                self.differences.append(f"storebag {world.number}, session {session.number}, {what}: "
                                        f"explain says {says!r}, the daemon does {does!r}")

        start, *messages = told
        backends = explained["backends"]
        if start["storebag"]:
            same("origin", [explained[key] for key in ("storebag", "version", "section")],
                 [start["storebag"].get(key) for key in ("name", "version", "section")])
        same("answer to start", sorted(name for name in backends if backends[name]["state"] in (2, 3)), sorted(session.reporting or []))
        same("back ends that explain leaves out", set(start["backends"]) - set(backends), set())
        # Of those that are not made, the record of fates names three.
        unsaid = set(backends) - set(start["backends"]) if sum(of["state"] is None for of in start["backends"].values()) == 3 else set()
        same("back ends", sorted(set(start["backends"]) | {name for name in unsaid if backends[name]["state"] is None}), sorted(backends))
        for name in sorted(set(backends) & set(start["backends"])):
            says, does = backends[name], start["backends"][name]
            for key in ("state", "reason", "entry", "nearest", "threshold"):
                same(f"{name} {key}", says[key], does[key])
            of = [message["backends"].get(name, {}) for message in messages]
            fates = [LATER.get(one.get("fate"), one.get("fate")) for one in of]
            if name != "mivo":  # there is no adaptor here
                same(f"{name} fates", [one["fate"] for one in says["fates"]], fates)
            for fate in fates:
                self.seen[f"{name} {fate}"] = self.seen.get(f"{name} {fate}", 0) + 1
            if name in HTTPS:
                same(f"{name} addresses", [one["url"] for one in says["fates"]], [one.get("url") for one in of])
                self.compare_events(name, says["events"], left.get((name, session.number), []), same)
            if name == "dashboard" and says["state"] == 2:
                same("texts", says["texts"], [re.sub("=[0-9a-f]{64}", "=null", texts.get((session.number, one["eventNumber"]), "none"))
                                              for one in of])
            changed = [one for one in [does] * (name in HTTPS) + of if one["fate"] in ("posted", "written", *SENT)]
            for key in ("removed", "hashed"):
                same(f"{name} {key}", says[key], sorted({field for one in changed for field in one[key]}))

    def compare_events(self, name, says, does, same):
        does = sorted(does, key=lambda event: event.get("_eventNumber", 0))
        same(f"{name} events", len(says), len(does))
        for number, (one, other) in enumerate(zip(says, does)):
            unknown = {key for key, value in one.items() if value is None}
            keyed = {key for key in unknown - RUN if re.fullmatch("[0-9a-f]{64}", str(other.get(key)))}
            same(f"{name} event {number}", {key: value for key, value in one.items() if key not in RUN | keyed},
                 {key: value for key, value in other.items() if key not in RUN | keyed})
            same(f"{name} event {number}, what only a run knows", unknown - keyed, RUN & set(other))


class ExplainedAndCompared(unittest.TestCase):
    """If one change of a storebag lets more leave, `veltra-storebag diff` says so."""

    def setUp(self):
        directory = tempfile.TemporaryDirectory(prefix="veltra-")
        self.addCleanup(directory.cleanup)
        self.path = pathlib.Path(directory.name)
        self.lab = types.SimpleNamespace(url="https://localhost:1", dashboard=("127.0.0.1", 1))

    def changed(self, world, bag):
        """The storebag with one key or entry changed."""
        made, dice = json.loads(json.dumps(bag)), world.dice
        section = made.get(world.section) or made["release"]
        name = dice.choice([name for name in HTTPS if section[name].get("clients")] or [None])
        if not name:
            return made
        clients = section[name]["clients"]
        place, other = dice.randrange(len(clients)), world.entry(name, 9)
        kind = dice.randrange(10)
        if kind == 0:
            clients.insert(place, other)
        elif kind == 1:
            clients.pop(place)
        elif kind == 2:
            clients.insert(0, clients.pop(place))
        else:
            key = dice.choice(sorted({*other, *clients[place]}))
            clients[place] = kept({**clients[place], key: other.get(key)})
        return made

    def leaving(self, told):
        """The data that leaves, by message: the host, and the fields in clear."""
        return {(name, event["_eventNumber"], url.split("/")[2].split(":")[0], field)
                for name, of in told["backends"].items() for event in of["events"]
                for url in [of["url"] or of["realtimeUrl"]] for field in [*event, None]
                if not re.fullmatch("[0-9a-f]{64}", str(event.get(field)))}

    def test_random_changes(self):
        begin, tried, more = time.monotonic(), 0, 0

        def goes_on():
            if BAGS:
                return tried < BAGS
            # A slow build tries few; one that lets more leave must be among them.
            return time.monotonic() < begin + (SECONDS / 3 if more else SECONDS * 3)

        while goes_on():
            group = Group(tried // BAGS_A_DAEMON)
            group.policy, world = {}, World(FIRST + tried, group, self.lab)
            bags = [world.bag, self.changed(world, world.bag)]
            for name, content in zip(("device.json", "policy.json", "old.json", "new.json"), (world.device, {}, *bags)):
                (self.path / name).write_text(json.dumps(content))
            done = subprocess.run([program("veltra-storebag"), "diff", "--json", self.path / "old.json", self.path / "new.json"],
                                  capture_output=True, text=True)
            changes = json.loads(done.stdout)["changes"]
            # When a batch is flushed decides what a back end that holds its events drops.
            said = done.returncode == 1 or any(change["kind"] == "batching" for change in changes)
            for session in world.sessions:
                draws = {name: world.dice.random() for name in HTTPS}
                was, now = (self.leaving(explain(self.path, world, session, draws, bag)) for bag in ("old.json", "new.json"))
                more += bool(now - was)
                self.assertTrue(said or not now - was, (SEED, world.number, session, now - was, changes, *bags))
            tried += 1
        print(f"{tried} changes, {more} sessions in which more leaves", flush=True)
        self.assertGreater(more, tried / 50 if BAGS else 0)
