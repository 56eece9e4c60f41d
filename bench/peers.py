# SPDX-License-Identifier: Apache-2.0
"""Other programs that take events from a Unix socket and post them in batches, beside the daemon: the same events, the same
collector, one client. The packages of syslog-ng and rsyslog cannot be installed at once, so both are unpacked."""
import functools
import gzip
import json
import os
import pathlib
import re
import socket
import subprocess
import threading
import time
import urllib.request

from figures import number
from place import (BATCHES_OF_1000, BATCHES_OF_50, OVERLOAD, SOURCE, Client, cpu_microseconds, found, wait_until)
from uploads import peak_kib

UNPACKED = SOURCE / "build" / "peers"
PACKAGES = ["syslog-ng-core", "syslog-ng-mod-http", "libivykis0", "libnet1", "libwrap0",
            "rsyslog", "rsyslog-elasticsearch", "libestr0", "libfastjson4", "liblognorm5"]
KEPT = 51_200  # events: as many as the daemon keeps in posts of 50
UNDER_OVERLOAD = 200_000  # events
LIBRARIES = "/usr/lib/x86_64-linux-gnu"
# What the daemon adds to each message.
ADDED = {"_build": "21B74", "_clientVersion": "0", "_internal": "3", "_osVersion": "12.1", "_productFamily": "Elm",
         "_productModel": "Elm4,2", "_reportVers": "8.0", "_sender": "JY", "_sessionID": "HQh6d89CT2eE63Dym379CQ==",
         "clientName": "phone", "serviceName": "bench"}
SYSLOG_NG = """@version: 3.38
options {{ stats-level(1); }};
source lines {{ unix-stream("{socket}" flags(syslog-protocol) max-connections(2) log-iw-size(20000) log-fetch-limit(1000)); }};
parser json {{ json-parser(prefix("e.")); }};
destination posts {{ http(url("https://localhost:{port}/events") method("POST") headers("Content-Type: application/json") workers(1)
  batch-lines({batch}) batch-timeout(500) body-prefix("{{\\"events\\":[") delimiter(",") body-suffix("]}}")
  body("$(format-json --key e.* --rekey e.* --shift-levels 1 {added})") log-fifo-size({kept}) tls(ca-file("{ca}"))); }};
log {{ source(lines); parser(json); destination(posts); {flow} }};
"""
RSYSLOG = """global(workDirectory="{dir}")
module(load="imptcp") module(load="mmjsonparse") module(load="omelasticsearch")
module(load="impstats" interval="1" format="json" resetCounters="off" log.syslog="off" log.file="{dir}/stats")
template(name="event" type="subtree" subtree="$!")
input(type="imptcp" path="{socket}" ruleset="posts")
ruleset(name="posts" queue.type="FixedArray" queue.size="{kept}" queue.dequeueBatchSize="{batch}" queue.workerThreads="1") {{
  action(type="mmjsonparse" cookie="")
  {added}
  action(type="omelasticsearch" name="posts" server="https://localhost" serverport="{port}" usehttps="on" tls.cacert="{ca}"
         searchIndex="events" bulkmode="on" template="event")
}}
"""
FLUENT_BIT = """[SERVICE]
    Flush 0.2
    Log_Level error
    Parsers_File {dir}/parsers
    HTTP_Server On
    HTTP_Port {metrics}
[INPUT]
    Name syslog
    Mode unix_tcp
    Path {socket}
    Parser line
    Buffer_Max_Size 1M
[FILTER]
    Name parser
    Match *
    Key_Name message
    Parser json
[FILTER]
    Name modify
    Match *
{added}
[OUTPUT]
    Name http
    Match *
    Host localhost
    Port {port}
    URI /events
    Format json
    tls On
    tls.ca_file {ca}
{compress}
"""
FLUENT_BIT_PARSERS = r"""[PARSER]
    Name line
    Format regex
    Regex ^<\d+>1 - - - - - - (?<message>.*)$
[PARSER]
    Name json
    Format json
"""


def unpack():
    if (UNPACKED / "usr/sbin/rsyslogd").exists():
        return
    packages = UNPACKED / "packages"
    packages.mkdir(parents=True, exist_ok=True)
    subprocess.run(["apt-get", "download", "-q", *PACKAGES], cwd=packages, check=True, stdout=subprocess.DEVNULL,
                   stderr=subprocess.DEVNULL)
    for package in packages.glob("*.deb"):
        subprocess.run(["dpkg", "-x", str(package), str(UNPACKED)], check=True)


