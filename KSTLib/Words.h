#ifndef KST_KSTLIB_WORDS_H
#define KST_KSTLIB_WORDS_H

#include "KSTLib/Credential.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Public.h"
#include "KSTLib/Requirement.h"
#include "KSTLib/Status.h"

#include <errno.h>
#include <stdint.h>

/** Names and words for the numbers that the library hands over: statuses, properties, purposes,
 *  states and types. All of it is in this header; the library is not needed for it, and a program
 *  has the words of the header that it was compiled with.
 *
 *  A function here gives a constant text in English, in lower case and without a full stop, for
 *  people to read. It is never null, belongs to nobody and stays for ever. A number without a
 *  meaning has a text that says so: print the number beside it. The functions may be called on any
 *  thread at any time; they call nothing, and C++ may use them in constant expressions.
 *
 *  The library itself gives no meaning to the statuses of the kernel side, to states, to purposes
 *  or to the data of requirements: the kernel service does. Those here are the ones that keystrand
 *  and keystrand-sim have. */

#ifdef __cplusplus
#define KST_WORDS [[nodiscard]] constexpr
#define KST_WORDS_END noexcept
#else
#define KST_WORDS static inline
#define KST_WORDS_END
#endif

/** The status of a connection that failed with `error`, a number of errno.h. */
#define KST_STATUS_OF_ERRNO(error) (-1000 - (error))

/** Statuses of the kernel side. */
enum {
    /** A request whose body is not what its operation takes. */
    kKSTKernelErrorMalformedRequest = -6001,
    kKSTKernelErrorNoSuchEntry = -6002,
    kKSTKernelErrorNotOpen = -6003,
    /** A selector, or a type of connection, that it does not have. */
    kKSTKernelErrorUnknownSelector = -6004,
    /** A command frame that is too short or has another magic. */
    kKSTKernelErrorMalformedFrame = -6005,
    /** A command, or a control code, that it does not have. */
    kKSTKernelErrorUnknownCommand = -6006,
    kKSTKernelErrorBadPayload = -6007,
    kKSTKernelErrorReplyDoesNotFit = -6008,
    /** No room for another environment variable, or another property of a context. */
    kKSTKernelErrorTableFull = -6009,
    kKSTKernelErrorNoSuchContext = -6010,
    kKSTKernelErrorTooManyContexts = -6011,
    kKSTKernelErrorTooManyCredentials = -6012,
    kKSTKernelErrorNoSuchPolicy = -6013,
    kKSTKernelErrorBadConstraint = -6014
};

/** Properties of credentials (KSTLib/Credential.h). Those that are named by their number are bytes
 *  that only the kernel service understands. */
enum {
    kKSTCredentialPropertyWord16 = 1,
    kKSTCredentialPropertyWord24 = 2,
    kKSTCredentialPropertyType = 3,
    kKSTCredentialPropertyWord4 = 4,
    kKSTCredentialPropertyUserId = 5,
    kKSTCredentialPropertyIdentifier = 100,
    kKSTCredentialProperty101 = 101,
    kKSTCredentialProperty102 = 102,
    kKSTCredentialPropertyPassphrase = 200,
    kKSTCredentialPropertyPurpose = 201,
    kKSTCredentialProperty300 = 300,
    kKSTCredentialProperty301 = 301,
    kKSTCredentialProperty302 = 302,
    kKSTCredentialProperty400 = 400,
    kKSTCredentialProperty401 = 401,
    kKSTCredentialProperty501 = 501,
    kKSTCredentialProperty502 = 502,
    kKSTCredentialPropertyDenyListFormat = 601,
    kKSTCredentialPropertyDenyListRevision = 602
};

/** Properties of requirements (KSTLib/Requirement.h), whose numbers are not those of credentials:
 *  200 is the purpose that is asked for here, and the passphrase itself there. */
enum {
    kKSTRequirementPropertyType = 1,
    kKSTRequirementPropertyState = 2,
    kKSTRequirementPropertyPriority = 3,
    /** Seconds since the credential was added, at most; kKSTNoAgeLimit for no limit. */
    kKSTRequirementPropertyAgeLimit = 100,
    kKSTRequirementPropertyPurpose = 200,
    kKSTRequirementProperty300 = 300,
    kKSTRequirementProperty301 = 301,
    kKSTRequirementProperty302 = 302,
    kKSTRequirementProperty400 = 400,
    /** How many of the children it takes. */
    kKSTRequirementPropertyK = 700
};

