# SPDX-License-Identifier: Apache-2.0
"""A client of veltrad that uses Python's standard library alone.

    import veltra

    with veltra.Session(client_type=7, client_name="phone") as session:
        session.start()
        session.send(5, 1, {"codec": "opus", "seconds": 12.5})

send() never blocks: a thread of the session writes to the daemon, and runs the callbacks. When the connection has ended, the
session connects again by itself, 0.1 to 30 s after each attempt, and is described and started anew. Calls that were not
written wait until then; those that were written and have no answer end with an error and are never repeated.

Methods may be called from any thread. In a callback those that wait raise Error, and close() does not wait. A session belongs
to the process that made it: in a forked child its methods raise ForkedError, but close() returns at once, statistics() is all
0, and the parent's connection is not touched. The child may make sessions of its own. No method may be called in a signal
handler. veltra.testing has a daemon for tests.
"""

from __future__ import annotations

import enum
import os
from collections.abc import Callable, Mapping, Sequence
from typing import Any, NamedTuple, Optional

from veltra._connection import Connection, ForkedError, start_call
from veltra._out import Call, Out
from veltra._record import Standing
from veltra._wire import DESCRIBE, FINISH, FLUSH, SEND, SEND_DICTIONARY, Error, call_body, socket_path

__all__ = [
    "Answer",
    "ClientType",
    "Error",
    "Flag",
    "ForkedError",
    "MessageKind",
    "Outcome",
    "Session",
    "State",
    "Statistics",
]


class ClientType(enum.IntEnum):
    """The kinds of clients. Each is named after the code that identifies it in reports."""

    PV = 0
    DR = 1
    XLN = 2
    BQ = 3
    HW = 4
    ZE = 5
    FU = 6
    JY = 7
    KO = 8
    WA = 9
    UT = 10
    EB = 11
    MYRT = 12
    QOLIN = 13
    FU_GLP = 14
    FU_TOLMS = 15
    GARNOVE = 16
    LIMBET = 17


class Flag(enum.IntFlag):
    """How a message is treated; REALTIME | OVERRIDE_SAMPLING is both."""

    NONE = 0
    REALTIME = 1  # posted at once, and what is batched before it
    OVERRIDE_SAMPLING = 2  # a back end that sampling holds back reports from now on


class MessageKind(enum.IntEnum):
    """The types of messages of category 0, which are about the session itself. Daemon and library send them."""

    START = 0
    STOP = 1
    FINISH = 2


class State(str, enum.Enum):
    """The states of a session's connection, which are texts."""

    CONNECTING = "connecting"  # it will connect; said again, with the reason, after each attempt that failed
    CONNECTED = "connected"  # the daemon has accepted the connection
    STARTED = "started"  # the daemon has answered a start, also one that the session has made again
    LOST = "lost"  # the connection has ended; calls under way end with an error
    CLOSED = "closed"  # there will be no further connection


StateChanged = Callable[[State, Optional[list[str]], str], None]


class Statistics(NamedTuple):
    """What became of the session's calls so far.

    A message that send() took (True) is counted once: by the daemon, which has run it, or as lost. After the daemon's orderly
    stop this is exact. After it was killed, what nobody can know counts as lost.
    """

    sent: int  # written to the daemon
    dropped: int  # refused by send(): the queue was full, the message too large, or the session closed
    queued: int  # waiting to be written, now
    lost: int  # messages that send() took and that are lost
    connections: int  # made so far


class Outcome(NamedTuple):
    """What has become of a message in one back end when the answer was written."""

    backend: str
    outcome: str  # posted, batched, held, dropped, waiting, sent, written, delivered or none
    reason: str  # a name for programs
    text: str  # the same for people


class Answer(NamedTuple):
    """The daemon's answer to a message."""

    text: str | None
    outcomes: list[Outcome] | None  # None: there is no answer, or the daemon is older
    error: str | None  # why there is no answer


def _checked(name: str, value: int | None, most: int) -> int | None:
    if value is not None and (isinstance(value, bool) or not isinstance(value, int) or not 0 <= value <= most):
        raise ValueError(f"{name} is {value!r}: expected 0 to {most}")
    return value if value is None else int(value)


def _present(**values: Any) -> dict[str, Any]:
    return {key: value for key, value in values.items() if value is not None}


def _description(
    client_type: int | None,
    session_id: int | None,
    client_version: int | None,
    client_name: str | None,
    service_name: str | None,
    user_info: Mapping[str, Any] | None,
    require_user_info: bool | None,
    batch_events: bool | None,
    frameworks_to_check: Sequence[str] | None,
) -> dict[str, Any]:
    return _present(
        sessionInfo=_present(
            clientType=_checked("client_type", client_type, 17),
            sessionID=_checked("session_id", session_id, 0xFFFF_FFFF),
            clientVersion=_checked("client_version", client_version, 0xFFFF),
            requireUserInfo=require_user_info,
            batchEvent=batch_events,
        ),
        userInfo={**(user_info or {}), **_present(clientName=client_name, serviceName=service_name)},
        frameworksToCheck=None if frameworks_to_check is None else list(frameworks_to_check),
        hasAggregationBlock=False,
    )


def _answer(call: Call) -> Answer:
    results = call.results
    outcomes = results.get("outcomes")
    keys = Outcome._fields
    return Answer(
        text=results.get("reply"),
        outcomes=[Outcome(*(str(one.get(key, "")) for key in keys)) for one in outcomes] if outcomes is not None else None,
        error=call.error,
    )


