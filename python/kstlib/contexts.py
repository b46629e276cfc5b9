"""Contexts, where credentials are put and policies are verified; and the kernel service's variables and control."""

from __future__ import annotations

import os
import warnings
from ctypes import byref, c_void_p, string_at
from dataclasses import dataclass
from typing import Any, Callable, Sequence, TypeVar

from . import _library
from .credentials import Credential, as_word
from .errors import KSTError, NotContainedError, error_for
from .passphrases import Passphrase
from .requirements import Answer, copied_tree
from .words import Scope

T = TypeVar("T")


@dataclass(frozen=True)
class Parameter:
    """A parameter of a question: a ParameterType and its value, of which a number takes 4 bytes."""

    type: int
    value: bytes | int | None = None


class _Place:
    """Where credentials are: a context, or the global one."""

    _scope: Scope

    def _reference(self) -> c_void_p | None:
        """The library's object. To be asked for, and used, under the lock."""
        raise NotImplementedError

    def remove(self, credential: Credential) -> None:
        """Takes out the credentials that equal this one."""
        self._change("KSTContextRemoveCredentialsByValueAndScope", credential)

    def remove_passphrases(self, purpose: int) -> None:
        """Takes out the passphrases of a purpose."""
        self._change("KSTContextRemovePassphraseCredentialsByPurposeAndScope", purpose)

    def replace_passphrases(self, credential: Credential) -> None:
        """Puts a passphrase in the place of those of its purpose."""
        self._change("KSTContextReplacePassphraseCredentialsWithScope", credential)

    def add(self, credential: Credential) -> None:
        """Adds a credential, which is copied."""
        self._change("KSTContextAddCredentialWithScope", credential)

    def add_passphrase(self, passphrase: Passphrase, purpose: int, user: int | None = None) -> None:
        """Adds a passphrase that this process's user, or `user`, has entered for a purpose."""
        with Credential.from_passphrase(passphrase, purpose, user) as credential:
            self.add(credential)

    def _change(self, name: str, what: Credential | int) -> None:
        with _library.locked():
            argument = what.open_pointer() if isinstance(what, Credential) else what
            _library.call(name, self._reference(), argument, self._scope)


class Context(_Place):
    """A context of the kernel service.

    Context() makes one, which close() or the end of a with-block destroys; Context.open() opens one that
    somebody else has made, and closing it then leaves the kernel service's end alone. What is dropped without
    being closed gives a ResourceWarning, and its end stays, too.
    """

    _scope = Scope.CONTEXT

    def __init__(self) -> None:
        self._pointer = c_void_p()
        self._owner: int | None = os.getpid()
        _library.call("KSTContextCreate", byref(self._pointer))

    @classmethod
    def open(cls, external_form: bytes | bytearray) -> Context:
        """Opens the context with this external form. There may be none, or the call may fail: the library does
        not tell, and both are a KSTError without a status."""
        name = "KSTContextCreateWithExternalForm"
        context = cls.__new__(cls)
        context._owner = None
        context._pointer = c_void_p(_library.call(name, *_library.as_data(external_form)))
        if not context._pointer:
            raise KSTError(name, None)
        return context

    def close(self, destroy: bool | None = None) -> None:
        """Frees the object, and has the kernel service destroy its end when this process has made it (a child that
        was forked has not), or as `destroy` says. When that fails, the object is freed all the same before the
        exception is raised. Closing it again does nothing."""
        with _library.locked():
            if not self._pointer:
                return
            try:
                if self._owner == os.getpid() if destroy is None else destroy:
                    _library.call("KSTContextDelete", self._pointer, True)
                    self._pointer = c_void_p()
            finally:
                if self._pointer:
                    _library.call("KSTContextDelete", self._pointer, False)
                    self._pointer = c_void_p()

    def external_form(self, process: Callable[[memoryview], T]) -> T:
        """What `process` makes of the 16 bytes by which another process opens this context. They are wiped after
        it; `bytes` keeps a copy. Who has them can use the context."""
        with _library.locked():
            form = _library.copy_of_bytes("KSTContextGetExternalForm", self._reference())
        return _library.process_and_wipe(form, process)

    def remove_type(self, type: int) -> None:
        """Takes out the credentials of a type."""
        self._change("KSTContextRemoveCredentialsByTypeAndScope", type)

    def contains(self, type: int, argument: int = 0) -> bool:
        """Whether there is a credential of a type. What the argument means is the kernel service's."""
        return self._contains("KSTContextContainsCredentialTypeEx", type, argument)

    def contains_passphrase(self, purpose: int, argument: int = 0) -> bool:
        """Whether there is a passphrase of a purpose."""
        return self._contains("KSTContextContainsPassphraseCredentialWithPurpose", purpose, argument)

    def verify_policy(
        self,
        policy: str,
        *,
        preflight: bool = False,
        parameters: Sequence[Parameter] = (),
        max_global_credential_age: int = 0,
    ) -> Answer:
        """Whether the credentials satisfy a policy, and if not, what is missing. `preflight` asks without using
        anything up; global credentials count up to an age, which is none at all for 0."""
        with _library.locked():
            return _ask(
                "KSTContextVerifyPolicyEx",
                (self._reference(), _library.as_text(policy)),
                preflight,
                parameters,
                max_global_credential_age,
            )

    def verify_acl_constraint(
        self,
        constraint: bytes,
        *,
        preflight: bool = False,
        parameters: Sequence[Parameter] = (),
        max_global_credential_age: int = 0,
    ) -> Answer:
        """As verify_policy, for a constraint of an access-control list."""
        with _library.locked():
            return _ask(
                "KSTContextVerifyAclConstraint",
                (self._reference(), *_library.as_data(constraint)),
                preflight,
                parameters,
                max_global_credential_age,
            )

    def _contains(self, name: str, what: int, argument: int) -> bool:
        try:
            with _library.locked():
                _library.call(name, self._reference(), what, argument)
        except NotContainedError:
            return False
        return True

    def _reference(self) -> c_void_p:
        if not self._pointer:
            raise ValueError("the context is closed")
        return self._pointer

    def __enter__(self) -> Context:
        return self

    def __exit__(self, kind: object, error: object, trace: object) -> None:
        try:
            self.close()
        except KSTError:
            # What went wrong first says more.
            if error is None:
                raise

    def __del__(self) -> None:
        pointer: Any = getattr(self, "_pointer", None)
        if pointer:
            warnings.warn(f"unclosed {self!r}", ResourceWarning, source=self)
            _library.drop("KSTContextDelete", pointer, False)