#define kKSTNoAgeLimit 0xffffffffU

/** The purpose of a leaf that any passphrase meets. All other purposes are agreed upon by who
 *  writes policies and who writes clients. */
#define kKSTPassphrasePurposeAny 0U

/** States of requirements. */
enum {
    /** No credential meets the leaf; of a composite: too many of its children are missing. */
    kKSTRequirementStateMissing = 1,
    /** A credential would meet the leaf, had it been added later. Adding it again does. */
    kKSTRequirementStateTooOld = 2
};

/** The leaves that KSTLib/Requirement.h has no names for. The markers bear the numbers of the
 *  credentials that meet them, which are not always their own. */
enum {
    kKSTRequirementTypeMarker6 = 6,
    kKSTRequirementTypeMarker8 = 8,
    kKSTRequirementTypeContinuityUnlock = 9,
    kKSTRequirementTypePasscodeValidated2 = 10,
    kKSTRequirementTypeMarker11 = 11,
    kKSTRequirementTypeKextDenyList = 12,
    kKSTRequirementTypeMarker4 = 14,
    kKSTRequirementTypeMarker5 = 15,
    /** No credential meets it. */
    kKSTRequirementTypeNever = 16
};

/** Types of parameters (KSTLib/PolicyVerification.h). Those that are named by their number are the
 *  policy's affair. */
enum {
    kKSTParameterTypeNone = 0,
    kKSTParameterTypeNumber1 = 1,
    kKSTParameterTypeBytes2 = 2,
    kKSTParameterTypeData = 3,
    /** Whose credentials count where a leaf does not say it. */
    kKSTParameterTypeUserId = 4,
    kKSTParameterTypeNumber5 = 5,
    kKSTParameterTypeBytes6 = 6,
    kKSTParameterTypeBytes7 = 7
};

