# SPDX-License-Identifier: Apache-2.0
"""Paths and helpers that the examples share."""
import sys
from pathlib import Path

SOURCE = Path(__file__).resolve().parents[2]
EXAMPLES = SOURCE / "examples"
sys.path.insert(0, str(SOURCE / "tests" / "e2e"))
from harness import Ctl, Daemon, Lab, Root, program, wait_until  # noqa: E402,F401


def heading(text):
    print(f"\n\033[1m{text}\033[0m" if sys.stdout.isatty() else f"\n{text}", flush=True)
