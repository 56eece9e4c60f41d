# SPDX-License-Identifier: Apache-2.0
"""Compiles the code of README.md and examples/ and checks its behaviour."""
import os
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

from harness import BUILD, SOURCE, Process, SystemTest, program

sys.path.insert(0, str(SOURCE / "python"))
import veltra.testing  # noqa: E402

PYTHON = {**os.environ, "PYTHONPATH": str(SOURCE / "python")}


def needs(compiler, package):
    return unittest.skipUnless(shutil.which(compiler), f"{compiler} is missing: install {package}")


class Readme(unittest.TestCase):
    def test_its_programs(self):
        text = (SOURCE / "README.md").read_text()
        python = next(block for block in re.findall(r"^```python\n(.*?)^```$", text, re.M | re.S) if "import veltra" in block)
        for command in ([program("readme_c")], [program("readme_cpp")], [sys.executable, "-c", python]):
            with self.subTest(command), veltra.testing.Daemon() as daemon:
                subprocess.run(command, env={**PYTHON, "VELTRA_ROOT": daemon.root}, check=True, timeout=60)
                self.assertEqual([(one["category"], one["type"]) for one in daemon.messages], [(5, 1)])
                self.assertEqual(daemon.messages[0]["payload"]["codec"], "opus")

    def test_the_test_of_a_program(self):
        subprocess.run([sys.executable, SOURCE / "examples/phone_test.py"], env=PYTHON, check=True, capture_output=True)


class Languages(SystemTest):
    def setUp(self):
        super().setUp()
        directory = tempfile.TemporaryDirectory()
        self.addCleanup(directory.cleanup)
        self.program = f"{directory.name}/hello"
        self.environment = {**os.environ, "GOCACHE": f"{directory.name}/cache", "GO111MODULE": "off"}

    def build(self, *command):
        subprocess.run(command, env=self.environment, check=True)

    def check(self):
        """The program reports each line of its input, over a restart and a sudden end of the daemon."""
        daemon = self.daemon()
        child = Process([self.program], self.root.environment(LD_LIBRARY_PATH=str(BUILD / "lib")), stdin=subprocess.PIPE)
        self.addCleanup(child.kill)
        for line in ("one", "zwölf", "three"):
            child.popen.stdin.write(f"{line}\n".encode())
            child.popen.stdin.flush()
            self.lab.wait_for_events(1, line=line)
            daemon.allow("user info provided")
            if line == "one":
                daemon.stop()
            else:
                daemon.kill()
            daemon = self.daemon()
        child.popen.stdin.close()
        self.assertEqual(child.end(), 0, child.text)
        self.assertEqual([event["line"] for event in self.lab.events() if "line" in event], ["one", "zwölf", "three"])

    @needs("go", "golang-go")
    def test_go(self):
        self.build("go", "build", "-o", self.program, *map(str, sorted((SOURCE / "examples/go").glob("*.go"))))
        self.check()

    @needs("rustc", "rustc")
    @unittest.skipIf(BUILD.name in ("asan", "tsan"), "the library needs a sanitizer that rustc does not link")
    def test_rust(self):
        self.build("rustc", "-o", self.program, str(SOURCE / "examples/rust/hello.rs"), "-L", str(BUILD / "lib"))
        self.check()
