"""Hostile bytes on the socket: they cost their sender its connection and nobody else anything."""
import os
import plistlib
import random
import struct

from harness import SystemTest, Wire, wait_until

SEND = "sendMessageWithCategory:type:payload:reply:"


def header(length, kind, fds=0, call=0):
    return struct.pack(">IBBHI", length, kind, fds, 0, call)


def deep(levels):
    """A binary property list of arrays inside one another, by hand: the writer's recursion would not go so deep."""
    objects = b"".join(b"\xa1" + struct.pack(">H", index + 1) for index in range(levels)) + b"\xa0"
    offsets = b"".join(struct.pack(">H", 8 + 3 * index) for index in range(levels + 1))
    return b"bplist00" + objects + offsets + struct.pack(">6xBBQQQ", 2, 2, levels + 1, 0, 8 + len(objects))


class Hostile(SystemTest):
    def setUp(self):
        super().setUp()
        self.process = self.daemon()
        self.witness = Wire(self.root)
        self.witness.describe()
        self.assertEqual(self.witness.call("startConfigWithCompletionHandler:")["results"]["backends"], ["httppost"])
        self.sent = 0

    def tearDown(self):
        """The same process, the same session, each message once at the collector, in order."""
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

    def open_descriptors(self):
        return len(os.listdir(f"/proc/{self.process.popen.pid}/fd"))

    def test_what_ends_a_connection(self):
        before = self.open_descriptors()
        hello = plistlib.dumps({"wire": 1, "library": "8.0"}, fmt=plistlib.FMT_BINARY)
        greeting = header(len(hello), Wire.HELLO) + hello
        table = {"length beyond the bound": greeting + header(1_048_577, Wire.CALL, call=1),
                 "length of 4 GiB": greeting + header(0xFFFFFFFF, Wire.LARGE_CALL, call=1),
                 "first frame is a call": header(len(hello), Wire.CALL, call=1) + hello,
                 "descriptor that never came": greeting + header(2, Wire.CALL, fds=1, call=1) + b"xx",
                 "two descriptors": greeting + header(2, Wire.CALL, fds=2, call=1) + b"xx",
                 "web browser": b"GET / HTTP/1.1\r\nHost: localhost\r\n\r\n" * 100,
                 "zeroes": bytes(4096)}
        for what, data in table.items():
            with self.subTest(what):
                client = Wire(self.root, hello=False)
                try:
                    client.raw(data)
                except (BrokenPipeError, ConnectionResetError):
                    pass
                while frame := client.frame():
                    self.assertNotEqual(frame[0], Wire.EVENT)
                client.close()
        with self.subTest("descriptor that nobody announced"):
            client = Wire(self.root)
            read, write = os.pipe()
            body = plistlib.dumps({"op": "fetchDisplayURL:", "args": {}}, fmt=plistlib.FMT_BINARY)
            client.raw(header(len(body), Wire.CALL, call=1) + body, [read])
            client.raw(header(len(body), Wire.CALL, call=2) + body)
            while client.frame():
                pass
            os.close(read)
            os.close(write)
            client.close()
        with self.subTest("unknown version"):
            client = Wire(self.root, hello=False)
            client.send(Wire.HELLO, {"wire": 77, "library": "99.0"})
            kind, _, body = client.frame()
            self.assertEqual(kind, Wire.REFUSAL)
            self.assertRegex(body["error"]["description"], r"(?s)77.*\b1\b|\b1\b.*77")
            self.assertIsNone(client.frame())
            client.close()
        self.process.wait_for_line("was invalidated", 1)
        wait_until(lambda: self.open_descriptors() <= before, f"descriptors back to {before}")

    def test_what_interrupts_and_goes_on(self):
        client = Wire(self.root)
        dictionary = lambda value: plistlib.dumps(value, fmt=plistlib.FMT_BINARY)
        bodies = {"no property list": b"x" * 100, "empty": b"", "an array": dictionary([1]), "too deep": deep(5000),
                  "unknown operation": dictionary({"op": "dance", "args": {}}),
                  "no operation": dictionary({"args": {}}),
                  "operation that is a number": dictionary({"op": 5, "args": {}}),
                  "arguments of the wrong type": dictionary({"op": SEND, "args": {"category": "five", "type": [1]}}),
                  "XML": plistlib.dumps({"op": SEND, "args": {}})[:1000]}
        for call, (what, body) in enumerate(bodies.items(), 100):
            with self.subTest(what):
                client.send(Wire.CALL, body, call=call)
                kind, answered, reply = client.frame()
                self.assertEqual((kind, answered), (Wire.REPLY, call))
                if what not in ("arguments of the wrong type", "XML"):
                    self.assertTrue(reply["error"]["description"])
        self.process.wait_for_line("was interrupted")
        self.assertEqual(client.call("fetchDisplayURL:")["results"]["reply"], "URL not available")
        client.close()

    def test_random_bytes_and_half_frames(self):
        rng = random.Random(42)
        good = plistlib.dumps({"op": SEND, "args": {"category": 1, "type": 2, "payload": {"a": [1, 2.5, b"x", "y"]}}},
                              fmt=plistlib.FMT_BINARY)
        for round in range(150):
            client = Wire(self.root, hello=round % 3 != 0)
            data = bytearray(header(len(good), Wire.CALL, call=1) + good)
            if round % 3 == 0:
                data = rng.randbytes(rng.randrange(1, 2000))
            elif round % 3 == 1:
                for _ in range(rng.randrange(1, 6)):
                    data[rng.randrange(12, len(data))] = rng.randrange(256)
            else:
                data = data[:rng.randrange(1, len(data))]
            try:
                client.raw(bytes(data))
            except (BrokenPipeError, ConnectionResetError):
                pass
            client.close()
            if round % 50 == 0:
                self.unharmed()
        self.process.wait_for_line("was invalidated", 100)

    def test_client_that_does_not_read(self):
        """It is no longer read from; what waits for it is bounded, and goes with it."""
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
