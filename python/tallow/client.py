"""The client: everything that a program needs to talk to the daemon."""

from __future__ import annotations

import os
from collections.abc import Iterable, Iterator, Sequence
from dataclasses import dataclass
from types import TracebackType

from .connection import Connection
from .errors import InvalidError
from .marshal import MAX_ARRAY_BYTES, encode_text
from .records import Condition, Item, decode_item, encode_item, encode_query

SEARCH_SERVICE = "com.quill.tallowsearch.SearchService"
EXPLANATION = "com.quill.tallowsearch.SearchExplanation"
DEBUG_SERVICE = "com.quill.tallow.DebugService"

#: Seconds that a search or a question waits for its reply.
SHORT_TIMEOUT = 120.0
#: Changes of the index wait for those before them.
LONG_TIMEOUT = 6 * 3600.0

_MAX_ELEMENTS = 262144
_ELEMENT_OVERHEAD = 8  # at most: its length, the NUL of a text, and padding


@dataclass(frozen=True)
class ReplacedWord:
    """A word that a search replaced because it found too little as typed."""

    typed: str
    replacement: str  #: for a stem, the beginning of words
    reason: str  #: "spelling", "synonym" or "stem"


def default_runtime_directory() -> str:
    """Where the sockets of the user's daemon are."""
    given = os.environ.get("RUNTIME_DIRECTORY", "")
    own = os.environ.get("XDG_RUNTIME_DIR", "")
    user_directory = os.path.join(own, "tallow") if own.startswith("/") else ""
    if given:
        return given
    if os.geteuid() == 0:
        return user_directory if user_directory and os.path.exists(user_directory) else "/run/tallow"
    return user_directory or "/run/tallow"


class Client:
    """A connection to the daemon, for one thread at a time.

    The first call connects, and so does the first call after the connection was lost. Every
    operation waits for its reply, and raises a subclass of `tallow.Error` when it fails.

    `name` identifies the client in the daemon's log, and owns its stored state.
    `protection_class` selects the index. `patience` is how many seconds a call waits for a daemon
    that is not running yet, and `timeout` for how many a search waits for its reply.
    """

    def __init__(
        self,
        name: str,
        *,
        protection_class: str = "default",
        runtime_directory: str | None = None,
        patience: float = 0.0,
        timeout: float = SHORT_TIMEOUT,
        change_timeout: float = LONG_TIMEOUT,
    ) -> None:
        self.name = name
        self.protection_class = protection_class
        self.timeout = timeout
        self.change_timeout = change_timeout
        directory = default_runtime_directory() if runtime_directory is None else runtime_directory
        self._search = Connection(directory, SEARCH_SERVICE, patience)
        self._debug = Connection(directory, DEBUG_SERVICE, patience)

    def __enter__(self) -> Client:
        return self

    def __exit__(
        self,
        kind: type[BaseException] | None,
        error: BaseException | None,
        traceback: TracebackType | None,
    ) -> None:
        self.close()

    def close(self) -> None:
        """Ends the connections; the next call connects again."""
        self._search.close()
        self._debug.close()

    def index(self, items: Iterable[Item]) -> None:
        """Indexes items; those with a known identifier replace what is in the index.

        Many items are sent in several calls, in order. The first failure ends the operation, and
        earlier calls keep their effect.
        """
        for batch in _batches(encode_item(item) for item in items):
            self._change("IndexItems", "aayss", batch, self.name, self.protection_class)

    def delete(self, identifiers: Iterable[str]) -> None:
        """Deletes by identifier.

        Raises `RefusedError` for one that is not in the index, after those before it in the list
        have been deleted.
        """
        for batch in _text_batches(identifiers):
            self._delete("DeleteItemsWithIdentifiers", batch)

    def delete_groups(self, groups: Iterable[str]) -> None:
        """Deletes all items of the groups."""
        for batch in _text_batches(groups):
            self._delete("DeleteItemsWithDomainIdentifiers", batch)

    def delete_all(self) -> None:
        """Deletes everything of the protection class, also what other clients indexed."""
        self._change("DeleteAllItems", "ss", self.name, self.protection_class)

    def update(self, items: Sequence[Item], deleted: Sequence[str], state: bytes) -> None:
        """Deletes, then indexes, and then stores the state.

        After a failure, `state` tells how far it came. Only the last call carries the state.
        """
        batches = list(_batches(encode_item(item) for item in items)) or [[]]
        texts = _text_batches(deleted)
        last_texts = texts.pop() if texts and len(batches) == 1 else []
        for text_batch in texts:
            self._delete("DeleteItemsWithIdentifiers", text_batch)
        for batch in batches[:-1]:
            self._change("IndexItems", "aayss", batch, self.name, self.protection_class)
        self._change(
            "IndexItemsDeleteItemsWithIdentifiers",
            "aayasbayss",
            batches[-1], last_texts, True, state, self.name, self.protection_class,
        )  # fmt: skip

    def state(self) -> bytes | None:
        """The state last stored under the client's name; None if there is none."""
        present, state = self._search.call(
            "FetchLastClientState", "ss", (self.name, self.protection_class), "bay", self.timeout
        )
        return bytes(state) if present else None

    def search(
        self, words: str = "", *, limit: int | None = 20, conditions: Iterable[Condition] = ()
    ) -> list[Item]:
        """The best messages that contain all words, best first; None as limit for all.

        All conditions must hold as well. The last word is a prefix unless a space follows it. Case and accents do not matter.
        """
        if limit is not None and limit < 0:
            raise InvalidError("a limit cannot be negative")
        maximum = -1 if limit is None else limit
        query = encode_query(words, conditions)
        (items,) = self._search.call(
            "SearchItemsForQuery", "aytsx", (query, 0, self.protection_class, maximum), "aay",
            self.timeout,
        )  # fmt: skip
        return [decode_item(item) for item in items]

    def replaced_words(self) -> list[ReplacedWord]:
        """The words that the last search of this client replaced."""
        (words,) = self._search.call(
            "FetchReplacedWords", "", (), "a(sss)", self.timeout, interface=EXPLANATION
        )
        return [ReplacedWord(*word) for word in words]

    def ping(self, text: str = "") -> str:
        """A text about the daemon that contains `text`."""
        (answer,) = self._debug.call("Ping", "s", (text,), "s", self.timeout)
        return str(answer)

    def statistics(self) -> dict[str, int | float]:
        """Counts and times of document store and text index, by name."""
        arguments = (self.name, self.protection_class)
        (numbers,) = self._debug.call("FetchStatsForIndexer", "ss", arguments, "a{sv}", self.timeout)
        return dict(numbers)

    def _change(self, member: str, signature: str, *arguments: object) -> None:
        self._search.call(member, signature, arguments, "", self.change_timeout)

    def _delete(self, member: str, texts: list[str]) -> None:
        self._change(member, "asss", texts, self.name, self.protection_class)


def _text_batches(texts: Iterable[str]) -> list[list[str]]:
    batches = _batches(encode_text(text) for text in texts)
    return [[text.decode() for text in batch] for batch in batches]


def _batches(parts: Iterable[bytes]) -> Iterator[list[bytes]]:
    """Lists that one call can carry, in order."""
    batch: list[bytes] = []
    size = 0
    for part in parts:
        length = len(part) + _ELEMENT_OVERHEAD
        if length > MAX_ARRAY_BYTES:
            raise InvalidError(f"an item takes {length} bytes, more than one call can carry")
        if size + length > MAX_ARRAY_BYTES or len(batch) == _MAX_ELEMENTS:
            yield batch
            batch, size = [], 0
        batch.append(part)
        size += length
    if batch:
        yield batch
