# SPDX-License-Identifier: Apache-2.0
"""Runs real processes (the lab, the daemon, its clients) in a temporary root directory. Everything waits for a condition,
with a deadline; nothing sleeps for a result."""
import atexit
import contextlib
import http.client
import json
import os
import pathlib
import plistlib
import shutil
import signal
import socket
import ssl
import struct
import subprocess
import sys
import tempfile
import threading
import time
import unittest

SOURCE = pathlib.Path(__file__).resolve().parents[2]
BUILD = pathlib.Path(os.environ.get("VELTRA_BUILD", SOURCE / "build" / "dev")).resolve()
DEADLINE = float(os.environ.get("VELTRA_DEADLINE", "20"))  # seconds; only a failing test waits that long
ENTITLEMENT = "com.florn.private.veltrad"
SERVING = "main: Listener resumes with sandbox, start loop."
DEVICE = {"ProductVersion": "12.1", "BuildVersion": "21B74", "ProductType": "Elm4,2", "DeviceName": "Elm",
          "HWModelStr": "E42", "SerialNumber": "S0042", "UniqueDeviceID": "ab" * 20, "ReleaseType": "Customer"}


def program(name):
    return str(BUILD / "bin" / name)


def wait_until(condition, what, deadline=DEADLINE, also=lambda: ""):
    """Polls condition() until the deadline and returns its first true value. On failure, the message contains also()."""
    end = time.monotonic() + deadline
    while not (value := condition()):
        if time.monotonic() > end:
            raise AssertionError(f"not within {deadline} s: {what} {also()}")
        time.sleep(0.01)
    return value


class Process:
    """A process; a thread collects the lines of one of its streams."""

    def __init__(self, arguments, env, stream="stderr", **options):
        options.setdefault(stream, subprocess.PIPE)
        options.setdefault("start_new_session", True)  # Ctrl-C reaches only the test, which ends the processes in order
        self.text, self._ended, self._news = [], False, threading.Condition()
        self.popen = subprocess.Popen(arguments, env=env, **options)
        self._stream = getattr(self.popen, stream)
        self._reader = threading.Thread(target=self._read, daemon=True)
        self._reader.start()

    def _read(self):
        for line in self._stream:
            with self._news:
                self.text.append(line.decode("utf-8", "replace").rstrip("\n"))
                self._news.notify_all()
        with self._news:
            self._ended = True
            self._news.notify_all()

    def wait_for(self, condition, what, deadline=DEADLINE):
        """Waits until condition(lines) is true and returns its value."""
        with self._news:
            self._news.wait_for(lambda: condition(self.text) or self._ended, deadline)
            if value := condition(self.text):
                return value
            raise AssertionError(f"{what}: not within {deadline} s, or the process ended; its last lines:\n" +
                                 "\n".join(self.text[-40:]))

    def end(self, deadline=DEADLINE):
        """Waits for the exit and returns the status."""
        try:
            status = self.popen.wait(deadline)
        except subprocess.TimeoutExpired:
            self.popen.kill()
            self.popen.wait()
            raise AssertionError(f"did not end within {deadline} s; its last lines:\n" + "\n".join(self.text[-40:]))
        self._reader.join(deadline)
        self._stream.close()
        return status

    def descriptors(self):
        """The targets of the open descriptors, without the message log, which is opened when its first line is written."""
        names = []
        for link in pathlib.Path(f"/proc/{self.popen.pid}/fd").iterdir():
            with contextlib.suppress(FileNotFoundError):  # closed in the meantime
                names.append(os.readlink(link))
        return sorted(name for name in names if not name.endswith("messageLog.diag"))

    def status(self, key):
        """A number from /proc/PID/status; sizes are in KiB."""
        lines = pathlib.Path(f"/proc/{self.popen.pid}/status").read_text().splitlines()
        return int(next(line.split()[1] for line in lines if line.startswith(key + ":")))

    def kill(self):
        if self.popen.poll() is None:
            self.popen.kill()
            self.popen.wait()


