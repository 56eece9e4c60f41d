# SPDX-License-Identifier: Apache-2.0
"""Devices' requests and datagrams, and a fleet to send them to."""
import gzip
import http.client
import json
import pathlib
import socket
import ssl
import struct
import sys
import threading
import time
import unittest
import uuid

SOURCE = pathlib.Path(__file__).resolve().parents[2]
sys.path.insert(0, str(SOURCE / "fleet"))
import side  # noqa: E402

JSON = {"Content-Type": "application/json"}
GZIP = {"Content-Type": "application/octet-stream", "Content-Encoding": "gzip"}


def envelope(*events, client="client"):
    return json.dumps({"clientId": client, "postTime": time.time(), "events": list(events)}).encode()


class Answer:
    def __init__(self, response):
        self.status, self.body, self.headers = response.status, response.read(), response.headers

    def __repr__(self):
        return f"{self.status} {self.body[:80]} {dict(self.headers)}"


class Door:
    """A connection to a gateway, or through nginx, that is made again when it is lost."""

    def __init__(self, address, tls=None, timeout=45):
        self.address, self.tls, self.timeout, self.connection = address, tls, timeout, None

    def request(self, method, path, body=None, headers={}):
        if not self.connection:
            host, port = self.address
            self.connection = (http.client.HTTPSConnection(host, port, context=self.tls, timeout=self.timeout) if self.tls
                               else http.client.HTTPConnection(host, port, timeout=self.timeout))
        try:
            self.connection.request(method, path, body, headers)
            return Answer(self.connection.getresponse())
        except (OSError, http.client.HTTPException):
            self.close()
            raise

    def post(self, path, body, **headers):
        return self.request("POST", path, body, {**JSON, **{name.replace("_", "-"): text for name, text in headers.items()}})

    def close(self):
        if self.connection:
            self.connection.close()
        self.connection = None


def datagram(number, text=b" a=1", session=4660, kind=1, length=None, flags=1, device=b"d" * 40):
    length = 64 + len(text) if length is None else length
    return struct.pack(">BBBBIIHHHH40sHH", 2, 6, kind, 30, int(time.time()), ~session & 0xffffffff, ~3 & 0xffff,
                       ~length & 0xffff, 5, 10, device, number, flags) + text


class Dashboard:
    def __init__(self, address):
        host, port = address.split(":")
        self.socket = socket.socket(socket.AF_INET, socket.SOCK_DGRAM)
        self.socket.connect((host, int(port)))  # an answer from elsewhere is not received

    def ask(self, packet, wait=5):
        """Returns the acknowledgement, or None."""
        self.socket.settimeout(wait)
        self.socket.send(packet)
        try:
            return self.socket.recv(2000)
        except OSError:
            return None

    def deliver(self, packet, stopped):
        """Sends until the number is acknowledged, as the daemon does."""
        number = packet[60:62]
        while not stopped():
            answer = self.ask(packet, 1)
            if answer and answer[60:62] == number:
                return True
        return False


class FleetTest(unittest.TestCase):
    """All tests of a class share a fleet without a daemon."""
    parts = [name for name in side.NAMES if name != "daemon"]
    options = {}

    @classmethod
    def setUpClass(cls):
        cls.fleet = side.Fleet.make(**cls.options)
        cls.addClassCleanup(cls.fleet.remove)
        cls.addClassCleanup(cls.fleet.stop)
        cls.prepare()
        cls.fleet.start(cls.parts)
        cls.line = cls.fleet.line()
        cls.tls = ssl.create_default_context(cafile=cls.line["ca"])

    @classmethod
    def prepare(cls):
        """Before the parts start."""

    def say(self, user, *lines, server="stream1"):
        """Sends something to a server of the stream in its own protocol; returns the answers until the server has read it."""
        name, password = self.fleet.secret(user).read_text().strip().split(":") if user else ("", "")
        words = {"verbose": False, "headers": True, **({"user": name, "pass": password} if user else {})}
        with socket.create_connection(("127.0.0.1", self.fleet.facts["streams"][server][0]), 10) as link:
            link.sendall(b"CONNECT " + json.dumps(words).encode() + b"\r\n" + b"".join(lines) + b"PING\r\n")
            heard = []
            for line in link.makefile("rb"):
                heard.append(line.strip().decode())
                if heard[-1] == "PONG":
                    break
            return heard

    def direct(self, at=0):
        port = int(self.line["gateways"][at]["listen"].rsplit(":", 1)[1])
        return self.closing(Door(("127.0.0.1", port)))

    def through(self):
        return self.closing(Door(("localhost", self.fleet.facts["https"]), self.tls))

    def closing(self, door):
        self.addCleanup(door.close)
        return door

    def rows(self, sql, count):
        """Waits until the query has so many rows, and returns them."""
        return side.wait_until(lambda: (found := self.fleet.query(sql)) and len(found) >= count and found, f"{count} rows of {sql}", 20)


def post_id():
    return uuid.uuid4().hex


def packed(bytes_):
    return gzip.compress(bytes_, 1)


def together(works):
    """Runs functions at the same time; returns what they return."""
    results = [None] * len(works)

    def run(at):
        results[at] = works[at]()
    threads = [threading.Thread(target=run, args=(at,), daemon=True) for at in range(len(works))]
    for thread in threads:
        thread.start()
    for thread in threads:
        thread.join()
    return results
