"""Messages and queries, and how they travel: the records of tallow.proto."""

from __future__ import annotations

import enum
from collections.abc import Callable, Iterable, Mapping, Sequence
from dataclasses import dataclass, field, fields
from typing import Any, Union

from . import wire
from .errors import InvalidError


class Key(enum.IntEnum):
    """The usual attributes of a message. Any other number of tallow.proto may be used as well."""

    SUBJECT = 13
    CONTENT_TYPE = 22
    KEYWORDS = 26
    MAIL_MESSAGE_ID = 100
    MAIL_DATE_RECEIVED = 101
    CONTENT_CREATION_DATE = 103
    HTML_CONTENT_DATA = 104
    ACCOUNT_IDENTIFIER = 106
    AUTHORS = 107
    AUTHOR_EMAIL_ADDRESSES = 108
    RECIPIENTS = 111
    RECIPIENT_EMAIL_ADDRESSES = 112
    ADDITIONAL_RECIPIENTS = 115
    HIDDEN_ADDITIONAL_RECIPIENTS = 119
    ATTACHMENT_TYPES = 131
    ATTACHMENT_NAMES = 132
    CONVERSATION_ID = 136
    MAILBOXES = 138
    READ = 142
    FLAGGED = 143
    REPLIED_TO = 144
    PRIORITY = 146
    MAILBOX_IDENTIFIERS = 165
    TEXT_CONTENT = 171
    CONTENT_SNIPPET = 172


@dataclass(frozen=True)
class Person:
    """A name and a mail address; either may be empty."""

    name: str = ""
    address: str = ""


#: The value of an attribute. A float is a date, in seconds since 1970-01-01 00:00:00 UTC.
Value = Union[str, bytes, bool, int, float, Sequence[str], Sequence[Person]]


def _attribute_field(key: Key) -> Any:
    return field(default=None, metadata={"key": key})


@dataclass
class Item:
    """A message to index, or one that a search found.

    The identifier is the client's name of the message: another item with it replaces this one in
    the index. Items can be deleted by group, such as the folder of a message. A found item has the
    attributes that lists show, and scores; the text of a message is not kept.
    """

    identifier: str
    group: str | None = None
    subject: str | None = _attribute_field(Key.SUBJECT)
    text: str | None = _attribute_field(Key.TEXT_CONTENT)
    html: bytes | None = _attribute_field(Key.HTML_CONTENT_DATA)
    authors: Sequence[Person] | None = _attribute_field(Key.AUTHORS)
    recipients: Sequence[Person] | None = _attribute_field(Key.RECIPIENTS)
    additional_recipients: Sequence[Person] | None = _attribute_field(Key.ADDITIONAL_RECIPIENTS)
    hidden_recipients: Sequence[Person] | None = _attribute_field(Key.HIDDEN_ADDITIONAL_RECIPIENTS)
    date_received: float | None = _attribute_field(Key.MAIL_DATE_RECEIVED)
    date_created: float | None = _attribute_field(Key.CONTENT_CREATION_DATE)
    message_id: str | None = _attribute_field(Key.MAIL_MESSAGE_ID)
    mailboxes: Sequence[str] | None = _attribute_field(Key.MAILBOXES)
    mailbox_identifiers: Sequence[str] | None = _attribute_field(Key.MAILBOX_IDENTIFIERS)
    attachment_names: Sequence[str] | None = _attribute_field(Key.ATTACHMENT_NAMES)
    attachment_types: Sequence[str] | None = _attribute_field(Key.ATTACHMENT_TYPES)
    content_type: str | None = _attribute_field(Key.CONTENT_TYPE)
    snippet: str | None = _attribute_field(Key.CONTENT_SNIPPET)
    #: Attributes without a field of their own, by number.
    others: Mapping[int, Value] = field(default_factory=dict)
    #: Set by searches: what the item was ranked by, and the part of it that its texts gave.
    score: float | None = None
    text_score: float | None = None


_FIELD_OF_KEY: dict[int, str] = {
    int(one.metadata["key"]): one.name for one in fields(Item) if "key" in one.metadata
}


def encode_item(item: Item) -> bytes:
    """The item in wire form."""
    parts = []
    for key, name in _FIELD_OF_KEY.items():
        value = getattr(item, name)
        if value is not None:
            parts.append(wire.field_bytes(1, _encode_attribute(key, value)))
    for key, value in item.others.items():
        parts.append(wire.field_bytes(1, _encode_attribute(key, value)))
    parts.append(wire.field_text(2, item.identifier))
    if item.group is not None:
        parts.append(wire.field_text(3, item.group))
    return b"".join(parts)


def _encode_attribute(key: int, value: Value) -> bytes:
    return wire.field_int(1, int(key)) + _encode_value(value)


def _encode_value(value: Value) -> bytes:
    if isinstance(value, str):
        return wire.field_text(3, value)
    if isinstance(value, (bytes, bytearray)):
        return wire.field_bytes(9, bytes(value))
    if isinstance(value, bool):
        return wire.field_int(7, value)
    if isinstance(value, int):
        return wire.field_int(4, value)
    if isinstance(value, float):
        return wire.field_double(6, value)
    if isinstance(value, Sequence):
        return b"".join(_encode_element(one) for one in value)
    raise InvalidError(f"an attribute cannot be of type {type(value).__name__}")


