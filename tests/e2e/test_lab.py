"""The lab alone, seen by Python's HTTP client."""
import base64
import gzip
import hashlib
import http.client
import json
import os
import pathlib
import plistlib
import socket
import ssl
import time
import unittest

from harness import DEADLINE, Lab, storebag


def rsa_numbers(der):
    """Modulus and exponent of a SubjectPublicKeyInfo, read without a library."""
    numbers, at = [], der.index(bytes.fromhex("2a864886f70d010101")) + 9
    while at < len(der) and len(numbers) < 2:
        tag, length, at = der[at], der[at + 1], at + 2
        if length > 0x80:
            count = length - 0x80
            length, at = int.from_bytes(der[at:at + count], "big"), at + count
        if tag == 2:
            numbers.append(int.from_bytes(der[at:at + length], "big"))
        at += {2: length, 3: 1, 5: 0, 0x30: 0}[tag]  # into a bit string and a sequence
    return numbers


class LabAlone(unittest.TestCase):
    def setUp(self):
        self.lab = Lab("--max-age", "1234")
        self.addCleanup(lambda: self.assertEqual(self.lab.stop(), 0))
        self.lab.put("quindle", storebag())

    def get(self, name="quindle", **headers):
        return self.lab.request("GET", f"/any/prefix/{name}?version=8.0", headers=headers)

    def verifies(self, container):
        bag, signature = (base64.b64decode(container[key]) for key in ("bag", "signature"))
        modulus, exponent = rsa_numbers(pathlib.Path(self.lab.public_key).read_bytes())
        padded = pow(int.from_bytes(signature, "big"), exponent, modulus).to_bytes(len(signature), "big")
        digest = bytes.fromhex("3021300906052b0e03021a05000414") + hashlib.sha1(bag).digest()
        return padded == b"\0\1" + b"\xff" * (len(signature) - len(digest) - 3) + b"\0" + digest

    def test_signed_storebag(self):
        response, body = self.get()
        container = plistlib.loads(body)
        self.assertTrue(self.verifies(container))
        bag = plistlib.loads(base64.b64decode(container["bag"]))
        self.assertEqual(bag["release"]["httppost"]["clients"][0]["post_url"], self.lab.url + "/events")
        self.assertEqual(response.headers["Cache-Control"], "max-age=1234")
        modified = response.headers["Last-Modified"]
        again, nothing = self.get(**{"If-Modified-Since": modified})
        self.assertEqual((again.status, nothing, again.headers["Last-Modified"]), (304, b"", modified))
        self.lab.put("quindle", storebag("v2"), age=0)
        self.assertEqual(self.get(**{"If-Modified-Since": modified})[0].status, 200)
        for name in ("nobody", "a.b", "%00"):
            self.assertEqual(self.get(name)[0].status, 404, name)
        (self.lab.path / "storebags/broken.json").write_text('{"version": ')
        response, body = self.get("broken")
        self.assertEqual(response.status, 500)
        self.assertIn(b"broken.json", body)
        arrived = self.lab.storebags()
        self.assertEqual([a["outcome"] for a in arrived], ["200", "304", "200", "404", "404", "404", "500"])
        self.assertEqual(arrived[1]["headers"]["If-Modified-Since"], modified)

    def test_collector(self):
        self.lab.request("POST", "/events", '{"a": 1.50, "b": [null]}', {"X-VLT-Sender": "JY"})
        packed = gzip.compress(b'{"a":\n"x"}')
        self.lab.request("POST", "/collect/realtime", packed, {"Content-Encoding": "gzip"})
        self.lab.request("POST", "/events", b"\xff<b>", {})
        first, second, third = self.lab.received("events", 3)
        self.assertEqual((first["path"], first["method"], first["bytes"], first["compressed"]),
                         ("/events", "POST", 24, False))
        self.assertEqual(first["headers"]["X-VLT-Sender"], "JY")
        self.assertAlmostEqual(first["time"], time.time(), delta=60)
        self.assertEqual((second["body"], second["compressed"], second["bytes"]), ({"a": "x"}, True, len(packed)))
        self.assertEqual(third["body"], {"$data": base64.b64encode(b"\xff<b>").decode()})
        self.lab.request("POST", "/events", "<script>1</script>")
        page = self.lab.request("GET", "/")[1].decode()
        self.assertIn("&lt;script&gt;", page)
        self.assertNotIn("<script>", page)
        bomb = gzip.compress(bytes(65 << 20))
        self.assertEqual(self.lab.request("POST", "/events", bomb, {"Content-Encoding": "gzip"})[0].status, 413)
        self.assertEqual(self.lab.request("POST", "/events", b"no gzip", {"Content-Encoding": "gzip"})[0].status, 400)

    def test_misbehaviour(self):
        self.lab.control(path="/events", times=2, status=503, headers={"Retry-After": "7"}, body="no")
        answers = [self.lab.request("POST", "/events", "{}") for _ in range(3)]
        self.assertEqual([a.status for a, _ in answers], [503, 503, 200])
        self.assertEqual((answers[0][0].headers["Retry-After"], answers[0][1]), ("7", b"no"))
        self.lab.control(path="/any", sign="wrong", lastModified=False)
        response, body = self.get()
        self.assertFalse(self.verifies(plistlib.loads(body)))
        self.assertNotIn("Last-Modified", response.headers)
        self.lab.control(path="/any", sign="missing")
        self.assertEqual(set(plistlib.loads(self.get()[1])), {"bag"})
        self.lab.control(path="/any", sign="none")
        self.assertEqual(plistlib.loads(self.get()[1])["version"], "v1")
        self.lab.control(path="/any", cut=True)
        with self.assertRaises((http.client.RemoteDisconnected, ConnectionError, ssl.SSLError)):
            self.get()
        self.lab.control(path="/any", cutHalfway=True)
        with self.assertRaises((http.client.IncompleteRead, ConnectionError, ssl.SSLError)):
            self.get()
        self.lab.control(path="/any", delayMs=200)
        begin = time.monotonic()
        self.assertEqual(self.get()[0].status, 200)
        self.assertGreaterEqual(time.monotonic() - begin, 0.2)
        self.lab.control(path="/events", dripMs=40, body="drops")
        connection = http.client.HTTPSConnection("localhost", self.lab.port, context=self.lab.tls, timeout=DEADLINE)
        connection.request("POST", "/events", "{}")
        answer = connection.getresponse()
        begin = time.monotonic()
        self.assertEqual([answer.read1() for _ in range(5)], [b"d", b"r", b"o", b"p", b"s"])
        self.assertGreaterEqual(time.monotonic() - begin, 0.12)
        connection.close()
        self.lab.control(path="/events", status=302, headers={"Location": "/there"})
        answer, _ = self.lab.request("POST", "/events", "{}")
        self.assertEqual((answer.status, answer.headers["Location"]), (302, "/there"))
        for rule, word in (({"stats": 1}, "stats"), ({"status": "503"}, "status"), ({"times": 0}, "times")):
            response, body = self.lab.request("POST", "/control", json.dumps(rule))
            self.assertEqual(response.status, 400)
            self.assertIn(f'"{word}": expected', body.decode())

    def test_stall_and_stop(self):
        """A stalled request is let go by the reset, and holds up no stop; an endless one neither."""
        self.lab.control(path="/events", stall=True)
        self.lab.control(path="/any", endless=True)
        stalled = http.client.HTTPSConnection("localhost", self.lab.port, context=self.lab.tls, timeout=DEADLINE)
        stalled.request("POST", "/events", "{}")
        self.lab.received("events", 1)
        self.lab.reset()
        self.assertEqual(stalled.getresponse().read(), b"{}")
        self.lab.control(path="/events", stall=True)
        self.lab.control(path="/any", endless=True)
        stalled.request("POST", "/events", "{}")
        self.lab.received("events", 2)
        endless = http.client.HTTPSConnection("localhost", self.lab.port, context=self.lab.tls, timeout=DEADLINE)
        endless.request("GET", "/any/quindle")
        self.assertEqual(len(endless.getresponse().read(1 << 20)), 1 << 20)
        begin = time.monotonic()
        self.lab.process.popen.terminate()
        self.assertEqual(self.lab.process.popen.wait(5), 0)
        self.assertLess(time.monotonic() - begin, 1)
        stalled.close()
        endless.close()
