"""The lab alone: its collector's odd bodies, its page, what it refuses, how it reads uploads and datagrams."""
import base64
import gzip
import hashlib
import json
import socket
import struct
import time
import unittest

from harness import DEADLINE, Lab, storebag


class LabAlone(unittest.TestCase):
    def setUp(self):
        self.lab = Lab("--max-age", "1234")
        self.addCleanup(lambda: self.assertEqual(self.lab.stop(), 0))
        self.lab.put("quindle", storebag())

    def get(self, name="quindle", **headers):
        return self.lab.request("GET", f"/any/prefix/{name}?version=8.0", headers=headers)

    def test_refusals(self):
        self.assertEqual(self.get()[0].headers["Cache-Control"], "max-age=1234")
        for name in ("nobody", "a.b", "%00"):
            self.assertEqual(self.get(name)[0].status, 404, name)
        (self.lab.path / "storebags/broken.json").write_text('{"version": ')
        response, body = self.get("broken")
        self.assertEqual((response.status, b"broken.json" in body), (500, True))
        self.assertEqual([a["outcome"] for a in self.lab.storebags()], ["200", "404", "404", "404", "500"])
        for rule, word in (({"stats": 1}, "stats"), ({"status": "503"}, "status"), ({"times": 0}, "times")):
            response, body = self.lab.request("POST", "/control", json.dumps(rule))
            self.assertEqual(response.status, 400)
            self.assertIn(f'"{word}": expected', body.decode())

    def test_collector(self):
        packed = gzip.compress(b'{"a":\n"x"}')
        for body, headers in ((packed, {"Content-Encoding": "gzip"}), (b"\xff<b>", {}), ("<script>1</script>", {})):
            self.lab.request("POST", "/events", body, headers)
        first, second, _ = self.lab.received("events", 3)
        self.assertEqual((first["body"], first["compressed"], first["bytes"]), ({"a": "x"}, True, len(packed)))
        self.assertEqual(second["body"], {"$data": base64.b64encode(b"\xff<b>").decode()})
        page = self.lab.request("GET", "/")[1].decode()
        self.assertIn("&lt;script&gt;", page)
        self.assertNotIn("<script>", page)
        for body, status in ((gzip.compress(bytes(65 << 20)), 413), (b"no gzip", 400)):
            self.assertEqual(self.lab.request("POST", "/events", body, {"Content-Encoding": "gzip"})[0].status, status)

    def test_uploads(self):
        def upload(body):
            answer = self.lab.request("POST", "/upload?uuid=a%20b&raw=true", body, {"Content-Encoding": "gzip"})[1]
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

    def test_every_field_of_a_datagram(self):
        client = socket.socket(socket.AF_INET, socket.SOCK_DGRAM)
        self.addCleanup(client.close)
        client.settimeout(DEADLINE)

        def send(event, text=b"", flags=1, device=b"ab" * 20):
            length = 64 + len(text)
            packet = struct.pack(">BBBBIIHHHH40sHH", 2, 7, 1, 30, 1400000000, 4660 ^ 0xffffffff, 3 ^ 0xffff,
                                 length ^ 0xffff, 5, 65535, device, event, flags) + text
            client.sendto(packet, self.lab.dashboard)
            return packet

        def acknowledged(count):
            answers = [client.recvfrom(4096) for _ in range(count)]
            self.assertEqual({(len(data), sender) for data, sender in answers}, {(64, self.lab.dashboard)})
            return [struct.unpack_from(">H", data, 60)[0] for data, _ in answers]

        packet = send(5, b" a=1 b=long value c=a\\=b\\\\d e=empty")
        send(6, flags=2, device=b"")
        for wrong in (packet + b"x", packet[:63], packet[:2] + b"\2" + packet[3:], b""):
            client.sendto(wrong, self.lab.dashboard)
        line, bare, *wrong = self.lab.received("dashboard", 6)
        expected = {"versionMajor": 2, "componentType": 7, "kind": 1, "timeFraction": 30, "seconds": 1400000000,
                    "sessionID": 4660, "clientVersion": 3, "length": len(packet), "bytes": len(packet), "method": 5,
                    "respCode": 65535, "deviceID": "ab" * 20, "eventID": 5, "flags": 1, "reliable": True,
                    "withoutSection": False, "text": packet[64:].decode(), "outcome": "acknowledged",
                    "payload": {"a": "1", "b": "long value", "c": "a=b\\d", "e": "empty"},
                    "from": "127.0.0.1:%d" % client.getsockname()[1]}
        self.assertAlmostEqual(line.pop("time"), time.time(), delta=60)
        self.assertEqual(line, expected)
        self.assertEqual((bare["deviceID"], bare["payload"], bare["withoutSection"], bare["outcome"]),
                         ("", {}, True, "not acknowledged: not asked for"))
        problems = ("says that it has", "shorter than", "kind is not 1", "shorter than")
        for found, problem in zip(wrong, problems, strict=True):
            self.assertIn(problem, found["problem"])
        self.assertEqual(acknowledged(3), [5] * 3)
        self.lab.control(path="/dashboard", times=1, ack="reorder")
        send(1), send(2)
        self.assertEqual(acknowledged(2), [2, 1])
