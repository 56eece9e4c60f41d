# SPDX-License-Identifier: Apache-2.0
"""The environment of measurements: a root, the lab that serves the storebags, nginx as the collector, daemons with their
clients, and what the kernel knows of a process."""
import contextlib
import json
import os
import pathlib
import re
import shutil
import socket
import subprocess
import sys
import tempfile
import time
import urllib.request

SOURCE = pathlib.Path(__file__).resolve().parent.parent
os.environ.setdefault("VELTRA_BUILD", str(SOURCE / "build" / "release"))
sys.path.insert(0, str(SOURCE / "tests" / "e2e"))
from harness import ENTITLEMENT, Daemon, Lab, Root, Wire, closed_port, program, storebag, wait_until  # noqa: E402, F401

# Client types, by what becomes of their messages.
OVERLOAD, BATCHES_OF_50, UPLOADS, BATCHES_OF_1000, SINGLE, DATAGRAMS, COPIED, REFUSED, CAPTURED = 5, 6, 7, 8, 9, 10, 12, 16, 17
POSTS_UNDER_OVERLOAD = 20  # a second, which is all that the collector answers then
NGINX = """daemon off; master_process off; pid {dir}/nginx.pid; error_log {dir}/nginx.log;
events {{ worker_connections 4096; }}
http {{ access_log off; client_max_body_size 0; keepalive_requests 100000000; keepalive_timeout 1h;
  client_body_temp_path {dir}/body; proxy_temp_path {dir}/proxy; fastcgi_temp_path {dir}/fastcgi;
  uwsgi_temp_path {dir}/uwsgi; scgi_temp_path {dir}/scgi; limit_req_zone $server_port zone=slow:1m rate={rate}r/s;
  server {{ listen 127.0.0.1:{port} ssl backlog=4096; ssl_certificate {lab}/certificate.pem;
    ssl_certificate_key {lab}/certificate-key.pem;
    location / {{ default_type application/json; return 200 '{{"took":1,"errors":false,"items":[]}}'; }} }}
  server {{ listen 127.0.0.1:{slow} ssl backlog=4096; ssl_certificate {lab}/certificate.pem;
    ssl_certificate_key {lab}/certificate-key.pem;
    location / {{ limit_req zone=slow burst=1000000; client_body_in_file_only on; proxy_pass_request_body off;
      proxy_set_header Content-Length ""; proxy_pass http://127.0.0.1:{status}/answer; }} }}
  server {{ listen 127.0.0.1:{status}; location /status {{ stub_status; }}
    location / {{ default_type application/json; return 200 '{{"took":1,"errors":false,"items":[]}}'; }} }}
}}
"""


def found(name, *folders):
    """The path of a program, which may be in a directory outside the PATH of users."""
    path = shutil.which(name, path=os.pathsep.join([os.environ["PATH"], "/usr/sbin", "/sbin", *map(str, folders)]))
    if not path:
        sys.exit(f"scripts/bench: {name} is missing; scripts/setup {name} installs it")
    return path


class Sink:
    """nginx with TLS, which answers every post at once, and on a slow port POSTS_UNDER_OVERLOAD in a second, whose bodies it keeps
    in files."""

    def __init__(self, lab):
        self.path = pathlib.Path(tempfile.mkdtemp(prefix="veltra-sink-"))
        self.port, self.slow_port, self.status_port = closed_port(), closed_port(), closed_port()
        (self.path / "nginx.conf").write_text(
            NGINX.format(dir=self.path, lab=lab.path, port=self.port, slow=self.slow_port,
                         status=self.status_port, rate=POSTS_UNDER_OVERLOAD))
        self.popen = subprocess.Popen([found("nginx"), "-c", str(self.path / "nginx.conf"), "-e", str(self.path / "nginx.log")])
        self.url, self.slow_url = (f"https://localhost:{port}" for port in (self.port, self.slow_port))
        wait_until(self._answers, "nginx", also=lambda: (self.path / "nginx.log").read_text())

    def _answers(self):
        try:
            return self.requests()
        except OSError:
            return None

    def requests(self):
        """The number of requests so far, without those of this function."""
        with urllib.request.urlopen(f"http://127.0.0.1:{self.status_port}/status") as answer:
            text = answer.read().decode()
        self._asked = getattr(self, "_asked", 0) + 1
        return int(re.search(r"requests\s+\d+ \d+ (\d+)", text).group(1)) - self._asked + 1

    def bodies(self):
        """The bodies of posts to the slow port, which are then deleted."""
        for path in sorted((self.path / "body").iterdir()):
            yield path.read_bytes()
            path.unlink()

    def stop(self):
        self.popen.terminate()
        self.popen.wait()
        shutil.rmtree(self.path, ignore_errors=True)


class Client:
    """A bench_load that sends when it is told to."""

    def __init__(self, place, way, client_type, sessions, messages):
        self._popen = subprocess.Popen([program("bench_load"), way, str(place.root.path), str(client_type), str(sessions),
                                        str(messages)], stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)
        self._answer()

    def _answer(self):
        line = self._popen.stdout.readline()
        if not line:
            raise AssertionError(f"bench_load ended with status {self._popen.wait()}")
        return json.loads(line)

    def run(self):
        self._popen.stdin.write("\n")
        self._popen.stdin.flush()
        return self._answer()

    def close(self):
        self._popen.communicate()


