# SPDX-License-Identifier: Apache-2.0
"""Compiles each file unchanged, which must succeed, and with a fault, which must fail with the given error. Also checks that
every lock has a rank, because the compiler would accept a lock without one in any order."""
import os
import re
import subprocess
import sys
from pathlib import Path

HERE = Path(__file__).resolve().parent
SOURCES = HERE.parent.parent / "src"
ROOMS = HERE.parent.parent / os.environ.get("VELTRA_BUILD", "build/dev") / "rooms"
LOCKS = ["-I", str(SOURCES), "-Wthread-safety", "-Wthread-safety-beta", "-Werror"]
CONFIG = [word for room in ("config", "support", "wire", "platform", "base") for word in ("-I", str(ROOMS / room))]
# File, compiler flags, and the text that the error must contain; None: it must compile.
CASES = [
    ("lock_order.cpp", LOCKS, None),
    ("lock_order.cpp", [*LOCKS, "-DWRONG_ORDER=1"], "must be acquired before"),
    ("lock_order.cpp", [*LOCKS, "-DWRONG_ORDER=2"], "must be acquired before"),
    ("include_ladder.cpp", CONFIG, None),
    ("include_ladder.cpp", [*CONFIG, "-DUPWARD"], "'session/veltrad_session.h' file not found"),
]


def main():
    failed = 0
    for name, flags, expected in CASES:
        command = ["clang++", "-std=c++20", "-fsyntax-only", *flags, str(HERE / name)]
        done = subprocess.run(command, capture_output=True, text=True)
        good = done.returncode == 0 if expected is None else done.returncode != 0 and expected in done.stderr
        if not good:
            failed += 1
            wanted = "does not compile" if expected is None else f"was not refused with \"{expected}\""
            print(f"{name} {[flag for flag in flags if flag.startswith('-D')]}: {wanted}\n{done.stderr}")
    for source in sorted(SOURCES.rglob("*.[hc]*")):
        for bare in re.findall(r"^\s*(?:mutable |static )*(?:Recursive)?Mutex \w+[{;].*", source.read_text(), re.M):
            failed += 1
            print(f"{source.relative_to(SOURCES)}: a lock without its rank: {bare.strip()}")
    print(f"{len(CASES) + 1 - min(failed, len(CASES) + 1)} passed, {failed} failed")
    sys.exit(1 if failed else 0)


main()
