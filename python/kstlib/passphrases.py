"""Passphrases that leave no copy behind: in memory of their own, which is wiped."""

from __future__ import annotations

import os
import select
import termios
from contextlib import contextmanager
from ctypes import c_char
from typing import Any, Iterator, NoReturn

from ._library import wipe
from .words import PASSPHRASE_MAX_LENGTH

_NEWLINE = 0x0A


class Passphrase:
    """A passphrase of at most 128 bytes, which is wiped at the end of a with-block.

    It takes its bytes from a bytearray, which is empty afterwards. A str or bytes object cannot be wiped, so
    neither is taken, and none is made.
    """

    __slots__ = ("_bytes", "_length", "__weakref__")

    def __init__(self, source: bytearray | None = None) -> None:
        # One more, for the end of the line. It never grows: that could leave a copy in its former place.
        self._bytes = bytearray(PASSPHRASE_MAX_LENGTH + 1)
        self._length = 0
        if source is None:
            return
        if not isinstance(source, bytearray):
            raise TypeError("a passphrase comes from a bytearray, which can be wiped")
        length = len(source)
        if length > PASSPHRASE_MAX_LENGTH:
            raise ValueError(f"a passphrase has at most {PASSPHRASE_MAX_LENGTH} bytes")
        self._bytes[:length] = source
        self._length = length
        wipe(source)
        source.clear()

    def __len__(self) -> int:
        return self._length

    def wipe(self) -> None:
        """Overwrites the passphrase; it is empty then."""
        wipe(self._bytes)
        self._length = 0

    def __enter__(self) -> Passphrase:
        return self

    def __exit__(self, *_: object) -> None:
        self.wipe()

    def __del__(self) -> None:
        if hasattr(self, "_bytes"):
            self.wipe()

    def __repr__(self) -> str:
        return "<Passphrase>"

    def __reduce__(self) -> NoReturn:
        raise TypeError("a passphrase is not copied")

    def _data(self) -> tuple[Any, int]:
        """Where it is, and its length."""
        return (c_char * len(self._bytes)).from_buffer(self._bytes), self._length

    def _read_line(self, source: int) -> bool:
        """Reads up to the end of a line; whether there was one, or at least something before the end."""
        room = memoryview(self._bytes)
        while _await(source) and os.readv(source, [room[self._length : self._length + 1]]):
            if self._bytes[self._length] == _NEWLINE:
                self._bytes[self._length] = 0
                return True
            if self._length == PASSPHRASE_MAX_LENGTH:
                while os.readv(source, [room[:1]]) and self._bytes[0] != _NEWLINE:
                    pass
                raise ValueError(f"a passphrase has at most {PASSPHRASE_MAX_LENGTH} bytes")
            self._length += 1
        return self._length > 0


def _await(source: int) -> bool:
    """Waits until there is something to read. Python sees an interrupt that comes right before a system call only
    after it, so none of them waits for ever."""
    poll = select.poll()
    poll.register(source, select.POLLIN)
    while not poll.poll(500):
        pass
    return True


@contextmanager
def _terminal() -> Iterator[tuple[int, int]]:
    """What to read from and what to ask on: the terminal of the process, or standard input and standard error."""
    try:
        terminal = os.open("/dev/tty", os.O_RDWR | os.O_NOCTTY | os.O_CLOEXEC)
    except OSError:
        yield 0, 2
        return
    try:
        yield terminal, terminal
    finally:
        os.close(terminal)


@contextmanager
def _without_echo(terminal: int) -> Iterator[None]:
    """While it lasts a terminal shows nothing of what is typed; of anything else there is no echo."""
    if not os.isatty(terminal):
        yield
        return
    before = termios.tcgetattr(terminal)
    silent = [*before[:3], before[3] & ~termios.ECHO, *before[4:]]
    termios.tcsetattr(terminal, termios.TCSAFLUSH, silent)
    try:
        yield
    finally:
        termios.tcsetattr(terminal, termios.TCSAFLUSH, before)


def read_passphrase(prompt: str = "Passphrase: ") -> Passphrase:
    """Asks for a passphrase on the terminal, without echo, and reads it straight into memory that is wiped.

    `getpass.getpass` returns a str, which cannot be wiped, after copies in the buffers of its stream. Without a
    terminal the prompt goes to standard error, and a line of standard input is the passphrase. Raises EOFError
    when there is none, and ValueError when it is too long.
    """
    passphrase = Passphrase()
    try:
        with _terminal() as (source, screen), _without_echo(source):
            os.write(screen, prompt.encode())
            is_there = passphrase._read_line(source)
            os.write(screen, b"\n")
        if not is_there:
            raise EOFError("no passphrase")
        return passphrase
    except BaseException:
        passphrase.wipe()
        raise
