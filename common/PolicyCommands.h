#pragma once

#include "KSTLib/Contexts.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Requirement.h"
#include "common/CommandSender.h"

#include <cstddef>
#include <cstdint>

/// The commands that ask whether the credentials of a context suffice, for the library and for its
/// LibCall twin.
namespace kst {

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
