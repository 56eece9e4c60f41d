"""What the daemon makes of storebags, good and bad, and of their servers."""
import time

from harness import SystemTest, closed_port, storebag

FAILED = "fetchAndCacheStorebag: Unable to fetch storebag for client type "
SECTION = "fetchStorebagForEnvironmentAndClientType: Could not fetch storebag for client type "
UNRESOLVED = "fetchStorebagWithName: Error resolving with lookup server "


class Conditional(SystemTest):
    lab_arguments = ("--max-age", "0")

    def test_request_with_date(self):
        with self.serving() as daemon:
            self.assertEqual(self.open()[1], ["httppost"])
            self.assertEqual(self.open()[1], ["httppost"])
            first, second = self.lab.storebags(2)
            self.assertEqual((first["outcome"], second["outcome"]), ("200", "304"))
            self.assertEqual(first["path"], "/storebags/maple/quindle?version=8.0")
            self.assertNotIn("If-Modified-Since", first["headers"])
            daemon.wait_for_line("fetchStorebagWithName: storebag content has not changed. using its cached version")
            self.lab.put("quindle", storebag("v2", post_url="${url}/elsewhere"), age=0)
            session, _ = self.open()
            session.send()
            session.close()
            self.assertEqual(self.lab.wait_for_events(1, _status=1, _method=0)[0]["StorebagVersion"], "v2")
            third = self.lab.storebags(3)[2]
            self.assertEqual(third["outcome"], "200")
            self.assertEqual(third["headers"]["If-Modified-Since"], second["headers"]["If-Modified-Since"])
            # Not modified, but without the date: a failure, and the section stays.
            self.lab.control(path="/storebags", lastModified=False)
            daemon.allow("fetchStorebagWithName: Signature is missing", "propertyListWithData error", FAILED, SECTION)
            self.assertEqual(self.open()[1], ["httppost"])
            daemon.wait_for_line("fetchStorebagWithName: Signature is missing")
            self.assertEqual(self.open()[1], ["httppost"])
            daemon.wait_for_line("storebagForSession: Not fetching storebag for client type 7 - must wait 900 seconds "
                                 "between attempts")
            self.assertEqual(len(self.lab.storebags()), 4)


class Servers(SystemTest):
    """The storebag server fails; quindle's built-in storebag stands in, other names get nothing."""
    allowed = (FAILED, SECTION, "mivo", "Mivo")

    def fails(self, daemon):
        self.assertIsNone(self.open(6)[1])
        daemon.wait_for_line(UNRESOLVED)
        daemon.wait_for_line(FAILED + "6")
        self.assertIsNotNone(self.open(7)[1])
        daemon.wait_for_line("fetchStorebagWithName: Loading default storebag 'quindle'")
        daemon.wait_for_line("fetchAndCacheStorebag: Storebag max age: 3600 seconds")

    def test_unreachable(self):
        for url in (f"https://localhost:{closed_port()}/bags", "https://no-such-host.invalid/bags",
                    self.lab.url.replace("https", "http")):
            with self.subTest(url):
                self.root.prefer(veltra_storebag_url=url)
                with self.serving(*self.allowed) as daemon:
                    self.fails(daemon)
        self.assertEqual(self.lab.storebags(), [])

    def test_certificate_that_nobody_vouches_for_and_broken_answers(self):
        with self.serving(*self.allowed) as daemon:
            self.lab.control(path="/storebags", cutHalfway=True)
            self.fails(daemon)
        came = len(self.lab.storebags())
        (self.root.path / "etc/veltrad/ca.pem").unlink()
        with self.serving(*self.allowed) as daemon:
            self.fails(daemon)
        self.assertEqual(len(self.lab.storebags()), came)


class Stalled(SystemTest):
    def test_gives_up_after_15_seconds(self):
        self.lab.control(path="/storebags", stall=True)
        with self.serving(FAILED, SECTION) as daemon:
            begin = time.monotonic()
            self.assertIsNone(self.open(6, deadline=25)[1])
            self.assertAlmostEqual(time.monotonic() - begin, 15, delta=2)
            daemon.wait_for_line(UNRESOLVED)
