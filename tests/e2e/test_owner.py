# SPDX-License-Identifier: Apache-2.0
"""The owner's commands: the receipt of turning reporting off, identifiers, and the history."""
import contextlib
import http.server
import json
import os
import random
import ssl
import stat
import subprocess
import threading
import time

from harness import program, wait_until
from test_https import entry
from test_policy import PolicyTest, UPLOAD_LOG, WHO

REFUSED = "The owner of the device does not let it leave"
HISTORY = "var/lib/veltrad/history"


class Collector(http.server.BaseHTTPRequestHandler):
    """Keeps the bodies as they arrive."""
    protocol_version = "HTTP/1.1"
    bodies = []

    def do_POST(self):
        self.bodies.append(self.rfile.read(int(self.headers["Content-Length"])))
        self.wfile.write(b"HTTP/1.1 200 OK\r\nContent-Length: 7\r\n\r\nsuccess")

    def log_message(self, *_):
        pass

    @classmethod
    def start(cls, lab):
        cls.bodies = []
        tls = ssl.SSLContext(ssl.PROTOCOL_TLS_SERVER)
        tls.load_cert_chain(lab.certificate, lab.certificate.replace("certificate.pem", "certificate-key.pem"))
        server = http.server.ThreadingHTTPServer(("localhost", 0), cls)
        server.socket = tls.wrap_socket(server.socket, server_side=True)
        threading.Thread(target=server.serve_forever, daemon=True).start()
        return server


class OwnerTest(PolicyTest):
    def privacy(self, *arguments, status=0):
        return json.loads(self.ctl("privacy", *arguments, "--json", status=status)[0])

    def history(self):
        return [json.loads(line) for line in self.ctl("history", "--json")[0].splitlines()]

    def raw(self, item):
        return subprocess.run([program("veltractl"), "history", "show", item["id"], "--raw"], check=True, capture_output=True,
                              env=self.root.environment()).stdout

    def upload(self, content=b"x" * 1000, status=0):
        path = self.root.path / "crash.log"
        path.write_bytes(content)
        return self.ctl("upload", "--client-type", "7", "--session-id", "9", str(path), status=status)


class Off(OwnerTest):
    alone = True  # it measures time

    def test_turning_off_gives_an_exact_receipt_and_outlives_a_restart(self):
        self.lab.control(path="/dashboard", ack="drop")
        self.lab.control(path="/events/slow", stall=True)
        self.everything("quindle", entry("phone"), entry("slow"), reliable=60_000)
        with self.serving("post error", "stays: the owner", "upload failed") as daemon:
            self.assertEqual(self.privacy("on")["reporting"], "on")
            batching = self.client("phone", batchEvent=True)
            for number in range(3):
                batching.message(number=number)
            slow = self.client("slow")
            self.lab.received("dashboard", 5)
            wait_until(lambda: any(server["address"] == self.lab.url for server in self.status()["servers"]), "the storebag's server")
            began = time.monotonic()
            receipt = self.privacy("off")
            self.assertEqual(receipt["reporting"], "off")
            of = [{"clientType": 7, "sessionID": client.number, "client": name, "service": name, "events": events,
                   "datagrams": datagrams, "files": 0} for client, name, events, datagrams in
                  ((batching, "phone", 4, 4), (slow, "slow", 0, 1))]
            self.assertEqual(sorted(receipt["dropped"].pop("byClient"), key=lambda line: line["sessionID"]), of)
            self.assertEqual(receipt["dropped"], {"events": 4, "datagrams": 5, "files": 0, "posts": 0})
            self.assertEqual(receipt["underWay"], {"posts": 1, "events": 1, "files": 0})
            self.assertEqual(set(receipt["onDisk"]), {"messageLog", "energyLog", "history"})
            self.assertGreater(receipt["onDisk"]["energyLog"], 0)
            daemon.wait_for_line("post error: " + REFUSED)  # what was under way is ended
            self.assertLess(time.monotonic() - began, 1)
            before = self.arrived()
            batching.message(number=4)
            self.upload(status=1)
            self.assertEqual((batching.states(**WHO), self.arrived()), ([], before))
        with self.serving("stays: the owner", "upload failed"):
            self.assertEqual(self.client().backends, [])
            self.assertEqual(self.privacy()["reporting"], "off")
            self.say(reporting="off")
            self.assertEqual(self.privacy("on", status=1)["reporting"], "off")
            self.forget()
            wait_until(lambda: self.client().backends, "back ends")
            self.assertEqual(self.privacy()["reporting"], "on")


