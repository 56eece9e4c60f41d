#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Runs the tests with real processes: all of them, or those given as arguments (road, test_road.Road.test_examples).

VELTRA_BUILD is the build directory, by default build/dev. Each class runs in its own process; four run at a time on two cores,
because they mostly wait, and those with `alone` one after the other at the end. The last line is "N passed, N failed"; the exit status is 1 if any test failed."""
import concurrent.futures
import os
import pathlib
import subprocess
import sys
import time
import unittest

HERE = pathlib.Path(__file__).resolve().parent
sys.path.insert(0, str(HERE))


def leaves(suite):
    for item in suite:
        yield from leaves(item) if isinstance(item, unittest.TestSuite) else [item]


def run_here(names):
    result = unittest.TextTestRunner(verbosity=2).run(unittest.defaultTestLoader.loadTestsFromNames(names))
    for test, why in result.skipped:
        print(f"SKIPPED {test.id()}: {why}")
    failed = {getattr(test, "test_case", test).id() for test, _ in result.failures + result.errors}  # a subtest's test
    print(f"RESULT {result.testsRun - len(failed) - len(result.skipped)} {len(failed)}")


def run_apart(names):
    begin = time.monotonic()
    done = subprocess.run([sys.executable, __file__, "--here", *names], stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT)
    *lines, last = done.stdout.decode("utf-8", "replace").rstrip("\n").split("\n")
    if last.startswith("RESULT "):
        passed, failed = map(int, last.split()[1:])
    else:
        lines, passed, failed = lines + [last], 0, len(names)
    return names[0].rsplit(".", 1)[0], passed, failed, time.monotonic() - begin, "\n".join(lines)


def main(names):
    names = [name if name.startswith("test_") else "test_" + name for name in names]
    names = names or sorted(path.stem for path in HERE.glob("test_*.py"))
    classes = {}
    for test in leaves(unittest.defaultTestLoader.loadTestsFromNames(names)):
        classes.setdefault(type(test), []).append(test.id())
    total_passed = total_failed = 0
    for alone, workers in ((False, 2 * min(2, os.cpu_count() or 1)), (True, 1)):
        chosen = [ids for kind, ids in classes.items() if getattr(kind, "alone", False) == alone]
        with concurrent.futures.ThreadPoolExecutor(workers) as pool:
            for done in concurrent.futures.as_completed([pool.submit(run_apart, ids) for ids in chosen]):
                name, passed, failed, seconds, output = done.result()
                total_passed, total_failed = total_passed + passed, total_failed + failed
                print(f"{name}: {passed} passed, {failed} failed, {seconds:.1f} s", flush=True)
                skipped = [line for line in output.split("\n") if line.startswith("SKIPPED ")]
                print(output if failed else "\n".join(skipped), end="\n" if failed or skipped else "", flush=True)
    print(f"{total_passed} passed, {total_failed} failed")
    return 1 if total_failed or not total_passed else 0


if __name__ == "__main__":
    if sys.argv[1:2] == ["--here"]:
        run_here(sys.argv[2:])
    else:
        sys.exit(main(sys.argv[1:]))
