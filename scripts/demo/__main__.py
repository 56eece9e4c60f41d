# SPDX-License-Identifier: Apache-2.0
"""Starts a lab and a daemon in a temporary root directory and runs the examples one after another. The status is 0 if
exactly what should have arrived did arrive."""
import shlex
import signal
import subprocess
import sys
import threading

import call
import family
import upload
import why
from stage import Daemon, Lab, Root, heading, program, wait_until

ACTS = (call, family, upload)


def show_stats(root):
    taken = sum(act.taken() for act in ACTS)

    def stats():
        done = subprocess.run([program("veltractl"), "--root", str(root.path), "stats"], capture_output=True, text=True)
        return done.stdout if f"{taken}  message taken in" in done.stdout else None
    heading("veltractl stats")
    print("  " + wait_until(stats, f"{taken} messages counted").replace("\n", "\n  ").rstrip())


def stay(root, lab):
    control = shlex.join([program("veltractl"), "--root", str(root.path)])
    heading("Running until Ctrl-C. In another terminal, try:")
    print(f"  {control} {shlex.join(call.PHONE)}")
    print("""    and then lines such as {"op":"send","category":5,"type":10,"payload":{"codec":"opus"}}""")
    print(f"  {control} send --client-type 6 --client phone --service ringer --require-user-info "
          "--category 5 --type 10 codec=opus seconds=12.5")
    print(f"  {control} stats")
    print(f"  VELTRA_ROOT={root.path} {program('veltra-example-hello')}")
    print(f"  open {lab.url}/ in a browser: shows what arrives (the certificate is self-signed by the lab)")
    print(f"  edit {lab.path}/storebags/ostvane.json: the daemon's configuration, signed at each request", flush=True)
    stopped = threading.Event()
    for number in (signal.SIGINT, signal.SIGTERM):
        signal.signal(number, lambda *_: stopped.set())
    stopped.wait()


def main():
    root = Root()
    print(f"starting the lab and the daemon; the root directory of this run is {root.path}", file=sys.stderr)
    lab = Lab()
    try:
        root.use(lab)
        daemon = Daemon(root)
        try:
            problems = [problem for act in ACTS for problem in act.show(root, lab, daemon)]
            show_stats(root)
            problems += why.show(root)
            heading("\n".join(problems) or "Everything that should arrive has arrived, and nothing else.")
            if sys.stdin.isatty() and sys.stdout.isatty() and "--once" not in sys.argv:
                daemon.allow("<")  # the user may try anything
                stay(root, lab)
        finally:
            daemon.stop()
        return 1 if problems else 0
    except AssertionError as fault:
        print(f"scripts/run: {fault}", file=sys.stderr)
        return 1
    finally:
        lab.stop()
        Lab.forget_keys()
        root.remove()


sys.exit(main())