class Root:
    """A temporary directory that is used as the root directory."""

    def __init__(self):
        self.path = pathlib.Path(tempfile.mkdtemp(prefix="veltra-"))
        self.preferences = {"environmentType": 4, "DiagnosticLogSubmissionEnabled": True}
        self.write("etc/veltrad/device.plist", DEVICE)
        self.grant([{"uid": os.getuid(), "entitlements": {ENTITLEMENT: True}}])

    def copy_of(self, name):
        """A copy of the program that any user may run: the build may lie where its owner alone may look, as below /root."""
        os.chmod(self.path, 0o755)
        if not (self.path / name).exists():
            shutil.copy(program(name), self.path / name)
        return str(self.path / name)

    def write(self, name, content):
        """Writes a property list, or bytes unchanged."""
        path = self.path / name
        path.parent.mkdir(parents=True, exist_ok=True)
        new = path.with_name(path.name + ".new")
        new.write_bytes(content if isinstance(content, bytes) else plistlib.dumps(content))
        new.rename(path)

    def grant(self, rules):
        self.write("etc/veltrad/entitlements.plist", rules)

    def prefer(self, **preferences):
        self.preferences.update(preferences)
        self.write("var/lib/veltrad/preferences/com.florn.veltra.plist", self.preferences)

    def use(self, lab):
        self.write("etc/veltrad/ca.pem", pathlib.Path(lab.certificate).read_bytes())
        self.write("usr/share/veltra/publicKey.der", pathlib.Path(lab.public_key).read_bytes())
        self.prefer(veltra_storebag_url=lab.url + "/storebags/maple")

    @property
    def socket(self):
        return str(self.path / "run/veltrad/com.florn.veltrad.sock")

    def environment(self, **more):
        kept = {key: value for key, value in os.environ.items()
                if key == "PATH" or key.endswith("SAN_OPTIONS") or key.startswith("LLVM_")}
        return {**kept, "LANG": "en_US.UTF-8", "TZ": "UTC", "VELTRA_ROOT": str(self.path), **more}

    def remove(self):
        shutil.rmtree(self.path, ignore_errors=True)


class Lab:
    _keys = None  # created once per test process; later labs start with a copy

    def __init__(self, *arguments):
        self.path = pathlib.Path(tempfile.mkdtemp(prefix="veltra-lab-"))
        if Lab._keys:
            shutil.copytree(Lab._keys, self.path, dirs_exist_ok=True)
        command = [program("veltra-lab"), "--dir", str(self.path), "--port", "0", *arguments]
        self.process = Process(command, None, "stdout")
        try:
            line = json.loads(self.process.wait_for(lambda lines: lines and lines[0], "the lab's first line"))
        except AssertionError:
            self.process.kill()
            shutil.rmtree(self.path, ignore_errors=True)
            raise
        self.url, self.certificate, self.public_key = line["url"], line["certificate"], line["publicKey"]
        self.port, self.dashboard = int(self.url.rsplit(":", 1)[1]), ("127.0.0.1", line["dashboardPort"])
        self.tls = ssl.create_default_context(cafile=self.certificate)
        if not Lab._keys:
            Lab._keys = pathlib.Path(tempfile.mkdtemp(prefix="veltra-keys-"))
            atexit.register(Lab.forget_keys)
            shutil.copytree(self.path / "signing", Lab._keys / "signing")
            for name in ("certificate.pem", "certificate-key.pem"):
                shutil.copy(self.path / name, Lab._keys)

    @classmethod
    def forget_keys(cls):
        if cls._keys:
            shutil.rmtree(cls._keys)
            cls._keys = None

    def request(self, method, path, body=None, headers={}):
        """Returns (response, body)."""
        with contextlib.closing(http.client.HTTPSConnection("localhost", self.port, context=self.tls,
                                                            timeout=DEADLINE + 5)) as connection:
            connection.request(method, path, body, headers)
            response = connection.getresponse()
            return response, response.read()

    def control(self, **rule):
        response, body = self.request("POST", "/control", json.dumps(rule))
        assert response.status == 200, body

    def reset(self):
        assert self.request("DELETE", "/control")[0].status == 200

    def put(self, name, storebag, age=100):
        """Writes the storebag's file, with a modification time `age` seconds ago."""
        path = self.path / "storebags" / f"{name}.plist"
        path.write_bytes(plistlib.dumps(storebag))
        os.utime(path, (time.time() - age,) * 2)

    def received(self, kind, count=0, deadline=DEADLINE):
        path = f"/received?kind={kind}&count={count}&waitMs={int(deadline * 1000)}"
        lines = self.request("GET", path)[1].splitlines()
        if len(lines) < count:
            raise AssertionError(f"{len(lines)} of {count} {kind} came within {deadline} s: {lines}")
        return [json.loads(line) for line in lines]

    def events(self):
        return [event for post in self.received("events") for event in post["body"]["events"]]

    def wait_for_events(self, count, deadline=DEADLINE, **like):
        """Waits for at least `count` events with the given fields and returns them in order of arrival."""
        def matching():
            found = [e for e in self.events() if all(e.get(key) == value for key, value in like.items())]
            return found if len(found) >= count else None
        return wait_until(matching, f"{count} events like {like}", deadline)

    def stop(self):
        self.process.popen.send_signal(signal.SIGTERM)
        try:
            return self.process.end(5)
        finally:
            shutil.rmtree(self.path, ignore_errors=True)


