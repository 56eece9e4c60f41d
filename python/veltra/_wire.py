# SPDX-License-Identifier: Apache-2.0
"""The frames of the wire protocol, for both ends of the socket. See the wire protocol in the documentation of veltrad."""

from __future__ import annotations

import os
import plistlib
import struct
from collections.abc import Iterator
from typing import Any, NamedTuple

HELLO, CALL, REPLY, EVENT, REFUSAL = 1, 2, 3, 4, 5
SOCKET = "run/veltrad/com.florn.veltrad.sock"  # under the root

DESCRIBE = "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:"
START = "startConfigWithCompletionHandler:"
SEND = "sendMessageWithCategory:type:payload:reply:"
SEND_DICTIONARY = "sendMessageWithDictionary:reply:"
SEND_ONE_SHOT = "sendMessageWithSessionInfo:userInfo:category:type:payload:reply:"
FLUSH = "flushMessagesWithCompletion:"
FINISH = "finishSessionWithReply:"
UPLOAD_FILE = "uploadFileAtPath:extensionToken:completionHandler:"
UPLOAD_LOG_DATA = "uploadLogData:completionHandler:"
GOODBYE = "goodbye"

MOST_BODY = 1 << 20
_MOST_READ = 16 << 20  # no frame is longer
_HEADER = struct.Struct(">IBBHI")  # length, kind, descriptors, zero, call ID


class Error(Exception):
    """The daemon is not there, has refused something, or gave no answer."""


class Frame(NamedTuple):
    kind: int
    call: int
    body: dict[str, Any]

    def text(self, key: str) -> str | None:
        found = self.body.get(key)
        return found if isinstance(found, str) else None

    def dictionary(self, key: str) -> dict[str, Any]:
        found = self.body.get(key)
        return found if isinstance(found, dict) else {}

    def error(self) -> str | None:
        """The description of the error in a reply or a refusal."""
        return str(self.dictionary("error").get("description", "")) if "error" in self.body else None


def encoded(body: dict[str, Any]) -> bytes:
    return plistlib.dumps(body, fmt=plistlib.FMT_BINARY)


def call_body(op: str, **args: Any) -> bytes:
    return encoded({"op": op, "args": args} if args else {"op": op})


def frame(kind: int, call: int, body: bytes) -> bytes:
    return _HEADER.pack(len(body), kind, 0, 0, call) + body


def socket_path(root: str | os.PathLike[str] | None) -> str:
    return os.path.join(root or os.environ.get("VELTRA_ROOT") or "/", SOCKET)


class FrameReader:
    """Collects bytes. Raises Error for what is no frame."""

    def __init__(self) -> None:
        self._bytes = bytearray()

    def add(self, part: bytes) -> Iterator[Frame]:
        """Returns the frames that are whole now."""
        self._bytes += part
        while len(self._bytes) >= _HEADER.size:
            length, kind, _, _, call = _HEADER.unpack_from(self._bytes)
            if length > _MOST_READ:
                raise Error("A frame came that is too long.")
            end = _HEADER.size + length
            if len(self._bytes) < end:
                return
            body = bytes(self._bytes[_HEADER.size : end])
            del self._bytes[:end]
            yield Frame(kind, call, _dictionary(body))


def _dictionary(body: bytes) -> dict[str, Any]:
    try:
        found = plistlib.loads(body, fmt=plistlib.FMT_BINARY)
    except Exception as error:  # whatever the parser raises
        raise Error(f"A frame came that is not readable: {error}") from error
    if not isinstance(found, dict):
        raise Error("A frame came that holds no dictionary.")
    return found
