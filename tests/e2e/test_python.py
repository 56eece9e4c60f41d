# SPDX-License-Identifier: Apache-2.0
"""The Python client, against a daemon that works, is missing, comes later, restarts, refuses or stands still."""
import itertools
import os
import signal
import sys
import time

from harness import SOURCE, SystemTest

sys.path.insert(0, str(SOURCE / "python"))
import veltra  # noqa: E402
import veltra.testing  # noqa: E402


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
                answer = session.send_and_wait(5, 2, flag=veltra.Flag.REALTIME)
                self.assertEqual([one[:3] for one in answer.outcomes], [("httppost", "posted", "no_user_info_required")])
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
        states = [state for state, _ in itertools.groupby(state for state, _, _ in said)]
        self.assertEqual(states, ["connecting", "connected", "started", "closed"])
        self.assertEqual(said[-2][1], ["httppost"])

    def test_a_restart_a_fork_and_refusals(self):
        said = []
        with veltra.testing.Daemon() as daemon:
            session = self.session(root=daemon.root, state_changed=lambda *state: said.append(state[0]))
            session.start()
            session.describe(client_type=2, user_info={"more": "y"}, frameworks_to_check=["A"])
            for number in range(500):
                session.send(5, number)
                if number == 250:
                    daemon.restart()
            self.assertTrue(daemon.wait(500))
            self.assertEqual([message["type"] for message in daemon.messages], list(range(500)))
            self.assertEqual(daemon.messages[-1]["sessionInfo"], {"clientType": 2})
            self.assertEqual(daemon.messages[-1]["userInfo"], {"more": "y"})
            self.assertEqual(said[-4:], ["lost", "connecting", "connected", "started"])
            if not (child := os.fork()):
                try:
                    session.send(5, 1)
                except veltra.ForkedError:
                    with veltra.Session(root=daemon.root) as own:
                        own.send_and_wait(6, 1)
                    os._exit(session.close())
                os._exit(1)
            self.assertEqual(os.waitpid(child, 0)[1], 0)
            daemon.refuse("no room")
            for refused in (lambda: session.send_and_wait(5, 1), lambda: self.session(root=daemon.root)):
                with self.assertRaisesRegex(veltra.Error, "no room"):
                    refused()
            daemon.refuse(None)
            daemon.delay(0.2)
            begin = time.monotonic()
            session.send_and_wait(7, 1)
            self.assertGreaterEqual(time.monotonic() - begin, 0.2)
            self.assertEqual([message["category"] for message in daemon.messages[500:]], [6, 7])
            self.assertEqual((session.statistics()[1:4], session.close()), ((0, 0, 0), 0))

    def test_a_daemon_that_stands_still(self):
        daemon = self.daemon()
        said = []
        session = self.session(queue_bytes=1 << 16, state_changed=lambda *state: said.append(state))
        os.kill(daemon.popen.pid, signal.SIGSTOP)
        taken, longest, most_queued = 0, 0.0, 0
        while True:
            most_queued = max(most_queued, session.statistics().queued)  # the socket may take them after the refusal
            begin = time.monotonic()
            if not session.send(5, 1, {"padding": "x" * 1000}):
                break
            longest, taken = max(longest, time.monotonic() - begin), taken + 1
        self.assertLess(longest, 1)
        self.assertGreater(most_queued, 50)
        counts = session.statistics()
        self.assertEqual((counts.sent + counts.queued, counts.dropped), (taken, 1))
        begin = time.monotonic()
        lost = session.close()
        self.assertLess(time.monotonic() - begin, 5)
        self.assertEqual(session.statistics().sent + lost, taken)
        self.assertEqual(said[-1][0], "closed")
        daemon.kill()
