# SPDX-License-Identifier: Apache-2.0
"""What a session has written and lost, and how a new connection is told about the session. Used under the connection's lock."""

from __future__ import annotations

from collections import deque
from typing import Any

from veltra._wire import DESCRIBE, START, call_body

_ASKED_IN_PERIOD, _PERIOD, _MOST_UNASKED = 16, 0.01, 64


class WrittenCalls:
    """The calls of one connection that are not known to have been run.

    The daemon runs the calls of a connection in order. So an answer shows that its call and all before it were run, and the
    daemon's "goodbye" says how many were. Of calls that want no answer, the first 16 in each 10 ms ask for one all the same,
    and then every 64th, so that few are uncertain when the daemon is killed.
    """

    def __init__(self) -> None:
        self._period_began, self._asked_in_period, self._unasked = 0.0, 0, 0
        self.clear()

    def clear(self) -> None:
        """For a new connection."""
        self._calls: deque[tuple[int, bool]] = deque()
        self._asked: set[int] = set()
        self._ran = 0
        self.uncertain = 0  # those that are counted when they are lost

    def should_ask(self, now: float) -> bool:
        if now - self._period_began >= _PERIOD:
            self._period_began, self._asked_in_period = now, 0
        if self._asked_in_period >= _ASKED_IN_PERIOD:
            self._unasked += 1
            if self._unasked < _MOST_UNASKED:
                return False
        self._asked_in_period, self._unasked = self._asked_in_period + 1, 0
        return True

    def add(self, call: int, counted: bool) -> None:
        """call: 0 if it asks for no answer."""
        self._calls.append((call, counted))
        self.uncertain += counted
        if call:
            self._asked.add(call)

    def answered(self, call: int) -> None:
        while call in self._asked:
            self._drop()

    def ran(self, calls: int) -> None:
        while self._calls and self._ran < calls:
            self._drop()

    def all_ran(self) -> None:
        self.ran(self._ran + len(self._calls))

    def _drop(self) -> None:
        call, counted = self._calls.popleft()
        self._asked.discard(call)
        self.uncertain -= counted
        self._ran += 1


class Standing:
    """What the daemon was last told about the session."""

    def __init__(self, description: dict[str, Any]) -> None:
        self.description = description
        self.started = self.finished = False

    def start(self) -> None:
        self.started, self.finished = True, False

    def finish(self) -> None:
        self.finished = True

    def first_calls(self) -> list[bytes]:
        description = call_body(DESCRIBE, **self.description)
        return [description, call_body(START)] if self.started else [description]
