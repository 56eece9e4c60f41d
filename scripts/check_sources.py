# SPDX-License-Identifier: Apache-2.0
"""Checks license, format, include ladder, sizes of files, functions and classes, code that must not compile, and clang-tidy. Prints each
problem with its place; the exit status is 1 if there is any."""
import collections
import concurrent.futures
import json
import os
import re
import shlex
import subprocess
import sys
from pathlib import Path

ROOT = Path(__file__).resolve().parent.parent
# The ladder is read from src/CMakeLists.txt: one rung per line, lowest first.
RUNGS = [line.split() for line in re.findall(r"^veltra_rung\((.*)\)$", (ROOT / "src/CMakeLists.txt").read_text(), re.M)]
RUNG_OF = {room: number for number, rung in enumerate(RUNGS) for room in rung}
# Kinds of back ends, which must not include each other.
KINDS = ["https", "dashboard", "upload", "mivo", "ampery"]
LONGEST_BODY = 380
LONGEST_HEADER = 300
LONGEST_FUNCTION = 50
MOST_FIELDS = 12
LARGEST_UNIT = 24
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
    """Every source names its license in its first line, or after "#!". --add-license adds missing lines."""
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


def long_functions(lines):
    """The first lines of blocks that are too long, by the layout that clang-format gives them."""
    for end, line in enumerate(lines):
        indent = len(line) - 1
        if line == " " * indent + "}":
            begin = next(i for i in range(end - 1, -1, -1) if re.match(rf" {{{indent}}}[^ }}#/]", lines[i]))
            if end - begin >= LONGEST_FUNCTION:
                yield begin + 1, end - begin + 1


def fields_of(body):
    """The names of the fields that the lines of a class's body declare."""
    text = re.sub(r"//.*|^ *(public|private|protected):$", "", "\n".join(body), flags=re.M)
    statements, statement, depth = [], "", 0
    for character in text:
        depth += (character == "{") - (character == "}")
        if depth == 0:
            statement += character
        # A function ends with its body, everything else with a semicolon.
        if depth == 0 and (character == ";" or character == "}" and re.search(r"\)[^()=]*\}$", statement)
                           and not re.search(r"(GUARDED_BY\(\w+\)|_LOCK|function<.*>)[^()]*\}$", statement, re.S)):
            statements.append(" ".join(statement.rstrip(";").split()))
            statement = ""
    fields = []
    for statement in statements:
        head = re.sub(r"\b(GUARDED_BY\(\w+\)|[A-Z_]+_LOCK\b)|=.*|\}", "", statement)
        while "<" in head and head != (shorter := re.sub(r"<[^<>]*>", "", head)):
            head = shorter
        if head and not re.search(r"\(|\boperator\b|^(using|friend|static|enum|template|class|struct|union)\b", head):
            fields += head.split(",")
    return fields


def large_classes(lines):
    """The first lines of classes with many fields whose comment does not say how many and why."""
    for begin, line in enumerate(lines):
        match = re.match(r"( *)(class|struct) \w[^;]*$", line)
        first = next((i for i in range(begin, len(lines)) if lines[i].endswith(("{", ";"))), None) if match else None
        if first is None or lines[first].endswith(";"):
            continue
        end = next((i for i in range(first, len(lines)) if lines[i].startswith(match[1] + "}")), len(lines))
        count, comment, above = len(fields_of(lines[first + 1:end])), "", begin - 1
        while above >= 0 and re.match(r" *(//|template)", lines[above]):
            comment, above = lines[above].strip(" /") + " " + comment, above - 1
        said = re.search(r"Its (\d+) fields", comment)
        if int(said[1]) != count if said else count > MOST_FIELDS:
            yield begin + 1, count


def check_size():
    found = []
    for path in sources(".cpp", ".h", ".hpp"):
        if path.relative_to(ROOT).parts[0] != "src":
            continue
        lines = path.read_text().splitlines()[1:]  # without that of the license
        name = path.relative_to(ROOT)
        bound = LONGEST_BODY if path.suffix == ".cpp" else LONGEST_HEADER
        if len(lines) > bound:
            found.append(f"{name}: {len(lines)} lines, more than {bound}; look for the second class in it")
        found += [f"{name}:{begin + 1}: a function of {length} lines, more than {LONGEST_FUNCTION}; divide it"
                  for begin, length in long_functions(lines)]
        found += [f"{name}:{begin + 1}: {count} fields; a class of more than {MOST_FIELDS} says \"Its {count} fields\", and why"
                  for begin, count in large_classes(lines)]
    return found


def configure(preset):
    done = subprocess.run(["cmake", "--preset", preset], cwd=ROOT, capture_output=True, text=True)
    if done.returncode != 0:
        sys.exit(done.stdout + done.stderr)


def check_must_not_compile():
    configure("dev")  # creates the rooms' include directories
    done = subprocess.run([sys.executable, "tests/must_not_compile/run.py"], cwd=ROOT, capture_output=True, text=True)
    return [] if done.returncode == 0 else done.stdout.splitlines()


def git(*arguments):
    done = subprocess.run(["git", *arguments], cwd=ROOT, capture_output=True, text=True)
    return done.stdout.split() if done.returncode == 0 else []


def changed_files(given=None):
    """Files that differ from the given commit, else from the commit where this branch left origin/main or, on main itself and
    without a remote, from the commit before this one. Nothing, which is said, where there is no such commit."""
    base = git("rev-parse", "--verify", given) if given else git("merge-base", "HEAD", "origin/main")
    if not given and (not base or base == git("rev-parse", "HEAD")):
        base = git("rev-parse", "--verify", "HEAD~1")
    if not base:
        print("no commit to compare with: run scripts/check for the lint of all sources")
        return set()
    return set(git("diff", "--name-only", *base) + git("ls-files", "--others", "--exclude-standard"))


