"""Credentials in this process's memory."""

from __future__ import annotations

import os
import sys
from ctypes import byref, c_void_p
from typing import Any, Callable, Mapping, TypeVar, Union

from . import _library
from .passphrases import Passphrase
from .words import CredentialProperty, CredentialType

T = TypeVar("T")

#: What a property is set to. A number takes 4 bytes; None clears a passphrase.
Value = Union[bytes, bytearray, Passphrase, int, None]


def as_word(number: int) -> bytes:
    """A number of 4 bytes as C has it; a negative one is signed."""
    return number.to_bytes(4, sys.byteorder, signed=number < 0)


class Credential:
    """The proof of one authentication event: made empty, filled property by property, wiped and freed by close(),
    at the end of a with-block, or when it is dropped.

    KSTLib/Credential.h says which type has which properties, and how long they are.
    """

    def __init__(self, type: int, properties: Mapping[int, Value] | None = None) -> None:
        self._pointer = c_void_p()
        _library.call("KSTCredentialCreate", type, byref(self._pointer))
        for number, value in (properties or {}).items():
            self.set(number, value)

    @classmethod
    def from_passphrase(cls, passphrase: Passphrase, purpose: int, user: int | None = None) -> Credential:
        """A passphrase that this process's user, or `user`, has entered for a purpose."""
        return cls(
            CredentialType.PASSPHRASE_ENTERED,
            {
                CredentialProperty.USER_ID: os.getuid() if user is None else user,
                CredentialProperty.PURPOSE: purpose,
                CredentialProperty.PASSPHRASE: passphrase,
            },
        )

    @property
    def type(self) -> int:
        """Its type, a CredentialType."""
        with _library.locked():
            return int(_library.call("KSTCredentialGetType", self.open_pointer()))

    def set(self, number: int, value: Value) -> None:
        """Sets a property. The bytes are copied into the credential and nowhere else; a length that is not the
        property's is a BadParameterError, and changes nothing."""
        if isinstance(value, Passphrase):
            data, length = value._data()
        else:
            data, length = _library.as_data(as_word(value) if isinstance(value, int) else value)
        with _library.locked():
            _library.call("KSTCredentialSetProperty", self.open_pointer(), number, data if length else None, length)

    def get(self, number: int, process: Callable[[memoryview], T]) -> T:
        """What `process` makes of a property's bytes, which are wiped after it; `bytes` keeps a copy."""
        with _library.locked():
            data = _library.copy_of_bytes("KSTCredentialGetProperty", self.open_pointer(), number)
        return _library.process_and_wipe(data, process)

    def number(self, number: int) -> int:
        """A property as an unsigned number."""
        return self.get(number, lambda data: int.from_bytes(data, sys.byteorder))

    def close(self) -> None:
        """Wipes and frees it. Closing it again does nothing."""
        with _library.locked():
            if self._pointer:
                _library.call("KSTCredentialDelete", self._pointer)
                self._pointer = c_void_p()

    def open_pointer(self) -> c_void_p:
        """The library's object. To be asked for, and used, under the lock."""
        if not self._pointer:
            raise ValueError("the credential is closed")
        return self._pointer

    def __enter__(self) -> Credential:
        return self

    def __exit__(self, *_: object) -> None:
        self.close()

    def __del__(self) -> None:
        pointer: Any = getattr(self, "_pointer", None)
        if pointer:
            _library.drop("KSTCredentialDelete", pointer)
