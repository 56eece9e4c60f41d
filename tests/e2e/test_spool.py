# SPDX-License-Identifier: Apache-2.0
"""Posts that fail are kept and sent again: despite faults of servers and disks, restarts and kills, within the owner's policy.

VELTRA_ROUNDS is the number of times that the daemon is killed (10)."""
import collections
import contextlib
import json
import os
import random
import stat
import subprocess
import time

from harness import Lab, wait_until
from test_https import HTTPSTest, entry

SPOOL = "var/lib/veltrad/spool"
QUICK = {"firstWait": 0.05, "longestWait": 0.2, "postsPerSecond": 1000}
PATIENT = {**QUICK, "firstWait": 3600, "longestWait": 3600}
POST_ERROR = "post error: "
KEPT = "event kept: in the spool"


class SpoolTest(HTTPSTest):
    def setUp(self):
        super().setUp()
        self.serve(entry("phone"), entry("lamp"))
        self.keep()

    def keep(self, spool=QUICK, **more):
        settings = json.dumps({**({} if spool is None else {"spool": spool}), **more})
        self.root.write("etc/veltrad/settings.json", settings.encode())

    def say(self, **rules):
        self.root.write("etc/veltrad/policy.json", json.dumps(rules).encode())

    def files(self):
        folder = self.root.path / SPOOL
        return sorted(path.name for path in folder.iterdir()) if folder.is_dir() else []

    def spooled(self, *command):
        return [json.loads(line) for line in self.ctl("spool", *command, "--json")[0].splitlines()]

    def status(self):
        return json.loads(self.ctl("status", "--json")[0])["spool"]

    def settled(self, posts=0):
        wait_until(lambda: self.status()["posts"] == posts and not any(name.endswith(".new") for name in self.files())
                   and len(self.files()) == posts, f"{posts} posts in the spool", also=lambda: (self.status(), self.files()))

    def so_far(self):
        written = (self.root.path / "run/veltrad/counters.json").exists()
        return self.counts() if written else {}

    def counted(self, text, times):
        wait_until(lambda: self.so_far().get(text) == times, f"{times} {text}", also=self.so_far)

    def spoil(self, path="/events", **rule):
        self.lab.control(path=path, **(rule or {"status": 503}))

    def ids(self, **like):
        """For each ID that has come with events like this: their numbers, in the order of first arrival, and how often."""
        found = collections.OrderedDict()
        for post in self.lab.received("events"):
            numbers = [event.get("number") for event in post["body"]["events"]]
            if all(event.get(key) == value for event in post["body"]["events"] for key, value in like.items()):
                found.setdefault(post["headers"]["X-VLT-Post-ID"], (numbers, []))[1].append(post["outcome"])
        return found

    def arrived(self, **like):
        """The numbers of events that were answered with 200, each ID once."""
        return [number for numbers, outcomes in self.ids(**like).values() if "200" in outcomes for number in numbers
                if number is not None]

    def filled(self, *arguments, **options):
        """A session's three posts and its start in the spool."""
        client = self.client(*arguments, requireUserInfo=True, **options)
        for number in range(3):
            client.message(number=number)
        self.settled(4)
        return client