/** What a status says. */
// NOLINTNEXTLINE(readability-function-size): one line for each number
KST_WORDS const char* KSTStatusText(KSTStatus status) KST_WORDS_END {
    switch (status) {
    case kKSTErrorSuccess:
        return "success";
    case kKSTErrorBadParameter:
        return "an argument, or what was read, is not what it must be";
    case kKSTErrorOutOfMemory:
        return "out of memory";
    case kKSTErrorUnexpected:
        return "there is no kernel service, or its reply has the wrong size";
    case kKSTErrorNotContained:
        return "the context has no such credential";
    case kKSTKernelErrorMalformedRequest:
        return "malformed request body";
    case kKSTKernelErrorNoSuchEntry:
        return "no such entry";
    case kKSTKernelErrorNotOpen:
        return "the connection is not open";
    case kKSTKernelErrorUnknownSelector:
        return "unknown selector or connection type";
    case kKSTKernelErrorMalformedFrame:
        return "malformed command frame: too short, or another magic";
    case kKSTKernelErrorUnknownCommand:
        return "unknown command, or unknown control code";
    case kKSTKernelErrorBadPayload:
        return "a payload that the command does not take";
    case kKSTKernelErrorReplyDoesNotFit:
        return "the reply does not fit into what was offered";
    case kKSTKernelErrorTableFull:
        return "no room for another environment variable, or property of a context";
    case kKSTKernelErrorNoSuchContext:
        return "no such context";
    case kKSTKernelErrorTooManyContexts:
        return "no room for another context";
    case kKSTKernelErrorTooManyCredentials:
        return "no room for another credential";
    case kKSTKernelErrorNoSuchPolicy:
        return "no such policy";
    case kKSTKernelErrorBadConstraint:
        return "a constraint or an access-control list that cannot be understood";
    case KST_STATUS_OF_ERRNO(EPERM):
        return "the socket of the kernel service is served by another user";
    case KST_STATUS_OF_ERRNO(ENOENT):
    case KST_STATUS_OF_ERRNO(ENOTDIR):
        return "the kernel service has no socket";
    case KST_STATUS_OF_ERRNO(EACCES):
        return "this user may not connect to the kernel service";
    case KST_STATUS_OF_ERRNO(ECONNREFUSED):
        return "nobody serves the socket of the kernel service";
    case KST_STATUS_OF_ERRNO(ETIMEDOUT):
        return "the kernel service did not answer in time";
    case KST_STATUS_OF_ERRNO(ECONNRESET):
        return "the kernel service hung up instead of answering";
    case KST_STATUS_OF_ERRNO(EPIPE):
    case KST_STATUS_OF_ERRNO(ENOTCONN):
        return "the kernel service hung up before anything was sent";
    case KST_STATUS_OF_ERRNO(EPROTO):
        return "the kernel service broke the rules of the connection";
    case KST_STATUS_OF_ERRNO(EMSGSIZE):
        return "more than a packet, or than was offered, can hold";
    case KST_STATUS_OF_ERRNO(E2BIG):
        return "more numbers than a request can hold";
    case KST_STATUS_OF_ERRNO(EBADF):
        return "the connection was closed before";
    case KST_STATUS_OF_ERRNO(EINVAL):
        return "a request that cannot be sent";
    case KST_STATUS_OF_ERRNO(EMFILE):
    case KST_STATUS_OF_ERRNO(ENFILE):
        return "too many open files or connections";
    case KST_STATUS_OF_ERRNO(ENAMETOOLONG):
        return "the path of the socket is too long";
    case KST_STATUS_OF_ERRNO(ENOMEM):
    case KST_STATUS_OF_ERRNO(ENOBUFS):
        return "out of memory for the connection";
    case KST_STATUS_OF_ERRNO(EAGAIN):
        return "the kernel service takes no connection at the moment";
    case KST_STATUS_OF_ERRNO(EPROTOTYPE):
    case KST_STATUS_OF_ERRNO(ENOTSOCK):
        return "what lies in the place of the socket is another thing";
    default:
        break;
    }
    return status < KST_STATUS_OF_ERRNO(0) && status >= KST_STATUS_OF_ERRNO(4095)
               ? "the connection to the kernel service failed"
               : "a status without a meaning here";
}

/** What a property of a credential is. */
KST_WORDS const char* KSTCredentialPropertyText(uint32_t propertyId) KST_WORDS_END {
    switch (propertyId) {
    case kKSTCredentialPropertyType:
        return "type";
    case kKSTCredentialPropertyUserId:
        return "user id";
    case kKSTCredentialPropertyIdentifier:
        return "identifier";
    case kKSTCredentialPropertyPassphrase:
        return "passphrase";
    case kKSTCredentialPropertyPurpose:
        return "purpose of the passphrase";
    case kKSTCredentialPropertyDenyListFormat:
        return "format of the deny list";
    case kKSTCredentialPropertyDenyListRevision:
        return "revision of the deny list";
    case kKSTCredentialPropertyWord16:
    case kKSTCredentialPropertyWord24:
    case kKSTCredentialPropertyWord4:
        return "kernel service's own field of the header";
    case kKSTCredentialProperty101:
    case kKSTCredentialProperty102:
    case kKSTCredentialProperty300:
    case kKSTCredentialProperty301:
    case kKSTCredentialProperty302:
    case kKSTCredentialProperty400:
    case kKSTCredentialProperty401:
    case kKSTCredentialProperty501:
    case kKSTCredentialProperty502:
        return "kernel service's own data";
    default:
        return "not a property of credentials";
    }
}

/** What a property of a requirement is. */
KST_WORDS const char* KSTRequirementPropertyText(uint32_t propertyId) KST_WORDS_END {
    switch (propertyId) {
    case kKSTRequirementPropertyType:
        return "type";
    case kKSTRequirementPropertyState:
        return "state";
    case kKSTRequirementPropertyPriority:
        return "priority";
    case kKSTRequirementPropertyAgeLimit:
        return "age limit in seconds";
    case kKSTRequirementPropertyPurpose:
        return "purpose that is asked for";
    case kKSTRequirementPropertyK:
        return "how many of the children it takes";
    case kKSTRequirementProperty300:
    case kKSTRequirementProperty301:
    case kKSTRequirementProperty302:
    case kKSTRequirementProperty400:
        return "kernel service's own data";
    default:
        return "not a property of requirements";
    }
}

