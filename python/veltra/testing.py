# SPDX-License-Identifier: Apache-2.0
"""A daemon for tests of programs that report, in the test's own process. It accepts every message and sends nothing.

    import veltra.testing

    with veltra.testing.Daemon() as daemon:
        with veltra.Session(client_type=7, root=daemon.root) as session:
            session.send(5, 1, {"codec": "opus"})
        assert daemon.wait(1)
        assert daemon.messages[0]["payload"] == {"codec": "opus"}

A program that is not given a root finds it with VELTRA_ROOT in its environment.
"""

from __future__ import annotations

import contextlib
import os
import queue
import socket
import tempfile
import threading
import time
from collections.abc import Callable
from typing import Any

from veltra._wire import CALL, DESCRIBE, EVENT, GOODBYE, HELLO, REFUSAL, REPLY, SEND, SEND_DICTIONARY, SEND_ONE_SHOT, START
from veltra._wire import UPLOAD_FILE, UPLOAD_LOG_DATA, Error, Frame, FrameReader, encoded, frame, socket_path

__all__ = ["Daemon"]

_LARGE_CALL = 6
_BACKEND = "testing"
_OUTCOME = {"backend": _BACKEND, "outcome": "delivered", "reason": "reports", "text": "its client entry lets it"}


class Daemon:
    """Runs from its construction until stop(), which leaving a "with" block calls. Any thread may use it.

    root: the directory that sessions are to be given as their root. It is removed by stop().
    """

    def __init__(self) -> None:
        self._directory = tempfile.TemporaryDirectory(prefix="veltra-testing-")
        self.root = self._directory.name
        os.makedirs(os.path.dirname(socket_path(self.root)))
        self._changed = threading.Condition()
        # Guarded by it.
        self._messages: list[dict[str, Any]] = []
        self._refusal: str | None = None
        self._delay = 0.0
        self._clients: list[_Client] = []
        # Answers that are due later, in order.
        self._late: queue.SimpleQueue[tuple[float, Callable[[], None]] | None] = queue.SimpleQueue()
        self._stopped = threading.Event()
        self._answering = threading.Thread(target=self._answer_late, daemon=True)
        self._answering.start()
        self._listen()

    def __enter__(self) -> Daemon:
        return self

    def __exit__(self, *exception: object) -> None:
        self.stop()

    @property
    def messages(self) -> list[dict[str, Any]]:
        """What has come so far, in the order of arrival, restarts included. Each message has "category", "type", "payload" (None
        if there is none), "flag", "sessionInfo" and "userInfo"."""
        with self._changed:
            return list(self._messages)

    def wait(self, count: int, timeout: float = 5.0) -> bool:
        """Waits until at least `count` messages have come. False: they have not come in time, in seconds."""
        with self._changed:
            return self._changed.wait_for(lambda: len(self._messages) >= count, timeout)

    def refuse(self, text: str | None) -> None:
        """From now on, new connections are refused with this text, and calls end with it as their error; their messages are not
        taken in. None: no more."""
        with self._changed:
            self._refusal = text

    def delay(self, seconds: float) -> None:
        """From now on, answers to calls go out this much later."""
        with self._changed:
            self._delay = seconds

    def restart(self) -> None:
        """Stops in order, as the real daemon does: runs what has arrived, and ends all connections. Then it serves again."""
        self._end()
        self._listen()

    def stop(self) -> None:
        """May be called again."""
        self._end()
        self._stopped.set()
        self._late.put(None)
        self._answering.join()
        self._directory.cleanup()

    # ---- Connections ----

    def _listen(self) -> None:
        self._listener = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self._listener.bind(socket_path(self.root))
        self._listener.listen(128)
        self._accepting = threading.Thread(target=self._accept, args=(self._listener,), daemon=True)
        self._accepting.start()

    def _accept(self, listener: socket.socket) -> None:
        while True:
            try:
                end, _ = listener.accept()
            except OSError:  # it was shut down
                return
            refusal = self._refused()
            if refusal is not None:
                with end, contextlib.suppress(OSError):
                    end.sendall(frame(REFUSAL, 0, encoded(_error(refusal))))
                    end.shutdown(socket.SHUT_RDWR)
                    while end.recv(1 << 16):  # or what was written would be lost
                        pass
                continue
            client = _Client(self, end)
            with self._changed:
                self._clients = [one for one in self._clients if one.thread.is_alive()] + [client]
                client.thread.start()

    def _end(self) -> None:
        with contextlib.suppress(OSError):
            self._listener.shutdown(socket.SHUT_RDWR)
        self._accepting.join()
        self._listener.close()
        with contextlib.suppress(FileNotFoundError):
            os.unlink(socket_path(self.root))
        with self._changed:
            clients, self._clients = self._clients, []
        for client in clients:
            client.stop()

    # ---- Calls, on the connections' threads ----

    def _refused(self) -> str | None:
        with self._changed:
            return self._refusal

    def _take(self, message: dict[str, Any]) -> None:
        with self._changed:
            self._messages.append(message)
            self._changed.notify_all()

    def _answer(self, send: Callable[[], None]) -> None:
        with self._changed:
            delay = self._delay
        if delay > 0:
            self._late.put((time.monotonic() + delay, send))
        else:
            send()

    def _answer_late(self) -> None:
        while (late := self._late.get()) is not None:
            due, send = late
            if not self._stopped.wait(max(0.0, due - time.monotonic())):
                send()