class Place:
    """The root, lab and collector of a daemon. Every daemon starts with the storebags of all client types above."""

    def __init__(self):
        found("nginx")  # before the lab starts, because nothing would stop the lab after a failure
        self.root, self.lab = Root(), Lab()
        self.root.use(self.lab)
        self.sink = Sink(self.lab)
        self.level = 6
        reporting = {"locale_whitelist": ["US"], "filters": [], "sampling_threshold": 1,
                     "post_url": self.sink.url + "/events", "override_dnu": 1}  # no readable copies
        entries = {"melkard": {"locale_whitelist": ["FR"]}, "ostvane": {"event_threshold": 49, "expedite": 0},
                   "brevatto": {"event_threshold": 999, "expedite": 0}, "sollwick": {"event_threshold": 49, "expedite": 1},
                   "crovish": {"event_threshold": 49, "expedite": 0, "override_dnu": 0},
                   "pellmarch": {"event_threshold": 49, "expedite": 0, "post_url": self.sink.slow_url + "/events"},
                   "yarrowin": {"event_threshold": 49, "expedite": 0, "post_url": "${url}/events"}}
        for name, entry in entries.items():
            self.lab.put(name, storebag(backends={"httppost": {"clients": [{**reporting, **entry}]}}))
        self.lab.put("tamberlin", storebag(backends={"dashboard": {"ip": self.lab.dashboard[0], "port": self.lab.dashboard[1]}}))
        self.lab.put("quindle", storebag(backends={"uploadserver": {"post_url": "${url}/upload"}}))

    def compress(self, level):
        self.root.write("etc/veltrad/settings.json", json.dumps({"compression": {"level": level}}).encode())
        self.level = level

    @contextlib.contextmanager
    def daemon(self, wrapper=(), patience=60, **options):
        daemon = Daemon(self.root, wrapper=wrapper, env={"VELTRA_LOG": "error"}, serving=False, **options)
        try:
            wait_until(lambda: self.accepts() or daemon.popen.poll() is not None, "a daemon", patience)
            yield daemon
            daemon.popen.terminate()
            daemon.end(patience)
        finally:
            daemon.kill()

    def accepts(self):
        with socket.socket(socket.AF_UNIX) as probe:
            return probe.connect_ex(self.root.socket) == 0

    @contextlib.contextmanager
    def client(self, *arguments):
        client = Client(self, *arguments)
        try:
            yield client
        finally:
            client.close()

    def load(self, *arguments):
        """One answer of bench_load."""
        done = subprocess.run([program("bench_load"), *map(str, arguments)], capture_output=True, text=True)
        assert done.returncode == 0, done.stderr
        return json.loads(done.stdout)

    def capture(self):
        """Stores a post of 50 events as the daemon makes it, from which bodies of other sizes are made, and the size of a
        datagram of the same message."""
        with self.daemon():
            for client_type in (CAPTURED, DATAGRAMS):
                with self.client("flood", client_type, 1, 150) as client:
                    client.run()
            self._body = next(post["body"] for post in self.lab.received("events", 3) if len(post["body"]["events"]) == 50)
            self.datagram_bytes = wait_until(lambda: [line["bytes"] for line in self.lab.received("dashboard", 100)
                                                      if line["method"] == 5], "datagrams")[0]

    def body(self, events):
        path = self.root.path / f"post-of-{events}.json"
        if not path.exists():
            some = self._body["events"]
            many = {**self._body, "events": (some * (events // len(some) + 1))[:events]}
            path.write_text(json.dumps(many, separators=(",", ":"), ensure_ascii=False))
        return str(path)

    def floors(self, events, *more):
        """What the parts cost, CPU microseconds an event, for posts of so many events. With (in flight, seconds): posts a second."""
        words = ["posts"] if more else []
        words += [self.body(events), self.sink.url + "/events", self.lab.certificate, self.level,
                  *(more or [self.datagram_bytes])]
        done = subprocess.run([program("bench_floors"), *map(str, words)], capture_output=True, text=True)
        assert done.returncode == 0, done.stderr
        return json.loads(done.stdout)

    def close(self):
        self.sink.stop()
        self.lab.stop()
        self.root.remove()


def cpu_microseconds(pid):
    """CPU time of all threads, of those that have ended too."""
    return time.clock_gettime_ns((~pid << 3) | 2) / 1e3


def page_faults(pid):
    return int(pathlib.Path(f"/proc/{pid}/stat").read_text().rsplit(")", 1)[1].split()[7])


def context_switches(pid):
    """Voluntary context switches of the threads that are alive."""
    texts = [task.read_text() for task in pathlib.Path(f"/proc/{pid}/task").glob("*/status")]
    return sum(int(re.search(r"^voluntary_ctxt_switches:\s+(\d+)", text, re.M).group(1)) for text in texts)


def memory_kib(pid, *keys):
    text = pathlib.Path(f"/proc/{pid}/smaps_rollup").read_text()
    return sum(int(re.search(rf"^{key}:\s+(\d+)", text, re.M).group(1)) for key in keys or ("Rss",))


def cores():
    """The number of cores that this run may use."""
    return len(os.sched_getaffinity(0))


def pin(pid, cores):
    for task in pathlib.Path(f"/proc/{pid}/task").iterdir():
        os.sched_setaffinity(int(task.name), cores)
