# SPDX-License-Identifier: Apache-2.0
"""The files under etc/veltrad: both forms, SIGHUP, settings.json."""
import json
import os
import signal
import time

from harness import ENTITLEMENT, SystemTest, closed_port, storebag, wait_until

SETTINGS = "etc/veltrad/settings.json"
KEPT = "var/lib/veltrad/storebags/ostvane"
NONE = ("fetchAndCacheStorebag: Unable to fetch storebag", "Could not fetch storebag for client type 6")


def comments(text):
    return b"// as an administrator writes it\n" + text.encode()


class Configuration(SystemTest):
    def hang_up(self, daemon, count):
        daemon.popen.send_signal(signal.SIGHUP)
        daemon.wait_for_line("main: SIGHUP", count)

    def test_a_hang_up_reads_everything_again_and_sessions_stay(self):
        etc = self.root.path / "etc/veltrad"
        (etc / "entitlements.plist").unlink()
        self.root.write("etc/veltrad/entitlements.json",
                        comments('[{"uid": %d, "entitlements": {"%s": true}}, // who reports\n 7]' % (os.getuid(), ENTITLEMENT)))
        with self.serving("rule 1 grants nothing", "Device properties", "Settings") as daemon:
            session, backends = self.open()
            self.assertEqual(backends, ["httppost"])
            daemon.wait_for_line(f"Entitlements: {etc}/entitlements.json:3:2: rule 1 grants nothing: expected a dictionary")
            self.root.write("etc/veltrad/device.json", comments('{"DeviceName": "Elm",\n "SerialNumber" "S"}'))
            self.root.write(SETTINGS, comments('{"sampling": "often"}'))
            self.hang_up(daemon, 1)
            daemon.wait_for_line(f"the machine is asked: {etc}/device.json:3:17: ")
            daemon.wait_for_line(f"Device properties: {etc}/device.json and {etc}/device.plist: both are there")
            daemon.wait_for_line(f'{etc}/settings.json:2:2: "sampling" is "often": expected "drawn" or "stable"')
            self.hang_up(daemon, 2)
            self.assertIsNotNone(session.send(number=1)["reply"])
            self.assertEqual(session.close(), 0)
            for text, times in (("the machine is asked", 1), ("grants nothing", 1), ('"sampling" is', 1)):
                self.assertEqual(sum(text in line for line in daemon.text), times, text)
        self.assertEqual(len(self.lab.wait_for_events(1, number=1)), 1)

    def test_settings_that_never_could_be_read_accept_no_storebag(self):
        for broken, place in (('{"storebags": {"persist": 1}}', '2:16: "persist" is 1: expected true or false'),
                              ('{"jitter": 2}', '2:2: "jitter" is 2: expected a number from 0 to 1'),
                              ('{"keys": ["a", 1]}', '2:2: "keys" is ["a",1]: expected an array of texts'),
                              ("{", "2:2: "), ("[]", "1:1: the outermost value is not a dictionary")):
            self.root.write(SETTINGS, comments(broken))
            with self.subTest(broken), self.serving("Settings", "No storebag is accepted for client type 6",
                                                    "Storebag key not used: ") as daemon:
                self.assertIsNone(self.open(6)[1])
                daemon.wait_for_line(f"no storebag is accepted: {self.root.path}/{SETTINGS}:{place}")
                self.root.write(SETTINGS, b'{"sampling": "drawn", "speed": 1, "keys": ["k"%s]}' % (b', "k"' * 16))
                self.assertEqual(self.open(6)[1], ["httppost"])
                daemon.wait_for_line(':1:23: unknown key "speed": expected one of sampling, storebags, ')
                daemon.wait_for_line(':1:35: "keys" names 17 files, of which the first 16 are used')
                self.root.write(SETTINGS, comments(broken))
                self.assertEqual(self.open(7)[1], ["httppost"])
                daemon.wait_for_line("Settings could not be read, the last ones stand: ")
            self.assertEqual(self.counts()["storebag refused: the settings cannot be read, and never could"], 1)