@functools.cache
def lines(count):
    """Messages as the daemon's clients send them, as syslog lines, a thousand in each piece."""
    made = []
    for turn in range(count):
        mixed = (turn + 1) * 0x9e3779b97f4a7c15 % 2 ** 64 >> 8
        fields = {"field0": f"{mixed:014x}", **{f"field{i}": f"value number {i}" for i in range(1, 8)}, "seconds": 12.5, "count": 42}
        made.append(b"<14>1 - - - - - - " + json.dumps(fields, separators=(",", ":")).encode() + b"\n")
    return [b"".join(made[begin:begin + 1000]) for begin in range(0, count, 1000)]


class Peer:
    """A program that runs in a directory of its own. `slow`: it posts to the slow port of the collector."""
    name = program = ""

    def __init__(self, place, batch, gzip=False, slow=False):
        self.place, self.batch, self.slow, self.gzip = place, batch, slow, gzip
        self.dir = pathlib.Path(place.root.path) / f"peer-{self.name}-{time.monotonic_ns()}"
        self.dir.mkdir()
        self.socket = str(self.dir / "socket")
        self.values = {"dir": self.dir, "socket": self.socket, "ca": place.lab.certificate, "batch": batch, "kept": KEPT,
                       "port": place.sink.slow_port if slow else place.sink.port}
        folders = [f"{UNPACKED}{LIBRARIES}", f"{UNPACKED}/lib/x86_64-linux-gnu", f"{UNPACKED}/usr/lib/syslog-ng"]
        self.environment = {**os.environ, "LD_LIBRARY_PATH": os.pathsep.join(folders)}
        self.process = subprocess.Popen(self.command(), env=self.environment, stdout=(self.dir / "out").open("w"),
                                        stderr=subprocess.STDOUT)
        self.pid = self.process.pid
        self.stream = socket.socket(socket.AF_UNIX)
        self.stream.settimeout(60)  # for a piece of a thousand messages
        wait_until(lambda: self._connected() or self.process.poll() is not None, self.name)
        assert self.process.poll() is None, (self.dir / "out").read_text()

    def _connected(self):
        try:
            self.stream.connect(self.socket)
            return True
        except OSError:  # it does not listen yet
            return False

    def send(self, count):
        for piece in lines(count):
            self.stream.sendall(piece)

    def close(self):
        self.stream.close()
        self.process.terminate()
        try:
            self.process.wait(20)
        except subprocess.TimeoutExpired:
            self.process.kill()
            self.process.wait()


class SyslogNG(Peer):
    name = "syslog-ng"

    def command(self):
        added = " ".join(f"--pair {key}=\\\"{value}\\\"" for key, value in ADDED.items())
        (self.dir / "conf").write_text(SYSLOG_NG.format(**self.values, added=added, flow="flags(flow-control);" if not self.slow else ""))
        return [f"{UNPACKED}/usr/sbin/syslog-ng", "-F", "--no-caps", "-f", f"{self.dir}/conf", "-R", f"{self.dir}/persist", "-c",
                f"{self.dir}/control", "-p", f"{self.dir}/pid", "--module-path", f"{UNPACKED}/usr/lib/syslog-ng/3.38"]

    def counted(self):
        done = subprocess.run([f"{UNPACKED}/usr/sbin/syslog-ng-ctl", "stats", "-c", f"{self.dir}/control"], env=self.environment,
                              capture_output=True, text=True, check=True)
        return sum(int(lost) for lost in re.findall(r"^dst\.http;.*;dropped;(\d+)$", done.stdout, re.M))


class Rsyslog(Peer):
    name = "rsyslog"

    def command(self):
        added = "\n  ".join(f'set $!{key} = "{value}";' for key, value in ADDED.items())
        (self.dir / "conf").write_text(RSYSLOG.format(**self.values, added=added))
        return [f"{UNPACKED}/usr/sbin/rsyslogd", "-n", "-f", f"{self.dir}/conf", "-i", f"{self.dir}/pid", "-M",
                f"{UNPACKED}{LIBRARIES}/rsyslog"]

    def counted(self):
        time.sleep(1.5)  # until the statistics have been written once more
        last = {}
        for line in (self.dir / "stats").read_text().splitlines():
            text = line[line.find("{"):]
            got = json.loads(text) if text.startswith("{") else {}
            last[got.get("name")] = got
        return sum(got.get("discarded.full", 0) + got.get("discarded.nf", 0) for got in last.values())


