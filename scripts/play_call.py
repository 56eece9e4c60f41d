"""Plays examples/call.jsonl against a lab and a daemon in a temporary root, and shows both ends of the road."""
import json
import shlex
import signal
import subprocess
import sys
import threading
from pathlib import Path

SOURCE = Path(__file__).resolve().parent.parent
sys.path.insert(0, str(SOURCE / "tests" / "e2e"))
from harness import Daemon, Lab, Root, program  # noqa: E402

CALL = SOURCE / "examples" / "call.jsonl"
SESSION = ["session", "--client-type", "6", "--session-id", "42", "--client-version", "3"]
# The session itself reports its start and its end.
EVENTS = sum('"send"' in line or '"finish"' in line for line in CALL.read_text().splitlines()) + 2


def storebag(url):
    entry = {"post_url": url + "/collect/events", "realtime_post_url": url + "/collect/realtime", "filters": []}
    section = {"httppost": {"display_url": "https://reports.example/call/42", "clients": [entry]}}
    return {"release": section, "version": "1.0-example", "refresh_cycle": 3600}


def heading(text):
    print(f"\n\033[1m{text}\033[0m" if sys.stdout.isatty() else f"\n{text}", flush=True)


def show_answers(output):
    heading("What the client was answered")
    for line in output.splitlines():
        answer = json.loads(line)
        operation = answer.pop("op")
        reply = answer.get("reply")
        if isinstance(reply, str) and reply.startswith("{"):
            event = json.loads(reply)["events"][0]
            answer = f"event {event['_eventNumber']} (category {event['_method']}, type {event['_status']}) was posted"
        print(f"  {operation:<11} {answer if isinstance(answer, str) else json.dumps(answer)}")


def show_posts(posts):
    heading("What arrived at the collector")
    for post in posts:
        print(f"  POST {post['path']}  {post['bytes']} bytes{', gzip' if post['compressed'] else ''}")
        for name, value in sorted(post["headers"].items()):
            print(f"    {name}: {value}")
        for line in json.dumps(post["body"], indent=2, ensure_ascii=False).splitlines():
            print(f"    {line}")


def stay(root, lab):
    control = shlex.join([program("veltractl"), "--root", str(root.path)])
    heading("Up until Ctrl-C. In another terminal, try:")
    print(f"  {control} {shlex.join(SESSION)}")
    print("""    and then lines such as {"op":"send","category":5,"type":1,"payload":{"codec":"opus"}}""")
    print(f"  {control} send --client-type 6 --category 5 --type 1 codec=opus seconds=12.5")
    print(f"  {control} stats")
    print(f"  VELTRA_ROOT={root.path} {program('hello')}")
    print(f"  open {lab.url}/ in a browser: what arrives, live (the certificate is the lab's own)")
    print(f"  edit {lab.path}/storebags/ostvane.plist: what the daemon is told (signed at each request)", flush=True)
    stopped = threading.Event()
    for number in (signal.SIGINT, signal.SIGTERM):
        signal.signal(number, lambda *_: stopped.set())
    stopped.wait()


def play(root, lab):
    print("starting the daemon", file=sys.stderr)
    daemon = Daemon(root)
    try:
        print(f"playing {CALL.relative_to(SOURCE)} through veltractl session", file=sys.stderr)
        done = subprocess.run([program("veltractl"), "--root", str(root.path), *SESSION, "--input", str(CALL)],
                              capture_output=True, text=True, timeout=60)
        sys.stderr.write(done.stderr)
        show_answers(done.stdout)
        show_posts(lab.received("events", EVENTS))
        heading(f"{EVENTS} of {EVENTS} events arrived")
        if sys.stdin.isatty() and sys.stdout.isatty() and "--once" not in sys.argv:
            stay(root, lab)
        return done.returncode
    finally:
        daemon.stop()


def main():
    root = Root()
    print(f"starting the lab; this run's root is {root.path}", file=sys.stderr)
    lab = Lab()
    try:
        root.use(lab)
        root.prefer(environmentType=4)
        lab.put("ostvane", storebag(lab.url))
        return play(root, lab)
    except AssertionError as fault:
        print(f"scripts/run: {fault}", file=sys.stderr)
        return 1
    finally:
        lab.stop()
        Lab.forget_keys()
        root.remove()


sys.exit(main())