class Sampling(SystemTest):
    def factors(self, *client_types):
        with self.serving("secret of this device") as daemon:
            found = []
            for client_type in client_types:
                before = len(daemon.text)
                session, _ = self.open(client_type)
                line = daemon.wait_for(lambda lines: next((line for line in lines[before:] if "samplingFactor=" in line), None),
                                       "the factor of a session")
                found.append(float(line.split("samplingFactor=")[1].split(",")[0]))
                session.close()
            return found, any("secret of this device" in line for line in daemon.text)

    def test_a_stable_factor_is_the_devices_own_and_the_same_after_every_start(self):
        drawn, _ = self.factors(7, 7)
        self.assertEqual(drawn, self.factors(7, 7)[0])
        self.assertNotEqual(drawn[0], drawn[1])
        secret = self.root.path / "var/lib/veltrad/secret"
        self.assertFalse(secret.exists())
        self.root.write(SETTINGS, comments('{"sampling": "stable"}'))
        (first, again, other), _ = self.factors(7, 7, 6)
        self.assertEqual(first, again)
        self.assertNotEqual(first, other)
        self.assertTrue(0 <= first < 1)
        self.assertEqual((secret.stat().st_mode & 0o777, len(secret.read_bytes())), (0o600, 32))
        self.assertEqual(self.factors(6, 7), ([other, first], False))
        secret.write_bytes(bytes(31))  # no secret of ours: kept as it is, and one for this process serves
        (lasting, same), warned = self.factors(7, 7)
        self.assertEqual((lasting, warned, secret.read_bytes()), (same, True, bytes(31)))
        self.assertNotEqual(lasting, first)


class Compression(SystemTest):
    def test_posts_are_compressed_at_the_level_that_is_written_now(self):
        text, posts = " ".join(f"line {n} of {n // 7} at {n * n % 101}" for n in range(400)), []
        with self.serving("last ones stand") as daemon:
            session, _ = self.open()
            for number, level in enumerate(("none", 1, 9, 0, 10)):  # 10 is refused, and 0 stands
                if level != "none":
                    self.root.write(SETTINGS, comments('{"compression": {"level": %d}}' % level))
                session.send(number=number, text=text)
                self.lab.wait_for_events(1, number=number)
                posts.append(next(post for post in self.lab.received("events")
                                  if post["body"]["events"][0].get("number") == number))
            daemon.wait_for_line('2:18: "level" is 10: expected an integer from 0 to 9')
            session.close()
        default, fast, small, plain, still_plain = (post["bytes"] for post in posts)
        self.assertTrue(small <= default + 16 and default + 200 < fast < plain / 2, (small, default, fast, plain))
        self.assertTrue(len(text) < min(plain, still_plain))
        self.assertEqual([post["headers"].get("Content-Encoding") for post in posts], ["gzip"] * 3 + [None] * 2)


class Persistence(SystemTest):
    def cut_off(self):
        self.root.prefer(veltra_storebag_url=f"https://localhost:{closed_port()}/bags")

    def test_the_last_good_section_survives_a_restart_verified_anew(self):
        kept = self.root.path / KEPT
        with self.serving():
            self.assertEqual(self.open(6)[1], ["httppost"])
        self.assertFalse(kept.parent.exists())
        self.root.write(SETTINGS, comments('{"storebags": {"persist": true}}'))
        with self.serving():
            self.assertEqual(self.open(6)[1], ["httppost"])
        self.assertEqual((kept.stat().st_mode & 0o777, kept.parent.stat().st_mode & 0o777), (0o600, 0o700))
        good, requests = kept.read_bytes(), len(self.lab.received("storebags"))
        self.cut_off()
        with self.serving():
            session, backends = self.open(6)
            self.assertEqual(backends, ["httppost"])
            session.send(number=1)
            session.close()
            self.lab.wait_for_events(1, number=1)
            self.assertEqual(self.lab.wait_for_events(3, _status=1, _method=0)[2]["StorebagVersion"], "v1")
        removed = f"Storebag kept in {kept} is not used and removed: "
        key = self.root.path / "usr/share/veltra/publicKey.der"
        right = key.read_bytes()
        other_key = right[:-20] + bytes(8) + right[-12:]
        for bytes_kept, public_key, why in ((good[:-1], right, "no storebag as this daemon keeps them"),
                                            (b"rubbish", right, "no storebag as this daemon keeps them"),
                                            (good, other_key, "its signature cannot be verified")):
            kept.write_bytes(bytes_kept)
            key.write_bytes(public_key)
            with self.subTest(why), self.serving(removed, "Signature can not be verified", *NONE) as daemon:
                self.assertIsNone(self.open(6)[1])
                self.assertIsNone(self.open(14)[1])  # of the same storebag
                daemon.wait_for_line(removed + why)
            self.assertEqual(sum(removed in line for line in daemon.text), 1)
            self.assertFalse(kept.exists())
        key.write_bytes(right)
        kept.write_bytes(good)
        (self.root.path / SETTINGS).unlink()
        with self.serving(*NONE):
            self.assertIsNone(self.open(6)[1])
        self.assertEqual((kept.read_bytes(), len(self.lab.received("storebags"))), (good, requests))


