"""What can go wrong, as exceptions."""

from __future__ import annotations


class Error(Exception):
    """The base of all errors of this package."""


class UnreachableError(Error):
    """No daemon answers on the socket, or the connection was lost before the reply.

    The next call connects again.
    """


class TimedOutError(Error):
    """The reply did not come in time. The daemon may still carry out the call."""


class RefusedError(Error):
    """The daemon refused the call or failed; interfaces/errors.md lists domains and codes."""

    def __init__(self, message: str, domain: str, code: int) -> None:
        super().__init__(message)
        self.domain = domain
        self.code = code


class ProtocolError(Error):
    """What came over the socket is not what the protocol has."""


class InvalidError(Error, ValueError):
    """An argument cannot be sent; nothing was."""
