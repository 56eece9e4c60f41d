"""What the daemon makes of storebags, good and bad, and of their servers."""
import concurrent.futures
import time

from harness import Ctl, SystemTest, closed_port, storebag

FAILED = "fetchAndCacheStorebag: Unable to fetch storebag for client type "
SECTION = "fetchStorebagForEnvironmentAndClientType: Could not fetch storebag for client type "
UNRESOLVED = "fetchStorebagWithName: Error resolving with lookup server "


class Cache(SystemTest):
    def test_client_types_share_one_download(self):
        self.lab.control(path="/storebags", delayMs=300)
        with self.serving() as daemon, concurrent.futures.ThreadPoolExecutor() as pool:
            opened = list(pool.map(lambda client_type: self.open(client_type), (7, 13)))
            self.assertEqual([backends for _, backends in opened], [["httppost"]] * 2)
            daemon.wait_for_line("storebagForSession: Cached storebag found for client type ")
            self.assertEqual({e["_sender"] for e in self.lab.wait_for_events(2)}, {"JY", "QOLIN"})
            request, = self.lab.storebags()
            self.assertEqual(request["path"], "/storebags/maple/quindle?version=8.0")
            self.assertNotIn("If-Modified-Since", request["headers"])
            self.assertEqual(self.open(2)[1], None)  # a client type without storebag, and without a download
            daemon.allow("Could not find storebag name for client type 2")
            daemon.wait_for_line("<3>fetchStorebagForEnvironmentAndClientType: Could not find storebag name for client "
                                 "type 2")
            self.assertEqual(len(self.lab.storebags()), 1)


class Conditional(SystemTest):
    lab_arguments = ("--max-age", "0")

    def test_request_with_date(self):
        with self.serving() as daemon:
            self.assertEqual(self.open()[1], ["httppost"])
            self.assertEqual(self.open()[1], ["httppost"])
            first, second = self.lab.storebags(2)
            self.assertEqual((first["outcome"], second["outcome"]), ("200", "304"))
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


class Untrusted(SystemTest):
    def test_what_is_not_signed_is_not_used(self):
        unverified = "fetchStorebagWithName: Signature can not be verified, "
        missing = "fetchStorebagWithName: Signature is missing"
        table = [(5, "pellmarch", {"sign": "wrong"}, unverified), (6, "ostvane", {"sign": "missing"}, missing),
                 (10, "tamberlin", {"status": 500, "body": ""}, missing)]
        with self.serving(unverified, missing, "propertyListWithData error ", FAILED, SECTION) as daemon:
            for client_type, name, rule, line in table:
                with self.subTest(**rule):
                    self.lab.put(name, storebag())
                    self.lab.control(path="/storebags", **rule)
                    self.assertIsNone(self.open(client_type)[1])
                    daemon.wait_for_line(f"{FAILED}{client_type}")
            daemon.wait_for_line(unverified)
            daemon.wait_for_line(missing, 2)
            self.assertEqual(self.lab.events(), [])


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
    def test_nobody_waits_for_a_server_that_he_did_not_ask_for(self):
        self.lab.control(path="/storebags/maple/ostvane", stall=True)
        with self.serving() as daemon:
            waiting = Ctl(self.root, 6)
            self.addCleanup(waiting.kill)
            self.lab.storebags(1)
            session, backends = self.open(7)
            self.assertEqual(backends, ["httppost"])
            session.send()
            session.ask("finish")
            session.close()
            self.lab.wait_for_events(4)
            daemon.wait_for_line("was invalidated")
            self.assertEqual(waiting.text, [])
            self.lab.reset()
            self.assertEqual(waiting.answer()["backends"], ["httppost"])

    def test_gives_up_after_15_seconds(self):
        self.lab.control(path="/storebags", stall=True)
        with self.serving(FAILED, SECTION) as daemon:
            begin = time.monotonic()
            self.assertIsNone(self.open(6, deadline=25)[1])
            self.assertAlmostEqual(time.monotonic() - begin, 15, delta=2)
            daemon.wait_for_line(UNRESOLVED)
