# SPDX-License-Identifier: Apache-2.0
"""The control socket: the answers for administrators."""
import json
import os
import subprocess
import unittest

from harness import DEADLINE, ENTITLEMENT, SystemTest, Wire, program, storebag, wait_until

OBSERVE, CONTROL = "com.florn.veltrad.observe", "com.florn.veltrad.control"
NOBODY = 65534


class Control(SystemTest):
    def status(self, *arguments):
        return json.loads(self.ctl("status", "--json", *arguments)[0])

    def backend(self, client, name="httppost"):
        """The first session's back end, once it is there."""
        def found():
            for session in self.status()["sessions"]:
                for backend in session["backends"]:
                    if (session["clientName"], backend["name"]) == (client, name):
                        return backend
            return None
        return wait_until(found, f"the back end of {client}")

    def test_status_of_what_runs(self):
        self.lab.put("quindle", storebag(backends={"httppost": {"clients": [
            {"client": "batching", "post_url": "${url}/events", "locale_whitelist": ["US"], "filters": [],
             "sampling_threshold": 1, "event_threshold": 49, "expedite": 0}]},
            "ampery": {"active": True}}))
        with self.serving("FETCH", "fetch") as daemon:
            empty = self.status()
            self.assertEqual((empty["sessions"], empty["servers"]), ([], []))
            self.assertEqual(empty["daemon"]["pid"], daemon.popen.pid)
            self.assertEqual({bag["state"] for bag in empty["storebags"]}, {"never"})
            limits = {limit["name"]: limit for limit in empty["daemon"]["limits"]}
            self.assertEqual((limits["connections"]["used"], limits["connections"]["limit"]), (0, 4096))
            ctl, _ = self.open(identity=("--client", "batching", "--require-user-info"))
            refused, _ = self.open(identity=("--client", "other", "--require-user-info"), session_id=7)
            ctl.send()
            ctl.send()
            self.assertEqual(self.backend("batching")["held"], 3)  # with the start message
            ctl.ask("flush")
            posted = self.backend("batching")
            self.assertEqual((posted["state"], posted["reason"]["name"], posted["held"], posted["underWay"],
                              posted["lastOutcome"]), (2, "reports", 0, 0, "HTTP 200"))
            self.assertEqual(self.backend("other")["reason"]["name"], "no_entry")
            self.assertEqual(self.backend("other")["state"], 1)
            self.assertEqual(self.backend("other", "ampery")["reason"]["name"], "always")
            status = self.status()
            quindle = next(bag for bag in status["storebags"] if bag["name"] == "quindle")
            self.assertEqual((quindle["state"], quindle["version"]), ("successful", "v1"))
            self.assertEqual([(server["address"], server["failures"]) for server in status["servers"]],
                             [(self.lab.url, 0)])
            self.assertAlmostEqual(status["servers"][0]["lastSuccess"], quindle["nextAttempt"] - 86400, delta=60)
            shown = self.ctl("status")[0]
            for words in ("batching / no service name", "no client entry fits", "HTTP 200", "quindle"):
                self.assertIn(words, shown)
            metrics = dict(line.rsplit(" ", 1) for line in self.ctl("metrics")[0].splitlines() if line[0] != "#")
            self.assertEqual(metrics["veltrad_messages_total"], "4")
            self.assertEqual(metrics['veltrad_outcomes_total{reason="event_posted"}'], "3")
            self.assertEqual(metrics["veltrad_sessions"], "2")
            path = self.root.path / "run/veltrad/metrics.prom"
            kept = wait_until(lambda: path.exists() and "veltrad_messages_total 4\n" in (text := path.read_text()) and text,
                              "the file of the metrics")
            self.assertTrue(kept.endswith("# EOF\n"))
            ctl.close()
            refused.close()
            wait_until(lambda: self.status()["sessions"] == [], "no session")

    def test_families_are_trees_and_many_sessions_more_than_a_page(self):
        clients = [{"client": name, "hierarchy": level, "post_url": "${url}/events", "filters": [],
                    "locale_whitelist": ["US"], "sampling_threshold": 1}
                   for name, level in (("root", 0),)]
        self.lab.put("quindle", storebag(backends={"httppost": {"clients": clients}}))
        self.lab.put("ostvane", storebag(backends={"httppost": {"clients": [{**clients[0], "hierarchy": 1}]}}))
        with self.serving("fetch"):
            identity = ("--client", "root", "--service", "s", "--require-user-info")
            root, _ = self.open(identity=identity)
            child, _ = self.open(6, identity=identity, session_id=43)
            tree = self.status()["sessions"]
            self.assertEqual([(one["sessionID"], [below["sessionID"] for below in one["children"]]) for one in tree],
                             [(42, [43])])
            for first in "ab":  # two names that would fill a reply must not keep the others from being seen
                long = Wire(self.root)
                self.addCleanup(long.close)
                long.describe(user_info={"clientName": first + "\u00e9" * 400_000})
            many = [self.started() for _ in range(228)]
            self.assertEqual(len(self.status()["sessions"]), 231)
            self.assertEqual(len({one["sessionID"] for one in self.status()["sessions"]}), 2)
            self.assertIn("a" + "\u00e9" * 127, [one["clientName"] for one in self.status()["sessions"]])
            for one in many:
                one.close()
            root.close()
            child.close()

    @unittest.skipIf(os.getuid() != 0, "only root can be another user")
    def test_who_may_ask(self):
        """Each row: what uid 65534 is granted, whether status is answered."""
        veltractl = self.root.copy_of("veltractl")
        with self.serving():
            for granted, answered in (({}, False), ({OBSERVE: True}, True), ({CONTROL: True}, True), ({OBSERVE: 1}, False),
                                      ({ENTITLEMENT: True}, False)):
                with self.subTest(granted=granted):
                    self.root.grant([{"uid": NOBODY, "entitlements": granted}])
                    done = subprocess.run([veltractl, "status", "--json"], capture_output=True, text=True,
                                          env=self.root.environment(), user=NOBODY, timeout=DEADLINE)
                    self.assertEqual(done.returncode, 0 if answered else 1, done.stderr)
                    if not answered:
                        self.assertIn(OBSERVE, done.stderr)
            self.root.grant([{"uid": NOBODY, "entitlements": {OBSERVE: True}}])
            done = subprocess.run([veltractl, "watch", "--contents"], capture_output=True, text=True,
                                  env=self.root.environment(), user=NOBODY, timeout=DEADLINE)
            self.assertEqual((done.returncode, CONTROL in done.stderr), (1, True), done.stderr)

    @unittest.skipIf(os.getuid() != 0, "only root can be another user")
    def test_places_are_kept_for_root(self):
        os.chmod(self.root.path, 0o755)
        hold = ("import os, socket, sys, time\nos.setuid(int(sys.argv[2]))\nkept = []\n"
                "while len(kept) < 70:\n kept.append(socket.socket(socket.AF_UNIX)); kept[-1].connect(sys.argv[1])\n"
                "print('held', flush=True)\ntime.sleep(600)\n")
        with self.serving():
            path = str(self.root.path / "run/veltrad/control.sock")
            holders = [subprocess.Popen(["python3", "-c", hold, path, str(uid)], stdout=subprocess.PIPE, text=True)
                       for uid in (NOBODY, NOBODY - 1)]
            try:
                self.assertEqual([holder.stdout.readline() for holder in holders], ["held\n"] * 2)
                self.assertEqual(self.status()["sessions"], [])
                self.assertEqual(self.open()[1], ["httppost"])
            finally:
                for holder in holders:
                    holder.kill()
                    holder.communicate()

    def test_without_a_daemon(self):
        for command in ("status", "metrics"):
            self.assertIn("veltrad", self.ctl(command, status=1)[1])
