"""One connection to a service of the daemon: D-Bus, peer to peer, over a Unix socket."""

from __future__ import annotations

import os
import socket
import struct
import time
from collections.abc import Sequence
from typing import Any

from .errors import ProtocolError, RefusedError, TimedOutError, UnreachableError
from .marshal import Reader, Writer

MAX_MESSAGE_BYTES = 128 << 20
MAX_HEADER_BYTES = 64 << 10
AUTHENTICATION_SECONDS = 10.0

_ERROR_NAME = "com.quill.tallow.Error"
_CALL, _RETURN, _ERROR = 1, 2, 3
_PATH, _INTERFACE, _MEMBER, _ERROR_FIELD, _REPLY_SERIAL, _SIGNATURE = 1, 2, 3, 4, 5, 8
_FIXED_HEADER = struct.Struct("<BBBBIII")
_READ_BYTES = 1 << 20
_MAX_LINE = 256


class Connection:
    """Calls the operations of one service. One thread at a time."""

    def __init__(self, runtime_directory: str, service: str, patience: float) -> None:
        self._path = os.path.join(runtime_directory, service)
        self._service = service
        self._patience = patience
        self._socket: socket.socket | None = None
        self._serial = 0
        self._deadline = 0.0

    def close(self) -> None:
        if self._socket is not None:
            self._socket.close()
        self._socket = None

    def call(
        self,
        member: str,
        signature: str,
        arguments: Sequence[Any],
        expected: str,
        timeout: float,
        interface: str | None = None,
    ) -> list[Any]:
        """Calls a member and gives the values of its reply, which must have the expected types."""
        message = self._message(interface or self._service, member, signature, arguments)
        self._connect()
        self._deadline = time.monotonic() + timeout
        try:
            self._send(message)
            return self._reply(expected)
        except RefusedError:
            raise
        except BaseException:
            # What is left of a reply must not be taken for the next one.
            self.close()
            raise

    def _message(self, interface: str, member: str, signature: str, arguments: Sequence[Any]) -> bytes:
        body = Writer()
        self._serial = self._serial % 0xFFFFFFFF + 1
        fields: list[tuple[int, tuple[str, str]]] = [
            (_PATH, ("o", "/" + self._service.replace(".", "/"))),
            (_INTERFACE, ("s", interface)),
            (_MEMBER, ("s", member)),
        ]
        if signature:
            fields.append((_SIGNATURE, ("g", signature)))
            body.put(f"({signature})", tuple(arguments))
        header = Writer()
        header.data.extend(
            struct.pack("<cBBBII", b"l", _CALL, 0, 1, len(body.data), self._serial)
        )
        header.put("a(yv)", fields)
        header.align(8)
        return bytes(header.data + body.data)

    def _connect(self) -> None:
        if self._socket is not None and self._hung_up(self._socket):
            self.close()
        if self._socket is not None:
            return
        end = time.monotonic() + self._patience
        while True:
            try:
                self._socket = self._open()
                break
            except OSError as error:
                if time.monotonic() >= end:
                    raise self._unreachable(error) from error
                time.sleep(0.05)
        self._deadline = time.monotonic() + AUTHENTICATION_SECONDS
        try:
            self._authenticate()
        except BaseException:
            self.close()
            raise

    def _open(self) -> socket.socket:
        opened = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        try:
            opened.settimeout(AUTHENTICATION_SECONDS)
            opened.connect(self._path)
        except BaseException:
            opened.close()
            raise
        return opened

    @staticmethod
    def _hung_up(opened: socket.socket) -> bool:
        """Whether the daemon has closed the connection, for example to make room for another."""
        try:
            # With a timeout, recv would wait for it, whatever its flags say.
            opened.setblocking(False)
            return opened.recv(1, socket.MSG_PEEK) == b""
        except BlockingIOError:
            return False
        except OSError:
            return True

    def _authenticate(self) -> None:
        uid = str(os.getuid()).encode().hex()
        self._send(f"\0AUTH EXTERNAL {uid}\r\n".encode())
        line = bytearray()
        while not line.endswith(b"\r\n"):
            if len(line) > _MAX_LINE:
                raise ProtocolError("the daemon did not answer the authentication")
            line += self._receive(1)
        if not line.startswith(b"OK "):
            raise ProtocolError("the daemon refused the authentication")
        self._send(b"BEGIN\r\n")

    def _unreachable(self, error: OSError | None) -> UnreachableError:
        reason = f": {error.strerror}" if error is not None and error.strerror else ""
        return UnreachableError(f"daemon not reachable at {self._path}{reason}")

    def _wait(self) -> socket.socket:
        """The socket, set to wait until the deadline."""
        left = self._deadline - time.monotonic()
        if left <= 0:
            raise TimedOutError("the daemon did not answer in time")
        assert self._socket is not None
        self._socket.settimeout(left)
        return self._socket

    def _send(self, data: bytes) -> None:
        try:
            self._wait().sendall(data)
        except TimeoutError as error:
            raise TimedOutError("the daemon did not take the call in time") from error
        except OSError as error:
            raise self._unreachable(error) from error

    def _receive(self, size: int) -> bytes:
        """Exactly `size` bytes. Memory grows with what arrives, not with what was announced."""
        data = bytearray()
        while len(data) < size:
            try:
                part = self._wait().recv(min(size - len(data), _READ_BYTES))
            except TimeoutError as error:
                raise TimedOutError("the daemon did not answer in time") from error
            except OSError as error:
                raise self._unreachable(error) from error
            if not part:
                raise self._unreachable(None)
            data += part
        return bytes(data)

    def _reply(self, expected: str) -> list[Any]:
        while True:
            kind, fields, body = self._read_message()
            if fields.get(_REPLY_SERIAL) != self._serial:
                continue
            if kind == _ERROR:
                raise _refusal(fields, body)
            if kind != _RETURN or fields.get(_SIGNATURE, "") != expected:
                raise ProtocolError("the reply has other types than expected")
            reader = Reader(body)
            values = reader.get_all(expected)
            if reader.at != len(body):
                raise ProtocolError("the reply is longer than its values")
            return values

    def _read_message(self) -> tuple[int, dict[int, Any], bytes]:
        fixed = self._receive(_FIXED_HEADER.size)
        endian, kind, _, version, body_size, _, fields_size = _FIXED_HEADER.unpack(fixed)
        if endian != ord("l") or version != 1:
            raise ProtocolError("the daemon does not speak D-Bus as expected")
        if fields_size > MAX_HEADER_BYTES or body_size > MAX_MESSAGE_BYTES:
            raise ProtocolError("the reply is too large")
        padded = fields_size + -fields_size % 8
        reader = Reader(fixed + self._receive(padded), _FIXED_HEADER.size - 4)
        fields = dict(reader.get("a(yv)"))
        return kind, fields, self._receive(body_size)


def _refusal(fields: dict[int, Any], body: bytes) -> RefusedError:
    name = str(fields.get(_ERROR_FIELD, ""))
    signature = fields.get(_SIGNATURE, "")
    if name == _ERROR_NAME and signature == "ssi":
        message, domain, code = Reader(body).get_all("ssi")
        return RefusedError(message, domain, code)
    text = Reader(body).get("s") if str(signature).startswith("s") else "call failed"
    return RefusedError(f"{text} ({name})", name, 0)
