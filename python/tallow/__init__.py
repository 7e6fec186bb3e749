"""Indexing and searching mail through tallowsearchd, with the standard library alone."""

from .client import Client, ReplacedWord, default_runtime_directory
from .errors import (
    Error,
    InvalidError,
    ProtocolError,
    RefusedError,
    TimedOutError,
    UnreachableError,
)
from .records import Condition, Item, Key, Person, Value, contains, lacks

__all__ = [
    "Client",
    "Condition",
    "Error",
    "InvalidError",
    "Item",
    "Key",
    "Person",
    "ProtocolError",
    "RefusedError",
    "ReplacedWord",
    "TimedOutError",
    "UnreachableError",
    "Value",
    "contains",
    "default_runtime_directory",
    "lacks",
]