def _encode_element(value: object) -> bytes:
    if isinstance(value, str):
        return wire.field_text(10, value)
    if not isinstance(value, Person):
        raise InvalidError(f"a list of an attribute cannot hold {type(value).__name__}")
    name = wire.field_text(1, value.name) if value.name else b""
    address = wire.field_text(2, value.address) if value.address else b""
    return wire.field_bytes(11, name + address)


def decode_item(data: bytes) -> Item:
    """An item from its wire form. Of attributes with the same key the first one counts."""
    item = Item("")
    others: dict[int, Value] = {}
    for number, kind, _, part in wire.numbers_and_parts(data):
        if kind != wire.LENGTH:
            continue
        if number == 1:
            _take_attribute(item, others, part)
        elif number == 2:
            item.identifier = wire.text_of(part)
        elif number == 3:
            item.group = wire.text_of(part)
        elif number == 5:
            _take_card(item, part)
    item.others = others
    return item


def _take_attribute(item: Item, others: dict[int, Value], data: bytes) -> None:
    key = 0
    value: Value | None = None
    texts: list[str] = []
    persons: list[Person] = []
    for number, kind, bits, part in wire.numbers_and_parts(data):
        if number == 1 and kind == wire.VARINT:
            key = bits
        elif number == 10 and kind == wire.LENGTH:
            texts.append(wire.text_of(part))
        elif number in (8, 11) and kind == wire.LENGTH:
            persons.append(_decode_person(part))
        elif (number, kind) in _DECODERS:
            value = _DECODERS[number, kind](bits, part)
    if value is None:
        value = persons or texts
    name = _FIELD_OF_KEY.get(key)
    if name is None:
        others.setdefault(key, value)
    elif getattr(item, name) is None:
        setattr(item, name, value)


_DECODERS: dict[tuple[int, int], Callable[[int, bytes], Value]] = {
    (3, wire.LENGTH): lambda bits, part: wire.text_of(part),
    (4, wire.VARINT): lambda bits, part: wire.signed(bits),
    (5, wire.FIXED32): lambda bits, part: wire.float_of(bits),
    (6, wire.FIXED64): lambda bits, part: wire.double_of(bits),
    (7, wire.VARINT): lambda bits, part: bool(bits),
    (9, wire.LENGTH): lambda bits, part: part,
}


def _decode_person(data: bytes) -> Person:
    texts = {1: "", 2: ""}
    for number, kind, _, part in wire.numbers_and_parts(data):
        if number in texts and kind == wire.LENGTH:
            texts[number] = wire.text_of(part)
    return Person(texts[1], texts[2])


def _take_card(item: Item, data: bytes) -> None:
    for number, kind, bits, _ in wire.numbers_and_parts(data):
        if number == 1 and kind == wire.FIXED32:
            item.text_score = wire.float_of(bits)
        elif number == 2 and kind == wire.FIXED32:
            item.score = wire.float_of(bits)


@dataclass(frozen=True)
class Condition:
    """What must hold for a message, besides the words of a search; see `contains` and `lacks`."""

    keys: tuple[int, ...]
    texts: tuple[str, ...]
    absent: bool = False


def contains(keys: int | Sequence[int], *texts: str) -> Condition:
    """Messages that have one of the texts in one of the attributes.

    The words of a text match one after another, and the last may be a prefix. Mailboxes, accounts
    and content types are compared as they stand, as prefixes. Only attributes that hold texts or
    persons are looked up, not dates or flags.
    """
    return _condition(keys, texts, False)


def lacks(keys: int | Sequence[int], *texts: str) -> Condition:
    """Messages that have none of the texts in any of the attributes."""
    return _condition(keys, texts, True)


def _condition(keys: int | Sequence[int], texts: tuple[str, ...], absent: bool) -> Condition:
    condition = Condition((keys,) if isinstance(keys, int) else tuple(keys), texts, absent)
    if not condition.keys or not condition.texts:
        raise InvalidError("a condition needs an attribute and a text")
    return condition


_STRING_EQUAL, _STRING_NOT_EQUAL = 1, 5
_LEAF, _AND, _OR = 0, 1, 2


def _encode_leaf(condition: Condition, text: str) -> bytes:
    keys = b"".join(wire.field_int(1, int(key)) for key in condition.keys)
    operator = _STRING_NOT_EQUAL if condition.absent else _STRING_EQUAL
    return wire.field_bytes(
        9, keys + wire.field_text(2, text) + wire.field_int(7, operator) + wire.field_int(8, _LEAF)
    )


def _encode_condition(condition: Condition) -> bytes:
    leaves = b"".join(_encode_leaf(condition, text) for text in condition.texts)
    return wire.field_bytes(9, wire.field_int(8, _AND if condition.absent else _OR) + leaves)


def encode_query(words: str, conditions: Iterable[Condition]) -> bytes:
    """The query in wire form: words to rank by, and conditions that all must hold."""
    children = b"".join(_encode_condition(condition) for condition in conditions)
    root = wire.field_bytes(1, wire.field_int(8, _AND) + children) if children else b""
    return root + wire.field_text(4, words) + wire.field_text(5, words)
