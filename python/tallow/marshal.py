"""Values in the wire format of D-Bus, little-endian.

Types are those of the daemon's interfaces: y b n q i u x t d s o g v, arrays, structures and
dictionary entries. An array of bytes is `bytes`, a dictionary is a `dict`, a structure a `tuple`.
"""

from __future__ import annotations

import struct
from typing import Any

from .errors import InvalidError, ProtocolError

MAX_ARRAY_BYTES = 64 << 20
MAX_DEPTH = 16

_FIXED = {
    "y": "<B", "n": "<h", "q": "<H", "i": "<i", "u": "<I", "x": "<q", "t": "<Q", "d": "<d", "b": "<I",
}
_ALIGNMENT = {
    "y": 1, "b": 4, "n": 2, "q": 2, "i": 4, "u": 4, "x": 8, "t": 8, "d": 8,
    "s": 4, "o": 4, "g": 1, "a": 4, "(": 8, "{": 8, "v": 1,
}  # fmt: skip


def split_signature(signature: str) -> list[str]:
    """The complete types in a signature, such as ["s", "a{sv}"]."""
    types = []
    begin = 0
    while begin < len(signature):
        end = _end_of_type(signature, begin, 0)
        types.append(signature[begin:end])
        begin = end
    return types


def _end_of_type(signature: str, at: int, depth: int) -> int:
    if at >= len(signature) or depth > MAX_DEPTH or signature[at] not in _ALIGNMENT:
        raise ProtocolError("a signature is malformed")
    kind = signature[at]
    if kind == "a":
        return _end_of_type(signature, at + 1, depth + 1)
    if kind not in "({":
        return at + 1
    closing = ")" if kind == "(" else "}"
    at += 1
    while at < len(signature) and signature[at] != closing:
        at = _end_of_type(signature, at, depth + 1)
    if at >= len(signature):
        raise ProtocolError("a signature is malformed")
    return at + 1


def _check_entry(kind: str) -> None:
    members = split_signature(kind[1:-1])
    if len(members) != 2 or members[0] not in _FIXED.keys() | {"s", "o", "g"}:
        raise ProtocolError("a dictionary is malformed")


class Writer:
    """Appends values to one message body."""

    def __init__(self) -> None:
        self.data = bytearray()

    def align(self, alignment: int) -> None:
        self.data.extend(bytes(-len(self.data) % alignment))

    def put(self, kind: str, value: Any) -> None:
        first = kind[0]
        self.align(_ALIGNMENT[first])
        if first in _FIXED:
            self._put_number(first, value)
        elif first in "so":
            self._put_text(value, "<I")
        elif first == "g":
            self._put_text(value, "<B")
        elif first == "a":
            self._put_array(kind[1:], value)
        elif first == "(":
            for member, part in zip(split_signature(kind[1:-1]), value, strict=True):
                self.put(member, part)
        elif first == "v":
            self.put("g", value[0])
            self.put(*value)
        else:
            raise InvalidError(f"values of type {kind} cannot be sent")

    def _put_number(self, kind: str, value: Any) -> None:
        try:
            self.data.extend(struct.pack(_FIXED[kind], value))
        except struct.error as error:
            raise InvalidError(f"{value!r} is no number that can be sent") from error

    def _put_text(self, text: str, length: str) -> None:
        encoded = encode_text(text)
        self.data.extend(struct.pack(length, len(encoded)))
        self.data.extend(encoded)
        self.data.append(0)

    def _put_array(self, kind: str, values: Any) -> None:
        if kind == "y":
            self._check_length(len(values))
            self.data.extend(struct.pack("<I", len(values)))
            self.data.extend(values)
            return
        place = len(self.data)
        self.data.extend(bytes(4))
        self.align(_ALIGNMENT[kind[0]])
        begin = len(self.data)
        for value in values:
            self.put(kind, value)
        length = len(self.data) - begin
        self._check_length(length)
        struct.pack_into("<I", self.data, place, length)

    @staticmethod
    def _check_length(length: int) -> None:
        if length > MAX_ARRAY_BYTES:
            raise InvalidError(f"a list of {length} bytes is more than one call can carry")


def encode_text(text: str) -> bytes:
    """A text as D-Bus carries it: UTF-8 without NUL."""
    try:
        encoded = text.encode("utf-8")
    except UnicodeEncodeError as error:
        raise InvalidError("a text has characters that are not Unicode") from error
    if b"\0" in encoded:
        raise InvalidError("a text contains NUL")
    return encoded


class Reader:
    """Reads values from one message. Every length is checked before anything is made of it."""

    def __init__(self, data: bytes, at: int = 0) -> None:
        self.data = data
        self.at = at

    def align(self, alignment: int) -> None:
        self.at += -self.at % alignment

    def take(self, size: int) -> bytes:
        end = self.at + size
        if end > len(self.data):
            raise ProtocolError("a message ends too early")
        part = self.data[self.at : end]
        self.at = end
        return part

    def get(self, kind: str, depth: int = 0) -> Any:
        if depth > MAX_DEPTH:
            raise ProtocolError("a message nests too deep")
        first = kind[0]
        self.align(_ALIGNMENT[first])
        if first in _FIXED:
            return self._get_number(first)
        if first in "so":
            return self._get_text(self._get_number("u"))
        if first == "g":
            return self._get_text(self._get_number("y"))
        if first == "a":
            return self._get_array(kind[1:], depth)
        if first == "v":
            signature = split_signature(self.get("g"))
            if len(signature) != 1:
                raise ProtocolError("a variant has more than one type")
            return self.get(signature[0], depth + 1)
        return tuple(self.get(member, depth + 1) for member in split_signature(kind[1:-1]))

    def get_all(self, signature: str) -> list[Any]:
        return [self.get(kind) for kind in split_signature(signature)]

    def _get_number(self, kind: str) -> Any:
        size = struct.calcsize(_FIXED[kind])
        (value,) = struct.unpack(_FIXED[kind], self.take(size))
        return bool(value) if kind == "b" else value

    def _get_text(self, size: int) -> str:
        try:
            text = self.take(size).decode("utf-8")
        except UnicodeDecodeError as error:
            raise ProtocolError("a text is not UTF-8") from error
        if self.take(1) != b"\0":
            raise ProtocolError("a text has no end")
        return text

    def _get_array(self, kind: str, depth: int) -> Any:
        size = self._get_number("u")
        if size > MAX_ARRAY_BYTES:
            raise ProtocolError("an array is too long")
        if kind == "y":
            return self.take(size)
        if kind[0] == "{":
            _check_entry(kind)
        self.align(_ALIGNMENT[kind[0]])
        end = self.at + size
        if end > len(self.data):
            raise ProtocolError("a message ends too early")
        values = []
        while self.at < end:
            before = self.at
            values.append(self.get(kind, depth + 1))
            if self.at == before:
                raise ProtocolError("an array has elements without content")
        if self.at != end:
            raise ProtocolError("an array is longer than it says")
        return dict(values) if kind[0] == "{" else values
