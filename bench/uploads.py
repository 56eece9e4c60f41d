# SPDX-License-Identifier: Apache-2.0
"""A large file through the daemon beside `gzip -6 | curl`, for log text and for noise."""
import os
import pathlib
import random
import subprocess
import time

from figures import Figure
from measures import Measure
from place import memory_kib, program

MIB = 1 << 20
POST = """gzip -6 < "$0" | curl -s --cacert "$1" -H 'Content-Type: application/octet-stream' -H 'Content-Encoding: gzip' \
--data-binary @- -o /dev/null "$2/upload?filename=x.gz" """


def log_text(size):
    draw = random.Random(1)
    words = ["".join(draw.choices("abcdefghijklmnopqrstuvwxyz", k=draw.randrange(3, 10))) for _ in range(3000)]
    lines = [f"2026-11-25T{i // 3600 % 24:02}:{i // 60 % 60:02}:{i % 60:02} host proc[{draw.randrange(99999)}]: "
             f"{' '.join(draw.choices(words, k=8))} id={draw.getrandbits(64):016x}\n" for i in range(100_000)]
    text = "".join(lines).encode()
    return (text * (size // len(text) + 1))[:size]


def seconds(command, env=None):
    begin = time.monotonic()
    subprocess.run(command, env=env, check=True, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    return time.monotonic() - begin


def peak_kib(pid):
    status = pathlib.Path(f"/proc/{pid}/status").read_text()
    return int(status.split("VmHWM:")[1].split()[0])


class Uploads(Measure):
    def __init__(self, *arguments):
        super().__init__(*arguments)
        self.size = (10 if self.quick else 100) * MIB
        self.contents = {"text": log_text(self.size), "noise": os.urandom(self.size)}

    def _upload(self, path):
        return seconds([program("veltractl"), "upload", "--client-type", "7", str(path)], self.place.root.environment())

    def round(self):
        lab, path = self.place.lab, self.place.root.path / "large.log"
        with self.place.daemon() as daemon:
            pid = daemon.popen.pid
            path.write_bytes(b"x")
            self._upload(path)
            for name, content in self.contents.items():
                path.write_bytes(content)
                floor = seconds(["sh", "-c", POST, str(path), lab.certificate, lab.url])
                rest = memory_kib(pid)
                pathlib.Path(f"/proc/{pid}/clear_refs").write_text("5")  # the peak is what is resident now
                self.take(**{name: self._upload(path), name + "Floor": floor, name + "Peak": (peak_kib(pid) - rest) / 1024})
                assert not path.exists(), "the file was not confirmed"

    def figures(self):
        for name in self.contents:
            yield Figure(f"a file of {self.size // MIB} MiB, {name}", "s", self.taken[name], "gzip -6 | curl",
                         self.taken[name + "Floor"], most=1)
            yield Figure(f"memory above rest for a file of {name}", "MiB", self.taken[name + "Peak"], most=8)
