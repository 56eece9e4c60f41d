# SPDX-License-Identifier: Apache-2.0
"""The lab without a daemon: unusual bodies, its page, refusals, uploads and datagrams."""
import base64
import gzip
import hashlib
import json
import plistlib
import socket
import struct
import unittest

from harness import DEADLINE, Lab, storebag, wait_until


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
        self.assertEqual((response.status, b"broken.json:1:13: " in body), (500, True))
        (self.lab.path / "storebags/signed.json").write_text('{"bag": "", "signature": ""} // by whom?')
        response, body = self.get("signed")
        self.assertEqual((response.status, b"signed already" in body), (500, True))
        self.assertEqual([a["outcome"] for a in self.lab.received("storebags")], ["200", "404", "404", "404", "500", "500"])
        for rule, word in (({"stats": 1}, "stats"), ({"status": "503"}, "status"), ({"times": 0}, "times"),
                           ({"bag": {"speed": 1}}, "bag"), ({"bag": {"clock": "noon"}}, "bag")):
            response, body = self.lab.request("POST", "/control", json.dumps(rule))
            self.assertEqual(response.status, 400)
            self.assertIn(f'"{word}": expected', body.decode())

    def test_stamps(self):
        bag = lambda: plistlib.loads(base64.b64decode(plistlib.loads(self.get()[1])["bag"]))
        self.lab.control(path="/", bag={"serial": 3, "name": "n", "clock": "2026-01-01T00:00:00Z", "validFor": 61})
        self.assertEqual([bag()[key] for key in ("serial", "name", "expires")], [3, "n", "2026-01-01T00:01:01Z"])
        keys = [hashlib.sha256((self.lab.path / "signing" / name).read_bytes()).hexdigest()
                for name in ("publicKey.der", "ed25519.der")]
        self.assertEqual([one["key"] for one in plistlib.loads(self.get()[1])["signatures"]], [keys[1][:16]])
        self.lab.control(path="/", bag={"revoked": ["signing", "a" * 64], "ed25519": []})
        self.assertEqual(bag()["revoked"], [*keys, "a" * 64])
        self.assertNotIn("signatures", plistlib.loads(self.get()[1]))
        self.lab.control(path="/", bag={"key": "nobody"})
        response, body = self.get()
        self.assertEqual((response.status, b"signing/nobody/private.pem" in body), (500, True))
        (self.lab.path / "storebags/quindle").write_bytes(b"as it is")
        self.assertEqual(self.get()[1], b"as it is")

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

    def test_a_script_is_followed_and_what_comes_twice_is_told_by_its_id(self):
        steps = [{"status": 429, "headers": {"Retry-After": "7"}}, {"status": 503, "times": 2}, {"status": 500, "forMs": 200}]
        self.lab.control(path="/events", script=steps)

        def post(identifier):
            response = self.lab.request("POST", "/events", b"{}", {"X-VLT-Post-ID": identifier})[0]
            return response.status, response.headers["Retry-After"]
        self.assertEqual([post(name) for name in ("a", "b", "a", "c")], [(429, "7"), (503, None), (503, None), (500, None)])
        wait_until(lambda: post("d")[0] == 200, "the end of the script")
        self.assertEqual(post("a"), (200, None))
        doubles = json.loads(self.lab.request("GET", "/doubles")[1])
        self.assertEqual((doubles["ids"], doubles["doubles"]["a"], "b" in doubles["doubles"]), (4, 3, False))
        self.assertEqual([line["double"] for line in self.lab.received("events")[:4]], [False, False, True, False])
        response, body = self.lab.request("POST", "/control", json.dumps({"path": "/events", "script": [{"path": "/a"}]}))
        self.assertEqual((response.status, b'"script": expected an array of rules without paths' in body), (400, True))

    def test_uploads(self):
        plain = bytes(65 << 20) + b"end"
        packed = gzip.compress(plain, 1)
        for body, problem in ((packed, ""), (b"", "empty"), (packed[:-1], "cut short"), (packed + b"x", "behind"),
                              (plain, "no gzip")):
            self.lab.request("POST", "/upload?uuid=a%20b", body, {"Content-Encoding": "gzip"})
            line = self.lab.received("uploads")[-1]
            self.assertEqual((line["bytes"], line["sha256"]), (len(body), hashlib.sha256(body).hexdigest()))
            self.assertRegex(line.get("problem", ""), problem or "^$")

    def test_datagrams(self):
        with socket.socket(socket.AF_INET, socket.SOCK_DGRAM) as client:
            client.settimeout(DEADLINE)
            good = [struct.pack(">2xB11xHHH40xHH", 1, 68 ^ 0xffff, 5, 1, event, 1) + b" a=b" for event in (1, 2)]
            for wrong in (good[0] + b"x", good[0][:63], b""):
                client.sendto(wrong, self.lab.dashboard)
            for line, problem in zip(self.lab.received("dashboard", 3), ("says that it has", "shorter", "shorter")):
                self.assertIn(problem, line["problem"])
            self.lab.control(path="/dashboard", times=1, ack="reorder")
            for packet in good:
                client.sendto(packet, self.lab.dashboard)
            answers = [client.recvfrom(4096) for _ in range(3)]
        self.assertEqual({sender for _, sender in answers}, {self.lab.dashboard})
        self.assertEqual([struct.unpack(">60xH2x", answer)[0] for answer, _ in answers], [1, 2, 1])
