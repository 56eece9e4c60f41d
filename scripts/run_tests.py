# SPDX-License-Identifier: Apache-2.0
"""Builds the given presets (default: dev; all: every one), runs every test program in each and prints the totals."""
import os
import re
import shutil
import subprocess
import sys
import time
from pathlib import Path

ROOT = Path(__file__).resolve().parent.parent
ALL = ["dev", "asan", "tsan"]
PRESETS = [*ALL, "plain"]
TIMEOUT_SECONDS = 900
SANITIZER_OPTIONS = {
    "ASAN_OPTIONS": "detect_leaks=1:detect_stack_use_after_return=1:abort_on_error=0",
    "UBSAN_OPTIONS": "print_stacktrace=1",
    "TSAN_OPTIONS": "halt_on_error=0:exitcode=66:second_deadlock_stack=1",
}


def say(text):
    print(f"[{time.strftime('%H:%M:%S')}] {text}", flush=True)


def build(preset):
    say(f"{preset}: building")
    configure = subprocess.run(["cmake", "--preset", preset], cwd=ROOT, capture_output=True, text=True)
    if configure.returncode != 0:
        print(configure.stdout + configure.stderr)
        return False
    return subprocess.run(["cmake", "--build", "--preset", preset], cwd=ROOT).returncode == 0


def run(command, environment):
    """Runs one test program; returns (passed, failed, output)."""
    try:
        done = subprocess.run(command, cwd=ROOT, env=environment, capture_output=True, text=True,
                              errors="replace", timeout=TIMEOUT_SECONDS)
        output, status = done.stdout + done.stderr, done.returncode
    except subprocess.TimeoutExpired as late:
        output, status = (late.stdout or b"").decode(errors="replace") + "\n(timed out)", -1
    passed = failed = 0
    if match := re.search(r"^\[  PASSED  \] (\d+) test", output, re.M):
        passed = int(match[1])
    if match := re.search(r"^ ?(\d+) FAILED TESTS?$", output, re.M):
        failed = int(match[1])
    if match := re.findall(r"^(\d+) passed, (\d+) failed", output, re.M):
        passed, failed = int(match[-1][0]), int(match[-1][1])
    if match := re.search(r"^(\d+) inputs replayed$", output, re.M):
        passed = int(match[1])
    if status != 0 and failed == 0:
        failed = 1  # it crashed, timed out, or a sanitizer reported an error
    if status == 0 and passed == 0:
        failed, output = 1, output + "\n(ran no test)"
    return passed, failed, output


def programs(preset):
    binaries = ROOT / "build" / preset / "bin"
    for program in sorted(binaries.glob("test_*")):
        yield [str(program), "--gtest_brief=1"]
    for program in sorted(binaries.glob("replay_*")):
        yield [str(program), "tests/fuzz/corpus/" + program.name.removeprefix("replay_")]
    if preset in ("dev", "plain"):
        yield [sys.executable, "tests/must_not_compile/run.py"]
    yield [sys.executable, "tests/e2e/run.py"]
    # Without the gateway or its servers (scripts/setup gateway) there is nothing to run. It takes minutes, so CI leaves it out.
    if preset == "dev" and (binaries / "veltra-gateway").exists() and shutil.which("nats-server"):
        yield [sys.executable, "tests/fleet/run.py"]


def test(preset):
    environment = dict(os.environ, VELTRA_BUILD=f"build/{preset}", **SANITIZER_OPTIONS)
    total = [0, 0]
    for command in programs(preset):
        started = time.monotonic()
        passed, failed, output = run(command, environment)
        total[0] += passed
        total[1] += failed
        last = Path(command[-1]) if command[0] == sys.executable else Path(command[0])
        name = last.parent.name if last.name == "run.py" else last.name
        say(f"{preset}: {name}: {passed} passed, {failed} failed ({time.monotonic() - started:.1f} s)")
        if failed:
            print(output, flush=True)
    return total


def main():
    presets = ALL if sys.argv[1:] == ["all"] else sys.argv[1:] or ["dev"]
    unknown = [preset for preset in presets if preset not in PRESETS]
    if unknown:
        sys.exit(f"scripts/test: unknown preset {unknown[0]}; expected all, or some of: {' '.join(PRESETS)}")
    passed = failed = 0
    for preset in presets:
        if build(preset):
            more_passed, more_failed = test(preset)
            passed, failed = passed + more_passed, failed + more_failed
        else:
            say(f"{preset}: does not build")
            failed += 1
    print(f"{passed} passed, {failed} failed")
    sys.exit(1 if failed else 0)


main()