class Daemon(Process):
    # Lines that depend on the machine's kernel, not on the daemon.
    machine = ("Landlock", "SO_PEERPIDFD")

    def __init__(self, root, wrapper=(), serving=True, env={}, **options):
        self.root, self.allowed = root, list(self.machine)
        super().__init__([*wrapper, root.copy_of("veltrad") if "user" in options else program("veltrad")],
                         root.environment(**{"VELTRA_LOG": "debug", "VELTRA_LOG_TARGET": "stderr", **env}), **options)
        if serving:
            self.wait_for_line(SERVING)

    def wait_for_line(self, text, count=1, deadline=DEADLINE):
        """Waits for the count-th line that contains the text and returns it."""
        def found(lines):
            hits = [line for line in lines if text in line]
            return hits[count - 1] if len(hits) >= count else None
        return self.wait_for(found, f"line {count} with {text!r}", deadline)

    def allow(self, *texts):
        """Marks warnings and errors that contain one of the texts as expected."""
        self.allowed += texts

    def unexpected(self):
        return [line for line in self.text if line[:3] in ("<3>", "<4>") and not any(a in line for a in self.allowed)
                or not line.startswith("<")]

    def stop(self, within=10, status=0, signals=(signal.SIGTERM,)):
        """Stops it and returns the seconds that this took. Fails on a wrong status and on unexpected warnings or errors."""
        begin = time.monotonic()
        for number in signals:
            self.popen.send_signal(number)
        got = self.end(within + 2)
        took = time.monotonic() - begin
        assert got == status, f"status {got}, expected {status}:\n" + "\n".join(self.text[-40:])
        assert took <= within + 0.5, f"took {took:.1f} s"
        assert not self.unexpected(), "unexpected lines:\n" + "\n".join(self.unexpected())
        return took


# Hands the two descriptors in its arguments over like a service manager and becomes the program that follows.
HAND_OVER = ("import os, sys; [os.dup2(int(n), 20 + i) for i, n in enumerate(sys.argv[1:3])]; "
             "os.dup2(20, 3); os.dup2(21, 4); os.environ.update(LISTEN_FDS='2', LISTEN_PID=str(os.getpid())); "
             "os.execv(sys.argv[3], sys.argv[3:])")


def activated(*listeners):
    """Options of a Daemon that gets these two listening sockets."""
    handed = [listener.fileno() for listener in listeners]
    return {"wrapper": (sys.executable, "-c", HAND_OVER, *map(str, handed)), "pass_fds": handed}


START = "startConfigWithCompletionHandler:"
IDENTITY = ("--client", "phone", "--service", "ringer", "--require-user-info")


class Ctl(Process):
    """A `veltractl session` process that gets its input line by line."""

    def __init__(self, root, client_type=7, *options, identity=IDENTITY, session_id=42):
        self._next = 0
        super().__init__([program("veltractl"), "session", "--client-type", str(client_type), "--session-id",
                          str(session_id), "--client-version", "3", *identity, *options],
                         root.environment(), "stdout", stdin=subprocess.PIPE)

    def answer(self, deadline=DEADLINE):
        self._next += 1
        return json.loads(self.wait_for(lambda lines: len(lines) >= self._next and lines[self._next - 1],
                                        f"answer {self._next}", deadline))

    def say(self, **line):
        self.popen.stdin.write(json.dumps(line).encode() + b"\n")
        self.popen.stdin.flush()

    def ask(self, op, **fields):
        self.say(op=op, **fields)
        return self.answer()

    def send(self, category=5, type=1, **payload):
        return self.ask("send", category=category, type=type, payload=payload)

    def close(self):
        self.popen.stdin.close()
        return self.end()


