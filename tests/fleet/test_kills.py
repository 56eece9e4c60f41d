# SPDX-License-Identifier: Apache-2.0
"""Parts are killed in turn under load and come back. VELTRA_ROUNDS is the number of kills, VELTRA_CLIENTS that of devices."""
import itertools
import json
import os
import subprocess
import threading
import time

import side
from devices import Dashboard, FleetTest, datagram, envelope, post_id, together

ROUNDS = int(os.environ.get("VELTRA_ROUNDS", "6"))
CLIENTS = int(os.environ.get("VELTRA_CLIENTS", "12"))
VICTIMS = ["stream1", "nginx", "gateway1", "drain", "postgres", "stream2", "gateway2", "stream3"]


class Device:
    """Posts events until it is told to stop, each until it is answered 200."""

    def __init__(self, test, number):
        self.name, self.door, self.sent, self.repeated, self.faults = f"device{number}", test.through(), 0, 0, []

    def run(self, stopped):
        while not stopped():
            identifier = post_id()
            body = envelope(*[{"n": self.sent + at, "_sessionID": self.name} for at in range(5)], client=self.name)
            while not self.is_taken(body, identifier):
                self.repeated += 1
                time.sleep(0.05)
            self.sent += 5

    def is_taken(self, body, identifier):
        try:
            answer = self.door.post("/events", body, X_VLT_Post_ID=identifier)
        except Exception:
            return False
        if answer.status not in (200, 429) or answer.body:
            self.faults.append(answer)
        return answer.status == 200


class Screen:
    """Sends datagrams, each until it is acknowledged."""

    def __init__(self, test, number):
        self.session, self.dashboard, self.sent = 1000 + number, Dashboard(test.line["dashboard"]), 0

    def run(self, stopped):
        for number in itertools.cycle(range(1, 65536)):
            if stopped() or not self.dashboard.deliver(datagram(number, session=self.session), stopped):
                return
            self.sent += 1


class Reporter:
    """A program that reports through the fleet's daemon, whose spool keeps what is not taken."""

    def __init__(self, fleet):
        self.process = subprocess.Popen([side.program("sender"), "reporter", "5000", "post"], stdin=subprocess.PIPE,
                                        stdout=subprocess.PIPE, text=True, env={**os.environ, "VELTRA_ROOT": str(fleet.path / "root")})
        self.process.stdout.readline()  # it sends

    def finish(self):
        """How many messages the daemon was given."""
        said = json.loads(self.process.communicate()[0].splitlines()[-1])
        if said["refused"] or said["lost"]:
            raise AssertionError(said)
        return said["sent"]


class Kills(FleetTest):
    parts = side.NAMES

    @classmethod
    def prepare(cls):
        spool = {"firstWait": 0.2, "longestWait": 2, "postsPerSecond": 100}
        (cls.fleet.path / "root/etc/veltrad/settings.json").write_text(json.dumps({"spool": spool}))
        entry = {"post_url": "${url}/events/daemon", "locale_whitelist": ["US"], "filters": [], "sampling_threshold": 1, "event_threshold": 49}
        cls.fleet.publish("quindle", json.dumps({"version": "1", "release": {"httppost": {"clients": [entry]}}}))

    def test_everything_confirmed_is_in_the_tables_once(self):
        stop = threading.Event()
        devices = [Device(self, number) for number in range(CLIENTS)]
        screens = [Screen(self, number) for number in range(2)]
        senders = [threading.Thread(target=one.run, args=(stop.is_set,), daemon=True) for one in devices + screens]
        for sender in senders:
            sender.start()
        reporter = Reporter(self.fleet)
        self.addCleanup(reporter.process.wait)
        self.addCleanup(reporter.process.kill)
        for _, victim in zip(range(ROUNDS), itertools.cycle(VICTIMS)):
            before = sum(device.sent for device in devices)
            side.wait_until(lambda: sum(device.sent for device in devices) > before + 200, f"load before {victim} is killed")
            old = self.fleet.facts["pids"][victim]
            self.fleet.kill(victim)
            side.wait_until(lambda: not side.alive(old), f"the end of {victim}")
            self.fleet.start([victim])
        stop.set()
        together([sender.join for sender in senders])
        self.assertEqual([fault for device in devices for fault in device.faults], [])
        events = sum(device.sent for device in devices)
        reported = reporter.finish()
        counts = ("SELECT count(*), count(DISTINCT fields->>'number') FROM veltra.events WHERE fields->>'sender' = 'reporter'")
        side.wait_until(lambda: int(self.fleet.query(counts)[0][0]) >= reported, "what the daemon's spool has kept is in the table")
        self.assertEqual(self.fleet.query(counts), [[str(reported), str(reported)]])
        side.wait_until(self.fleet.is_carried, "all events are in the table")
        for device in devices:
            with self.subTest(device=device.name):
                counts = self.fleet.query("SELECT count(*), count(DISTINCT fields->>'n'), max((fields->>'n')::int) FROM veltra.events "
                                          f"WHERE client_id = '{device.name}'")
                self.assertEqual(counts, [[str(device.sent), str(device.sent), str(device.sent - 1)]])
        for screen in screens:
            with self.subTest(screen=screen.session):
                [[rows, numbers]] = self.fleet.query("SELECT count(*), count(DISTINCT event_number) FROM veltra.datagrams "
                                                     f"WHERE session_id = {screen.session}")
                # The last one may have been taken without its acknowledgement being awaited.
                self.assertEqual(rows, numbers)
                self.assertIn(int(rows), (screen.sent, screen.sent + 1))
        print(json.dumps({"rounds": ROUNDS, "events": events, "reported": reported, "repeated": sum(device.repeated for device in devices),
                          "datagrams": sum(screen.sent for screen in screens)}), flush=True)
