# SPDX-License-Identifier: Apache-2.0
"""Valid and invalid storebags, and servers that fail."""
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
            first, second = self.lab.received("storebags", 2)
            self.assertEqual((first["outcome"], second["outcome"]), ("200", "304"))
            self.assertEqual(first["path"], "/storebags/maple/quindle?version=8.0")
            self.assertNotIn("If-Modified-Since", first["headers"])
            daemon.wait_for_line("fetchStorebagWithName: storebag content has not changed. using its cached version")
            self.lab.put("quindle", storebag("v2", post_url="${url}/elsewhere"), age=0)
            session, _ = self.open()
            session.send()
            session.close()
            self.assertEqual(self.lab.wait_for_events(1, _status=1, _method=0)[0]["StorebagVersion"], "v2")
            third = self.lab.received("storebags", 3)[2]
            self.assertEqual(third["outcome"], "200")
            self.assertEqual(third["headers"]["If-Modified-Since"], second["headers"]["If-Modified-Since"])
            # "Not modified" without the date is a failure, and the section stays in use.
            self.lab.control(path="/storebags", lastModified=False)
            daemon.allow("fetchStorebagWithName: Signature is missing", "propertyListWithData error", FAILED, SECTION)
            self.assertEqual(self.open()[1], ["httppost"])
            daemon.wait_for_line("fetchStorebagWithName: Signature is missing")
            self.assertEqual(self.open()[1], ["httppost"])
            daemon.wait_for_line("storebagForSession: Not fetching storebag for client type 7 - must wait 900 seconds "
                                 "between attempts")
            self.assertEqual(len(self.lab.received("storebags")), 4)


class Servers(SystemTest):
    def test_quindle_has_a_default_and_other_names_get_nothing(self):
        """Each row: the server's address, how the lab misbehaves, how many requests arrive."""
        for url, cut, came in ((f"https://localhost:{closed_port()}/bags", False, 0),
                               ("https://no-such-host.invalid/bags", False, 0),
                               (self.lab.url.replace("https", "http"), False, 0), (self.lab.url, True, 2),
                               (self.lab.url, False, 0)):  # whose certificate is no longer trusted
            with self.subTest(url=url, cut=cut), self.serving(FAILED, SECTION, "mivo", "Mivo") as daemon:
                before = len(self.lab.received("storebags"))
                self.root.prefer(veltra_storebag_url=url)
                self.lab.control(path="/", cutHalfway=cut)
                self.assertIsNone(self.open(6)[1])
                daemon.wait_for_line(UNRESOLVED)
                daemon.wait_for_line(FAILED + "6")
                self.assertIsNotNone(self.open(7)[1])
                daemon.wait_for_line("fetchStorebagWithName: Loading default storebag 'quindle'")
                daemon.wait_for_line("fetchAndCacheStorebag: Storebag max age: 3600 seconds")
                self.assertEqual(len(self.lab.received("storebags")) - before, came)
                if cut:
                    (self.root.path / "etc/veltrad/ca.pem").unlink()


class Stalled(SystemTest):
    def test_gives_up_after_15_seconds(self):
        self.lab.control(path="/storebags", stall=True)
        with self.serving(FAILED, SECTION) as daemon:
            begin = time.monotonic()
            self.assertIsNone(self.open(6, deadline=25)[1])
            self.assertAlmostEqual(time.monotonic() - begin, 15, delta=2)
            daemon.wait_for_line(UNRESOLVED)
