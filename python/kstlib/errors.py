"""Statuses as exceptions."""

from __future__ import annotations

import os

from .words import Status, is_connection_status, status_text


class KSTError(Exception):
    """A call of the library failed.

    `function` is the library's function. `status` is the number that it failed with, or None where the
    function does not tell: the library's log does.
    """

    def __init__(self, function: str, status: int | None) -> None:
        super().__init__(function, status)
        self.function = function
        self.status = status

    def __str__(self) -> str:
        if self.status is None:
            return f"{self.function}: failed; the library's log says why"
        return f"{self.function}: {status_text(self.status)} (status {self.status})"


class BadParameterError(KSTError, ValueError):
    """An argument is too long, too short or of the wrong kind, or the reply could not be read (-3)."""


class OutOfMemoryError(KSTError, MemoryError):
    """Memory for a command or its reply could not be had (-4)."""


class UnexpectedError(KSTError):
    """There is no kernel service, or its reply has the wrong size (-5)."""


class NotContainedError(KSTError):
    """The context has no such credential (-7). The questions of Context answer False instead."""


class ConnectionFailedError(KSTError):
    """The connection to the kernel service could not be opened, or ended. `errno` is why.

    After a command was sent it is unknown whether it was carried out.
    """

    @property
    def errno(self) -> int:
        return -1000 - (self.status or 0)

    def __str__(self) -> str:
        return f"{super().__str__()[:-1]}: {os.strerror(self.errno)})"


class KernelError(KSTError):
    """The kernel service refused; `status` is its own."""


_KINDS: dict[int, type[KSTError]] = {
    Status.BAD_PARAMETER: BadParameterError,
    Status.OUT_OF_MEMORY: OutOfMemoryError,
    Status.UNEXPECTED: UnexpectedError,
    Status.NOT_CONTAINED: NotContainedError,
}


def error_for(function: str, status: int) -> KSTError:
    """The exception for a status that is not 0."""
    kind = ConnectionFailedError if is_connection_status(status) else KernelError
    return _KINDS.get(status, kind)(function, status)