class Owner(OwnerTest):
    def test_other_identifiers_reach_open_sessions_and_the_old_ones_are_forgotten(self):
        self.root.write("etc/veltrad/device.plist", {"ProductType": "Elm4,2", "DeviceName": "Elm"})
        self.everything("quindle", entry("phone"), entry("own", custom_clientId=1))
        self.say(hash=["number"])
        with self.serving():
            clients = [self.client("phone"), self.client("own")]

            def seen(turn):
                """The identifiers and digests that leave now."""
                for client in clients:
                    client.message(number="0170", turn=turn)
                posts = [self.posts(name, turn + 1)[-1]["body"] for name in ("phone", "own")]
                datagrams = self.lab.received("dashboard", 2 + 2 * turn)[-2:]
                return ({post["clientId"] for post in posts} | {line["deviceID"] for line in datagrams} - {""},
                        {event["number"] for post in posts for event in post["events"]})
            before = seen(1)
            known = {one["name"]: one for one in self.privacy()["identifiers"]}
            self.assertLessEqual(before[0], {one["value"] for one in known.values()})
            self.assertEqual({one["resettable"] for one in known.values()}, {True})
            self.assertAlmostEqual(known["uuidRespectDNU"]["made"], time.time(), delta=60)
            made = {one["name"]: one["value"] for one in self.privacy("reset-identifiers")["identifiers"]}
            after = seen(2)
            self.assertFalse(before[0] & after[0] or before[1] & after[1], (before, after))
            # A machine without an identifier of its own has none in its datagrams either.
            self.assertEqual(len(after[0]), 3 if os.path.exists("/etc/machine-id") else 2)
            self.assertIn(made["uuidRespectDNU"], after[0])
            now = {one["name"]: one["value"] for one in self.privacy()["identifiers"]}
            self.assertEqual(set(now), set(known))
            self.assertFalse({one["value"] for one in known.values()} & set(now.values()))
            self.assertNotIn(known["uuidRespectDNU"]["value"].encode(), (self.root.path / "var/lib/veltrad/preferences/com.florn.veltra.plist").read_bytes())

    def test_history_shows_what_left_as_it_arrived(self):
        collector = Collector.start(self.lab)
        self.addCleanup(collector.server_close)
        self.addCleanup(collector.shutdown)
        url = f"https://localhost:{collector.server_port}"
        self.lab.put("quindle", {"version": "v7", "release": {
            "httppost": {"clients": [entry(post_url=url + "/events", filters=[{"key": "secret", "action": "remove"}])]}, "uploadserver": {"post_url": url + "/upload"},
            "dashboard": {"ip": "127.0.0.1", "port": "${dashboardPort}", "post_url": url + "/logdata", "reliable": 250}}})
        self.say(history={"bytes": 65_536}, hash=["number"])
        with self.serving():
            client = self.client()
            client.message(number="0170", secret="none", text="x" * 2000)
            client.ask(UPLOAD_LOG, data=[{"kept": 2}])
            self.upload()
            self.upload(os.urandom(30_000))  # above a quarter
            # Each upload has a session of its own, which posts its start and its stop.
            wait_until(lambda: len(Collector.bodies) == 9, "all bodies", also=lambda: len(Collector.bodies))

            def answered():
                found = self.history()
                return found if all(item["status"] for item in found if item["kind"] != "datagram") else None
            items = wait_until(answered, "all answers")
            kinds = [item["kind"] for item in items]
            self.assertEqual({kind: kinds.count(kind) for kind in kinds}, {"post": 6, "datagram": 7, "logData": 1, "file": 2})
            large = items.pop(next(at for at, item in enumerate(items) if item["bytes"] > 16_384))
            self.assertEqual((large["kind"], large["kept"], len(large["sha256"])), ("file", False, 64))
            self.ctl("history", "show", large["id"], "--raw", status=1)
            kept = [self.raw(item) for item in items if item["kind"] != "datagram"]
            self.assertEqual(sorted(kept), sorted(body for body in Collector.bodies if len(body) < 16_384))
            post = next(item for item in items if item["kind"] == "post" and item["hashed"])
            self.assertEqual([post[key] for key in ("to", "events", "status", "error", "transmissions", "clientType", "sessionID", "client", "service", "backend", "entry", "removed", "hashed")],
                             [url + "/events", 1, 200, None, 1, 7, client.number, "phone", "phone", "httppost", 0, ["secret"], ["number"]])
            self.assertEqual(post["storebag"], {"name": "quindle", "version": "v7", "section": "release"})
            shown = self.ctl("history", "show", post["id"])[0]
            for words in (f"Host: localhost:{collector.server_port}", "Content-Encoding: gzip", '"text": "xxx', "removed     secret"):
                self.assertIn(words, shown)
            datagram = next(item for item in items if item["kind"] == "datagram")
            self.assertEqual((datagram["to"], datagram["transmissions"], len(self.raw(datagram))), (f"udp://127.0.0.1:{self.lab.dashboard[1]}", 1, datagram["bytes"]))
            left = {line["to"]: line for line in self.privacy()["destinations"]}
            self.assertEqual([left[url][key] for key in ("events", "files", "logData")], [6, 2, 1])
            page = self.root.path / "page.html"
            self.ctl("history", "--html", str(page))
            self.assertEqual(stat.S_IMODE(page.stat().st_mode), 0o600)
            self.assertEqual(page.read_text().count('<details class="item"'), len(items) + 1)
            files = list((self.root.path / HISTORY).iterdir())
            self.assertEqual([stat.S_IMODE(path.stat().st_mode) for path in files], [0o600])
            removed = json.loads(self.ctl("history", "purge", "--json")[0])
            self.assertEqual((removed["records"], removed["days"]), (len(items) + 1, 1))
            self.assertEqual((self.history(), list((self.root.path / HISTORY).iterdir())), ([], []))

    def test_a_days_limit_holds_over_kills(self):
        self.say(dailyEvents=6)  # each message: a post and a datagram
        for number in range(4):
            (self.root.path / "var/lib/veltrad/daily.json").unlink(missing_ok=True)  # the kill came before it was written
            daemon = self.daemon()
            client = self.client()
            for _ in range(4):
                client.message(number=number)
            daemon.wait_for_line(REFUSED + " (over_daily_limit)")
            wait_until(lambda: sum(self.arrived()[:2]) >= 6, "what may leave", also=self.arrived)
            daemon.kill()
        self.assertEqual(sum(self.arrived()[:2]), 6)

    def test_history_survives_kills_whole(self, rounds=int(os.environ.get("VELTRA_ROUNDS", "5"))):
        self.say(history={})
        synced = {}  # some of what was listed, and so is on disk, with its body
        for number in range(rounds):
            daemon = self.daemon()
            items = {item["id"]: item for item in self.history()}
            self.assertLessEqual(set(synced), set(items))
            for item, body in random.sample(sorted(synced.items()), min(2, len(synced))):
                self.assertEqual(self.raw(items[item]), body)
            client = self.client()
            for size in random.sample(range(3000), 20):
                client.message(number=number, text="x" * size)
            synced |= {item["id"]: self.raw(item) for item in random.sample(self.history(), 2)}
            for _ in range(random.randrange(200)):
                client.begin("sendMessageWithDictionary:reply:", message={"category": 5, "type": 2, "payload": {"text": "y" * 500}})
            daemon.kill()
        self.assertTrue(synced)