class Session:
    """A session with veltrad. Leaving the "with" block closes it.

    client_type: 0 to 17, a ClientType; selects the storebag.  session_id: 32 bits.  client_version: 16 bits.
    client_name, service_name, user_info: who the client is; values of user_info are like those of a payload.
    require_user_info: report nothing without user info.  batch_events: let back ends collect events.
    frameworks_to_check: names that the daemon is told with the description.
    root: the directory that holds run/veltrad; by default VELTRA_ROOT, else "/".
    queue_bytes: how much may wait to be written; a single call may be larger.
    connect_later: do not wait for the daemon, and do not fail without it: start() and send() queue until it is there.
    connect_timeout: seconds that the daemon has to accept a connection, and that a waiting call waits for one.
    state_changed: called with a State, the names of the back ends that report (or None) and a text that says why.

    Without connect_later, Error says why there is no connection. ValueError names what is outside its range.
    """

    def __init__(
        self,
        *,
        client_type: int | None = None,
        session_id: int | None = None,
        client_version: int | None = None,
        client_name: str | None = None,
        service_name: str | None = None,
        user_info: Mapping[str, Any] | None = None,
        require_user_info: bool | None = None,
        batch_events: bool | None = None,
        root: str | os.PathLike[str] | None = None,
        queue_bytes: int = 1 << 20,
        connect_later: bool = False,
        state_changed: StateChanged | None = None,
        frameworks_to_check: Sequence[str] | None = None,
        connect_timeout: float = 5.0,
    ) -> None:
        description = _description(
            client_type,
            session_id,
            client_version,
            client_name,
            service_name,
            user_info,
            require_user_info,
            batch_events,
            frameworks_to_check,
        )

        told = None
        if state_changed is not None:
            changed = state_changed
            told = lambda state, backends, why: changed(State(state), backends, why)  # noqa: E731
        self._connection = Connection(socket_path(root), description, queue_bytes, connect_later, connect_timeout, told)

    def __enter__(self) -> Session:
        return self

    def __exit__(self, *exception: object) -> None:
        self.close()

    def describe(
        self,
        *,
        client_type: int | None = None,
        session_id: int | None = None,
        client_version: int | None = None,
        client_name: str | None = None,
        service_name: str | None = None,
        user_info: Mapping[str, Any] | None = None,
        require_user_info: bool | None = None,
        batch_events: bool | None = None,
        frameworks_to_check: Sequence[str] | None = None,
    ) -> bool:
        """Describes the live session anew: all of these replace what was given before, and the back ends follow at the next
        start. Does not wait. False: it was dropped, and counted."""
        description = _description(
            client_type,
            session_id,
            client_version,
            client_name,
            service_name,
            user_info,
            require_user_info,
            batch_events,
            frameworks_to_check,
        )

        def change(standing: Standing) -> None:
            standing.description = description

        return self._connection.tell(Out(call_body(DESCRIBE, **description), change=change))

    def start(self) -> list[str] | None:
        """Returns the names of the back ends that report, or None if there is no storebag for the client. Also None
        while there is no connection: the start is queued, and state_changed is told the names."""
        if not self._connection.connected():
            if not self._connection.tell(start_call()):
                raise Error("The session is closed, or its queue is full.")
            return None
        backends = self._connection.ask(start_call()).get("backends")
        return backends if isinstance(backends, list) else None

    def send(
        self,
        category: int,
        type: int,
        payload: Mapping[str, Any] | None = None,
        flag: int = 0,
        *,
        answered: Callable[[Answer], None] | None = None,
    ) -> bool:
        """Queues one message and returns at once. False: it was dropped, and counted.

        category and type: 0 to 65535.  payload: keys are texts; values are bool, int, float, str, bytes,
        datetime (UTC), list or dict.  flag: 0 to 3, see Flag.  answered: called once, if the message was not dropped.
        Raises ValueError, TypeError or OverflowError for what no message can hold.
        """
        call = None
        if answered is not None:
            told = answered
            call = Call(lambda ended: told(_answer(ended)))
        return self._connection.tell(self._message(category, type, payload, flag, call))

    def send_and_wait(
        self, category: int, type: int, payload: Mapping[str, Any] | None = None, flag: int = 0
    ) -> Answer:
        """Sends one message and waits for its answer. Error says why there is none."""
        call = Call()
        self._connection.ask(self._message(category, type, payload, flag, call))
        return _answer(call)

    def flush(self) -> str | None:
        """Lets the back ends post what they have collected, and waits for it. Returns None, or why nothing was posted."""
        error = self._connection.ask(Out(call_body(FLUSH), Call())).get("error")
        return error.get("description") if isinstance(error, dict) else None

    def finish(self) -> None:
        """Ends the session and waits for it. There is no further connection once this one has ended."""
        self._connection.ask(Out(call_body(FINISH), Call(), change=Standing.finish))

    def close(self) -> int:
        """Writes out what waits and learns what was run, for at most 2 s, and closes the connection. Returns how many messages
        were lost that statistics() has not told; later statistics() tell them too."""
        return self._connection.close()

    def statistics(self) -> Statistics:
        return Statistics(*self._connection.counts())

    @staticmethod
    def _message(category: int, type: int, payload: Mapping[str, Any] | None, flag: int, call: Call | None) -> Out:
        message = _present(
            category=_checked("category", category, 0xFFFF),
            type=_checked("type", type, 0xFFFF),
            payload=None if payload is None else dict(payload),
        )
        if _checked("flag", flag, 3):
            body = call_body(SEND_DICTIONARY, message={**message, "flag": int(flag)})
        else:
            body = call_body(SEND, **message)
        return Out(body, call, counted=True)
