#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""What the other side takes on this machine: events through gateways and stream into the table, CPU time of each part for an event,
beside the lab alone; memory of a gateway with 10,000 connections, of its own and through nginx. Prints lines.

  VELTRA_BUILD=build/release python3 bench/fleet.py [--seconds 10] [--connections 10000]"""
import argparse
import json
import os
import pathlib
import resource
import socket
import ssl
import subprocess
import sys
import tempfile
import threading
import time
import uuid

SOURCE = pathlib.Path(__file__).resolve().parents[1]
sys.path.insert(0, str(SOURCE / "fleet"))
import side  # noqa: E402

EVENTS = 50
EVENT = {"_startTS": 1400000000, "_sender": "FU", "_clientVersion": 3, "_sessionID": "wBGJTI0aTvKq0QkQkBqWJw==", "_method": 5,
         "_status": 10, "_clientTS": 1400000012.5, "eventTime": 1400000012.5, "_productFamily": "Elm", "_productModel": "Elm4,2",
         "_osVersion": "12.1", "_build": "21B74", "_internal": 3, "_reportVers": "8.0", "_timezoneOffset": 0, "codec": "opus",
         "seconds": 12.5, "clientName": "phone", "serviceName": "ringer"}
CLOCK = os.sysconf("SC_CLK_TCK")


def body():
    events = [dict(EVENT, _eventNumber=number) for number in range(EVENTS)]
    return json.dumps({"clientId": str(uuid.uuid4()), "postTime": time.time(), "events": events}).encode()


def request(content):
    head = ("POST /events/bench HTTP/1.1\r\nHost: localhost\r\nContent-Type: application/json\r\nX-VLT-Post-ID: %s\r\n"
            "Content-Length: %d\r\n\r\n") % (uuid.uuid4().hex, len(content))
    return head.encode() + content


def connect(port, tls=None):
    made = socket.create_connection(("127.0.0.1", port))
    made.setsockopt(socket.IPPROTO_TCP, socket.TCP_NODELAY, 1)
    return tls.wrap_socket(made, server_hostname="localhost") if tls else made


def post(connection, content):
    connection.sendall(request(content))
    answer = b""
    while b"\r\n\r\n" not in answer:
        more = connection.recv(65536)
        if not more:
            raise AssertionError("the connection was closed")
        answer += more
    return answer.split(b" ", 2)[1] == b"200"


def load(ports, seconds, senders, tls=None):
    """Posts in closed loops; returns how many were answered 200."""
    content, taken, end = body(), [0] * senders, time.monotonic() + seconds

    def run(at):
        with connect(ports[at % len(ports)], tls) as connection:
            while time.monotonic() < end:
                taken[at] += post(connection, content)
    threads = [threading.Thread(target=run, args=(at,)) for at in range(senders)]
    for thread in threads:
        thread.start()
    for thread in threads:
        thread.join()
    return sum(taken)


def cpu(pid):
    """Seconds of a process and of its children, which PostgreSQL has."""
    def own(one):
        fields = pathlib.Path(f"/proc/{one}/stat").read_text().rsplit(")", 1)[1].split()
        return (int(fields[11]) + int(fields[12]) + int(fields[13]) + int(fields[14])) / CLOCK
    children = pathlib.Path(f"/proc/{pid}/task/{pid}/children").read_text().split()
    total = 0
    for one in [pid, *children]:
        try:
            total += own(one)
        except FileNotFoundError:
            pass
    return total


def resident(pid):
    lines = pathlib.Path(f"/proc/{pid}/status").read_text().splitlines()
    return int(next(line.split()[1] for line in lines if line.startswith("VmRSS")))


def throughput(fleet, seconds, senders):
    ports = [listen for listen, _ in fleet.facts["gateways"].values()]
    load(ports, 1, senders)
    side.wait_until(fleet.is_carried, "the warm-up is carried")
    before = {name: cpu(pid) for name, pid in fleet.facts["pids"].items()}
    begin = time.monotonic()
    events = load(ports, seconds, senders) * EVENTS
    answered = time.monotonic() - begin
    side.wait_until(fleet.is_carried, "everything is carried", 120)
    carried = time.monotonic() - begin
    used = {name: (cpu(pid) - before[name]) / events * 1e6 for name, pid in fleet.facts["pids"].items()}
    print(f"{senders} connections, {EVENTS} events a post: {events / answered:,.0f} events/s answered, {events / carried:,.0f} events/s "
          "into the table; µs of CPU an event: " + ", ".join(f"{name} {value:.1f}" for name, value in used.items()), flush=True)


def lab_alone(seconds, senders):
    with tempfile.TemporaryDirectory() as folder:
        lab = subprocess.Popen([side.program("veltra-lab"), "--dir", folder, "--port", "0"], stdout=subprocess.PIPE, text=True)
        line = json.loads(lab.stdout.readline())
        tls = ssl.create_default_context(cafile=line["certificate"])
        begin, before = time.monotonic(), cpu(lab.pid)
        events = load([int(line["url"].rsplit(":", 1)[1])], seconds, senders, tls) * EVENTS
        print(f"the lab alone, with TLS: {events / (time.monotonic() - begin):,.0f} events/s; "
              f"{(cpu(lab.pid) - before) / events * 1e6:.1f} µs of CPU an event", flush=True)
        lab.terminate()
        lab.wait()


def memory(fleet, count):
    pid = fleet.facts["pids"]["gateway1"]
    [listen, _] = fleet.facts["gateways"]["gateway1"]
    content = json.dumps({"clientId": "c", "postTime": 1, "events": []}).encode()
    tls = ssl.create_default_context(cafile=fleet.line()["ca"])
    for words, port, context in (("of its own", listen, None), ("through nginx", fleet.facts["https"], tls)):
        rest, open_ = resident(pid), []
        nginx = sum(resident(int(one)) for one in pathlib.Path(f"/proc/{fleet.facts['pids']['nginx']}/task/{fleet.facts['pids']['nginx']}/children").read_text().split())
        good = 0
        for _ in range(count):
            open_.append(connect(port, context))
            good += post(open_[-1], content)
        after = resident(pid)
        more = sum(resident(int(one)) for one in pathlib.Path(f"/proc/{fleet.facts['pids']['nginx']}/task/{fleet.facts['pids']['nginx']}/children").read_text().split()) - nginx
        print(f"{count:,} connections {words}, {good:,} answered: gateway {rest:,} KiB before, {after:,} KiB with them "
              f"({(after - rest) * 1024 // count:,} bytes each); nginx {more:+,} KiB", flush=True)
        for connection in open_:
            connection.close()


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--seconds", type=float, default=10)
    parser.add_argument("--connections", type=int, default=10_000)
    given = parser.parse_args()
    hard = resource.getrlimit(resource.RLIMIT_NOFILE)[1]
    resource.setrlimit(resource.RLIMIT_NOFILE, (hard, hard))
    fleet = side.Fleet.make()
    conf = fleet.path / "nginx/nginx.conf"
    conf.write_text(conf.read_text().replace("keepalive_timeout 75s", "keepalive_timeout 900s"))  # until all are open
    try:
        fleet.start([name for name in side.NAMES if name != "daemon"])
        memory(fleet, given.connections)
        for senders in (16, 64):
            throughput(fleet, given.seconds, senders)
        lab_alone(given.seconds, 16)
    finally:
        fleet.stop()
        fleet.remove()


main()
