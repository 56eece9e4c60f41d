# SPDX-License-Identifier: Apache-2.0
"""Shows why two messages of the call did not arrive, or arrived changed: that of the lamp, and one with a hashed field."""
import json
import subprocess

from stage import heading, program


def why(root, *arguments):
    return subprocess.run([program("veltractl"), "--root", str(root.path), "why", "--last", "1", *arguments],
                          capture_output=True, text=True, check=True).stdout


def show(root):
    """Prints both and returns the problems."""
    problems = []
    for title, expected, arguments in (
            ("why: the lamp was sampled out", ("fateReason", "sampled_out"), ("--client", "lamp", "--category", "7")),
            ("why: the field \"number\" was hashed", ("hashed", ["number"]), ("--client", "phone", "--type", "10", "--session-id", "42"))):
        heading(f"veltractl {title}")
        print("  " + why(root, *arguments).rstrip().replace("\n", "\n  "))
        told = json.loads(why(root, "--json", *arguments).splitlines()[-1])["backends"]["httppost"]
        if told[expected[0]] != expected[1]:
            problems.append(f"veltractl why says {expected[0]} {told[expected[0]]}, not {expected[1]}")
    return problems
