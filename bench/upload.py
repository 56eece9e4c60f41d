# SPDX-License-Identifier: Apache-2.0
"""Compares an upload of 100 MiB with `gzip -6 | curl`, with the programs in VELTRA_BUILD (by default build/release): the
time of both for the same bytes, alternating, and the daemon's peak of resident memory above rest. The files are log text
and noise."""
import os
import pathlib
import random
import statistics
import subprocess
import time

from family import Daemon, Lab, Root, storebag
from harness import program

SIZE, ROUNDS, MIB = 100 << 20, 5, 1 << 20
POST = """gzip -6 < "$0" | curl -s --cacert "$1" -H 'Content-Type: application/octet-stream' -H 'Content-Encoding: gzip' \
--data-binary @- -o /dev/null "$2/upload?filename=x.gz" """


def log_text():
    draw = random.Random(1)
    words = ["".join(draw.choices("abcdefghijklmnopqrstuvwxyz", k=draw.randrange(3, 10))) for _ in range(3000)]
    lines = [f"2026-11-25T{i // 3600 % 24:02}:{i // 60 % 60:02}:{i % 60:02} host proc[{draw.randrange(99999)}]: "
             f"{' '.join(draw.choices(words, k=8))} id={draw.getrandbits(64):016x}\n" for i in range(200_000)]
    text = "".join(lines).encode()
    return (text * (SIZE // len(text) + 1))[:SIZE]


def seconds(command, env=None):
    begin = time.monotonic()
    subprocess.run(command, env=env, check=True, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    return time.monotonic() - begin


def upload(path, root):
    return seconds([program("veltractl"), "upload", "--client-type", "7", str(path)], root.environment())


def resident_peak(pid):
    status = pathlib.Path(f"/proc/{pid}/status").read_text()
    return int(status.split("VmHWM:")[1].split()[0]) * 1024


def measure(name, content, root, lab, daemon):
    path, pid, ratios, peaks = root.path / f"{name}.log", daemon.popen.pid, [], []
    for _ in range(ROUNDS):
        path.write_bytes(content)
        floor = seconds(["sh", "-c", POST, str(path), lab.certificate, lab.url])
        pathlib.Path(f"/proc/{pid}/clear_refs").write_text("5")
        rest = resident_peak(pid)
        ratios.append(upload(path, root) / floor)
        peaks.append(resident_peak(pid) - rest)
        assert not path.exists()
    packed = lab.received("uploads")[-1]["bytes"]
    print(f"{name}: {statistics.median(ratios):.2f} of gzip -6 | curl ({min(ratios):.2f} to {max(ratios):.2f}); memory "
          f"{max(peaks) / MIB:.0f} MiB above rest, file and compressed file {(len(content) + packed) / MIB:.0f} MiB")


def main():
    root, lab = Root(), Lab()
    root.use(lab)
    lab.put("quindle", storebag(backends={"uploadserver": {"post_url": "${url}/upload"}}))
    daemon = Daemon(root)
    try:
        path = root.path / "warm-up"
        path.write_bytes(b"x")
        upload(path, root)
        for name, content in (("text", log_text()), ("noise", os.urandom(SIZE))):
            measure(name, content, root, lab, daemon)
        daemon.stop()
    finally:
        daemon.kill()
        lab.stop()
        root.remove()


if __name__ == "__main__":
    main()
