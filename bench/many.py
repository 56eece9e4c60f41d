# SPDX-License-Identifier: Apache-2.0
"""Measures idle connections, and a well-behaved client among hostile ones."""
import os
import random
import subprocess
import sys
import threading
import time

from figures import Figure
from measures import Measure
from place import (BATCHES_OF_1000, ENTITLEMENT, SOURCE, Wire, context_switches, cpu_microseconds, memory_kib, wait_until)

HOLD = """import os, sys, types
sys.path[:0] = [sys.argv[1]]
from harness import Wire
root = types.SimpleNamespace(socket=sys.argv[2])
os.setuid(int(sys.argv[4]))
held = [Wire(root) for _ in range(int(sys.argv[3]))]
print("held", flush=True)
sys.stdin.read()
"""
SHARE, FIRST_USER = 1000, 64_000  # connections of one user; the daemon takes 1,024 of each


class Idle(Measure):
    """4,096 idle connections, of several users if the caller is root."""

    def round(self):
        users = [FIRST_USER + number for number in range(4)] if os.geteuid() == 0 else []
        counts = [1024] * len(users) or [SHARE]
        if self.quick:
            counts = [count // 8 for count in counts]
        root = self.place.root
        root.path.chmod(0o755)
        root.grant([{"uid": user, "entitlements": {ENTITLEMENT: True}} for user in (os.getuid(), *users)])
        with self.place.daemon() as daemon:
            pid, rest = daemon.popen.pid, memory_kib(daemon.popen.pid)
            held = [subprocess.Popen([sys.executable, "-c", HOLD, str(SOURCE / "tests/e2e"), root.socket, str(count),
                                      str(user)], stdin=subprocess.PIPE, stdout=subprocess.PIPE)
                    for user, count in zip(users or [os.getuid()], counts)]
            for holder in held:
                assert holder.stdout.readline() == b"held\n", "a connection was refused"
            self.count = sum(counts)
            self.take(memory=(memory_kib(pid) - rest) / self.count)
            time.sleep(1.5)  # until the counters have been written
            before, waits, begin = cpu_microseconds(pid), context_switches(pid), time.monotonic()
            time.sleep(2 if self.quick else 5)
            took = time.monotonic() - begin
            self.take(cpu=(cpu_microseconds(pid) - before) / took / 1e4, waits=(context_switches(pid) - waits) / took)
            for holder in held:
                holder.communicate()
        root.grant([{"uid": os.getuid(), "entitlements": {ENTITLEMENT: True}}])

    def figures(self):
        yield Figure(f"CPU of {self.count:,} idle connections", "% of a core", self.taken["cpu"], most=0.1)
        yield Figure(f"wake-ups of {self.count:,} idle connections", "a second", self.taken["waits"])
        yield Figure("memory of an idle connection", "KiB", self.taken["memory"], most=40)


class Attack(Measure):
    """A client sends 1,000 messages a second with replies while others connect and leave, send rubbish and stop in the middle of
    a frame."""
    ATTACKERS = 4

    def _attack(self, seed, until):
        draw, kept = random.Random(seed), []
        while not until.is_set():
            try:
                wire = Wire(self.place.root, hello=draw.random() < 0.5)
                wire.raw(draw.choice((b"\xff" * 12, draw.randbytes(200), (60_000).to_bytes(4, "big") + b"\x02\0\0\0\0\0\0\x01half")))
                kept.append(wire)
            except (OSError, AssertionError, ValueError):
                pass  # refused, or closed while it was sending: expected for an attacker
            if len(kept) > 100:
                kept.pop(0).close()
        for wire in kept:
            wire.close()

    def round(self):
        with self.place.daemon() as daemon:
            pid = daemon.popen.pid
            with self.place.client("waits", BATCHES_OF_1000, 1, 100) as client:
                client.run()
            first, descriptors = memory_kib(pid), len(os.listdir(f"/proc/{pid}/fd"))
            until = threading.Event()
            attackers = [threading.Thread(target=self._attack, args=(seed, until)) for seed in range(self.ATTACKERS)]
            for attacker in attackers:
                attacker.start()
            try:
                got = self.place.load("latency", self.place.root.path, BATCHES_OF_1000, 1000, 1 if self.quick else 5)
                self.take(p99=got["p99"] / 1000, memory=(memory_kib(pid) - first) / 1024)
            finally:
                until.set()
                for attacker in attackers:
                    attacker.join()
            begin = time.monotonic()
            wait_until(lambda: len(os.listdir(f"/proc/{pid}/fd")) <= descriptors + 2, "the attackers' descriptors")
            self.take(back=time.monotonic() - begin)

    def figures(self):
        yield Figure("p99 of send with reply under attack", "ms", self.taken["p99"], most=100)
        yield Figure("memory above rest under attack", "MiB", self.taken["memory"], most=64)
        yield Figure("descriptors back after an attack", "s", self.taken["back"], most=5)