def body_for(header, bodies):
    """A body that includes the header, preferably the header's own body."""
    includes = re.compile(rf'#include ["<](.*/)?{re.escape(header.name)}[">]')
    for body in sorted(bodies, key=lambda path: (path.stem != header.stem, path)):
        if includes.search(body.read_text()):
            return body
    return None


def bodies_of_rooms():
    return {path for path in sources(".cpp") if path.relative_to(ROOT).parts[0] == "src"}


def changed_bodies(changed):
    """The bodies that changed and, for each header that changed, one that includes it."""
    bodies = bodies_of_rooms()
    files = {ROOT / name for name in changed if name.startswith(("src/", "include/"))}
    headers = {path for path in files if path.suffix in (".h", ".hpp") and path.exists()}
    return bodies & (files | {body_for(path, bodies) for path in headers})


def check_alone(bodies):
    """Compiles each body by itself: where bodies are joined, one can lack a header that another has included before."""
    configure("lint")
    commands = [entry for entry in json.loads((ROOT / "build/lint/compile_commands.json").read_text())
                if Path(entry["file"]) in bodies]

    def compile_alone(entry):
        command = shlex.split(entry["command"].partition(" -o ")[0]) + ["-fsyntax-only", entry["file"]]
        done = subprocess.run(command, cwd=entry["directory"], capture_output=True, text=True)
        return re.findall(r"^.*: (?:fatal )?error: .*$", done.stderr, re.M) or (
            [] if done.returncode == 0 else [f"{entry['file']}: {done.stderr.strip()}"])

    with concurrent.futures.ThreadPoolExecutor(os.cpu_count()) as pool:
        return sorted({line.replace(f"{ROOT}/", "") for lines in pool.map(compile_alone, commands) for line in lines})


def lint_units(bodies):
    """Divides the bodies of each folder of CMake into units of at most LARGEST_UNIT, largest first: pairs of the bodies and
    the flags they are compiled with. A unit becomes one file, because most of clang-tidy's time goes into the headers."""
    folders = collections.defaultdict(list)
    for entry in json.loads((ROOT / "build/lint/compile_commands.json").read_text()):
        command, _, target = entry["command"].partition(" -o ")
        folder = target.split("/CMakeFiles/")[0]
        if Path(entry["file"]) in bodies and Path(entry["file"]).is_relative_to(ROOT / folder):  # others borrow it
            folders[folder].append((entry["file"], command.split(" ", 1)[1]))
    units = []
    for commands in folders.values():
        commands.sort()
        count = -(-len(commands) // LARGEST_UNIT)
        units += [commands[len(commands) * i // count:len(commands) * (i + 1) // count] for i in range(count)]
    units.sort(key=len, reverse=True)
    return [([body for body, _ in unit], shlex.split(" ".join(dict.fromkeys(flags for _, flags in unit)))) for unit in units]


def lint(unit):
    bodies, flags = unit
    lines, origin = [], []
    for body in bodies:
        text = Path(body).read_text().splitlines()
        lines += text
        origin += [f"{body}:{number}" for number in range(1, len(text) + 1)]
    path = ROOT / "build/lint/units" / "_".join(Path(bodies[0]).relative_to(ROOT / "src").parts)
    path.parent.mkdir(exist_ok=True)
    path.write_text("\n".join(lines) + "\n")
    folders = [word for folder in sorted({str(Path(body).parent) for body in bodies}) for word in ("-iquote", folder)]
    done = subprocess.run(["clang-tidy", "--quiet", str(path), "--", *flags, *folders], cwd=ROOT, capture_output=True, text=True)
    found = [re.sub(rf"^{re.escape(str(path))}:(\d+)", lambda place: origin[int(place[1]) - 1], line)
             for line in done.stdout.splitlines() if re.search(r": (warning|error):", line)]
    return found or ([] if done.returncode == 0 else [f"{bodies[0]}: clang-tidy failed: {done.stderr.strip()}"])


def check_lint():
    return lint_bodies(bodies_of_rooms())


def lint_bodies(bodies):
    configure("lint")
    with concurrent.futures.ThreadPoolExecutor(os.cpu_count()) as pool:
        found = {line for lines in pool.map(lint, lint_units(bodies)) for line in lines}
    # A room's header is included through the link to the room's folder.
    return sorted({re.sub(r"^build/lint/rooms/\w+/", "src/", line.replace(f"{ROOT}/", "")) for line in found})


def main():
    if "--add-license" in sys.argv[1:]:
        check_license(add=True)
    checks = {"license": check_license, "format": check_format, "include ladder": check_ladder, "size": check_size,
              "must not compile": check_must_not_compile, "lint": check_lint}
    arguments = [argument for argument in sys.argv[1:] if argument != "--add-license"]
    if arguments == ["--no-lint"]:
        del checks["lint"]
    elif arguments[:1] == ["--changed"] and len(arguments) <= 2:
        changed = changed_bodies(changed_files(*arguments[1:]))
        checks = {"compiled alone": lambda: check_alone(changed), "lint of what changed": lambda: lint_bodies(changed)}
    elif arguments:
        sys.exit(f"scripts/check: unknown argument {arguments[0]}; expected --no-lint or --changed [COMMIT]")
    failed = 0
    for name, check in checks.items():
        found = check()
        failed += bool(found)
        print(f"{name}: " + ("ok" if not found else f"{len(found)} found"), flush=True)
        for line in found:
            print("  " + line)
    print(f"{len(checks) - failed} passed, {failed} failed")
    sys.exit(1 if failed else 0)


main()
