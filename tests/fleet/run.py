#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Runs the tests of the gateway and the fleet with their real servers: all of them, or those given as arguments (kills,
test_doors.Doors.test_datagrams). VELTRA_BUILD is the build directory. The last line is "N passed, N failed"; without the
gateway or the servers it says what is missing, and nothing fails."""
import os
import pathlib
import sys
import unittest

HERE = pathlib.Path(__file__).resolve().parent
os.environ["VELTRA_BUILD"] = str(pathlib.Path(os.environ.get("VELTRA_BUILD", HERE.parents[1] / "build/dev")).resolve())
sys.path[:0] = [str(HERE), str(HERE.parents[1] / "fleet")]
import side  # noqa: E402


def main(names):
    try:
        side.check_programs()
    except side.Missing as missing:
        print(f"the fleet's tests are left out: {missing}")
        print("0 passed, 0 failed")
        return 0
    names = [name if name.startswith("test_") else "test_" + name for name in names]
    names = names or sorted(path.stem for path in HERE.glob("test_*.py"))
    result = unittest.TextTestRunner(stream=sys.stdout, verbosity=2).run(unittest.defaultTestLoader.loadTestsFromNames(names))
    failed = {getattr(test, "test_case", test).id() for test, _ in result.failures + result.errors}
    print(f"{result.testsRun - len(failed)} passed, {len(failed)} failed")
    return 1 if failed or not result.testsRun else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
