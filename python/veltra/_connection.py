# SPDX-License-Identifier: Apache-2.0
"""A session's connection to veltrad: a bounded queue, and the thread that connects, writes, reads and runs callbacks."""

from __future__ import annotations

import enum
import functools
import logging
import os
import random
import select
import socket
import threading
import time
import weakref
from collections import deque
from collections.abc import Callable
from typing import Any, Optional

from veltra._out import Call, Out, OutFrames
from veltra._record import Standing, WrittenCalls
from veltra._wire import CALL, DESCRIBE, EVENT, GOODBYE, HELLO, MOST_BODY, REFUSAL, REPLY, START
from veltra._wire import Error, Frame, FrameReader, call_body, encoded, frame

_SECONDS_TO_CLOSE = 2.0
_FIRST_PAUSE, _LONGEST_PAUSE = 0.2, 30.0  # between attempts to connect, at most; each is drawn from the upper half
_READ_BYTES = 1 << 16  # at once
_MOST_WRITES = 4  # before anything else is looked at
_LONGEST_PATH = 107
_ENDED = "The connection to the daemon ended before the answer came."

StateCallback = Callable[[str, Optional[list[str]], str], None]


class ForkedError(Error):
    """The session belongs to the process that this one was forked from."""


class _Phase(enum.Enum):
    WAITING = enum.auto()  # there is no connection; the next attempt is due at a time
    GREETING = enum.auto()  # connected; the daemon's hello is to come
    STARTING = enum.auto()  # the session is being started anew; its calls still wait
    OPEN = enum.auto()  # calls are written
    OVER = enum.auto()  # for good


_connections: weakref.WeakSet[Connection] = weakref.WeakSet()


def _in_forked_child() -> None:
    for connection in list(_connections):
        connection.abandon()


os.register_at_fork(after_in_child=_in_forked_child)


