#pragma once

#include "KSTLib/Contexts.h"
#include "KSTLib/Credential.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Requirement.h"
#include "common/Failure.h"

#include <cstddef>
#include <cstdint>

namespace kst {

/// How a family of functions sends its commands and reports what fails: the library over its own
/// channel, or a LibCall function over its caller's transport.
struct CommandSender {
    AssertionContext context;
    /// Not null.
    KSTTransport transport;

    /// Sends one command with third byte 0 and a null transport context. A failure is reported and
    /// returned.
    [[nodiscard]] KSTStatus send(std::uint32_t code, const void* inData, std::size_t inSize,
                                 void* outData, std::size_t* outSize,
                                 CheckPlace place = CheckPlace::here()) const {
        const KSTStatus err = transport(nullptr, code, 0, inData, inSize, outData, outSize);
        return err == kKSTErrorSuccess ? err : failCall(context, err, place);
    }
};

// The commands that concern the credentials of a context, for the library and for its LibCall
// twins.

/// A command whose payload carries a credential.
struct CredentialCommand {
    std::uint32_t code;
    KSTStatus (*getSize)(const KSTHandle* handle, const KSTCredential* credential, KSTScope scope,
                         std::size_t* outSize);
    KSTStatus (*serialize)(const KSTHandle* handle, const KSTCredential* credential, KSTScope scope,
                           void* outBuffer, std::size_t* outSize);
};

extern const CredentialCommand kAddCredential;
extern const CredentialCommand kRemoveCredential;
extern const CredentialCommand kReplacePassphrase;

/// Only the global scope needs no context. Otherwise kKSTErrorBadParameter.
[[nodiscard]] KSTStatus checkScope(const AssertionContext& report, KSTContextRef context,
                                   KSTScope scope) noexcept;

/// `checkScope`, and there must be a credential.
[[nodiscard]] KSTStatus checkCredential(const AssertionContext& report, KSTContextRef context,
                                        const KSTCredential* credential, KSTScope scope) noexcept;

/// Sends `command`. kKSTErrorOutOfMemory; or what its payload, or the transport, fails with.
[[nodiscard]] KSTStatus sendCredential(const CommandSender& sender,
                                       const CredentialCommand& command, KSTContextRef context,
                                       const KSTCredential* credential, KSTScope scope) noexcept;

/// Sends a command whose payload is the handle, or zeros, and two numbers. kKSTErrorOutOfMemory, or
/// what the transport fails with.
[[nodiscard]] KSTStatus sendNumbers(const CommandSender& sender, std::uint32_t code,
                                    KSTContextRef context, std::uint32_t first,
                                    std::uint32_t second, void* outData,
                                    std::size_t* outSize) noexcept;

// The commands that ask whether the credentials of a context suffice, for the library and for its
// LibCall twin.

/// The size of the reply that is offered.
inline constexpr std::size_t kPolicyReplySize = 4096;

/// What is asked beside the policy or the constraint itself.
struct PolicyQuestion {
    KSTContextRef context;
    bool preflight;
    std::uint32_t maxGlobalCredentialAge;
    const KSTParameter* parameters;
    std::uint32_t parametersCount;
};

struct PolicyAnswer {
    bool satisfied = false;
    /// The requirement tree, for DeallocRequirement, or null.
    KSTRequirement* requirement = nullptr;
};

/// Asks about the policy `policyId`. Context and policy are there. The reply is 4 bytes, not 0 when
/// satisfied, and behind them a requirement tree, which is looked at only when it is `wanted` and
/// which an answer that is satisfied may lack.
///
/// kKSTErrorBadParameter: the payload cannot carry that. kKSTErrorOutOfMemory.
/// kKSTErrorUnexpected: a reply below 4 bytes or above what was offered. Or what the transport or
/// DeserializeRequirement fails with. `answer` is set on success only.
[[nodiscard]] KSTStatus askAboutPolicy(const CommandSender& sender, const char* policyId,
                                       const PolicyQuestion& question, bool wanted,
                                       PolicyAnswer& answer) noexcept;

/// Asks about the constraint of `length` bytes at `aclConstraint`. All are there. As
/// `askAboutPolicy`.
[[nodiscard]] KSTStatus askAboutAclConstraint(const CommandSender& sender,
                                              const void* aclConstraint, std::uint32_t length,
                                              const PolicyQuestion& question, bool wanted,
                                              PolicyAnswer& answer) noexcept;

} // namespace kst
