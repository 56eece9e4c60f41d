# SPDX-License-Identifier: Apache-2.0
"""Writes an SPDX 2.3 document for veltrad: the Debian packages of the libraries that the program links, directly or through
each other. Arguments: the program, and the directory for the document."""
import datetime
import json
import os
import re
import subprocess
import sys
from pathlib import Path


def output(*command):
    return subprocess.run(command, check=True, capture_output=True, text=True).stdout


def package_of(library):
    """The database may know a file by either of its names if /lib is a link to /usr/lib."""
    names = {library, os.path.realpath(library)}
    names |= {name.removeprefix("/usr") if name.startswith("/usr/") else "/usr" + name for name in names}
    found = subprocess.run(["dpkg-query", "-S", *sorted(names)], capture_output=True, text=True).stdout
    if not found:
        sys.exit(f"scripts/sbom.py: no package owns {library}")
    return found.split(": ")[0]


def linked_packages(program):
    listing = output("ldd", program)
    if "not found" in listing:
        sys.exit(f"scripts/sbom.py: {program} links a library that is not here:\n{listing}")
    libraries = set(re.findall(r"(?<=\s)(/\S+)(?= \()", listing))
    form = "${Package}\t${Version}\t${Architecture}\t${source:Package}\t${source:Version}\n"
    lines = output("dpkg-query", "-W", "-f", form, *{package_of(library) for library in libraries})
    return sorted(tuple(line.split("\t")) for line in lines.splitlines())


def identifier(name):
    return "SPDXRef-" + re.sub(r"[^A-Za-z0-9.-]", "-", name)


def described(name, version, supplier, **more):
    return {"SPDXID": identifier(name), "name": name, "versionInfo": version, "supplier": supplier,
            "downloadLocation": "NOASSERTION", "filesAnalyzed": False, "licenseConcluded": "NOASSERTION",
            "copyrightText": "NOASSERTION", **more}


def main():
    program, directory = sys.argv[1:]
    tree = Path(__file__).resolve().parent.parent
    changelog = ["dpkg-parsechangelog", "-l", str(tree / "packaging/debian/changelog"), "-S"]
    version = output(*changelog, "Version").strip()
    made = datetime.datetime.fromtimestamp(int(output(*changelog, "Timestamp")), datetime.timezone.utc)
    packages = [described("veltrad", version, "Organization: veltrad developers", licenseDeclared="Apache-2.0",
                          primaryPackagePurpose="APPLICATION")]
    relations = [{"spdxElementId": "SPDXRef-DOCUMENT", "relationshipType": "DESCRIBES",
                  "relatedSpdxElement": identifier("veltrad")}]
    for name, number, architecture, source, source_version in linked_packages(program):
        locator = f"pkg:deb/debian/{name}@{number}?arch={architecture}"
        packages.append(described(name, number, "Organization: Debian", licenseDeclared="NOASSERTION",
                                  sourceInfo=f"built from {source} {source_version}",
                                  externalRefs=[{"referenceCategory": "PACKAGE-MANAGER", "referenceType": "purl",
                                                 "referenceLocator": locator}]))
        relations.append({"spdxElementId": identifier("veltrad"), "relationshipType": "DYNAMIC_LINK",
                          "relatedSpdxElement": identifier(name)})
    document = {"spdxVersion": "SPDX-2.3", "dataLicense": "CC0-1.0", "SPDXID": "SPDXRef-DOCUMENT",
                "name": f"veltrad-{version}", "documentNamespace": f"https://veltra.example/spdx/veltrad-{version}",
                "creationInfo": {"created": made.strftime("%Y-%m-%dT%H:%M:%SZ"), "creators": ["Tool: scripts/sbom.py"]},
                "packages": packages, "relationships": relations}
    (Path(directory) / f"veltrad_{version}.spdx.json").write_text(json.dumps(document, indent=2) + "\n")


main()
