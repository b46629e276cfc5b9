"""The shared library through ctypes: its functions, its blocks, and the one lock around every call into it."""

from __future__ import annotations

import os
import sys
import threading
from collections import deque
from contextlib import contextmanager
from ctypes import (
    CDLL,
    CFUNCTYPE,
    POINTER,
    Structure,
    c_bool,
    c_char,
    c_char_p,
    c_int32,
    c_int64,
    c_size_t,
    c_uint32,
    c_void_p,
    cast,
)
from typing import Any, Callable, Iterator, TypeVar

from .errors import KSTError, error_for

T = TypeVar("T")


def _block(*handed: Any) -> Any:
    """A block of the library: a function and what it captured, which Python keeps in the function itself."""
    invoke = CFUNCTYPE(None, c_void_p, *handed)
    fields = [("invoke", invoke), ("captured", c_void_p)]
    return type("Block", (Structure,), {"_fields_": fields, "invoke_type": invoke})


DataBlock = _block(c_void_p, c_size_t)
RequirementBlock = _block(c_void_p)
StatusDataBlock = _block(c_int32, c_void_p, c_size_t)
PolicyStatusBlock = _block(c_int32, c_bool, c_void_p)


class CParameter(Structure):
    """KSTParameter."""

    _fields_ = [
        ("type", c_uint32),
        ("parameterData", c_void_p),
        ("parameterDataLength", c_uint32),
    ]


_QUESTION = (c_bool, POINTER(CParameter), c_uint32)

# Result and arguments. A result of c_int32 is a status.
_PROTOTYPES: dict[str, tuple[Any, ...]] = {
    "KSTContextAddCredentialWithScope": (c_int32, c_void_p, c_void_p, c_uint32),
    "KSTContextContainsCredentialTypeEx": (c_int32, c_void_p, c_uint32, c_uint32),
    "KSTContextContainsPassphraseCredentialWithPurpose": (c_int32, c_void_p, c_uint32, c_uint32),
    "KSTContextCreate": (c_int32, POINTER(c_void_p)),
    "KSTContextCreateWithExternalForm": (c_void_p, c_void_p, c_size_t),
    "KSTContextDelete": (c_int32, c_void_p, c_bool),
    "KSTContextGetExternalForm": (None, c_void_p, DataBlock),
    "KSTContextRemoveCredentialsByTypeAndScope": (c_int32, c_void_p, c_uint32, c_uint32),
    "KSTContextRemoveCredentialsByValueAndScope": (c_int32, c_void_p, c_void_p, c_uint32),
    "KSTContextRemovePassphraseCredentialsByPurposeAndScope": (c_int32, c_void_p, c_uint32, c_uint32),
    "KSTContextReplacePassphraseCredentialsWithScope": (c_int32, c_void_p, c_void_p, c_uint32),
    "KSTContextVerifyAclConstraint": (
        None,
        c_void_p,
        c_void_p,
        c_size_t,
        *_QUESTION,
        c_uint32,
        PolicyStatusBlock,
    ),
    "KSTContextVerifyPolicyEx": (None, c_void_p, c_char_p, *_QUESTION, c_uint32, PolicyStatusBlock),
    "KSTCredentialCreate": (c_int32, c_uint32, POINTER(c_void_p)),
    "KSTCredentialDelete": (None, c_void_p),
    "KSTCredentialGetProperty": (c_int32, c_void_p, c_uint32, DataBlock),
    "KSTCredentialGetType": (c_uint32, c_void_p),
    "KSTCredentialSetProperty": (c_int32, c_void_p, c_uint32, c_void_p, c_size_t),
    "KSTGetEnvironmentVariable": (c_int32, c_uint32, DataBlock),
    "KSTGlobalContextAddCredential": (c_int32, c_void_p),
    "KSTGlobalContextRemoveCredentialsByType": (c_int32, c_uint32),
    "KSTGlobalContextVerifyPolicy": (None, c_char_p, *_QUESTION, PolicyStatusBlock),
    "KSTKernelControl": (c_int32, c_uint32, c_void_p, c_size_t, DataBlock),
    "KSTParseAclAndCopyConstraintCharacteristics": (c_int32, c_void_p, c_size_t, StatusDataBlock),
    "KSTRequirementGetPriority": (c_uint32, c_void_p),
    "KSTRequirementGetProperty": (c_int32, c_void_p, c_uint32, DataBlock),
    "KSTRequirementGetState": (c_uint32, c_void_p),
    "KSTRequirementGetSubrequirements": (None, c_void_p, RequirementBlock),
    "KSTRequirementGetType": (c_uint32, c_void_p),
    "KSTSetEnvironmentVariable": (c_int32, c_uint32, c_void_p, c_size_t),
}

#: Functions that do less than one that is called here, and by which.
SHORT_FORMS = {
    "KSTContextAddCredential": "KSTContextAddCredentialWithScope",
    "KSTContextContainsCredentialType": "KSTContextContainsCredentialTypeEx",
    "KSTContextRemoveCredentialsByType": "KSTContextRemoveCredentialsByTypeAndScope",
    "KSTContextRemoveCredentialsByValue": "KSTContextRemoveCredentialsByValueAndScope",
    "KSTContextVerifyPolicy": "KSTContextVerifyPolicyEx",
    "KSTContextVerifyPolicyWithPreflight": "KSTContextVerifyPolicyEx",
    "KSTCredentialGetPropertyData": "KSTCredentialGetProperty",
    "KSTRequirementGetProperties": "KSTRequirementGetProperty",
    "KSTRequirementGetPropertyData": "KSTRequirementGetProperty",
}

