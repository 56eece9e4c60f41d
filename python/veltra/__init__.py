# SPDX-License-Identifier: Apache-2.0
"""A client of veltrad that uses Python's standard library alone.

    import veltra

    with veltra.Session(client_type=7, client_name="phone") as session:
        session.start()
        session.send(5, 1, {"codec": "opus", "seconds": 12.5})

send() never blocks: a thread of the session writes to the daemon. Methods may be called from any thread. A session belongs to
the process that made it; after a fork the child makes one of its own.
"""

from __future__ import annotations

import os
from collections.abc import Callable, Mapping
from typing import Any, NamedTuple, Optional

from veltra._connection import Connection, Error, encoded

__all__ = ["Error", "Session", "Statistics"]

StateChanged = Callable[[str, Optional[list[str]], str], None]


class Statistics(NamedTuple):
    """What became of the session's calls so far."""

    sent: int  # written to the daemon
    dropped: int  # refused by send(): the queue was full, the message too large, or the connection had ended
    queued: int  # waiting to be written, now
    lost: int  # taken by send(), but not written when the connection ended or the session was closed
    connections: int  # made so far


def _checked(name: str, value: int | None, most: int) -> int | None:
    if value is not None and (isinstance(value, bool) or not isinstance(value, int) or not 0 <= value <= most):
        raise ValueError(f"{name} is {value!r}: expected 0 to {most}")
    return value


def _present(**values: Any) -> dict[str, Any]:
    return {key: value for key, value in values.items() if value is not None}


class Session:
    """A session with veltrad. Leaving the "with" block closes it.

    client_type: 0 to 17, selects the storebag.  session_id: 32 bits.  client_version: 16 bits.
    client_name, service_name, user_info: who the client is; values of user_info are like those of a payload.
    require_user_info: report nothing without user info.  batch_events: let back ends collect events.
    root: the directory that holds run/veltrad; by default VELTRA_ROOT, else "/".
    queue_bytes: how much may wait to be written.
    connect_later: do not wait for the daemon, and do not fail without it: it is asked again until it is there,
        and start() and send() queue until then.
    state_changed: called with a state, the names of the back ends that report (or None) and a text that says why.
        The states are "connecting", "connected", "started", "lost" and "closed". It runs on the session's thread.

    Without connect_later, Error says why there is no connection. The session does not connect again after its
    connection has ended.
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
    ) -> None:
        description = encoded(
            "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:",
            sessionInfo=_present(
                clientType=_checked("client_type", client_type, 17),
                sessionID=_checked("session_id", session_id, 0xFFFF_FFFF),
                clientVersion=_checked("client_version", client_version, 0xFFFF),
                requireUserInfo=require_user_info,
                batchEvent=batch_events,
            ),
            userInfo={**(user_info or {}), **_present(clientName=client_name, serviceName=service_name)},
            hasAggregationBlock=False,
        )
        place = os.path.join(root or os.environ.get("VELTRA_ROOT") or "/", "run/veltrad/com.florn.veltrad.sock")
        self._connection = Connection(place, description, queue_bytes, connect_later, state_changed)

    def __enter__(self) -> Session:
        return self

    def __exit__(self, *exception: object) -> None:
        self.close()

    def start(self) -> list[str] | None:
        """Returns the names of the back ends that report, or None if there is no storebag for the client. Also None
        while there is no connection yet (connect_later): the start is queued, and state_changed is told the names."""
        results = self._connection.ask("startConfigWithCompletionHandler:")
        backends = results.get("backends")
        return backends if isinstance(backends, list) else None

    def send(self, category: int, type: int, payload: Mapping[str, Any] | None = None, flag: int = 0) -> bool:
        """Queues one message and returns at once. False: it was dropped, and counted.

        category and type: 0 to 65535.  payload: keys are texts; values are bool, int, float, str, bytes,
        datetime (UTC), list or dict.  flag: 1 and 3 report at once, 2 and 3 override the sampling.
        Raises ValueError, TypeError or OverflowError for what no message can hold.
        """
        _checked("category", category, 0xFFFF)
        _checked("type", type, 0xFFFF)
        _checked("flag", flag, 3)
        message = _present(category=category, type=type, payload=None if payload is None else dict(payload))
        if flag:
            return self._connection.tell(encoded("sendMessageWithDictionary:reply:", message={**message, "flag": flag}))
        return self._connection.tell(encoded("sendMessageWithCategory:type:payload:reply:", **message))

    def flush(self) -> str | None:
        """Lets the back ends post what they have collected, and waits for it. Returns None, or why nothing was posted."""
        error = self._connection.ask("flushMessagesWithCompletion:").get("error")
        return error.get("description") if isinstance(error, dict) else None

    def close(self) -> int:
        """Writes out what waits, for at most 2 s, and closes the connection. Returns how many calls were lost by that."""
        return self._connection.close()

    def statistics(self) -> Statistics:
        return Statistics(*self._connection.counts())
