"""Names and words for the numbers that the library hands over.

The library gives no meaning to the statuses of the kernel side, to states, to purposes or to the data of
requirements: the kernel service does. Those here are the ones that keystrand and keystrand-sim have. A number
that has no name here is handed over as the number that it is.
"""

from __future__ import annotations

import errno
from enum import IntEnum

NO_USER = 0xFFFFFFFF
NO_AGE_LIMIT = 0xFFFFFFFF
ANY_PURPOSE = 0
PASSPHRASE_MAX_LENGTH = 128
MAX_PARAMETERS = 10
EXTERNAL_FORM_SIZE = 16


class Status(IntEnum):
    """How a call ended: the library's own statuses."""

    SUCCESS = 0
    BAD_PARAMETER = -3
    OUT_OF_MEMORY = -4
    UNEXPECTED = -5
    NOT_CONTAINED = -7


class KernelStatus(IntEnum):
    """Statuses of the kernel side."""

    MALFORMED_REQUEST = -6001
    NO_SUCH_ENTRY = -6002
    NOT_OPEN = -6003
    UNKNOWN_SELECTOR = -6004
    MALFORMED_FRAME = -6005
    UNKNOWN_COMMAND = -6006
    BAD_PAYLOAD = -6007
    REPLY_DOES_NOT_FIT = -6008
    TABLE_FULL = -6009
    NO_SUCH_CONTEXT = -6010
    TOO_MANY_CONTEXTS = -6011
    TOO_MANY_CREDENTIALS = -6012
    NO_SUCH_POLICY = -6013
    BAD_CONSTRAINT = -6014


class Scope(IntEnum):
    """Where a credential belongs."""

    CONTEXT = 1
    GLOBAL = 2


class CredentialType(IntEnum):
    """Types of credentials. A marker carries no data: that it is there says everything."""

    PASSCODE_VALIDATED = 1
    PASSPHRASE_ENTERED = 2
    BIOMETRY_MATCHED = 3
    MARKER4 = 4
    MARKER5 = 5
    MARKER6 = 6
    USER_OUTPUT_DISPLAYED = 7
    MARKER8 = 8
    CONTINUITY_UNLOCK = 9
    PASSCODE_VALIDATED2 = 10
    MARKER11 = 11
    KEXT_DENY_LIST = 12


class CredentialProperty(IntEnum):
    """Properties of credentials. Those that are named by their number only the kernel service understands."""

    WORD16 = 1
    WORD24 = 2
    TYPE = 3
    WORD4 = 4
    USER_ID = 5
    IDENTIFIER = 100
    PROPERTY_101 = 101
    PROPERTY_102 = 102
    PASSPHRASE = 200
    PURPOSE = 201
    PROPERTY_300 = 300
    PROPERTY_301 = 301
    PROPERTY_302 = 302
    PROPERTY_400 = 400
    PROPERTY_401 = 401
    PROPERTY_501 = 501
    PROPERTY_502 = 502
    DENY_LIST_FORMAT = 601
    DENY_LIST_REVISION = 602


class RequirementType(IntEnum):
    """Types of requirements. AND, OR and K_OF_N have children, the others are leaves. The markers bear the
    numbers of the credentials that meet them, which are not always their own."""

    PASSCODE_VALIDATED = 1
    PASSPHRASE_ENTERED = 2
    BIOMETRY_MATCHED = 3
    AND = 4
    OR = 5
    MARKER6 = 6
    K_OF_N = 7
    MARKER8 = 8
    CONTINUITY_UNLOCK = 9
    PASSCODE_VALIDATED2 = 10
    MARKER11 = 11
    KEXT_DENY_LIST = 12
    USER_OUTPUT_DISPLAYED = 13
    MARKER4 = 14
    MARKER5 = 15
    NEVER = 16


class RequirementProperty(IntEnum):
    """Properties of requirements, whose numbers are not those of credentials: 200 is the purpose that is
    asked for here, and the passphrase itself there."""

    TYPE = 1
    STATE = 2
    PRIORITY = 3
    AGE_LIMIT = 100
    PURPOSE = 200
    PROPERTY_300 = 300
    PROPERTY_301 = 301
    PROPERTY_302 = 302
    PROPERTY_400 = 400
    K = 700


class RequirementState(IntEnum):
    """States of requirements. MISSING: no credential meets the leaf; of a composite, too many of its children
    are missing. TOO_OLD: a credential would meet the leaf, had it been added later."""

    MISSING = 1
    TOO_OLD = 2


class ParameterType(IntEnum):
    """Types of the parameters of a question. USER_ID is whose credentials count where a leaf does not say it;
    those that are named by their number are the policy's affair."""

    NONE = 0
    NUMBER1 = 1
    BYTES2 = 2
    DATA = 3
    USER_ID = 4
    NUMBER5 = 5
    BYTES6 = 6
    BYTES7 = 7