class FluentBit(Peer):
    name = "Fluent Bit"

    def command(self):
        with socket.socket() as probe:
            probe.bind(("127.0.0.1", 0))
            self.metrics = probe.getsockname()[1]
        added = "\n".join(f"    Add {key} {value}" for key, value in ADDED.items())
        (self.dir / "parsers").write_text(FLUENT_BIT_PARSERS)
        (self.dir / "conf").write_text(FLUENT_BIT.format(**self.values, added=added, metrics=self.metrics,
                                                         compress="    compress gzip" if self.gzip else ""))
        return [FluentBit.program, "-c", f"{self.dir}/conf"]

    def counted(self):
        with urllib.request.urlopen(f"http://127.0.0.1:{self.metrics}/api/v1/metrics") as answer:
            outputs = json.loads(answer.read())["output"].values()
        return sum(output["dropped_records"] + output.get("retries_failed", 0) for output in outputs)


class Ours:
    """The daemon with one session of the client library."""
    name = "veltrad"

    def __init__(self, place, batch, gzip=False, slow=False):
        self.place, self.gzip, self.level = place, gzip, place.level
        place.compress(6 if gzip else 0)
        self._serving = place.daemon()
        self.pid = self._serving.__enter__().popen.pid
        self._type = OVERLOAD if slow else BATCHES_OF_50 if batch == 50 else BATCHES_OF_1000
        self._client = None

    def send(self, count):
        if self._client is None:
            self._client = Client(self.place, "flood", self._type, 1, count)
        self._client.run()

    def counted(self):
        time.sleep(1.5)  # until the counters have been written once more
        counts = json.loads((self.place.root.path / "run/veltrad/counters.json").read_text())["counts"]
        return sum(count for name, count in counts.items() if name.startswith(("event lost", "event dropped", "message lost")))

    def close(self):
        self._client.close()
        self._serving.__exit__(None, None, None)
        self.place.compress(self.level)


def settle(sink, begin, still):
    """Waits until no post has come for `still` seconds; returns the posts and the time of the last of them."""
    seen, last = sink.requests(), time.monotonic()
    while time.monotonic() - last < still and time.monotonic() - begin < 300:
        time.sleep(0.01)
        if (now := sink.requests()) != seen:
            seen, last = now, time.monotonic()
    return seen, last


def throughput(make, place, events):
    """Of the second of two runs."""
    lines(events)
    peer = make()
    try:
        peer.send(events)
        first, _ = settle(place.sink, time.monotonic(), 2)
        begin, used = time.monotonic(), cpu_microseconds(peer.pid)
        peer.send(events)
        posts, end = settle(place.sink, begin, 2)
        return {"rate": events / (end - begin), "cpu": (cpu_microseconds(peer.pid) - used) / events,
                "posted": events / max(posts - first, 1), "memory": peak_kib(peer.pid) / 1024}
    finally:
        peer.close()


def overload(make, place, events):
    """Sends faster than the collector answers; counts at the collector what has arrived."""
    lines(events)  # made before anybody waits for them
    list(place.sink.bodies())
    peer = make()
    try:
        sender = threading.Thread(target=peer.send, args=(events,))
        sender.start()
        sender.join(60)
        settle(place.sink, time.monotonic(), 3)
        sender.join()
        arrived = 0
        for body in place.sink.bodies():
            plain = gzip.decompress(body) if body[:2] == b"\x1f\x8b" else body
            arrived += plain.count(b'"field0"')
        return {"sent": events, "arrived": arrived, "counted": peer.counted(), "peak": peak_kib(peer.pid) / 1024}
    finally:
        peer.close()


def measure(place, given):
    unpack()
    FluentBit.program = given.fluent_bit
    kinds = [(Ours, True), (Ours, False), (SyslogNG, False), (Rsyslog, False)]
    if given.fluent_bit:
        kinds += [(FluentBit, True), (FluentBit, False)]
    events, taken = (20_000 if given.quick else 200_000), []
    for batch in (50, 1000):
        for kind, packed in kinds:
            got = throughput(lambda: kind(place, batch, packed), place, events)
            taken.append({"name": kind.name, "batch": batch, "gzip": packed, **got})
    for kind, packed in kinds:
        if kind is not Ours or packed:
            row = next(row for row in taken if row["name"] == kind.name and row["batch"] == 50 and row["gzip"] == packed)
            row.update(overload(lambda: kind(place, 50, packed, slow=True), place, UNDER_OVERLOAD))
    return taken


HEADINGS = ["program", "events in a post", "gzip", "events a second", "CPU of an event, µs", "events in a post, reached",
            "memory, MiB", "sent under overload", "lost", "of them counted", "memory under overload, MiB"]


def rows(taken):
    for row in taken:
        cells = [row["name"], number(row["batch"]), "yes" if row["gzip"] else "no", number(row["rate"]), number(row["cpu"]),
                 number(row["posted"]), number(row["memory"])]
        if "sent" in row:
            cells += [number(row["sent"]), number(row["sent"] - row["arrived"]), number(row["counted"]), number(row["peak"])]
        yield cells + [""] * (len(HEADINGS) - len(cells))