class Wire:
    """A client on the bare socket that writes frames (docs/wire-protocol.md), valid or not."""
    HELLO, CALL, REPLY, EVENT, REFUSAL, LARGE_CALL = range(1, 7)

    def __init__(self, root, hello=True):
        self.socket = socket.socket(socket.AF_UNIX)
        self.socket.connect(root.socket)  # blocks while the queue is full
        self.socket.settimeout(DEADLINE)
        self._stream, self._call = self.socket.makefile("rb"), 0
        if hello:
            self.send(self.HELLO, {"wire": 1, "library": "8.0"})
            kind, _, body = self.frame()
            assert kind == self.HELLO and body["wire"] == 1, (kind, body)

    def send(self, kind, body, call=0, fds=0, descriptors=()):
        data = body if isinstance(body, bytes) else plistlib.dumps(body, fmt=plistlib.FMT_BINARY)
        self.raw(struct.pack(">IBBHI", len(data), kind, fds, 0, call) + data, descriptors)

    def raw(self, data, descriptors=()):
        if descriptors:
            sent = socket.send_fds(self.socket, [data], descriptors)
            data = data[sent:]
        self.socket.sendall(data)

    def frame(self):
        """Returns (kind, call id, body), or None if the daemon has ended the connection."""
        try:
            head = self._stream.read(12)
            if len(head) < 12:
                return None
            length, kind, _, _, call = struct.unpack(">IBBHI", head)
            return kind, call, plistlib.loads(self._stream.read(length))
        except ConnectionResetError:
            return None

    def begin(self, op, **args):
        self._call += 1
        self.send(self.CALL, {"op": op, "args": args}, self._call)

    def call(self, op, **args):
        """Returns the reply's body and skips events."""
        self.begin(op, **args)
        while frame := self.frame():
            if frame[0] == self.REPLY and frame[1] == self._call:
                return frame[2]
        return None

    def describe(self, client_type=7, aggregates=False, user_info={}, **session_info):
        return self.call(
            "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:", hasAggregationBlock=aggregates,
            sessionInfo={"clientType": client_type, "sessionID": 9, "requireUserInfo": True, **session_info},
            userInfo={"clientName": "phone", "serviceName": "ringer", **user_info}, frameworksToCheck=[])

    def close(self):
        self._stream.close()
        self.socket.close()


def storebag(version="v1", backends=None, **more):
    """A storebag with one client entry that reports everything to the lab immediately; `more` changes the entry."""
    entry = {"post_url": "${url}/events", "realtime_post_url": "${url}/realtime", "locale_whitelist": ["US"],
             "filters": [], "sampling_threshold": 1, "event_threshold": 49, **more}
    backends = backends or {"httppost": {"display_url": "https://display.example/phone", "clients": [entry]}}
    return {"version": version, "release": backends}


class SystemTest(unittest.TestCase):
    """A root directory, a lab that serves "quindle" and "ostvane", and daemons, which are stopped and checked at the end."""
    lab_arguments = ()
    opened = ()  # the clients of the daemon that serves

    def setUp(self):
        self.root = Root()
        self.addCleanup(self.root.remove)
        self.lab = Lab(*self.lab_arguments)
        self.addCleanup(lambda: self.assertEqual(self.lab.stop(), 0, "the lab's status"))
        self.root.use(self.lab)
        for name in ("quindle", "ostvane"):
            self.lab.put(name, storebag())

    def daemon(self, **options):
        daemon = Daemon(self.root, **options)
        self.addCleanup(daemon.kill)
        return daemon

    def started(self, client_type=7):
        """Starts a session on the bare socket."""
        wire = Wire(self.root)
        self.addCleanup(wire.close)
        wire.describe(client_type)
        wire.call(START)
        return wire

    @contextlib.contextmanager
    def serving(self, *allowed, **options):
        daemon = self.daemon(**options)
        daemon.allow(*allowed)
        try:
            yield daemon
        except BaseException:
            daemon.kill()  # so that the next row of a table can start its own
            raise
        finally:
            opened, self.opened = self.opened, ()
        daemon.stop()
        for ctl in opened:  # else it would come back to the next daemon
            ctl.kill()

    def open(self, *arguments, deadline=DEADLINE, **options):
        """Starts a session with veltractl; returns it and the answer to its start."""
        ctl = Ctl(self.root, *arguments, **options)
        self.addCleanup(ctl.kill)
        self.opened = (*self.opened, ctl)
        answer = ctl.answer(deadline)
        self.assertEqual(answer["op"], "start")
        return ctl, answer["backends"]

    def counts(self):
        """The counters of the daemon that has ended."""
        return json.loads((self.root.path / "run/veltrad/counters.json").read_text())["counts"]

    def ctl(self, *arguments, input="", status=0, root=None):
        """Runs veltractl until it ends; returns its answers and its standard error."""
        done = subprocess.run([program("veltractl"), *arguments], input=input.encode(), capture_output=True,
                              env=(root or self.root).environment(), timeout=DEADLINE)
        self.assertEqual(done.returncode, status, done.stderr.decode())
        return done.stdout.decode(), done.stderr.decode()


def closed_port():
    with socket.socket() as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]
