# SPDX-License-Identifier: Apache-2.0
"""scripts/fleet as somebody who looks after a fleet uses it."""
import json
import os
import pathlib
import re
import signal
import subprocess
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
        for view in ("events_by_hour", "sessions", "sampled", "gaps", "storebag_versions"):
            self.assertIn(f"veltra.{view}\n", done.stdout)

    def test_parts_come_back_and_all_end(self):
        process = subprocess.Popen([str(SOURCE / "scripts/fleet")], stdout=subprocess.PIPE, text=True, env=ENVIRONMENT)
        self.addCleanup(process.stdout.close)
        self.addCleanup(process.kill)
        line = json.loads(process.stdout.readline())
        self.assertEqual(sorted(line["parts"]), sorted(side.NAMES))
        os.kill(line["parts"]["gateway1"], signal.SIGKILL)
        side.wait_until(lambda: not side.alive(line["parts"]["gateway1"]), "the gateway's end")
        self.assertIsNone(process.poll())
        again = subprocess.run([str(SOURCE / "scripts/fleet"), "start", "gateway1", "--dir", line["dir"]], capture_output=True,
                               text=True, timeout=60, env=ENVIRONMENT)
        self.assertEqual(again.returncode, 0, again.stderr)
        now = json.loads(again.stdout)
        self.assertNotEqual(now["parts"]["gateway1"], line["parts"]["gateway1"])
        process.send_signal(signal.SIGTERM)
        self.assertEqual(process.wait(60), 0)
        self.assertEqual([name for name, pid in now["parts"].items() if side.alive(pid)], [])
        self.assertFalse(pathlib.Path(line["dir"]).exists())
