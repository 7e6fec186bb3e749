"""The wire format of Protocol Buffers, as far as the records of tallow.proto need it."""

from __future__ import annotations

import struct
from collections.abc import Iterator

from .errors import InvalidError, ProtocolError

VARINT, FIXED64, LENGTH, FIXED32 = 0, 1, 2, 5
MAX_RECORD_BYTES = 64 << 20
_MAX_VARINT_BYTES = 10
_MASK = (1 << 64) - 1


def varint(number: int) -> bytes:
    """A whole number of 64 bits; negative ones take ten bytes."""
    if not -(1 << 63) <= number < 1 << 64:
        raise InvalidError(f"{number} has more than 64 bits")
    number &= _MASK
    out = bytearray()
    while number > 0x7F:
        out.append(number & 0x7F | 0x80)
        number >>= 7
    out.append(number)
    return bytes(out)


def field_int(number: int, value: int) -> bytes:
    return varint(number << 3 | VARINT) + varint(value)


def field_double(number: int, value: float) -> bytes:
    return varint(number << 3 | FIXED64) + struct.pack("<d", value)


def field_bytes(number: int, value: bytes) -> bytes:
    return varint(number << 3 | LENGTH) + varint(len(value)) + value


def field_text(number: int, text: str) -> bytes:
    try:
        return field_bytes(number, text.encode("utf-8"))
    except UnicodeEncodeError as error:
        raise InvalidError("a text has characters that are not Unicode") from error


def signed(number: int) -> int:
    """The signed meaning of a number that was read."""
    return number - (1 << 64) if number >> 63 else number


def float_of(bits: int) -> float:
    return float(struct.unpack("<f", struct.pack("<I", bits))[0])


def double_of(bits: int) -> float:
    return float(struct.unpack("<d", struct.pack("<Q", bits))[0])


def text_of(value: bytes) -> str:
    """The text in a field; bytes that are not UTF-8 become U+FFFD."""
    return value.decode("utf-8", "replace")


def _read_varint(data: bytes, at: int) -> tuple[int, int]:
    number = 0
    for i in range(_MAX_VARINT_BYTES):
        if at >= len(data):
            raise ProtocolError("a record ends too early")
        byte = data[at]
        at += 1
        number |= (byte & 0x7F) << (7 * i)
        if byte < 0x80:
            return number & _MASK, at
    raise ProtocolError("a number in a record is too long")


def numbers_and_parts(data: bytes) -> Iterator[tuple[int, int, int, bytes]]:
    """The fields of a record in order: number, wire type, and its number or its bytes."""
    at = 0
    while at < len(data):
        tag, at = _read_varint(data, at)
        number, kind = tag >> 3, tag & 7
        if number == 0:
            raise ProtocolError("a record has a field without number")
        if kind == VARINT:
            value, at = _read_varint(data, at)
            yield number, kind, value, b""
            continue
        if kind == LENGTH:
            size, at = _read_varint(data, at)
        elif kind in (FIXED32, FIXED64):
            size = 4 if kind == FIXED32 else 8
        else:
            raise ProtocolError("a record has a field of unknown type")
        if size > len(data) - at:
            raise ProtocolError("a record ends too early")
        part = data[at : at + size]
        at += size
        yield number, kind, 0 if kind == LENGTH else int.from_bytes(part, "little"), part
