# SPDX-License-Identifier: Apache-2.0
"""scripts/fleet as an administrator uses it."""
import contextlib
import itertools
import json
import os
import pathlib
import re
import signal
import subprocess
import sys
import tempfile
import unittest

import side
from devices import SOURCE

ENVIRONMENT = {**os.environ, "VELTRA_BUILD": str(side.BUILD)}


class Examples(unittest.TestCase):
    def test_once_shows_what_the_views_answer(self):
        done = subprocess.run([str(SOURCE / "scripts/fleet"), "--once"], capture_output=True, text=True, timeout=120, env=ENVIRONMENT)
        self.assertEqual(done.returncode, 0, done.stderr)
        counts = re.fullmatch(r"(\d+) events, (\d+) datagrams, (\d+) files, (\d+) log data, (\d+) sessions in the tables",
                              done.stdout.rstrip().splitlines()[-1])
        self.assertTrue(counts, done.stdout[-300:])
        events, datagrams, files, log_data, sessions = map(int, counts.groups())
        self.assertEqual((files, log_data), (1, 1))
        self.assertTrue(events >= 10 and datagrams >= 10 and sessions >= 4, counts[0])
        for view in ("events_by_hour", "sessions", "sampled", "storebag_versions"):
            self.assertRegex(done.stdout, rf"veltra\.{view}\n[^(]*\([1-9]\d* rows?\)")
        self.assertIn("veltra.gaps\n", done.stdout)

    def test_parts_come_back_and_all_end(self):
        process = subprocess.Popen([str(SOURCE / "scripts/fleet")], stdout=subprocess.PIPE, text=True, env=ENVIRONMENT)
        self.addCleanup(process.stdout.close)
        self.addCleanup(process.kill)
        line = json.loads(process.stdout.readline())
        self.assertEqual(sorted(line["parts"]), sorted(side.NAMES))
        # No other user can become the database's superuser.
        self.assertEqual(side.Fleet.at(line["dir"]).query("SHOW listen_addresses"), [[""]])
        self.assertEqual((pathlib.Path(line["dir"]) / "postgres").stat().st_mode & 0o077, 0)
        for name in ("gateway1", "nginx"):  # nginx leaves a worker that goes on listening
            os.kill(line["parts"][name], signal.SIGKILL)
            side.wait_until(lambda: not side.alive(line["parts"][name]), f"the end of {name}")
        self.assertIsNone(process.poll())
        again = subprocess.run([str(SOURCE / "scripts/fleet"), "start", "gateway1", "nginx", "--dir", line["dir"]], capture_output=True,
                               text=True, timeout=60, env=ENVIRONMENT)
        self.assertEqual(again.returncode, 0, again.stderr)
        now = json.loads(again.stdout)
        for name in ("gateway1", "nginx"):
            self.assertNotEqual(now["parts"][name], line["parts"][name])
        self.assertTrue(side.Fleet.at(line["dir"]).runs("nginx"))
        process.send_signal(signal.SIGTERM)
        self.assertEqual(process.wait(60), 0)
        self.assertEqual([name for name, pid in now["parts"].items() if side.alive(pid)], [])
        self.assertFalse(pathlib.Path(line["dir"]).exists())


class Endings(unittest.TestCase):
    """Whenever scripts/fleet is ended, it leaves no process and no directory."""

    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.folder = pathlib.Path(folder.name)
        self.folder.chmod(0o755)  # PostgreSQL runs as another user than root

    def start(self, *arguments, **environment):
        return subprocess.Popen([sys.executable, str(SOURCE / "scripts/fleet"), *arguments], text=True, stdout=subprocess.PIPE,
                                stderr=subprocess.PIPE, env={**ENVIRONMENT, "TMPDIR": str(self.folder), **environment})

    def assert_nothing_left(self):
        self.assertEqual(list(self.folder.iterdir()), [])
        for path in itertools.chain(*(pathlib.Path("/proc").glob(f"[0-9]*/{name}") for name in ("cmdline", "environ"))):
            with contextlib.suppress(OSError):
                self.assertNotIn(str(self.folder).encode(), path.read_bytes(), path)

    def test_signals_at_any_time(self):
        moments = [  # what is there, and the signals that come then
            ("veltra-fleet-*", [signal.SIGINT]),
            ("veltra-fleet-*/postgres/data/PG_VERSION", [signal.SIGHUP]),
            ("veltra-fleet-*/logs/stream2.log", [signal.SIGTERM]),
            ("veltra-fleet-*/report.log", [signal.SIGINT, signal.SIGINT]),  # --once plays the examples
        ]
        for pattern, numbers in moments:
            with self.subTest(pattern=pattern):
                process = self.start("--once")
                self.addCleanup(process.kill)
                side.wait_until(lambda: list(self.folder.glob(pattern)) or process.poll() is not None, pattern)
                for number in numbers:
                    process.send_signal(number)
                    # The second one comes while it ends its parts.
                    side.wait_until(lambda: process.poll() is not None or not self.runs("daemon"), "the daemon's end")
                _, errors = process.communicate(timeout=60)
                self.assertEqual((process.returncode, errors), (0, ""))
                self.assert_nothing_left()

    def runs(self, name):
        with contextlib.suppress(OSError, IndexError):
            return side.Fleet.at(next(self.folder.iterdir(), None) or self.folder).runs(name)
        return False

    def test_a_program_that_is_missing_is_named_first(self):
        for name in side.PROGRAMS:
            if name != "veltractl":
                (self.folder / name).touch(0o755)
        process = self.start(VELTRA_BUILD=str(self.folder), PATH=str(self.folder))
        _, errors = process.communicate(timeout=60)
        self.assertEqual(process.returncode, 1)
        self.assertIn("veltractl is not installed", errors)
        self.assertEqual(list(self.folder.glob("veltra-fleet-*")), [])
