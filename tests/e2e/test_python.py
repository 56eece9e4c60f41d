# SPDX-License-Identifier: Apache-2.0
"""The Python client, against a daemon that works, is missing, comes later, stands still, refuses or is killed."""
import os
import signal
import sys
import time

from harness import SOURCE, SystemTest, wait_until

sys.path.insert(0, str(SOURCE / "python"))
import veltra  # noqa: E402


class Python(SystemTest):
    def session(self, **options):
        return veltra.Session(**{"client_type": 7, "root": self.root.path, "client_name": "phone", **options})

    def test_a_session_from_start_to_close(self):
        payload = {"text": "ü", "number": -1, "real": 0.5, "flag": True}
        with self.serving("user info provided without requiring it"):
            with self.session(session_id=9, client_version=3, user_info={"more": "x"}, batch_events=True) as session:
                self.assertEqual(session.start(), ["httppost"])
                self.assertTrue(session.send(5, 1, payload))
                self.assertIsNone(session.flush())
                self.assertEqual(session.flush(), "Nothing to flush")
                self.assertTrue(session.send(5, 2, flag=1))
                event = self.lab.wait_for_events(1, _method=5, _status=1)[0]
                self.assertEqual({key: event[key] for key in payload}, payload)
                self.assertEqual(event["_clientVersion"], 3)
                self.lab.wait_for_events(1, _status=2)
                self.assertIn("/realtime", [post["path"] for post in self.lab.received("events")])
                self.assertEqual(session.statistics(), (5, 0, 0, 0, 1))
            self.assertFalse(session.send(5, 1))
            self.assertEqual(session.statistics().dropped, 1)
        for wrong in ({"client_type": 18}, {"client_version": 1 << 16}, {"session_id": -1}):
            with self.assertRaisesRegex(ValueError, f"{next(iter(wrong))}.*expected 0 to"):
                self.session(**wrong)

    def test_without_a_daemon_and_with_one_that_comes_later(self):
        with self.assertRaisesRegex(veltra.Error, "run/veltrad"):
            self.session()
        said = []
        session = self.session(connect_later=True, state_changed=lambda *state: said.append(state))
        self.assertIsNone(session.start())
        self.assertTrue(session.send(5, 1, {"early": True}))
        with self.serving("user info provided without requiring it"):
            self.lab.wait_for_events(1, early=True)
            self.assertEqual(session.close(), 0)
        self.assertEqual([state for state, _, _ in said], ["connecting", "connected", "started", "closed"])
        self.assertEqual(said[2][1], ["httppost"])

    def test_a_daemon_that_stands_still_and_one_that_dies(self):
        daemon = self.daemon()
        said = []
        session = self.session(queue_bytes=1 << 16, state_changed=lambda *state: said.append(state))
        other = self.session()
        os.kill(daemon.popen.pid, signal.SIGSTOP)
        taken, longest = 0, 0.0
        while True:
            begin = time.monotonic()
            if not session.send(5, 1, {"padding": "x" * 1000}):
                break
            longest, taken = max(longest, time.monotonic() - begin), taken + 1
        self.assertLess(longest, 1)
        counts = session.statistics()
        self.assertEqual((counts.sent + counts.queued, counts.dropped), (taken, 1))
        self.assertGreater(counts.queued, 50)
        begin = time.monotonic()
        lost = session.close()
        self.assertLess(time.monotonic() - begin, 5)
        self.assertEqual(session.statistics()[0] + lost, taken)
        self.assertEqual(said[-1][0], "closed")
        daemon.kill()
        wait_until(lambda: not other.send(5, 1), "the end of the connection")
        with self.assertRaisesRegex(veltra.Error, "daemon"):
            other.start()

    def test_a_refusal(self):
        self.root.grant([])
        with self.serving("entitlement"), self.assertRaisesRegex(veltra.Error, "entitle"):
            self.session()