_STATUS_TEXTS: dict[int, str] = {
    Status.SUCCESS: "success",
    Status.BAD_PARAMETER: "an argument, or what was read, is not what it must be",
    Status.OUT_OF_MEMORY: "out of memory",
    Status.UNEXPECTED: "there is no kernel service, or its reply has the wrong size",
    Status.NOT_CONTAINED: "the context has no such credential",
    KernelStatus.MALFORMED_REQUEST: "malformed request body",
    KernelStatus.NO_SUCH_ENTRY: "no such entry",
    KernelStatus.NOT_OPEN: "the connection is not open",
    KernelStatus.UNKNOWN_SELECTOR: "unknown selector or connection type",
    KernelStatus.MALFORMED_FRAME: "malformed command frame: too short, or another magic",
    KernelStatus.UNKNOWN_COMMAND: "unknown command, or unknown control code",
    KernelStatus.BAD_PAYLOAD: "a payload that the command does not take",
    KernelStatus.REPLY_DOES_NOT_FIT: "the reply does not fit into what was offered",
    KernelStatus.TABLE_FULL: "no room for another environment variable, or property of a context",
    KernelStatus.NO_SUCH_CONTEXT: "no such context",
    KernelStatus.TOO_MANY_CONTEXTS: "no room for another context",
    KernelStatus.TOO_MANY_CREDENTIALS: "no room for another credential",
    KernelStatus.NO_SUCH_POLICY: "no such policy",
    KernelStatus.BAD_CONSTRAINT: "a constraint or an access-control list that cannot be understood",
}

_CONNECTION_TEXTS: dict[int, str] = {
    errno.EPERM: "the socket of the kernel service is served by another user",
    errno.ENOENT: "the kernel service has no socket",
    errno.ENOTDIR: "the kernel service has no socket",
    errno.EACCES: "this user may not connect to the kernel service",
    errno.ECONNREFUSED: "nobody serves the socket of the kernel service",
    errno.ETIMEDOUT: "the kernel service did not answer in time",
    errno.ECONNRESET: "the kernel service hung up instead of answering",
    errno.EPIPE: "the kernel service hung up before anything was sent",
    errno.ENOTCONN: "the kernel service hung up before anything was sent",
    errno.EPROTO: "the kernel service broke the rules of the connection",
    errno.EMSGSIZE: "more than a packet, or than was offered, can hold",
    errno.E2BIG: "more numbers than a request can hold",
    errno.EBADF: "the connection was closed before",
    errno.EINVAL: "a request that cannot be sent",
    errno.EMFILE: "too many open files or connections",
    errno.ENFILE: "too many open files or connections",
    errno.ENAMETOOLONG: "the path of the socket is too long",
    errno.ENOMEM: "out of memory for the connection",
    errno.ENOBUFS: "out of memory for the connection",
    errno.EAGAIN: "the kernel service takes no connection at the moment",
    errno.EPROTOTYPE: "what lies in the place of the socket is another thing",
    errno.ENOTSOCK: "what lies in the place of the socket is another thing",
}

_REQUIREMENT_TEXTS: dict[int, str] = {
    RequirementType.PASSCODE_VALIDATED: "a passcode",
    RequirementType.PASSPHRASE_ENTERED: "a passphrase",
    RequirementType.BIOMETRY_MATCHED: "a biometric match",
    RequirementType.AND: "all of",
    RequirementType.OR: "any of",
    RequirementType.K_OF_N: "some of",
    RequirementType.CONTINUITY_UNLOCK: "a continuity unlock",
    RequirementType.PASSCODE_VALIDATED2: "a passcode of the second kind",
    RequirementType.KEXT_DENY_LIST: "a kext deny list",
    RequirementType.USER_OUTPUT_DISPLAYED: "output displayed to the user",
    RequirementType.MARKER4: "marker 4",
    RequirementType.MARKER5: "marker 5",
    RequirementType.MARKER6: "marker 6",
    RequirementType.MARKER8: "marker 8",
    RequirementType.MARKER11: "marker 11",
    RequirementType.NEVER: "what no credential gives",
}

_STATE_TEXTS: dict[int, str] = {RequirementState.MISSING: "missing", RequirementState.TOO_OLD: "too old"}

# The leaves whose credentials have another number, and those that no credential meets.
_CREDENTIALS_OF_LEAVES = {
    RequirementType.USER_OUTPUT_DISPLAYED: CredentialType.USER_OUTPUT_DISPLAYED,
    RequirementType.MARKER4: CredentialType.MARKER4,
    RequirementType.MARKER5: CredentialType.MARKER5,
}
_MET_BY_NONE = (RequirementType.AND, RequirementType.OR, RequirementType.K_OF_N, RequirementType.NEVER)


def is_connection_status(status: int) -> bool:
    """Whether a status says that the connection failed: it is -1000 - errno."""
    return -5095 <= status < -1000


def status_text(status: int) -> str:
    """What a status says."""
    if is_connection_status(status):
        return _CONNECTION_TEXTS.get(-1000 - status, "the connection to the kernel service failed")
    return _STATUS_TEXTS.get(status, "a status without a meaning here")


def requirement_type_text(type: int) -> str:
    """What a requirement of a type asks for."""
    return _REQUIREMENT_TEXTS.get(type, "not a type of requirements")


def requirement_state_text(state: int) -> str:
    """What the state of a requirement says."""
    return _STATE_TEXTS.get(state, "not a state")


def credential_type_for(requirement_type: int) -> CredentialType | None:
    """The type of the credentials that meet a leaf of this type, if there is one."""
    try:
        leaf = RequirementType(requirement_type)
    except ValueError:
        return None
    if leaf in _MET_BY_NONE:
        return None
    return _CREDENTIALS_OF_LEAVES.get(leaf) or CredentialType(leaf)
