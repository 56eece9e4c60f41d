# SPDX-License-Identifier: Apache-2.0
"""Builds the given presets (default: plain; all: and both sanitizers; gateway: plain, with tests/fleet), runs every test program
in each and prints the totals."""
import concurrent.futures
import os
import re
import subprocess
import sys
import time
from pathlib import Path

ROOT = Path(__file__).resolve().parent.parent
PRESETS = {"plain": ["plain"], "dev": ["dev"], "asan": ["asan"], "tsan": ["tsan"], "all": ["plain", "asan", "tsan"],
           "gateway": ["plain"]}
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


def programs(preset, with_fleet):
    """The test programs that run two at a time, and those that then run alone."""
    binaries = ROOT / "build" / preset / "bin"
    together = [[str(program), "--gtest_brief=1"] for program in sorted(binaries.glob("test_*"))]
    together += [[str(program), "tests/fuzz/corpus/" + program.name.removeprefix("replay_")]
                 for program in sorted(binaries.glob("replay_*"))]
    if preset in ("dev", "plain"):
        together.append([sys.executable, "tests/must_not_compile/run.py"])
    alone = [[sys.executable, "tests/e2e/run.py"]]
    if with_fleet:
        alone.append([sys.executable, "tests/fleet/run.py"])
    return together, alone


def test(preset, with_fleet):
    environment = dict(os.environ, VELTRA_BUILD=f"build/{preset}", **SANITIZER_OPTIONS)

    def run_and_say(command):
        started = time.monotonic()
        passed, failed, output = run(command, environment)
        last = Path(command[-1]) if command[0] == sys.executable else Path(command[0])
        name = last.parent.name if last.name == "run.py" else last.name
        say(f"{preset}: {name}: {passed} passed, {failed} failed ({time.monotonic() - started:.1f} s)"
            + ("\n" + output if failed else ""))
        return passed, failed

    together, alone = programs(preset, with_fleet)
    with concurrent.futures.ThreadPoolExecutor(2) as pool:  # unit tests mostly wait
        results = list(pool.map(run_and_say, together))
    results += map(run_and_say, alone)
    return [sum(column) for column in zip(*results)]


def main():
    arguments = sys.argv[1:] or ["plain"]
    for argument in arguments:
        if argument not in PRESETS:
            sys.exit(f"scripts/test: unknown preset {argument}; expected some of: {' '.join(PRESETS)}")
    passed = failed = 0
    for preset in dict.fromkeys(preset for argument in arguments for preset in PRESETS[argument]):
        if build(preset):
            more_passed, more_failed = test(preset, "gateway" in arguments)
            passed, failed = passed + more_passed, failed + more_failed
        else:
            say(f"{preset}: does not build")
            failed += 1
    print(f"{passed} passed, {failed} failed")
    sys.exit(1 if failed else 0)


main()
