"""The client library of the kernel service, Keystrand, for Python.

    import kstlib

    with kstlib.Context() as context:
        answer = context.verify_policy("unlock")
        print(answer.missing if not answer else "satisfied")

It wraps libKSTLib.so.1. Every call is made under one lock, so any thread may make one; what the library hands
over is copied; a status that is not 0 is an exception (KSTError). A process may fork at any time.
"""

from ._library import allocated_bytes, wipe
from .contexts import (
    Context,
    Parameter,
    acl_characteristics,
    environment_variable,
    global_context,
    kernel_control,
    set_environment_variable,
)
from .credentials import Credential
from .errors import (
    BadParameterError,
    ConnectionFailedError,
    KernelError,
    KSTError,
    NotContainedError,
    OutOfMemoryError,
    UnexpectedError,
)
from .passphrases import Passphrase, read_passphrase
from .requirements import Answer, Requirement
from .words import (
    ANY_PURPOSE,
    NO_AGE_LIMIT,
    NO_USER,
    CredentialProperty,
    CredentialType,
    KernelStatus,
    ParameterType,
    RequirementProperty,
    RequirementState,
    RequirementType,
    Status,
    credential_type_for,
    requirement_state_text,
    requirement_type_text,
    status_text,
)

__all__ = [
    "ANY_PURPOSE",
    "Answer",
    "BadParameterError",
    "ConnectionFailedError",
    "Context",
    "Credential",
    "CredentialProperty",
    "CredentialType",
    "KSTError",
    "KernelError",
    "KernelStatus",
    "NO_AGE_LIMIT",
    "NO_USER",
    "NotContainedError",
    "OutOfMemoryError",
    "Parameter",
    "ParameterType",
    "Passphrase",
    "Requirement",
    "RequirementProperty",
    "RequirementState",
    "RequirementType",
    "Status",
    "UnexpectedError",
    "acl_characteristics",
    "allocated_bytes",
    "credential_type_for",
    "environment_variable",
    "global_context",
    "kernel_control",
    "read_passphrase",
    "requirement_state_text",
    "requirement_type_text",
    "set_environment_variable",
    "status_text",
    "wipe",
]
