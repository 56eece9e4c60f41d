# SPDX-License-Identifier: Apache-2.0
"""A file that is compressed, uploaded, and removed when the server has confirmed it."""
import subprocess
import sys

from stage import heading, program

IDENTITY = ("--client-type", "6", "--session-id", "44", "--client", "phone", "--service", "ringer", "--require-user-info")


def taken():
    """The number of messages that the daemon takes in: the session's start and stop."""
    return 2


def show(root, lab, daemon):
    """Runs the example, prints the results and returns the problems."""
    file = root.path / "crash report.log"
    file.write_text("".join(f"frame {number}: ring() + {number * 16}\n" for number in range(2000)))
    size = file.stat().st_size
    print("uploading a file with veltractl upload", file=sys.stderr)
    done = subprocess.run([program("veltractl"), "--root", str(root.path), "upload", *IDENTITY, str(file)],
                          capture_output=True, text=True, timeout=60)
    daemon.wait_for_line("dealloc: VeltradSession dealloc: 44")
    heading("The upload of a file")
    print(f"  {done.stdout.strip()}\n  {done.stderr.strip()}")
    uploads = lab.received("uploads")
    for upload in uploads:
        print(f"  POST {upload['path']}\n    {upload['bytes']} bytes, gzip, of {upload['plainBytes']}")
    problems = [f"veltractl upload ended with status {done.returncode}"] if done.returncode else []
    problems += ["the file is still there"] if file.exists() else []
    return problems + ([] if [upload["plainBytes"] for upload in uploads] == [size] else ["the file did not arrive"])
