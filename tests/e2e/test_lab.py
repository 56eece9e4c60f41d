"""What the daemon's tests do not see of the lab: its collector's odd bodies, its page, its stop."""
import base64
import gzip
import http.client
import json
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

    def test_storebags_and_rules(self):
        response, _ = self.get()
        self.assertEqual(response.headers["Cache-Control"], "max-age=1234")
        modified = response.headers["Last-Modified"]
        again, nothing = self.get(**{"If-Modified-Since": modified})
        self.assertEqual((again.status, nothing, again.headers["Last-Modified"]), (304, b"", modified))
        for name in ("nobody", "a.b", "%00"):
            self.assertEqual(self.get(name)[0].status, 404, name)
        (self.lab.path / "storebags/broken.json").write_text('{"version": ')
        response, body = self.get("broken")
        self.assertEqual(response.status, 500)
        self.assertIn(b"broken.json", body)
        self.assertEqual([a["outcome"] for a in self.lab.storebags()], ["200", "304", "404", "404", "404", "500"])
        self.lab.control(path="/any", times=2, delayMs=200, status=503, headers={"Retry-After": "7"}, body="no")
        begin = time.monotonic()
        answers = [self.get() for _ in range(3)]
        self.assertGreaterEqual(time.monotonic() - begin, 0.4)
        self.assertEqual([a.status for a, _ in answers], [503, 503, 200])
        self.assertEqual((answers[0][0].headers["Retry-After"], answers[0][1]), ("7", b"no"))
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

    def test_stall_and_stop(self):
        """A stalled request is let go by the reset, and holds up no stop; an endless one neither."""
        stalled, endless = (http.client.HTTPSConnection("localhost", self.lab.port, context=self.lab.tls,
                                                        timeout=DEADLINE) for _ in range(2))
        for count in (1, 2):
            self.lab.control(path="/events", stall=True)
            self.lab.control(path="/any", endless=True)
            stalled.request("POST", "/events", "{}")
            self.lab.received("events", count)
            if count == 1:
                self.lab.reset()
                self.assertEqual(stalled.getresponse().read(), b"{}")
        endless.request("GET", "/any/quindle")
        self.assertEqual(len(endless.getresponse().read(1 << 20)), 1 << 20)
        begin = time.monotonic()
        self.lab.process.popen.terminate()
        self.assertEqual(self.lab.process.popen.wait(5), 0)
        self.assertLess(time.monotonic() - begin, 1)
        stalled.close()
        endless.close()
