#pragma once

#include "keystrand/CredentialSet.h"
#include "keystrand/PolicyRequirement.h"

#include <cstdint>
#include <optional>
#include <vector>

namespace keystrand {

inline constexpr std::uint32_t kNoAgeLimit = 0xffffffff;

/// What a requirement is held against.
struct Situation {
    const CredentialSet& own;
    const CredentialSet& global;
    /// In seconds. With 0 global credentials do not count; kNoAgeLimit lets every age count.
    std::uint32_t maxGlobalAge = 0;
    /// Who must be the user of the credentials where a leaf names none.
    std::optional<std::uint32_t> user;
    CredentialSet::Seconds now = 0;
};

/// The part of a requirement that is not met.
struct Missing {
    enum class State : std::uint32_t {
        /// Nothing that fits is there, or enough of the children are missing.
        absent = 1,
        /// A credential that fits is there but too old.
        tooOld = 2,
    };

    const PolicyRequirement* requirement = nullptr;
    State state = State::absent;
    /// How many of the children that are missing are still asked for.
    std::uint32_t needed = 0;
    /// Those children that are not met.
    std::vector<Missing> children;
};

/// None when the requirement is met. Every leaf is looked at for itself: one credential may meet
/// several. The requirement outlives the result.
[[nodiscard]] std::optional<Missing> whatIsMissing(const PolicyRequirement& requirement,
                                                   const Situation& situation);

/// The credentials of both sets that a requirement which is met uses up: those of its leaves that
/// are asked for once, of as many children as are needed, the first ones first. A leaf is met by
/// the oldest credential that fits, a context's own before a global one.
[[nodiscard]] std::vector<const KSTCredential*> whatIsUsedUp(const PolicyRequirement& requirement,
                                                             const Situation& situation);

/// The requirement tree that a client is told, on the wire: what is missing, each node with its
/// state and its priority. The data of the leaves are described in docs/client-guide.md.
[[nodiscard]] std::vector<std::uint8_t> encodeMissing(const Missing& missing);

} // namespace keystrand
