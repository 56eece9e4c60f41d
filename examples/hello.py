#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""A client of the wire protocol (docs/wire-protocol.md) that uses only Python's standard library. It opens a session,
starts it, sends one message and prints the daemon's answer."""

import os
import plistlib
import socket
import struct
import sys

HELLO, CALL, REPLY, EVENT, REFUSAL = 1, 2, 3, 4, 5
HEADER = struct.Struct(">IBBHI")  # length, kind, descriptors, zero, call id


class Connection:
    def __init__(self, path):
        self.socket = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self.socket.connect(path)
        self.last_call = 0
        self.write(HELLO, 0, {"wire": 1, "library": "8.0"})
        kind, _, body = self.read()
        if kind != HELLO:
            raise ConnectionRefusedError(body["error"]["description"])

    def write(self, kind, call, body):
        data = plistlib.dumps(body, fmt=plistlib.FMT_BINARY)
        header = HEADER.pack(len(data), kind, 0, 0, call)
        self.socket.sendall(header + data)

    def read_exactly(self, count):
        data = b""
        while len(data) < count:
            part = self.socket.recv(count - len(data))
            if not part:
                raise ConnectionResetError("The daemon ended the connection.")
            data += part
        return data

    def read(self):
        header = self.read_exactly(HEADER.size)
        length, kind, _, _, call = HEADER.unpack(header)
        body = self.read_exactly(length)
        return kind, call, plistlib.loads(body)

    def tell(self, op, **args):
        """Makes a call without a reply."""
        self.write(CALL, 0, {"op": op, "args": args})

    def ask(self, op, **args):
        """Makes a call and returns the results of its reply. Events that arrive before it are ignored."""
        self.last_call += 1
        self.write(CALL, self.last_call, {"op": op, "args": args})
        while True:
            kind, call, body = self.read()
            if kind == REPLY and call == self.last_call:
                if "error" in body:
                    raise RuntimeError(body["error"]["description"])
                return body["results"]


def main():
    root = os.environ.get("VELTRA_ROOT") or "/"
    daemon = Connection(os.path.join(root, "run/veltrad/com.florn.veltrad.sock"))
    daemon.tell(
        "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:",
        sessionInfo={"clientType": 7},
        userInfo={"clientName": "hello"},
        hasAggregationBlock=False,
    )
    daemon.ask("startConfigWithCompletionHandler:")
    results = daemon.ask(
        "sendMessageWithCategory:type:payload:reply:",
        category=5,
        type=10,
        payload={"greeting": "Hello, veltrad"},
    )
    print(results.get("reply", "(no text)"))


if __name__ == "__main__":
    try:
        main()
    except (OSError, RuntimeError) as error:
        sys.exit(str(error))
