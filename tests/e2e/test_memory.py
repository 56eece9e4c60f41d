# SPDX-License-Identifier: Apache-2.0
"""The memory that one user can make the daemon keep: all value types, sizes, depths and states, with and without consent,
with collectors that hang, send huge answers or never answer."""
import concurrent.futures
import pathlib
import plistlib
import random
import time
import unittest

from harness import BUILD, SystemTest, Wire, storebag, wait_until

MIB = 1 << 20
SEND = "sendMessageWithCategory:type:payload:reply:"
LOG_DATA = "uploadLogData:completionHandler:"
CLIENTS = 12
VALUES = (
    lambda r: "x" * r.choice((1, 200, 900_000)),
    lambda r: "\x01" * r.choice((20, 900_000)),
    lambda r: "€\U0001f600" * r.choice((9, 60_000)),
    lambda r: b"\0" * r.choice((1, 900_000)),
    lambda r: [{}] * r.choice((1, 49_000)),
    lambda r: {f"k{i}": i for i in range(r.choice((3, 25_000)))},
    lambda r: [["n" * 5_000] * 90] * 15,  # shared objects
    lambda r: nested(r.choice((5, 59))),
    lambda r: r.choice((True, -1, 1 << 63, 0.5, float("nan"))),
)


def nested(depth):
    return [nested(depth - 1)] if depth else 1


def message(r):
    if r.random() < 0.3:
        return {f"{i:05}": "v" * 30 for i in range(r.choice((10, 9_000)))}
    return {f"f{i}": r.choice(VALUES)(r) for i in range(r.choice((1, 3)))}


@unittest.skipIf(BUILD.name in ("asan", "tsan"), "a sanitizer keeps memory of its own")
class Memory(SystemTest):
    def resident(self, daemon):
        return daemon.status("VmRSS") * 1024

    def at_rest(self, daemon):
        """Resident memory after the first post and some time without a session."""
        session, _ = self.open()
        session.send()
        self.lab.wait_for_events(1)
        self.assertEqual(session.close(), 0)
        seen = [0]
        def settled():
            seen.append(self.resident(daemon))
            return abs(seen[-1] - seen[-2]) < 64 << 10 and seen[-1]
        return wait_until(settled, "memory at rest")

    def play(self, seed, end):
        """Runs one client after the other until `end`, each with random messages."""
        r = random.Random(seed)
        while time.monotonic() < end:
            wire = Wire(self.root)
            wire.socket.settimeout(15)
            try:
                wire.describe(r.choice((6, 7)), aggregates=r.random() < 0.3)
                wire.call("startConfigWithCompletionHandler:")
                for _ in range(r.choice((1, 10, 40))):
                    self.say(wire, r)
            except (OSError, plistlib.InvalidFileException):
                pass  # refused, or made to wait too long; the daemon may do both
            finally:
                wire.close()

    def say(self, wire, r):
        what = r.random()
        try:
            if what < 0.05:
                wire.send(Wire.LARGE_CALL, {"op": LOG_DATA, "args": {"data": [b"d" * r.choice((9, 15 * MIB))]}}, 0)
            elif what < 0.1:
                wire.call("flushMessagesWithCompletion:") if r.random() < 0.5 else wire.send(
                    Wire.CALL, {"op": "flushMessagesWithCompletion:", "args": {}})
            elif what < 0.13:
                wire.call("fetchStatesWithUserInfo:completionHandler:",
                          userInfo={"clientName": "phone", "serviceName": "ringer", "more": r.choice(VALUES)(r)})
            elif what < 0.15:
                wire.raw(b"\0\x0f\xff\xff\2\0\0\0\0\0\0\1" + b"h" * r.choice((9, 900_000)))  # an unfinished frame
                raise OSError
            else:
                wire.send(Wire.CALL, {"op": SEND, "args": {"category": r.choice((5, 6)), "type": 1,
                                                           "payload": message(r)}})
        except (plistlib.InvalidFileException, OverflowError, TypeError, ValueError):
            pass  # plistlib cannot write this value

    def test_a_crowd_that_comes_and_goes(self):
        """All within a second, each client with its own identity."""
        with self.serving("", env={"VELTRA_LOG": "error"}, serving=False) as daemon:
            wait_until(lambda: pathlib.Path(self.root.socket).exists(), "the socket")
            rest = self.at_rest(daemon)
            crowd = [Wire(self.root) for _ in range(400)]
            for number, wire in enumerate(crowd):
                wire.describe(7, user_info={"clientName": f"client {number}", "more": "x" * 20_000})
                wire.begin("startConfigWithCompletionHandler:")
            for wire in crowd:
                wire.close()
            wait_until(lambda: self.resident(daemon) - rest < 8 * MIB, "memory back", 10,
                       lambda: f"{(self.resident(daemon) - rest) / MIB:.1f} MiB above rest")

    def test_posting(self):
        self.lab.put("ostvane", storebag(sampling_threshold=0, override_sampling=1))
        with self.serving("", env={"VELTRA_LOG": "error"}, serving=False) as daemon:
            wait_until(lambda: pathlib.Path(self.root.socket).exists(), "the socket")
            rest = self.at_rest(daemon)
            for path in ("/events", "/logdata"):
                self.lab.control(path=path, stall=True)
            self.lab.control(path="/realtime", delayMs=3000)
            end, most = time.monotonic() + 8, 0
            with concurrent.futures.ThreadPoolExecutor(CLIENTS) as pool:
                playing = [pool.submit(self.play, seed, end) for seed in range(CLIENTS)]
                while not all(one.done() for one in playing):
                    most = max(most, self.resident(daemon))
                    time.sleep(0.01)  # a sampling interval
                for one in playing:
                    one.result()
            self.assertLess(most - rest, 64 * MIB + CLIENTS * 40 * 1024, f"{(most - rest) / MIB:.1f} MiB above rest")
            self.lab.reset()
            wait_until(lambda: self.resident(daemon) - rest < 8 * MIB, "memory back", 75,
                       lambda: f"{(self.resident(daemon) - rest) / MIB:.1f} MiB above rest")