class Spool(SpoolTest):
    def test_without_the_setting_nothing_is_kept_and_no_header_sent(self):
        self.keep(None)
        self.spoil()
        with self.serving():
            client = self.client()
            self.posts("phone", 1)
            wait_until(lambda: client.states(clientName="phone", serviceName="phone") == [], "a back end that is disabled")
            self.assertIsNone(self.status())
            self.assertFalse((self.root.path / SPOOL).exists())
            self.ctl("spool", status=1)
        self.assertNotIn("X-VLT-Post-ID", {name for post in self.lab.received("events") for name in post["headers"]})
        self.assertNotIn(KEPT, self.counts())

    def test_what_may_come_through_later_is_kept_and_comes_once_by_its_id(self):
        steps = [{"status": 503}, {"status": 429, "headers": {"Retry-After": "1"}}, {"cut": True}, {"status": 408},
                 {"cutHalfway": True}, {"status": 500}]
        with self.serving(POST_ERROR) as daemon:
            client = self.client()
            self.settled()
            before = self.posts("phone", 1)
            self.spoil("/events/phone", script=steps)
            client.message(number=1)
            post = wait_until(lambda: [one for one in self.ids().items() if one[1][0] == [1] and one[1][1].count("200") == 2],
                              "a post after its faults")[0]
            self.assertEqual(post[1][1], ["503", "429", "cut", "408", "200", "500", "200"])
            tries = [line for line in self.posts("phone") if line["headers"]["X-VLT-Post-ID"] == post[0]]
            self.assertEqual(len({json.dumps([line["path"], line["headers"], line["body"]], sort_keys=True) for line in tries}), 1)
            self.assertGreaterEqual(tries[2]["time"] - tries[1]["time"], 0.9)
            self.assertRegex(post[0], "^[0-9a-f]{32}$")
            self.assertEqual(json.loads(self.lab.request("GET", "/doubles")[1])["doubles"], {post[0]: 7})
            self.settled()
            told = json.loads(self.ctl("why", "--json", "--category", "5")[0].splitlines()[-1])["backends"]["httppost"]
            self.assertEqual((told["fate"], told["status"]), ("posted", 200))
            steps = [step["step"] for step in told["road"]]
            self.assertEqual((steps[:3], steps[-2:]), (["taken", "posted", "kept"], ["again", "answered"]))
            self.assertEqual((steps.count("kept"), steps.count("again")), (5, 5))  # after the cut libcurl repeats by itself
            self.spoil("/events/phone", script=[{"status": 501}])
            client.message(number=2)
            wait_until(lambda: client.states(clientName="phone", serviceName="phone") == [], "a back end that is disabled")
            self.settled()
        self.assertEqual(self.counts()[KEPT], 1)
        self.assertEqual(self.counts()["event lost: the server answered 5xx"], 1)

    def test_a_flush_gets_the_status_and_the_back_end_goes_on(self):
        self.keep(PATIENT)
        with self.serving():
            client = self.client(batchEvent=True)
            self.settled()
            for status in (503, 429):
                self.spoil(status=status)
                client.message(number=status)
                self.assertEqual(client.flush()[1], status)
                self.settled(1)
                post = self.spooled()[0]["id"]
                self.assertEqual(json.loads(self.ctl("spool", "drop", post, post, "--json")[0]), {"posts": 1})
            self.assertEqual(client.states(clientName="phone", serviceName="phone"), ["httppost"])
            self.counted("event dropped: from the spool: by_hand", 3)

    def test_an_address_that_fails_is_tried_with_its_oldest_post_alone_and_then_drained_in_order(self):
        self.keep({**PATIENT, "postsPerSecond": 20})
        self.spoil()
        with self.serving() as daemon:
            client, other = self.client(batchEvent=True), self.client("lamp", batchEvent=True)
            for number in range(10):
                for each in (client, other):
                    each.message(number=number, of=each.number)
                    each.flush()
            self.settled(20)
            self.assertEqual(len(self.lab.received("events")), 1)  # later ones were not sent
            listed = self.spooled("list")
            self.assertEqual([(line["id"], line["events"]) for line in listed],
                             [(name.split(".")[1], 2 if at < 2 else 1) for at, name in enumerate(self.files())])
            first = listed[0]
            self.assertEqual([first[key] for key in ("url", "clientType", "sessionID", "client", "service", "backend", "uid", "entry",
                                                     "tries", "lastError")],
                             [self.lab.url + "/events/phone", 7, client.number, "phone", "phone", "httppost", os.getuid(), 0, 1, "HTTP 503"])
            self.assertEqual(first["storebag"], {"name": "quindle", "version": "v1", "section": "release"})
            self.assertGreater(first["nextTry"], time.time())
            self.assertEqual([line["tries"] for line in listed[1:]], [0] * 19)
            status = self.status()
            self.assertEqual((status["posts"], status["bytes"], status["oldest"]),
                             (20, sum(line["bytes"] for line in listed), first["time"]))
            self.assertEqual({key: status["addresses"][0][key] for key in ("address", "posts", "lastError")},
                             {"address": self.lab.url, "posts": 20, "lastError": "HTTP 503"})
            self.assertIn("veltrad_spool_posts 20", self.ctl("metrics")[0])
            self.assertIn("kept: HTTP 503; next try in ", self.ctl("why", "--client", "phone", "--category", "5")[0])
            self.assertEqual(self.spooled("send"), [{"posts": 20}])
            self.lab.received("events", 2)
            wait_until(lambda: self.spooled()[0]["tries"] == 2, "the oldest alone was tried")
            self.lab.reset()
            began = time.monotonic()
            self.ctl("spool", "send")
            client.message(number=10, of=client.number)
            client.flush()
            self.settled()
            self.assertGreater(time.monotonic() - began, 19 / 20)
            for each, last in ((client, 11), (other, 10)):
                self.assertEqual(self.arrived(of=each.number), list(range(1, last)))  # 0 came with the start message
            late = self.client("lamp", batchEvent=True)
            late.message(number=99)
            self.assertEqual(late.flush()[1:], (None, None))

    def test_nothing_is_lost_over_stops_and_kills(self, rounds=int(os.environ.get("VELTRA_ROUNDS", "10"))):
        number, kept = 0, []
        for turn in range(rounds):
            daemon = self.daemon()
            daemon.allow(POST_ERROR, "storebag")
            client = self.client()
            fault = random.choice(({"status": 503}, {"cut": True}, {"status": 429, "headers": {"Retry-After": "1"}}))
            self.spoil(share=random.choice((0, 60, 100)), **fault)
            for _ in range(random.randrange(30)):
                number += 1
                client.message(number=number, turn=turn)
            kept.append([line["id"] for line in self.spooled() if line["sessionID"] == client.number])  # they are on disk
            client.close()
            if turn % 3:
                daemon.kill()
            else:
                daemon.stop()
                self.assertFalse([name for name in self.files() if name.endswith(".new")])
        self.lab.reset()
        with self.serving(POST_ERROR):
            self.spooled()  # it has been read
            self.ctl("spool", "send")
            self.settled()
        numbers = self.arrived()
        self.assertEqual(len(numbers), len(set(numbers)))
        came = list(dict.fromkeys(post["headers"]["X-VLT-Post-ID"] for post in self.lab.received("events") if post["outcome"] == "200"))
        for listed in kept:
            self.assertEqual([post for post in came if post in set(listed)], listed)
        self.assertTrue(any(kept))

    def test_what_lies_there_comes_after_a_restart_and_what_is_torn_does_not(self):
        self.keep(PATIENT)
        self.spoil()
        with self.serving():
            client = self.client()
            for number in range(3):
                client.message(number=number)
            self.settled(4)
        self.assertEqual({stat.S_IMODE((self.root.path / SPOOL / name).stat().st_mode) for name in self.files()}, {0o600})
        self.assertEqual(stat.S_IMODE((self.root.path / SPOOL).stat().st_mode), 0o700)
        torn = self.root.path / SPOOL / self.files()[2]
        torn.write_bytes(torn.read_bytes()[:-1])
        torn.with_name(torn.name + ".0123abcd.new").write_bytes(b"")
        self.keep()
        self.lab.reset()
        with self.serving("is torn"):
            self.settled()
            wait_until(lambda: self.arrived() == [0, 2], "what is whole", also=self.arrived)
        self.assertEqual((self.counts()["post lost: torn in the spool"], self.counts()["event posted"] >= 3), (1, True))
        self.keep(PATIENT)
        self.spoil()
        with self.serving():
            self.client().message(number=4)
            self.settled(2)
        self.keep(None)
        with self.serving('There is no "spool" in the settings'):
            self.assertFalse((self.root.path / SPOOL).exists())
        self.assertGreaterEqual(self.counts()["event dropped: from the spool: by_hand"], 2)

    def test_a_disk_that_takes_nothing_loses_posts_and_says_so_and_bounds_hold(self):
        self.keep({**PATIENT, "bytes": 1 << 20, "perUser": 0.01})
        self.spoil()
        with self.serving("A post could not be kept: ") as daemon:
            client = self.client()
            self.settled(1)
            for number in range(30):
                client.message(number=number, text=os.urandom(500).hex())
            self.counted("event kept: in the spool", 31)  # with the start message
            wait_until(lambda: self.so_far().get("event lost: its user's share of the spool is full"), "the oldest gone")
            self.assertLessEqual(self.status()["bytes"], (1 << 20) // 100)
            self.assertNotIn("event lost: the spool is full", self.counts())
            spool = self.root.path / SPOOL
            spool.rename(spool.with_name("away"))
            spool.write_bytes(b"")
            client.message(number=98)
            self.counted("event lost: the spool's disk", 1)
            spool.unlink()
            spool.with_name("away").rename(spool)
            client.message(number=99)
            self.lab.reset()
            self.ctl("spool", "send")
            wait_until(lambda: 99 in self.arrived(), "the disk again")
            self.assertEqual((self.arrived()[-1], 98 in self.arrived()), (99, False))
            self.assertEqual(sum("could not be kept" in line for line in daemon.text), 1)


    def test_a_disk_that_is_full_or_read_only_loses_new_posts_and_goes_on_with_those_that_lie_there(self):
        """On a file system of its own, where one may be mounted."""
        state = self.root.path / "var/lib"
        mount = ["mount", "-t", "tmpfs", "-o", "size=1m", "veltra", state]
        mounted = subprocess.run(mount, capture_output=True, text=True)
        if mounted.returncode != 0:
            self.skipTest("no file system can be mounted: " + mounted.stderr.strip())
        self.addCleanup(subprocess.run, ["umount", "--lazy", state])
        self.root.prefer()
        self.keep(PATIENT)
        self.spoil()
        with self.serving("No space left on device", "Read-only file system", "cannot be removed from the spool"):
            client = self.client()
            client.message(number=1)
            self.settled(2)  # with the start message
            filler = state / "filler"
            with contextlib.suppress(OSError):
                filler.write_bytes(bytes(2 << 20))
            client.message(number=2)
            self.counted("event lost: the spool's disk", 1)
            filler.unlink()
            client.message(number=3)
            self.settled(3)
            subprocess.run([*mount[:4], "remount,ro", *mount[5:]], check=True)
            client.message(number=4)
            self.counted("event lost: the spool's disk", 2)
            self.lab.reset()
            self.ctl("spool", "send")
            self.counted("post kept: its file could not be removed from the spool", 3)
            self.assertEqual(len(self.files()), 3)
            subprocess.run([*mount[:4], "remount,rw", *mount[5:]], check=True)
            self.settled()
            self.assertEqual(self.arrived(), [1, 3])


class Withdrawal(SpoolTest):
    alone = True  # it measures time

    def test_what_may_not_leave_any_more_is_deleted_within_a_second_and_counted(self):
        self.keep(PATIENT)
        for reason, change, back in (
                ("no_consent", lambda: self.root.prefer(DiagnosticLogSubmissionEnabled=False),
                 lambda: self.root.prefer(DiagnosticLogSubmissionEnabled=True)),
                ("policy_hosts", lambda: self.say(hosts=["elsewhere.example"]), lambda: self.say()),
                ("policy_reporting", lambda: self.say(reporting="off"), lambda: self.say())):
            self.spoil()
            with self.subTest(reason), self.serving():
                self.filled()
                before = len(self.lab.received("events"))
                change()
                began = time.monotonic()
                wait_until(lambda: not self.files(), "an empty spool")
                self.assertLess(time.monotonic() - began, 1)
                self.counted("event dropped: from the spool: " + reason, 4)
                self.lab.reset()
                self.ctl("spool", "send")
                self.assertEqual(len(self.lab.received("events")), before)
                back()

    def test_a_storebag_server_that_hangs_does_not_hold_up_a_withdrawal(self):
        self.keep(PATIENT)
        self.spoil()
        with self.serving():
            self.filled()
        self.spoil("/storebags", stall=True)
        with self.serving():
            wait_until(lambda: self.status()["posts"] == 5, "what was kept, and the stop message")
            began = time.monotonic()
            self.root.prefer(DiagnosticLogSubmissionEnabled=False)
            wait_until(lambda: not self.files(), "an empty spool")
            self.assertLess(time.monotonic() - began, 1)
        self.assertEqual(self.counts()["event dropped: from the spool: no_consent"], 5)


class Owner(SpoolTest):
    def test_an_entry_that_has_gone_and_a_limit_of_the_day_are_asked_before_a_try(self):
        self.keep(PATIENT)
        self.spoil()
        with self.serving():
            self.filled()
        self.serve(entry("lamp"))
        with self.serving():
            wait_until(lambda: not self.files(), "an empty spool")
            self.counted("event dropped: from the spool: no_entry", 5)  # and the stop message
        self.serve(entry("phone"))
        with self.serving("does not let it leave (over_daily_limit)"):
            self.filled()
            self.say(dailyEvents=1)
            self.lab.reset()
            wait_until(lambda: self.ctl("privacy", "--json")[0].find('"dailyEvents":1') > 0, "the policy")
            self.ctl("spool", "send")
            wait_until(lambda: not self.files(), "an empty spool")
            self.counted("event dropped: from the spool: over_daily_limit", 4)

    def test_privacy_off_and_other_identifiers_empty_it(self):
        self.keep(PATIENT)
        for command, reason in ((("off", "--json"), "privacy_off"), (("reset-identifiers", "--json"), "refused_by_owner")):
            self.spoil()
            with self.subTest(reason), self.serving():
                self.filled()
                answer = json.loads(self.ctl("privacy", *command)[0])
                self.assertEqual(self.files(), [])
                self.assertEqual(answer["dropped"]["posts"], 4)
                self.counted("event dropped: from the spool: " + reason, 4)
                self.ctl("privacy", "on")
                self.lab.reset()  # the stop message leaves

    def test_the_history_has_one_record_a_post_with_its_tries(self):
        self.say(history={})
        self.spoil("/events/phone", script=[{"status": 503, "times": 2}, {"cut": True}])
        with self.serving():
            client = self.client()
            self.settled()

            def records(count):
                items = [json.loads(line) for line in self.ctl("history", "--json")[0].splitlines()]
                return items if len(items) == count else None
            item, = wait_until(lambda: records(1), "a record")
            # libcurl repeats what was cut on a kept connection.
            self.assertEqual((item["status"], item["transmissions"], item["client"], len(self.posts("phone"))), (200, 4, "phone", 4))
            self.assertIn("X-VLT-Post-ID: ", self.ctl("history", "show", item["id"])[0])
            # One that was tried, and dropped before it was kept.
            self.spoil("/events/phone", status=503, delayMs=1000)
            client.message(number=1)
            wait_until(lambda: any(backend["underWay"] for session in json.loads(self.ctl("status", "--json")[0])["sessions"]
                                   for backend in session["backends"]), "a post under way")
            self.ctl("privacy", "reset-identifiers")
            dropped, = [each for each in wait_until(lambda: records(2), "another record") if each["id"] != item["id"]]
            self.assertEqual((dropped["status"], dropped["error"], dropped["transmissions"]), (None, "HTTP 503", 1))
            self.counted("event dropped: from the spool: refused_by_owner", 1)
            self.lab.reset()  # the stop message leaves
