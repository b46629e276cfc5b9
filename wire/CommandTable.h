#pragma once

#include "KSTLib/Command.h"

#include <cstddef>
#include <cstdint>

/// What the commands of a frame are, in every name that they have: the library sends them, a kernel
/// side answers them, kstctl shows them, and the pages list them.
namespace wire {

struct CommandKind {
    std::uint8_t code;
    /// For commands of the tools.
    const char* name;
    /// For people.
    const char* title;
    /// What the payload is and how many bytes it has; letters stand for what varies.
    const char* payload;
    /// The room that the library offers for the reply, in bytes.
    std::size_t replyOffered;
};

inline constexpr char kHandlePayload[] = "handle, 16";
inline constexpr char kNumbersPayload[] = "handle and two numbers, 24";
inline constexpr char kCredentialPayload[] = "credential command, D + 52";
/// A reply that holds a requirement or the characteristics of a constraint.
inline constexpr std::size_t kLongReplySize = 4096;
inline constexpr std::size_t kHandleReplySize = 16 + 1;
inline constexpr std::size_t kExistsReplySize = 4 + 1;
inline constexpr std::size_t kContainsReplySize = 4;

/// Ordered by their codes.
inline constexpr CommandKind kCommandKinds[] = {
    {kKSTCommandContextCreate, "create-context", "create a context", "none", kHandleReplySize},
    {kKSTCommandContextDelete, "delete-context", "delete a context", kHandlePayload, 0},
    {kKSTCommandVerifyPolicy, "verify-policy", "verify a policy", "verify policy, L + P + 26",
     kLongReplySize},
    {kKSTCommandContainsCredentialType, "contains-credential-type",
     "contains a credential of a type", kNumbersPayload, kContainsReplySize},
    {kKSTCommandAddCredential, "add-credential", "add a credential", kCredentialPayload, 0},
    {kKSTCommandRemoveCredentialsByValue, "remove-credentials-by-value",
     "remove credentials by value", kCredentialPayload, 0},
    {kKSTCommandRemoveCredentialsByType, "remove-credentials-by-type", "remove credentials by type",
     kNumbersPayload, 0},
    {kKSTCommandVerifyAclConstraint, "verify-acl-constraint", "verify an ACL constraint",
     "verify ACL constraint, N + P + 29", kLongReplySize},
    {kKSTCommandContainsPassphraseCredential, "contains-passphrase",
     "contains a passphrase of a purpose", kNumbersPayload, kContainsReplySize},
    {kKSTCommandReplacePassphraseCredentials, "replace-passphrases", "replace passphrases",
     kCredentialPayload, 0},
    {kKSTCommandRemovePassphraseCredentials, "remove-passphrases", "remove passphrases by purpose",
     kNumbersPayload, 0},
    {kKSTCommandContextCreateWithExternalForm, "open-external-form",
     "open a context by its external form", "external form, which is the handle, 16",
     kExistsReplySize},
    {kKSTCommandContextGetExternalForm, "get-external-form", "want the external form of a context",
     kHandlePayload, 0},
    {kKSTCommandParseAcl, "parse-acl", "parse an ACL", "process ACL, A + O + P + 32",
     kLongReplySize},
    {kKSTCommandSetEnvironmentVariable, "set-environment-variable", "set an environment variable",
     "4 to 68", 0},
    {kKSTCommandGetEnvironmentVariable, "get-environment-variable", "get an environment variable",
     "4", kKSTEnvironmentVariableMaxSize},
    {kKSTCommandKernelControl, "kernel-control", "kernel control", "4 to 260",
     kKSTKernelControlMaxSize},
};

/// Null for a code that is not used.
[[nodiscard]] constexpr const CommandKind* findCommandKind(std::uint32_t code) {
    for (const CommandKind& kind : kCommandKinds) {
        if (kind.code == code) {
            return &kind;
        }
    }
    return nullptr;
}

} // namespace wire
