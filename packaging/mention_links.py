#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""In the documents below the directories that are given, turns links to files that are not there, because they are only in the
source tree or in another package, into mentions of their paths."""
import os
import pathlib
import re
import sys

# Code blocks stay.
PATTERN = re.compile(r"^```.*?^```$|\[([^\]]*)\]\(((?![a-z]+:|#)[^)\s]+)\)", re.M | re.S)


def mentioned(document):
    def replaced(found):
        text, link = found.groups()
        if link is None or (document.parent / link.split("#")[0]).exists():
            return found[0]
        path = os.path.normpath(link).replace("../", "")
        return text if text.strip("`/") in path else f"{text} ({path})"
    return PATTERN.sub(replaced, document.read_text())


for directory in map(pathlib.Path, sys.argv[1:]):
    for document in directory.rglob("*.md"):
        document.write_text(mentioned(document))
