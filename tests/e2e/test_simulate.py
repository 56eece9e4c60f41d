# SPDX-License-Identifier: Apache-2.0
"""fleet/simulate with a small fleet: the page that it writes, its tables and its drawings."""
import pathlib
import re
import subprocess
import tempfile
import unittest
import xml.etree.ElementTree

from harness import BUILD, SOURCE, program


class Page(unittest.TestCase):
    def test_a_small_fleet_fills_the_page(self):
        if not pathlib.Path(program("veltra-simulate")).exists():
            self.skipTest("built without the dashboard")
        if BUILD.name in ("asan", "tsan"):
            self.skipTest("28 runs take minutes under a sanitizer; the simulation's own tests run there")
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        page = pathlib.Path(folder.name) / "fleet.md"
        done = subprocess.run([SOURCE / "fleet/simulate", "--devices", "600", "--page", str(page)], capture_output=True, text=True,
                              env={"VELTRA_BUILD": str(BUILD), "PATH": "/usr/bin:/bin"}, timeout=600)
        self.assertEqual(done.returncode, 0, done.stderr)
        text, committed = page.read_text(), (SOURCE / "docs/fleet.md").read_text()
        parts = dict(re.findall(r"<!-- made: (\w+) -->\n(.*?)<!-- end -->", text, re.S))
        # The committed page is of the model that stands here.
        self.assertIn(parts["parameters"].replace("| 600 |", "| 1,000,000 |"), committed)
        outage = [row.split("|") for row in parts["outage"].splitlines() if "openSessions" in row]
        without, spread = (float(row[5]) for row in outage)
        self.assertGreater(without, 3)
        self.assertLess(spread, 2)
        self.assertEqual(len(outage[0]), 8, outage)
        drawings = re.findall(r"\]\(fleet/(\w+\.svg)\)", text)
        self.assertEqual(len(drawings), 7)
        for name in drawings:
            drawing = xml.etree.ElementTree.parse(page.with_suffix("") / name).getroot()
            curves = [one for one in drawing.iter() if one.tag.endswith("polygon")]
            self.assertGreaterEqual(len(curves), 2, name)
            self.assertTrue(all(len(curve.get("points").split()) > 20 for curve in curves), name)
