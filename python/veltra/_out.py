# SPDX-License-Identifier: Apache-2.0
"""The calls of a session that wait to be written. Used under its connection's lock."""

from __future__ import annotations

import socket
from collections import deque
from collections.abc import Callable
from typing import Any, NamedTuple

from veltra._record import Standing
from veltra._wire import CALL, MOST_BODY, frame


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
    """Keeps calls in order and writes them without blocking. What no connection has taken any byte of waits for the next one.

    most: the bytes that may wait; a single call may be larger.
    call_id: gives a call its ID when its turn has come, 0 if it asks for no answer.  wrote: told of each call that is written.
    """

    def __init__(self, most: int, call_id: Callable[[Out], int], wrote: Callable[[Out, int], None]) -> None:
        self._most, self._call_id, self._wrote = most, call_id, wrote
        self._calls: deque[Out] = deque()
        self._bytes = 0
        self._first = b""  # what comes before the calls
        self._released = self._held = False
        self._part: bytes | None = None  # what is left of the first call, if its writing has begun
        self._part_id, self._part_taken = 0, False

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
        """False: it does not wait, or a part of it was written."""
        if out not in self._calls or (self._part_taken and self._calls[0] is out):
            return False
        self._calls.remove(out)
        self._bytes -= len(out.body)
        self._part = None
        return True

    def connect(self, first: bytes) -> None:
        """There is a new connection. The calls wait until release()."""
        self._first, self._released, self._held = first, False, False

    def release(self) -> None:
        self._released = True

    def hold(self) -> None:
        """Nothing more is written on this connection."""
        self._held = True

    def disconnect(self) -> Out | None:
        """The connection has ended. Returns the call of which only a part was written."""
        cut = self._take() if self._part_taken else None
        self._first, self._part, self._part_taken = b"", None, False
        return cut

    def stop(self) -> list[Out]:
        """Drops everything."""
        dropped = list(self._calls)
        self._calls.clear()
        self._bytes = 0
        return dropped

    def writes(self) -> bool:
        """Something waits for room in the socket."""
        return not self._held and bool(self._first or (self._released and self._calls))

    def write(self, end: socket.socket) -> bool:
        """Writes what it can of the next frame. False: nothing more for now."""
        if not self.writes():
            return False
        if not self._first and self._part is None:
            self._part_id = self._call_id(self._calls[0])
            self._part = frame(CALL, self._part_id, self._calls[0].body)
        data = self._first or self._part or b""
        try:
            rest = data[end.send(data) :]
        except BlockingIOError:
            return False
        except OSError:
            self._held = True  # the reader will find the end, and what the daemon has said before it
            return False
        if self._first:
            self._first = rest
            return True
        self._part, self._part_taken = rest, True
        if not rest:
            self._part, self._part_taken = None, False
            self._wrote(self._take(), self._part_id)
        return True

    def _take(self) -> Out:
        out = self._calls.popleft()
        self._bytes -= len(out.body)
        return out