def _error(description: str) -> dict[str, Any]:
    return {"error": {"domain": "com.florn.veltra.error", "code": -1, "description": description}}


class _Client:
    """One client's connection, with a thread of its own."""

    def __init__(self, daemon: Daemon, end: socket.socket) -> None:
        self._daemon, self._socket = daemon, end
        self._lock = threading.Lock()  # for writing
        self._session_info: dict[str, Any] = {}
        self._user_info: dict[str, Any] = {}
        self._calls, self._greeted, self._stopping = 0, False, False
        self.thread = threading.Thread(target=self._run, daemon=True)

    def stop(self) -> None:
        """Runs what has arrived, says goodbye and ends the connection."""
        self._stopping = True
        with contextlib.suppress(OSError):
            self._socket.shutdown(socket.SHUT_RD)
        self.thread.join()

    def _run(self) -> None:
        reader = FrameReader()
        with self._socket, contextlib.suppress(OSError, Error):
            while part := self._socket.recv(1 << 16):
                for one in reader.add(part):
                    self._take(one)
            if self._greeted and self._stopping:
                self._write(EVENT, 0, {"op": GOODBYE, "args": {"calls": self._calls}})
            self._socket.shutdown(socket.SHUT_RDWR)

    def _write(self, kind: int, call: int, body: dict[str, Any]) -> None:
        with self._lock, contextlib.suppress(OSError):  # the client may have gone
            self._socket.sendall(frame(kind, call, encoded(body)))

    def _take(self, one: Frame) -> None:
        if not self._greeted:
            self._greeted = True
            return self._write(HELLO, 0, {"wire": 1, "daemon": "8.0"})
        if one.kind not in (CALL, _LARGE_CALL):
            raise Error("A client sends calls.")
        self._calls += 1
        refusal = self._daemon._refused()
        body = {"results": self._results(one)} if refusal is None else _error(refusal)
        if one.call:
            self._daemon._answer(lambda: self._write(REPLY, one.call, body))

    def _results(self, one: Frame) -> dict[str, Any]:
        """Carries out the call."""
        op, args = one.text("op"), one.dictionary("args")
        if op in (DESCRIBE, SEND_ONE_SHOT):
            self._session_info, self._user_info = args.get("sessionInfo", {}), args.get("userInfo", {})
        if op in (SEND, SEND_DICTIONARY, SEND_ONE_SHOT):
            message = args.get("message", {}) if op == SEND_DICTIONARY else args
            keys = {"category": 0, "type": 0, "payload": None, "flag": 0}
            taken = {key: message.get(key, missing) for key, missing in keys.items()}
            self._daemon._take({**taken, "sessionInfo": self._session_info, "userInfo": self._user_info})
            return {"outcomes": [_OUTCOME]}
        if op == START:
            return {"backends": [_BACKEND]}
        return {"uploaded": True} if op in (UPLOAD_FILE, UPLOAD_LOG_DATA) else {}