class Refresh(SystemTest):
    lab_arguments = ("--max-age", "0")

    def test_what_is_kept_when_that_is_chosen_while_the_server_has_nothing_new(self):
        kept = self.root.path / KEPT
        with self.serving() as daemon:
            self.assertEqual(self.open(6)[1], ["httppost"])
            self.root.write(SETTINGS, b'{"storebags": {"persist": true}}')
            self.assertEqual(self.open(6)[1], ["httppost"])
            before = kept.read_bytes()
            self.assertEqual(self.open(6)[1], ["httppost"])
            daemon.wait_for_line("storebag content has not changed")
            self.assertNotEqual(kept.read_bytes(), before)  # its time
        self.assertEqual([line["outcome"] for line in self.lab.received("storebags")], ["200", "200", "304"])
        with self.serving():  # no longer fresh: asked for again, on the terms of what is kept
            self.assertEqual(self.open(6)[1], ["httppost"])
        self.assertEqual(self.lab.received("storebags")[-1]["outcome"], "304")


class Jitter(SystemTest):
    CYCLE = 1000

    def refresh(self, status=0):
        """Seconds from this fetch to the next attempt, as the daemon says."""
        self.ctl("refresh", "ostvane", status=status)
        told = next(one for one in json.loads(self.ctl("status", "--json")[0])["storebags"] if one["name"] == "ostvane")
        return told["nextAttempt"] - (time.time() - told["age"])

    def expect(self, least, most, status=0):
        """Draws until one wait lies well below the middle and one well above it."""
        waits, near = [], (most - least) / 4
        wait_until(lambda: waits.append(self.refresh(status)) or
                   min(waits) < least + near and max(waits) > most - near, f"waits of all lengths: {waits}")
        self.assertTrue(least - 1 < min(waits) and max(waits) < most + 1, waits)

    def test_waits_are_spread_and_a_fetch_comes_within_its_cycle(self):
        self.lab.put("ostvane", {"refresh_cycle": self.CYCLE, **storebag()})
        with self.serving("fetchStorebag", "Unable to fetch storebag", "Could not fetch storebag", "Error resolving") as daemon:
            self.assertEqual({round(self.refresh()) for _ in range(3)}, {self.CYCLE})
            self.root.write(SETTINGS, b'{"jitter": 0.5}')
            self.expect(self.CYCLE / 2, self.CYCLE)
            self.lab.control(path="/storebags", cut=True)
            self.expect(900, 900 + self.CYCLE / 2, status=1)
            line = "Not fetching storebag for client type 6 - must wait "
            self.open(6)
            said = int(daemon.wait_for_line(line).split(line)[1].split()[0])
            self.assertTrue(900 <= said <= 900 + self.CYCLE / 2, said)
            self.lab.reset()
            # An open session that follows gets it fetched that much sooner.
            self.lab.put("ostvane", {"refresh_cycle": 30, **storebag()})
            self.root.write(SETTINGS, b'{"jitter": 1, "storebags": {"openSessions": "follow"}}')
            wait_until(lambda: self.refresh() < 3, "a short wait")
            fetches = len(self.lab.received("storebags"))
            self.lab.received("storebags", fetches + 1, 10)
