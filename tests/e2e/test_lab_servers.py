"""The lab's dashboard, log data and upload servers alone, well behaved and not."""
import gzip
import hashlib
import plistlib
import socket
import struct
import time
import unittest

from harness import DEADLINE, Lab


class Posts(unittest.TestCase):
    def setUp(self):
        self.lab = Lab()
        self.addCleanup(lambda: self.assertEqual(self.lab.stop(), 0))

    def test_log_data(self):
        array = [{"name": "a.log", "data": b"\0\xff"}, 7, "text"]
        for number, body in enumerate((plistlib.dumps(array, fmt=plistlib.FMT_BINARY), b"bplist00no"), 1):
            answer, location = self.lab.request("POST", "/logdata", body, {"X-VLT-Sender": "JY"})
            self.assertEqual((answer.status, location.decode()), (200, f"/logs/{number}"))
        good, broken = self.lab.received("logdata", 2)
        self.assertEqual(good["body"], [{"data": {"$data": "AP8="}, "name": "a.log"}, 7, "text"])
        self.assertEqual((good["headers"]["X-VLT-Sender"], good["answer"], "problem" in good), ("JY", "/logs/1", False))
        self.assertEqual((broken["body"], bool(broken["problem"])), ("bplist00no", True))
        self.assertEqual(self.lab.received("events"), [])

    def test_uploads(self):
        def upload(body):
            answer = self.lab.request("POST", "/upload?uuid=a%20b&raw=true", body,
                                      {"Content-Encoding": "gzip", "Content-Type": "application/octet-stream"})[1]
            return answer, self.lab.received("uploads")[-1]

        plain = bytes(65 << 20) + b"end"
        packed = gzip.compress(plain, 1)
        answer, line = upload(packed)
        self.assertIn(b"success", answer)
        expected = {"query": {"uuid": "a b", "raw": "true"}, "bytes": len(packed), "plainBytes": len(plain),
                    "sha256": hashlib.sha256(packed).hexdigest(), "plainSHA256": hashlib.sha256(plain).hexdigest(),
                    "outcome": "200"}
        self.assertEqual({key: line.get(key) for key in expected}, expected)
        self.assertEqual((line["headers"]["Content-Encoding"], "problem" in line), ("gzip", False))
        for body, problem in ((b"", "empty"), (packed[:-1], "cut short"), (packed + b"x", "behind"),
                              (plain, "no gzip")):
            self.assertIn(problem, upload(body)[1]["problem"])
        for body, answer in (("no", b"no"), ({"$data": "//4="}, b"\xff\xfe")):
            self.lab.control(path="/upload", times=1, body=body)
            self.assertEqual(upload(packed)[0], answer)


class Dashboard(unittest.TestCase):
    def setUp(self):
        self.lab = Lab()
        self.addCleanup(lambda: self.assertEqual(self.lab.stop(), 0))
        self.socket = socket.socket(socket.AF_INET, socket.SOCK_DGRAM)
        self.addCleanup(self.socket.close)
        self.socket.settimeout(DEADLINE)

    def send(self, event, text=b"", flags=1, device=b"ab" * 20):
        length = 64 + len(text)
        packet = struct.pack(">BBBBIIHHHH40sHH", 2, 7, 1, 30, 1400000000, 4660 ^ 0xffffffff, 3 ^ 0xffff,
                             length ^ 0xffff, 5, 65535, device, event, flags) + text
        self.socket.sendto(packet, self.lab.dashboard)
        return packet

    def acknowledgement(self):
        """Event number (none where it is too short), bytes, whether the dashboard sent it."""
        data, sender = self.socket.recvfrom(4096)
        event = struct.unpack_from(">H", data, 60)[0] if len(data) > 61 else None
        return event, len(data), sender == self.lab.dashboard

    def test_every_field(self):
        packet = self.send(5, b" a=1 b=long value c=a\\=b\\\\d e=empty")
        self.send(6, flags=2, device=b"")
        for wrong in (packet + b"x", packet[:63], packet[:2] + b"\2" + packet[3:], b""):
            self.socket.sendto(wrong, self.lab.dashboard)
        line, bare, *wrong = self.lab.received("dashboard", 6)
        expected = {"versionMajor": 2, "componentType": 7, "kind": 1, "timeFraction": 30, "seconds": 1400000000,
                    "sessionID": 4660, "clientVersion": 3, "length": len(packet), "bytes": len(packet), "method": 5,
                    "respCode": 65535, "deviceID": "ab" * 20, "eventID": 5, "flags": 1, "reliable": True,
                    "withoutSection": False, "text": packet[64:].decode(), "outcome": "acknowledged",
                    "payload": {"a": "1", "b": "long value", "c": "a=b\\d", "e": "empty"},
                    "from": "127.0.0.1:%d" % self.socket.getsockname()[1]}
        self.assertAlmostEqual(line.pop("time"), time.time(), delta=60)
        self.assertEqual(line, expected)
        self.assertEqual((bare["deviceID"], bare["payload"], bare["withoutSection"], bare["outcome"]),
                         ("", {}, True, "not acknowledged: not asked for"))
        problems = ("says that it has", "shorter than", "kind is not 1", "shorter than")
        for found, problem in zip(wrong, problems, strict=True):
            self.assertIn(problem, found["problem"])
        self.assertEqual([self.acknowledgement() for _ in range(3)], [(5, 64, True)] * 3)

    def test_moods(self):
        right = [(event, 64, True) for event in range(4)]
        for mood, expected in (({}, right[1:3]), ({"ack": "drop"}, right[2:3]),
                               ({"ack": "reorder"}, [right[2], right[1]]),
                               ({"ack": "duplicate"}, [right[1], *right[1:3]]), ({"delayMs": 50}, [right[2], right[1]]),
                               ({"ack": "short"}, [(None, 61, True), right[2]]),
                               ({"ack": "long"}, [(1, 2000, True), right[2]]),
                               ({"ack": "foreign"}, [(0x4001, 64, True), right[2]]),
                               ({"ack": "stranger"}, [(1, 64, False), right[2]])):
            with self.subTest(mood):
                self.lab.control(path="/dashboard", times=1, **mood)
                self.send(1)
                self.send(2)
                self.assertEqual([self.acknowledgement() for _ in expected], expected)
                self.send(3)
                self.assertEqual(self.acknowledgement(), right[3])
        self.lab.control(path="/dashboard", times=1, ack="reorder")
        self.send(1)
        self.assertEqual(self.acknowledgement(), right[1])  # though nothing overtakes it
        self.lab.control(path="/dashboard", share=30, ack="drop")
        before = len(self.lab.received("dashboard"))
        for count in range(50, 301, 50):  # no more at once than a socket holds
            for event in range(50):
                self.send(event)
            lines = self.lab.received("dashboard", before + count)
        outcomes = [line["outcome"] for line in lines[before:]]
        self.assertAlmostEqual(outcomes.count("acknowledgement dropped"), 90, delta=30)
