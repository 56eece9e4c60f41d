"""Checks license, format, include ladder, file sizes, code that must not compile, and clang-tidy. Prints each problem with
its place; the exit status is 1 if there is any. With --add-license, first puts the line of the license where it is missing."""
import re
import subprocess
import sys
from pathlib import Path

ROOT = Path(__file__).resolve().parent.parent
# The ladder is read from src/CMakeLists.txt: one rung per line, lowest first.
RUNGS = [line.split() for line in re.findall(r"^veltra_rung\((.*)\)$", (ROOT / "src/CMakeLists.txt").read_text(), re.M)]
RUNG_OF = {room: number for number, rung in enumerate(RUNGS) for room in rung}
# Kinds of back ends, which must not include each other.
KINDS = ["https", "dashboard", "upload", "mivo", "ampery"]
LONGEST_BODY = 400
LONGEST_HEADER = 300
LICENSE_LINE = "SPDX-License-Identifier: Apache-2.0"
COMMENT_OF = {".cpp": ("//", ""), ".h": ("//", ""), ".hpp": ("//", ""), ".c": ("/*", " */"), ".py": ("#", ""),
              ".cmake": ("#", ""), ".map": ("/*", " */"), ".def": ("//", "")}


def sources(*suffixes):
    for folder in ("src", "include", "tests", "bench", "examples"):
        for path in sorted((ROOT / folder).rglob("*")):
            if path.suffix in suffixes:
                yield path


def licensed():
    """Every file that can hold a comment."""
    done = subprocess.run(["git", "ls-files"], cwd=ROOT, capture_output=True, text=True)
    names = done.stdout.splitlines() or [str(path.relative_to(ROOT)) for path in ROOT.rglob("*")]
    for name in names:
        path = ROOT / name
        if path.is_file() and (path.suffix in COMMENT_OF or path.name == "CMakeLists.txt" or is_script(path)):
            yield path


def is_script(path):
    with path.open("rb") as file:
        return "corpus" not in path.parts and file.read(2) == b"#!"


def check_license(add=False):
    """Every source names its license in its first line, or after "#!"; with --add-license the line is put where it is missing."""
    found = []
    for path in licensed():
        text = path.read_text()
        if any(re.fullmatch(rf"(//|/\*|#) {LICENSE_LINE}( \*/)?", line) for line in text.split("\n")[:2]):
            continue
        if not add:
            found.append(f"{path.relative_to(ROOT)}: no line \"{LICENSE_LINE}\"; run scripts/check --add-license")
            continue
        begin, end = ("/*", " */") if text.startswith("/*") else COMMENT_OF.get(path.suffix, ("#", ""))
        first = text.index("\n") + 1 if text.startswith("#!") else 0
        path.write_text(f"{text[:first]}{begin} {LICENSE_LINE}{end}\n{text[first:]}")
    return found


def check_format():
    files = [str(path) for path in sources(".cpp", ".h", ".hpp", ".c")]
    done = subprocess.run(["clang-format", "--dry-run", "-Werror", *files], capture_output=True, text=True)
    return sorted({line.split(":")[0] + ": not formatted; run clang-format -i on it"
                   for line in done.stderr.splitlines() if "error:" in line})


def check_ladder():
    found = []
    for path in sources(".cpp", ".h"):
        parts = path.relative_to(ROOT).parts
        if parts[0] != "src":
            continue
        room = parts[1]
        for number, line in enumerate(path.read_text().splitlines(), 1):
            match = re.match(r'#include "([a-z_]+)/([a-z_/]*)', line)
            if not match:
                continue
            target = match[1]
            place = f"{path.relative_to(ROOT)}:{number}"
            if target in RUNG_OF and target != room and RUNG_OF[target] >= RUNG_OF[room]:
                found.append(f"{place}: {room} includes {target}, which is not below it")
            kind = parts[2] if room == "backends" and len(parts) > 3 else None
            if kind in KINDS and target == "backends" and match[2].split("/")[0] in set(KINDS) - {kind}:
                found.append(f"{place}: one kind of back end includes another")
    return found


def check_size():
    found = []
    for path in sources(".cpp", ".h", ".hpp"):
        lines = len(path.read_text().splitlines()) - 1  # without that of the license
        bound = LONGEST_BODY if path.suffix == ".cpp" else LONGEST_HEADER
        if path.relative_to(ROOT).parts[0] == "src" and lines > bound:
            found.append(f"{path.relative_to(ROOT)}: {lines} lines, more than {bound}; look for the second class in it")
    return found


def configure():
    done = subprocess.run(["cmake", "--preset", "dev"], cwd=ROOT, capture_output=True, text=True)
    if done.returncode != 0:
        sys.exit(done.stdout + done.stderr)


def check_must_not_compile():
    configure()  # creates the rooms' include directories
    done = subprocess.run([sys.executable, "tests/must_not_compile/run.py"], cwd=ROOT, capture_output=True, text=True)
    return [] if done.returncode == 0 else done.stdout.splitlines()


def check_lint():
    configure()
    files = [str(path) for path in sources(".cpp") if path.relative_to(ROOT).parts[0] == "src"]
    done = subprocess.run(["run-clang-tidy", "-quiet", "-p", "build/dev", *files], cwd=ROOT, capture_output=True,
                          text=True)
    return [line for line in done.stdout.splitlines() if re.search(r": (warning|error):", line)]


def main():
    if "--add-license" in sys.argv[1:]:
        check_license(add=True)
    checks = {"license": check_license, "format": check_format, "include ladder": check_ladder, "size": check_size,
              "must not compile": check_must_not_compile, "lint": check_lint}
    if "--no-lint" in sys.argv[1:]:
        del checks["lint"]
    failed = False
    for name, check in checks.items():
        found = check()
        failed |= bool(found)
        print(f"{name}: " + ("ok" if not found else f"{len(found)} found"))
        for line in found:
            print("  " + line)
    sys.exit(1 if failed else 0)


main()
