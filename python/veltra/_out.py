# SPDX-License-Identifier: Apache-2.0
"""The calls of a session that wait to be written. Used under its connection's lock."""

from __future__ import annotations

import socket
from collections import deque
from collections.abc import Callable
from typing import Any, NamedTuple

from veltra._record import Standing
from veltra._wire import CALL, MOST_BODY, frame

_BYTES_AT_ONCE = 1 << 14


class Call:
    """A call whose answer somebody wants."""

    def __init__(self, callback: Callable[[Call], None] | None = None) -> None:
        self.callback = callback
        self.ended = False
        self.results: dict[str, Any] = {}
        self.error: str | None = None


class Out(NamedTuple):
    """A call on its way out."""

    body: bytes
    call: Call | None = None
    counted: bool = False  # a message, which is counted when it is lost
    change: Callable[[Standing], None] | None = None  # what it changes about the session, once it is written
    starts: bool = False


class OutFrames:
    """Keeps calls in order and writes them without blocking. A call of which no byte was written waits for the next connection.

    most: the bytes that may wait; a single call may be larger.
    call_id: gives a call its ID when it is to be written, 0 if it asks for no answer.  wrote: told of each call that is written.
    """

    def __init__(self, most: int, call_id: Callable[[Out], int], wrote: Callable[[Out, int], None]) -> None:
        self._most, self._call_id, self._wrote = most, call_id, wrote
        self._calls: deque[Out] = deque()
        self._bytes = 0
        self._first = b""  # what comes before the calls
        self._released = self._held = False
        self._begun: deque[tuple[int, int]] = deque()  # ID and size of the frames of the first calls, which are written at once
        self._rest = b""  # what is left of them
        self._taken = 0  # the bytes that were taken of the first one

    def __len__(self) -> int:
        return len(self._calls)

    def put(self, out: Out) -> bool:
        """False: there is no room."""
        if len(out.body) > MOST_BODY or (self._calls and self._bytes + len(out.body) > self._most):
            return False
        self._calls.append(out)
        self._bytes += len(out.body)
        return True

    def withdraw(self, out: Out) -> bool:
        """False: it is not waiting, or a part of it was written."""
        if out not in self._calls or self._begun:
            return False
        self._calls.remove(out)
        self._bytes -= len(out.body)
        return True

    def connect(self, first: bytes) -> None:
        """A new connection exists. The calls wait until release()."""
        self._first, self._released, self._held = first, False, False

    def release(self) -> None:
        self._released = True

    def hold(self) -> None:
        """Nothing more is written on this connection."""
        self._held = True

    def disconnect(self) -> Out | None:
        """The connection has ended. Returns the call of which only a part was written."""
        cut = self._pop() if self._taken else None
        self._begun.clear()
        self._first, self._rest, self._taken = b"", b"", 0
        return cut

    def stop(self) -> list[Out]:
        """Drops everything."""
        dropped = list(self._calls)
        self._calls.clear()
        self._bytes = 0
        return dropped

    def writes(self) -> bool:
        """True if something waits for room in the socket."""
        return not self._held and bool(self._first or (self._released and self._calls))

    def write(self, end: socket.socket) -> bool:
        """Writes as much as possible without waiting. False: the socket takes no more for now."""
        if not self.writes():
            return False
        if not self._first and not self._rest:
            self._begin()
        data = self._first or self._rest
        try:
            taken = end.send(data)
        except BlockingIOError:
            return False
        except OSError:
            self._held = True  # the reader will find the end of the connection, and what the daemon sent before it
            return False
        if self._first:
            self._first = data[taken:]
            return True
        self._rest = data[taken:]
        self._taken += taken
        while self._begun and self._taken >= self._begun[0][1]:
            call, size = self._begun.popleft()
            self._taken -= size
            self._wrote(self._pop(), call)
        return True

    def _begin(self) -> None:
        frames, size = [], 0
        for out in self._calls:
            call = self._call_id(out)
            frames.append(frame(CALL, call, out.body))
            self._begun.append((call, len(frames[-1])))
            size += len(frames[-1])
            if size > _BYTES_AT_ONCE:
                break
        self._rest = b"".join(frames)

    def _pop(self) -> Out:
        out = self._calls.popleft()
        self._bytes -= len(out.body)
        return out