class Connection:
    """Any thread may call its public methods. All others run on its own thread, most of them under the lock."""

    def __init__(
        self,
        path: str,
        description: dict[str, Any],
        queue_bytes: int,
        connect_later: bool,
        connect_timeout: float,
        state_changed: StateCallback | None,
    ) -> None:
        if len(os.fsencode(path)) > _LONGEST_PATH:
            raise Error(f"The socket's path {path} is longer than {_LONGEST_PATH} bytes: choose a shorter root.")
        if len(call_body(DESCRIBE, **description)) > MOST_BODY:
            raise Error(f"The user info is too large: with the session info it must fit into {MOST_BODY} bytes.")
        self._path, self._patience = path, connect_timeout
        self._state_changed = state_changed
        self.forked = False
        self._lock = threading.Lock()
        self._changed = threading.Condition(self._lock)  # an answer has come, or the phase has changed
        # Guarded by the lock. What is to be written:
        self._out = OutFrames(queue_bytes, self._id_of, self._wrote)
        # What was written, and what has come of it:
        self._standing, self._written = Standing(description), WrittenCalls()
        self._calls: dict[int, Call] = {}
        self._last_call = self._start_call = 0
        self._sent = self._dropped = self._lost = self._told = self._connections = 0
        # The wish to be connected:
        self._phase = _Phase.WAITING
        self._next = time.monotonic()  # when the next attempt is due, or the hello at the latest
        self._failures = 0
        self._give_up_at = None if connect_later else self._next + connect_timeout  # without a first connection
        self._why = ""
        self._closing: float | None = None  # until when
        self._woken = False
        # Of the thread alone.
        self._socket: socket.socket | None = None
        self._reader = FrameReader()
        self._half_closed = False
        self._last_words = ""
        self._ready: deque[Callable[[], None]] = deque()  # callbacks

        self._wake = os.eventfd(0, os.EFD_CLOEXEC | os.EFD_NONBLOCK)
        _connections.add(self)
        self._thread = threading.Thread(target=self._run, name="veltra", daemon=True)
        self._thread.start()
        with self._changed:
            while self._give_up_at is not None and self._phase is not _Phase.OVER:
                self._changed.wait()
            if self._phase is _Phase.OVER and not connect_later:
                raise Error(self._why)

    # ---- Any thread ----

    def tell(self, out: Out) -> bool:
        """Queues a call. False: it was dropped."""
        self._check_process()
        with self._lock:
            return self._put(out)

    def ask(self, out: Out) -> dict[str, Any]:
        """Waits for the answer; without a connection, for a limited time."""
        self._check_process()
        call = out.call
        assert call is not None
        if threading.current_thread() is self._thread:
            raise Error("A callback cannot wait for an answer.")
        deadline = time.monotonic() + self._patience
        with self._changed:
            if not self._put(out):
                raise Error(self._why or "The queue is full, or the session is being closed.")
            while not call.ended:
                if self._phase in (_Phase.STARTING, _Phase.OPEN):
                    self._changed.wait()
                elif not self._changed.wait(max(0.0, deadline - time.monotonic())):
                    if not call.ended and self._out.withdraw(out):
                        raise Error(f"veltrad cannot be reached at {self._path}.")
        if call.error is not None:
            raise Error(call.error)
        return call.results

    def connected(self) -> bool:
        self._check_process()
        with self._lock:
            return self._phase in (_Phase.STARTING, _Phase.OPEN)

    def close(self) -> int:
        if self.forked:
            return 0
        with self._lock:
            if self._closing is None:
                self._closing = time.monotonic() + _SECONDS_TO_CLOSE
            self._wake_thread()
        if threading.current_thread() is self._thread:
            return 0
        self._thread.join()
        with self._lock:
            untold, self._told = self._lost - self._told, self._lost
            return untold

    def counts(self) -> tuple[int, int, int, int, int]:
        if self.forked:
            return 0, 0, 0, 0, 0
        with self._lock:
            self._told = self._lost
            return self._sent, self._dropped, len(self._out), self._lost, self._connections

    def abandon(self) -> None:
        """In a forked child, which has one thread: closes its copies of the descriptors."""
        self.forked = True
        if self._socket is not None:
            self._socket.close()
        if self._wake >= 0:
            os.close(self._wake)
            self._wake = -1

    def _check_process(self) -> None:
        if self.forked:
            raise ForkedError("The session belongs to the process that this one was forked from.")

    def _put(self, out: Out) -> bool:
        if self._phase is _Phase.OVER or self._closing is not None or not self._out.put(out):
            self._dropped += 1
            return False
        self._wake_thread()
        return True

    def _wake_thread(self) -> None:
        if not self._woken and self._wake >= 0:
            self._woken = True
            os.eventfd_write(self._wake, 1)

    # ---- The thread ----

    def _run(self) -> None:
        self._say("connecting", None, "")
        while self._phase is not _Phase.OVER and not self.forked:
            try:
                self._step()
            except Exception:  # a fault of this module; callers must not wait for ever
                logging.getLogger("veltra").exception("The session has failed")
                with self._lock:
                    self._give_up("The session has failed.")
            self._run_callbacks()
        if self.forked:
            return
        with self._lock:
            os.close(self._wake)
            self._wake = -1

    def _step(self) -> None:
        """Handles what is due, then waits for the socket and reads or writes."""
        with self._lock:
            now = time.monotonic()
            if self._phase is _Phase.WAITING and now >= self._next:
                self._attempt(now)
            elif self._phase is _Phase.GREETING and now >= self._next:
                self._disconnect("veltrad did not answer in time.")
            if self._closing is not None:
                self._go_on_closing(now)
            if self._phase is _Phase.OVER or self._ready:
                return
            times = [self._closing] if self._closing is not None else []
            if self._phase in (_Phase.WAITING, _Phase.GREETING):
                times.append(self._next)
            writes = self._socket is not None and self._out.writes()
        found = self._poll(select.POLLIN | (select.POLLOUT if writes else 0), min(times, default=None))
        if found & ~select.POLLOUT:
            self._read()
        for _ in range(_MOST_WRITES if found & select.POLLOUT else 0):
            with self._lock:
                if self._socket is None or not self._out.write(self._socket):
                    break

    def _poll(self, events: int, until: float | None) -> int:
        """Returns the events of the socket; those of the wake-up are settled here."""
        poll = select.poll()
        poll.register(self._wake, select.POLLIN)
        if self._socket is not None:
            poll.register(self._socket, events)
        found = dict(poll.poll(None if until is None else max(0.0, until - time.monotonic()) * 1000 + 1))
        if self._wake in found:
            with self._lock:
                os.eventfd_read(self._wake)
                self._woken = False
        return 0 if self._socket is None else found.get(self._socket.fileno(), 0)

    def _run_callbacks(self) -> None:
        while self._ready and not self.forked:
            try:
                self._ready.popleft()()
            except Exception:
                logging.getLogger("veltra").exception("A callback of a session raised an exception")

    # ---- Connections ----

    def _attempt(self, now: float) -> None:
        end = None
        try:
            end = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
            end.setblocking(False)
            end.connect(self._path)
        except OSError as error:
            if end is not None:
                end.close()
            self._failed(f"veltrad cannot be reached at {self._path}: {error.strerror}", now)
            # BlockingIOError: the daemon is there, but more clients wait than the system holds for it.
            if self._give_up_at is not None and not (isinstance(error, BlockingIOError) and now < self._give_up_at):
                self._give_up(self._why)
            return
        self._socket, self._phase, self._next = end, _Phase.GREETING, now + self._patience
        first = frame(HELLO, 0, encoded({"wire": 1, "library": "8.0"}))
        for number, body in enumerate(self._standing.first_calls()):
            call = self._start_call = self._next_id() if number else 0
            first += frame(CALL, call, body)
            self._written.add(call, False)
        self._out.connect(first)

    def _failed(self, why: str, now: float) -> None:
        pause = min(_FIRST_PAUSE * 2**self._failures, _LONGEST_PAUSE) * random.uniform(0.5, 1.0)
        self._failures = min(self._failures + 1, 16)
        self._phase, self._next, self._why = _Phase.WAITING, now + pause, why
        self._say("connecting", None, why)

    def _greeted(self, hello: Frame) -> None:
        if hello.body.get("wire") != 1:
            raise Error(f"The daemon speaks wire version {hello.body.get('wire')}, this client speaks version 1.")
        self._connections += 1
        self._failures, self._give_up_at, self._why = 0, None, ""
        self._phase = _Phase.STARTING
        self._say("connected", None, "")
        if not self._standing.started:
            self._open()
        self._changed.notify_all()

    def _open(self) -> None:
        self._phase = _Phase.OPEN
        self._out.release()

    def _disconnect(self, why: str) -> None:
        greeted = self._phase is not _Phase.GREETING
        assert self._socket is not None
        self._socket.close()
        self._socket, self._reader, self._last_words, self._half_closed = None, FrameReader(), "", False
        if (cut := self._out.disconnect()) is not None:
            self._lost += cut.counted
            if cut.change is not None:
                cut.change(self._standing)
            self._end(cut.call, error=_ENDED)
        self._lost += self._written.uncertain
        self._written.clear()
        calls, self._calls, self._start_call = self._calls, {}, 0
        for call in calls.values():
            self._end(call, error=_ENDED)
        if greeted:
            self._say("lost", None, why)
        if self._closing is not None and not self._out:
            self._give_up("The session was closed.")
        elif self._standing.finished or self._give_up_at is not None:
            self._give_up(why)
        else:
            self._failed("" if greeted else why, time.monotonic())
        self._changed.notify_all()

    def _give_up(self, why: str) -> None:
        self._phase, self._why = _Phase.OVER, why
        if self._socket is not None:
            self._socket.close()
            self._socket = None
        dropped = self._out.stop()
        self._lost += sum(out.counted for out in dropped)
        for call in [out.call for out in dropped] + list(self._calls.values()):
            self._end(call, error=_ENDED)
        self._calls.clear()
        self._say("closed", None, why)
        self._changed.notify_all()

    def _go_on_closing(self, now: float) -> None:
        uncertain = self._socket is not None and self._written.uncertain > 0
        if (not self._out and not uncertain) or (self._closing is not None and now >= self._closing):
            self._give_up("The session was closed.")
        elif self._phase is _Phase.OPEN and not (self._out or self._out.writes() or self._half_closed):
            # The daemon ends the other half when it has run everything.
            self._half_closed = True
            assert self._socket is not None
            self._socket.shutdown(socket.SHUT_WR)

    # ---- Writing ----

    def _id_of(self, out: Out) -> int:
        asks = out.call is not None or out.starts or self._written.should_ask(time.monotonic())
        return self._next_id() if asks else 0

    def _next_id(self) -> int:
        self._last_call = self._last_call % 0xFFFF_FFFF + 1
        return self._last_call

    def _wrote(self, out: Out, call: int) -> None:
        self._sent += 1
        self._written.add(call, out.counted)
        if out.change is not None:
            out.change(self._standing)
        if out.starts:
            self._start_call = call
        if out.call is not None:
            self._calls[call] = out.call

    # ---- Reading ----

    def _read(self) -> None:
        assert self._socket is not None
        part, reset = b"", False
        try:
            part = self._socket.recv(_READ_BYTES)
        except BlockingIOError:
            return
        except OSError:
            reset = True
        with self._lock:
            try:
                for one in self._reader.add(part):
                    self._take(one)
            except Error as error:
                self._disconnect(str(error))
                return
            if part:
                return
            # After a half close, a daemon that has run everything ends the other half without a word.
            if self._half_closed and not reset and not self._last_words:
                self._written.all_ran()
            self._disconnect(self._last_words or "The daemon has ended the connection.")

    def _take(self, one: Frame) -> None:
        if one.kind == REFUSAL:
            raise Error(one.error() or "The daemon has refused the connection.")
        if self._phase is _Phase.GREETING:
            if one.kind != HELLO:
                raise Error("The daemon's first frame is no hello.")
            self._greeted(one)
        elif one.kind == REPLY:
            self._answered(one)
        elif one.kind == EVENT and one.text("op") == GOODBYE:
            calls = one.dictionary("args").get("calls")
            self._written.ran(calls if isinstance(calls, int) else 0)
            self._out.hold()
            self._last_words = "The daemon has stopped."

    def _answered(self, reply: Frame) -> None:
        self._written.answered(reply.call)
        if reply.call == self._start_call:
            self._started(reply)
        self._end(self._calls.pop(reply.call, None), reply.dictionary("results"), reply.error())

    def _started(self, reply: Frame) -> None:
        self._start_call = 0
        backends, error = reply.dictionary("results").get("backends"), reply.error()
        known = backends if isinstance(backends, list) else None
        self._say("started", known, error or ("" if known is not None else "No storebag is available."))
        if self._phase is _Phase.STARTING:
            self._open()

    def _end(self, call: Call | None, results: dict[str, Any] | None = None, error: str | None = None) -> None:
        if call is None:
            return
        call.ended, call.results, call.error = True, results or {}, error
        if call.callback is not None:
            self._ready.append(functools.partial(call.callback, call))
        self._changed.notify_all()

    def _say(self, state: str, backends: list[str] | None, why: str) -> None:
        if self._state_changed is not None:
            self._ready.append(functools.partial(self._state_changed, state, backends, why))


def start_call() -> Out:
    return Out(call_body(START), Call(), change=Standing.start, starts=True)
