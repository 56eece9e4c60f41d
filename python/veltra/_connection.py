# SPDX-License-Identifier: Apache-2.0
"""One connection to veltrad: frames, a bounded queue, and the thread that writes and reads. See the wire protocol in the
documentation of veltrad."""

from __future__ import annotations

import logging
import plistlib
import random
import select
import socket
import struct
import threading
import time
from collections import deque
from collections.abc import Callable
from typing import Any

_HELLO, _CALL, _REPLY, _REFUSAL = 1, 2, 3, 5
_HEADER = struct.Struct(">IBBHI")  # length, kind, descriptors, zero, call id
_MOST_BODY = 1 << 20
_MOST_READ = 2 << 20  # no frame of the daemon is longer
_SECONDS_TO_CONNECT = 5.0
_SECONDS_TO_CLOSE = 2.0
_FIRST_PAUSE, _LONGEST_PAUSE = 0.1, 30.0  # between attempts to connect
_READ_BYTES = 1 << 16  # at once


class Error(Exception):
    """The daemon is not there, has refused something, or gave no answer."""


class _Call:
    """A call whose answer somebody waits for."""

    def __init__(self) -> None:
        self.done = threading.Event()
        self.results: dict[str, Any] = {}
        self.error: str | None = None

    def end(self, error: str | None) -> None:
        self.error = error
        self.done.set()


def encoded(op: str, **args: Any) -> bytes:
    return plistlib.dumps({"op": op, "args": args} if args else {"op": op}, fmt=plistlib.FMT_BINARY)


def _frame(kind: int, call: int, body: bytes) -> bytes:
    return _HEADER.pack(len(body), kind, 0, 0, call) + body