#: What is for who carries commands and payloads himself, which is done in C; and a variable for a C program.
NOT_FOR_PYTHON = (
    "LibCall_",
    "Serialize",
    "Deserialize",
    "GetSerialized",
    "Dealloc",
    "Compare",
    "CopyCredential",
    "ValidateParameter",
    "gLastAllocatedBytes",
)

_library = CDLL("libKSTLib.so.1")
_allocated_bytes = c_int64.in_dll(_library, "gAllocatedBytes")
for _name, (_result, *_arguments) in _PROTOTYPES.items():
    _function = getattr(_library, _name)
    _function.restype, _function.argtypes = _result, _arguments

# The library locks nothing. A block may call it, hence a lock that its thread may take again.
_lock = threading.RLock()
# What was dropped without being closed. The garbage collector runs at any moment, when waiting for the lock
# could be for ever.
_dropped: deque[tuple[str, tuple[Any, ...]]] = deque()


def _begin_anew_in_child() -> None:
    # The thread that held the lock may not be there.
    global _lock
    _lock = threading.RLock()


os.register_at_fork(after_in_child=_begin_anew_in_child)


def _release_dropped() -> None:
    while _dropped:
        try:
            name, arguments = _dropped.popleft()
        except IndexError:
            return
        getattr(_library, name)(*arguments)


@contextmanager
def locked() -> Iterator[None]:
    """While it lasts no other thread calls the library."""
    with _lock:
        _release_dropped()
        yield


def drop(name: str, *arguments: Any) -> None:
    """Calls a function that releases something, as soon as no other thread is in a call."""
    _dropped.append((name, arguments))
    lock = _lock
    if lock.acquire(blocking=False):
        try:
            _release_dropped()
        finally:
            lock.release()


def call(name: str, *arguments: Any) -> Any:
    """Calls a function; raises the exception for a status that is not 0."""
    function = getattr(_library, name)
    for argument, kind in zip(arguments, function.argtypes):
        # ctypes would cut off what does not fit.
        if kind is c_uint32 and not 0 <= argument <= 0xFFFFFFFF:
            raise OverflowError(f"{name}: {argument} is not an unsigned number of 32 bits")
    with locked():
        result = function(*arguments)
    if function.restype is c_int32 and result != 0:
        raise error_for(name, result)
    return result


def collect(name: str, *arguments: Any, block: Any, take: Callable[..., T]) -> list[T]:
    """Calls a function whose last argument is a block, and returns what `take` makes of what that is handed.

    An exception of `take` ends the taking, and is raised when the library's call has ended. So is an interrupt
    that comes meanwhile. It counts before the status.
    """
    taken: list[T] = []
    raised: list[BaseException] = []

    def invoke(_captured: int | None, *handed: Any) -> None:
        try:
            if not raised:
                taken.append(take(*handed))
        except BaseException as error:
            raised.append(error)

    try:
        with locked(), _caught_at_entry(invoke, raised):
            try:
                call(name, *arguments, block(block.invoke_type(invoke), None))
            finally:
                if raised:
                    raise raised[0]
    finally:
        raised.clear()
    return taken


@contextmanager
def _caught_at_entry(function: Callable[..., None], raised: list[BaseException]) -> Iterator[None]:
    """While it lasts an interrupt is not lost that comes when a callback is entered, before it can catch it."""
    before = sys.unraisablehook

    def hook(unraisable: Any) -> None:
        if unraisable.object is function:
            raised.append(unraisable.exc_value)
        else:
            before(unraisable)

    sys.unraisablehook = hook
    try:
        yield
    finally:
        sys.unraisablehook = before


def call_with_block(name: str, *arguments: Any, block: Any, take: Callable[..., T]) -> T:
    """As collect, for a function that calls its block once when it succeeds, and may tell nothing otherwise."""
    taken = collect(name, *arguments, block=block, take=take)
    if not taken:
        raise KSTError(name, None)
    return taken[0]


def copy_of_bytes(name: str, *arguments: Any) -> bytearray:
    """Calls a function that hands over bytes, and returns a copy of them."""
    copy = bytearray()

    def keep(data: int | None, length: int) -> None:
        if data:
            copy.extend((c_char * length).from_address(data))

    try:
        call_with_block(name, *arguments, block=DataBlock, take=keep)
    except BaseException:
        wipe(copy)
        raise
    return copy


def process_and_wipe(data: bytearray, process: Callable[[memoryview], T]) -> T:
    """What `process` makes of bytes, which are wiped after it."""
    try:
        return process(memoryview(data).toreadonly())
    finally:
        wipe(data)


def wipe(data: bytearray) -> None:
    """Overwrites bytes with zeros where they are."""
    data[:] = bytes(len(data))


def as_data(data: bytes | bytearray | None) -> tuple[Any, int]:
    """The address of bytes, which are not copied, and their length."""
    if not data:
        return None, 0
    if isinstance(data, bytearray):
        return (c_char * len(data)).from_buffer(data), len(data)
    return c_char_p(data), len(data)


def c_parameter(type: int, value: bytes | None) -> CParameter:
    """A parameter that points to its value, which must outlive it."""
    if not 0 <= type <= 0xFFFFFFFF:
        raise OverflowError(f"{type} is not an unsigned number of 32 bits")
    return CParameter(type, cast(c_char_p(value), c_void_p) if value else None, len(value or b""))


def as_text(text: str) -> bytes:
    """A text as C has it."""
    encoded = text.encode()
    if b"\0" in encoded:
        raise ValueError("a text with a zero byte in it")
    return encoded


def allocated_bytes() -> int:
    """The bytes that the library holds at the moment: what was not closed yet, and 1 for each context that
    was made by Context() and is closed."""
    with locked():
        return _allocated_bytes.value
