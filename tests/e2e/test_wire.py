# SPDX-License-Identifier: Apache-2.0
"""Hostile bytes on the socket, which must end only the connection of their sender."""
import contextlib
import plistlib
import random
import struct

from harness import SystemTest, Wire, wait_until

SEND = "sendMessageWithCategory:type:payload:reply:"


def header(length, kind, fds=0, call=0):
    return struct.pack(">IBBHI", length, kind, fds, 0, call)


class Hostile(SystemTest):
    def setUp(self):
        super().setUp()
        self.process = self.daemon()
        self.witness, self.sent = self.started(), 0

    def tearDown(self):
        """Checks that process and session are the same as before and that each message arrived once and in order."""
        self.unharmed()
        self.lab.wait_for_events(self.sent, _method=5)
        self.assertEqual([e["n"] for e in self.lab.events() if e["_method"] == 5], list(range(1, self.sent + 1)))
        self.witness.close()
        self.process.stop()
        super().tearDown()

    def unharmed(self):
        self.sent += 1
        self.assertIn("results", self.witness.call(SEND, category=5, type=1, payload={"n": self.sent}))
        self.lab.wait_for_events(1, n=self.sent)

    def test_broken_random_and_half_frames(self):
        self.unharmed()
        before, rng = self.process.descriptors(), random.Random(42)
        good = plistlib.dumps({"op": SEND, "args": {"category": 1, "type": 2, "payload": {"a": [1, 2.5, b"x", "y"]}}},
                              fmt=plistlib.FMT_BINARY)
        for round in range(150):
            client = Wire(self.root, hello=round % 3 != 0)
            data, passed = bytearray(header(len(good), Wire.CALL, call=1) + good), ()
            if round % 3 == 0:
                data = rng.randbytes(rng.randrange(1, 2000))
            elif round % 3 == 1:
                for _ in range(rng.randrange(1, 6)):
                    data[rng.randrange(12, len(data))] = rng.randrange(256)
            else:
                data[5] = 1
                data, passed = data[:rng.randrange(1, len(data))], [client.socket.fileno()]  # its own connection
            with contextlib.suppress(BrokenPipeError, ConnectionResetError):
                client.raw(bytes(data), passed)
            client.close()
            if round % 50 == 0:
                self.unharmed()
        self.process.wait_for_line("was invalidated", 100)
        wait_until(lambda: len(self.process.descriptors()) <= len(before), f"descriptors back to {before}")

    def test_client_that_does_not_read(self):
        """The daemon stops reading from it. What waits for it is bounded and is freed when it is gone."""
        client = Wire(self.root)
        client.socket.settimeout(1)
        body = plistlib.dumps({"op": "fetchDisplayURL:", "args": {}}, fmt=plistlib.FMT_BINARY)
        frames = (header(len(body), Wire.CALL, call=1) + body) * 1000
        with self.assertRaises((BrokenPipeError, ConnectionResetError, TimeoutError)):
            for _ in range(1000):
                client.raw(frames)
        self.unharmed()
        client.close()
        self.process.wait_for_line("was invalidated")