class Connection:
    def __init__(
        self,
        path: str,
        description: bytes,
        queue_bytes: int,
        connect_later: bool,
        state_changed: Callable[[str, list[str] | None, str], None] | None,
    ) -> None:
        self._path, self._description, self._queue_bytes = path, description, queue_bytes
        self._connect_later, self._state_changed = connect_later, state_changed
        self._lock = threading.Lock()
        # Guarded by the lock.
        self._queue: deque[bytes] = deque()
        self._queued_bytes = 0
        self._sent = self._dropped = self._lost = self._connections = 0
        self._calls: dict[int, _Call] = {}
        self._last_call = self._start_call = 0
        self._ended: str | None = None  # why
        self._woken = False
        self._closing: float | None = None  # until when the thread may write
        # Of the thread alone.
        self._socket: socket.socket | None = None
        self._read = bytearray()
        self._writing = b""  # what is left of the frame that is being written
        self._writing_call = False  # it is a call of the session's

        self._greeted = threading.Event()  # or ended
        self._wake, self._waker = socket.socketpair()
        self._waker.setblocking(False)
        self._thread = threading.Thread(target=self._run, name="veltra", daemon=True)
        self._thread.start()
        if not connect_later:
            self._greeted.wait()
            if self._ended is not None:
                raise Error(self._ended)

    # ---- Any thread ----

    def tell(self, body: bytes) -> bool:
        with self._lock:
            return self._put(0, body)

    def ask(self, op: str) -> dict[str, Any]:
        """Waits for the answer, but not for the first connection: without one the results are empty."""
        if threading.current_thread() is self._thread:
            raise Error("A callback cannot wait for an answer.")
        call = _Call()
        with self._lock:
            self._last_call = self._last_call % 0xFFFF_FFFF + 1
            number = self._last_call
            if not self._put(number, encoded(op)):
                raise Error(self._ended or "The queue is full.")
            self._calls[number] = call
            if op.startswith("startConfig"):
                self._start_call = number
        if not self._greeted.is_set():
            return {}
        call.done.wait()
        if call.error is not None:
            raise Error(call.error)
        return call.results

    def close(self) -> int:
        with self._lock:
            before = self._lost
            if self._closing is None:
                self._closing = time.monotonic() + _SECONDS_TO_CLOSE
            self._wake_thread()
        if threading.current_thread() is not self._thread:
            self._thread.join()
        return self._lost - before

    def counts(self) -> tuple[int, int, int, int, int]:
        with self._lock:
            queued = len(self._queue) + self._writing_call
            return self._sent, self._dropped, queued, self._lost, self._connections

    def _put(self, call: int, body: bytes) -> bool:
        frame = _frame(_CALL, call, body)
        full = len(body) > _MOST_BODY or self._queued_bytes + len(frame) > self._queue_bytes
        if full or self._ended is not None or self._closing is not None:
            self._dropped += 1
            return False
        self._queue.append(frame)
        self._queued_bytes += len(frame)
        self._wake_thread()
        return True

    def _wake_thread(self) -> None:
        if not self._woken and self._ended is None:
            self._woken = True
            self._waker.send(b"x")

    # ---- The thread ----

    def _run(self) -> None:
        why = "The session was closed."
        try:
            if self._connect():
                self._serve()
        except Error as error:
            why = str(error)
        except OSError as error:
            why = f"The daemon ended the connection: {error.strerror}"
        with self._lock:
            self._ended = why
            self._lost += len(self._queue) + self._writing_call
            self._queue.clear()
            self._queued_bytes, self._writing_call = 0, False
            waiting, self._calls = self._calls, {}
            closed = self._closing is not None
        for end in (self._socket, self._wake, self._waker):
            if end is not None:
                end.close()
        for call in waiting.values():
            call.end(why)
        self._greeted.set()
        self._say("closed" if closed else "lost", None, why)

    def _connect(self) -> bool:
        """False: the session was closed meanwhile."""
        self._say("connecting", None, "")
        pause, deadline = _FIRST_PAUSE, time.monotonic() + _SECONDS_TO_CONNECT
        while self._socket is None:
            end = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
            end.setblocking(False)
            try:
                end.connect(self._path)
                self._socket = end
            except OSError as error:
                end.close()
                # BlockingIOError: the daemon is there, but more clients wait than the system holds for it.
                waits = self._connect_later or (isinstance(error, BlockingIOError) and time.monotonic() < deadline)
                if not waits:
                    raise Error(f"veltrad cannot be reached at {self._path}: {error.strerror}") from error
                self._wait([(self._wake, select.POLLIN)], time.monotonic() + pause * random.uniform(0.5, 1.0))
                if self._closing is not None:
                    return False
                pause = min(pause * 2, _LONGEST_PAUSE if self._connect_later else _FIRST_PAUSE)
        with self._lock:
            self._connections += 1
        hello = plistlib.dumps({"wire": 1, "library": "8.0"}, fmt=plistlib.FMT_BINARY)
        self._writing = _frame(_HELLO, 0, hello) + _frame(_CALL, 0, self._description)
        while not self._greeted.is_set() and not self._connect_later:
            if time.monotonic() >= deadline:
                raise Error("veltrad did not answer in time.")
            self._exchange(deadline)
        return True

    def _serve(self) -> None:
        while True:
            with self._lock:
                closing, idle = self._closing, not self._queue and not self._writing
            if closing is not None and (idle or time.monotonic() >= closing):
                return
            self._exchange(closing)

    def _exchange(self, deadline: float | None) -> None:
        """Waits until something can be read or written, and does it."""
        assert self._socket is not None
        with self._lock:
            writes = self._writing or (self._queue and self._greeted.is_set())
        events = select.POLLIN | (select.POLLOUT if writes else 0)
        found = self._wait([(self._wake, select.POLLIN), (self._socket, events)], deadline)
        if found & ~select.POLLOUT:
            self._read_frames()
        if found & select.POLLOUT:
            self._write()

    def _wait(self, watched: list[tuple[socket.socket, int]], deadline: float | None) -> int:
        """Returns the events of the last one watched; those of the wake-up are settled here."""
        poll = select.poll()
        for end, events in watched:
            poll.register(end, events)
        left = None if deadline is None else max(0.0, deadline - time.monotonic()) * 1000
        found = dict(poll.poll(left))
        with self._lock:
            if self._woken and self._wake.fileno() in found:
                self._wake.recv(1)
                self._woken = False
        end = watched[-1][0]
        return 0 if end is self._wake else found.get(end.fileno(), 0)

    def _write(self) -> None:
        assert self._socket is not None
        with self._lock:
            if not self._writing and self._queue:
                self._writing, self._writing_call = self._queue.popleft(), True
                self._queued_bytes -= len(self._writing)
        try:
            self._writing = self._writing[self._socket.send(self._writing) :]
        except BlockingIOError:
            return
        except OSError:
            self._read_frames()  # a refusal says why
            raise
        if not self._writing and self._writing_call:
            with self._lock:
                self._sent += 1
                self._writing_call = False

    def _read_frames(self) -> None:
        assert self._socket is not None
        try:
            part = self._socket.recv(_READ_BYTES)
        except BlockingIOError:
            return
        self._read += part
        while len(self._read) >= _HEADER.size:
            length, kind, _, _, call = _HEADER.unpack_from(self._read)
            if length > _MOST_READ:
                raise Error("The daemon sent a frame that is too long.")
            end = _HEADER.size + length
            if len(self._read) < end:
                break
            body = bytes(self._read[_HEADER.size : end])
            del self._read[:end]
            try:
                self._take(kind, call, plistlib.loads(body, fmt=plistlib.FMT_BINARY))
            except (plistlib.InvalidFileException, ValueError, KeyError, TypeError) as error:
                raise Error(f"The daemon sent a frame that is not readable: {error}") from error
        if not part:
            raise Error("The daemon ended the connection.")

    def _take(self, kind: int, number: int, body: dict[str, Any]) -> None:
        if kind == _REFUSAL:
            raise Error(body["error"]["description"])
        if kind == _HELLO:
            self._greeted.set()
            self._say("connected", None, "")
        if kind != _REPLY:
            return
        with self._lock:
            call = self._calls.pop(number, None)
            started = number == self._start_call
        if call is None:
            return
        call.results = body.get("results", {})
        call.end(body["error"]["description"] if "error" in body else None)
        if started and call.error is None:
            backends = call.results.get("backends")
            self._say("started", backends, "" if backends is not None else "No storebag is available.")

    def _say(self, state: str, backends: list[str] | None, why: str) -> None:
        if self._state_changed is None:
            return
        try:
            self._state_changed(state, backends, why)
        except Exception:
            logging.getLogger("veltra").exception("state_changed raised an exception")