/** What the purpose that a leaf asks for says. */
KST_WORDS const char* KSTPassphrasePurposeText(KSTPassphrasePurpose purpose) KST_WORDS_END {
    return purpose == kKSTPassphrasePurposeAny ? "any purpose" : "this purpose alone";
}

/** What the state of a requirement says. */
KST_WORDS const char* KSTRequirementStateText(uint32_t state) KST_WORDS_END {
    switch (state) {
    case kKSTRequirementStateMissing:
        return "missing";
    case kKSTRequirementStateTooOld:
        return "too old";
    default:
        return "not a state";
    }
}

/** What a requirement of a type asks for. */
KST_WORDS const char* KSTRequirementTypeText(uint32_t type) KST_WORDS_END {
    switch (type) {
    case kKSTRequirementTypePasscodeValidated:
        return "a passcode";
    case kKSTRequirementTypePassphraseEntered:
        return "a passphrase";
    case kKSTRequirementTypeBiometryMatched:
        return "a biometric match";
    case kKSTRequirementTypeAnd:
        return "all of";
    case kKSTRequirementTypeOr:
        return "any of";
    case kKSTRequirementTypeKofN:
        return "some of";
    case kKSTRequirementTypeContinuityUnlock:
        return "a continuity unlock";
    case kKSTRequirementTypePasscodeValidated2:
        return "a passcode of the second kind";
    case kKSTRequirementTypeKextDenyList:
        return "a kext deny list";
    case kKSTRequirementTypeUserOutputDisplayed:
        return "output displayed to the user";
    case kKSTRequirementTypeMarker4:
        return "marker 4";
    case kKSTRequirementTypeMarker5:
        return "marker 5";
    case kKSTRequirementTypeMarker6:
        return "marker 6";
    case kKSTRequirementTypeMarker8:
        return "marker 8";
    case kKSTRequirementTypeMarker11:
        return "marker 11";
    case kKSTRequirementTypeNever:
        return "what no credential gives";
    case kKSTRequirementTypeInMemory:
        return "a composite in memory";
    default:
        return "not a type of requirements";
    }
}

/** The type of the credentials that meet a leaf of this type; 0 for a composite, for what no
 *  credential meets and for what is not a type. */
KST_WORDS uint32_t KSTCredentialTypeForRequirementType(uint32_t type) KST_WORDS_END {
    switch (type) {
    case kKSTRequirementTypePasscodeValidated:
    case kKSTRequirementTypePassphraseEntered:
    case kKSTRequirementTypeBiometryMatched:
    case kKSTRequirementTypeMarker6:
    case kKSTRequirementTypeMarker8:
    case kKSTRequirementTypeContinuityUnlock:
    case kKSTRequirementTypePasscodeValidated2:
    case kKSTRequirementTypeMarker11:
    case kKSTRequirementTypeKextDenyList:
        return type;
    case kKSTRequirementTypeUserOutputDisplayed:
        return kKSTCredentialTypeUserOutputDisplayed;
    case kKSTRequirementTypeMarker4:
        return kKSTCredentialTypeMarker4;
    case kKSTRequirementTypeMarker5:
        return kKSTCredentialTypeMarker5;
    default:
        return 0;
    }
}

/** What the value of a parameter of a type is. */
KST_WORDS const char* KSTParameterTypeText(KSTParameterType type) KST_WORDS_END {
    switch (type) {
    case kKSTParameterTypeNone:
        return "no value";
    case kKSTParameterTypeNumber1:
    case kKSTParameterTypeNumber5:
        return "a signed number";
    case kKSTParameterTypeBytes2:
    case kKSTParameterTypeBytes6:
    case kKSTParameterTypeBytes7:
        return "16 opaque bytes";
    case kKSTParameterTypeData:
        return "1 to 1000 opaque bytes";
    case kKSTParameterTypeUserId:
        return "a user id";
    default:
        return "not a type of parameters";
    }
}

#endif
