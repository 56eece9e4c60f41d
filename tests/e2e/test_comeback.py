# SPDX-License-Identifier: Apache-2.0
"""Clients whose daemon is restarted, killed or stopped while they send: nothing arrives twice, and what did not arrive is
counted."""
import collections
import json
import signal
import subprocess

from harness import Process, SystemTest, program, storebag


BATCH = 49  # messages of a session that a daemon holds at most


class Sender(Process):
    """tests/e2e/clients/sender.cpp"""

    def __init__(self, root, name, microseconds, kind):
        self.name = name
        super().__init__([program("sender"), name, str(microseconds), kind], root.environment(), "stdout",
                         stdin=subprocess.PIPE)
        self.wait_for(lambda lines: lines, "the sender's first messages")

    def finish(self):
        """Ends its input; returns what it says about its messages."""
        self.popen.stdin.close()
        assert self.end() == 0
        return json.loads(self.text[-1])


def arrived(lab):
    """How often each message of each sender has arrived."""
    counts = collections.defaultdict(collections.Counter)
    for event in lab.events():
        if "sender" in event:
            counts[event["sender"]][event["number"]] += 1
    return counts


class Comeback(SystemTest):
    def setUp(self):
        super().setUp()
        self.lab.put("quindle", storebag())

    def daemon(self):
        return super().daemon(env={"VELTRA_LOG": "info"})

    def sender(self, name, microseconds=8000, kind="post"):
        sender = Sender(self.root, name, microseconds, kind)
        self.addCleanup(sender.kill)
        return sender

    def restart(self, senders, end):
        """Ends the daemon, starts another one and waits until it has messages of all senders."""
        end(self.running)
        before = {name: sum(counts.values()) for name, counts in arrived(self.lab).items()}
        self.running = self.daemon()
        for sender in senders:
            self.lab.wait_for_events(before.get(sender.name, 0) + 1, sender=sender.name)

    def check(self, said, held=0):
        """Compares what has arrived with what the senders say. `held`: messages that daemons had taken in and not posted when
        they were killed, which are not the library's to count."""
        counts = arrived(self.lab)
        for one in said:
            numbers = counts[one["sender"]]
            with self.subTest(one):
                self.assertEqual(max(numbers.values(), default=1), 1, "a message arrived twice")
                counted = len(numbers) + one["lost"] + one["closed"]
                if held:
                    self.assertGreaterEqual(counted + held, one["sent"])
                else:
                    self.assertEqual(counted, one["sent"])

    def test_orderly_restarts_lose_nothing_in_silence(self):
        senders = [self.sender("early")]  # before there is a daemon
        self.running = self.daemon()
        senders += [self.sender("post"), self.sender("reply", kind="reply")]
        for _ in range(4):
            self.restart(senders, lambda daemon: daemon.stop())
        said = [sender.finish() for sender in senders]
        self.running.stop()
        self.check(said)
        for one in said:
            self.assertGreater(one["connections"], 1)

    def test_what_a_killed_daemon_had_is_counted(self):
        self.running = self.daemon()
        senders = [self.sender("post"), self.sender("reply", kind="reply")]
        for _ in range(3):
            self.restart(senders, lambda daemon: daemon.kill())
        said = [sender.finish() for sender in senders]
        self.running.stop()
        self.check(said, 3 * len(senders) * BATCH)

    def test_a_stopped_daemon_holds_nobody_up(self):
        running = self.daemon()
        sender = self.sender("flood", 4000)
        self.lab.wait_for_events(1, sender="flood")
        running.popen.send_signal(signal.SIGSTOP)
        late = self.sender("late", 0)  # is created while nobody answers
        idle = self.sender("idle", 1000)
        said = [late.finish(), idle.finish()]
        running.popen.send_signal(signal.SIGCONT)
        said.append(sender.finish())
        running.stop()
        for one in said:
            self.assertLess(one["longest"], 1_000_000, one)
        self.check(said)