class _GlobalContext(_Place):
    """The context that all clients share, where a credential counts for each of them."""

    _scope = Scope.GLOBAL

    def _reference(self) -> None:
        return None

    def add(self, credential: Credential) -> None:
        """Adds a credential, which is copied."""
        with _library.locked():
            _library.call("KSTGlobalContextAddCredential", credential.open_pointer())

    def remove_type(self, type: int) -> None:
        """Takes out the credentials of a type."""
        _library.call("KSTGlobalContextRemoveCredentialsByType", type)

    def verify_policy(self, policy: str, *, preflight: bool = False, parameters: Sequence[Parameter] = ()) -> Answer:
        """Whether the global credentials, of any age, satisfy a policy, and if not, what is missing."""
        return _ask("KSTGlobalContextVerifyPolicy", (_library.as_text(policy),), preflight, parameters)


#: The context that all clients share.
global_context = _GlobalContext()


def _ask(name: str, about: tuple[Any, ...], preflight: bool, parameters: Sequence[Parameter], *age: int) -> Answer:
    """Asks a question, whose block alone learns the status."""
    values = [as_word(p.value) if isinstance(p.value, int) else p.value for p in parameters]
    array = (_library.CParameter * len(values))(
        *(_library.c_parameter(parameter.type, value) for parameter, value in zip(parameters, values))
    )

    def take(status: int, satisfied: bool, requirement: int | None) -> Answer:
        if status != 0:
            raise error_for(name, status)
        return Answer(satisfied, copied_tree(requirement) if requirement else None)

    return _library.call_with_block(
        name,
        *about,
        preflight,
        array if values else None,
        len(values),
        *age,
        block=_library.PolicyStatusBlock,
        take=take,
    )


def acl_characteristics(acl: bytes) -> bytes:
    """What the constraints of an access-control list are about."""
    name = "KSTParseAclAndCopyConstraintCharacteristics"

    def take(status: int, data: int | None, length: int) -> bytes:
        return string_at(data, length) if data else b""

    return _library.call_with_block(name, *_library.as_data(acl), block=_library.StatusDataBlock, take=take)


def environment_variable(number: int, process: Callable[[memoryview], T]) -> T:
    """What `process` makes of a variable of the kernel service, of up to 64 bytes, which are wiped after it;
    `bytes` keeps a copy."""
    return _library.process_and_wipe(_library.copy_of_bytes("KSTGetEnvironmentVariable", number), process)


def set_environment_variable(number: int, data: bytes | bytearray | None) -> None:
    """Sets a variable of the kernel service to 1 to 64 bytes, or to nothing."""
    _library.call("KSTSetEnvironmentVariable", number, *_library.as_data(data))


def kernel_control(code: int, data: bytes | bytearray | None, process: Callable[[memoryview], T]) -> T:
    """Sends a control code with 1 to 256 bytes, or with none; what `process` makes of the reply, of up to 256
    bytes, which are wiped after it; `bytes` keeps a copy."""
    reply = _library.copy_of_bytes("KSTKernelControl", code, *_library.as_data(data))
    return _library.process_and_wipe(reply, process)
