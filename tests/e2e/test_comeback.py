# SPDX-License-Identifier: Apache-2.0
"""Clients whose daemon is restarted, killed or stopped while they send: nothing arrives twice, and every loss is counted."""
import collections
import json
import os
import signal
import socket
import subprocess
import sys

from harness import SOURCE, Process, SystemTest, activated, program, storebag


class Sender(Process):
    """A program of tests/e2e/clients."""
    programs = {"C++": [program("sender")], "C": [program("sender_c")],
                "Python": [sys.executable, str(SOURCE / "tests/e2e/clients/sender.py")]}

    def __init__(self, root, name, microseconds, kind, language="C++"):
        self.name = name
        super().__init__([*self.programs[language], name, str(microseconds), kind], root.environment(), "stdout",
                         stdin=subprocess.PIPE)
        self.wait_for(lambda lines: lines, "the sender's first messages")

    def finish(self):
        """Ends the input of the sender; returns its report about its messages."""
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


class Ledger:
    """The losses that the successive daemons under a root have counted."""

    def __init__(self, root):
        self.path, self.by_process = root.path / "run/veltrad/counters.json", {}

    def add(self):
        """To be called when a daemon has ended. One that was killed early may have left the file of the one before it."""
        if self.path.exists():
            said = json.loads(self.path.read_text())
            lost = ("message lost", "message dropped", "event lost", "event dropped")
            self.by_process[said["pid"]] = sum(n for key, n in said["counts"].items() if key.startswith(lost))

    def total(self):
        return sum(self.by_process.values())


class Comeback(SystemTest):
    def setUp(self):
        super().setUp()
        self.lab.put("quindle", storebag())
        self.ledger = Ledger(self.root)

    handed = {}

    def daemon(self):
        return super().daemon(env={"VELTRA_LOG": "info"}, **self.handed)

    def sender(self, name, microseconds=8000, kind="post", language="C++"):
        sender = Sender(self.root, name, microseconds, kind, language)
        self.addCleanup(sender.kill)
        return sender

    def restart(self, senders, end):
        """Ends the daemon, starts another one and waits until it has messages of all senders."""
        end(self.running)
        self.ledger.add()
        before = {name: sum(counts.values()) for name, counts in arrived(self.lab).items()}
        self.running = self.daemon()
        for sender in senders:
            self.lab.wait_for_events(before.get(sender.name, 0) + 1, sender=sender.name)

    def stop(self, daemon):
        daemon.allow("post error", "did not end within")  # on a busy machine, whose last posts come too late
        daemon.stop()
        self.ledger.add()

    def check(self, said, exactly=True):
        """Compares the arrivals with the reports of the senders and the daemons."""
        counts, counted = arrived(self.lab), self.ledger.total()
        for one in said:
            numbers = counts[one["sender"]]
            with self.subTest(one):
                self.assertEqual(max(numbers.values(), default=1), 1, "a message arrived twice")
                here = len(numbers) + one["lost"] + one["closed"]
                counted += here
                if exactly:
                    self.assertLessEqual(here, one["sent"])
        sent = sum(one["sent"] for one in said)
        self.assertGreaterEqual(counted, sent, said)
        if exactly:
            self.assertEqual(counted, sent, said)

    def test_orderly_restarts_lose_nothing_in_silence(self):
        senders = [self.sender("early")]  # before there is a daemon
        self.running = self.daemon()
        senders += [self.sender("post"), self.sender("reply", kind="reply"), self.sender("python", language="Python")]
        for _ in range(4):
            self.restart(senders, self.stop)
        said = [sender.finish() for sender in senders]
        self.stop(self.running)
        self.check(said)
        for one in said:
            self.assertGreater(one["connections"], 1)

    def test_a_service_manager_that_keeps_the_socket_open(self):
        os.makedirs(os.path.dirname(self.root.socket))
        with socket.socket(socket.AF_UNIX) as listener, socket.socket(socket.AF_UNIX) as control:
            listener.bind(self.root.socket)
            control.bind(os.path.dirname(self.root.socket) + "/control.sock")
            for one in (listener, control):
                one.listen(5)
            self.handed = activated(control, listener)
            # It is connected, but nobody answers before there is a daemon.
            senders = [self.sender("early"), self.sender("reply", kind="reply")]
            self.running = self.daemon()
            for _ in range(3):
                self.restart(senders, self.stop)
            said = [sender.finish() for sender in senders]
            self.stop(self.running)
        self.check(said)

    def test_what_a_killed_daemon_had_is_counted(self):
        self.running = self.daemon()
        senders = [self.sender("post"), self.sender("python", kind="reply", language="Python")]
        senders += [self.sender("reply", kind="reply")]
        for _ in range(3):
            self.restart(senders, lambda daemon: daemon.kill())
        said = [sender.finish() for sender in senders]
        self.stop(self.running)
        self.check(said, exactly=False)

    def test_a_stopped_daemon_holds_nobody_up(self):
        running = self.daemon()
        sender = self.sender("flood", 4000)
        self.lab.wait_for_events(1, sender="flood")
        running.popen.send_signal(signal.SIGSTOP)
        late = self.sender("late", 0)  # is created while nobody answers
        idle = self.sender("idle", 1000)
        python = self.sender("python", 1000, language="Python")
        said = [late.finish(), idle.finish(), python.finish()]
        running.popen.send_signal(signal.SIGCONT)
        said.append(sender.finish())
        self.stop(running)
        for one in said:
            self.assertLess(one["longest"], 1_000_000, one)
        self.check(said)
