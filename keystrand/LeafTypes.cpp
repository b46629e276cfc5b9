#include "keystrand/LeafTypes.h"

#include "KSTLib/Credential.h"
#include "KSTLib/Requirement.h"

#include <algorithm>
#include <array>

namespace keystrand {

namespace {

constexpr std::uint32_t kAgeLimitSize = 4;
constexpr std::uint32_t kPurposeSize = 4;
constexpr std::uint32_t kBiometrySize = 4 + 16 + 16 + 32;
constexpr std::uint32_t kUserOutputSize = 32;

/// The numbers 4, 5 and 7 are composite requirements: what credentials of these types meet has
/// numbers above 12.
constexpr std::array kLeafTypes = {
    LeafType{"passcode", kKSTRequirementTypePasscodeValidated, kKSTCredentialTypePasscodeValidated,
             kAgeLimitSize},
    LeafType{"passphrase", kKSTRequirementTypePassphraseEntered,
             kKSTCredentialTypePassphraseEntered, kPurposeSize},
    LeafType{"biometry", kKSTRequirementTypeBiometryMatched, kKSTCredentialTypeBiometryMatched,
             kBiometrySize},
    LeafType{"marker-6", 6, kKSTCredentialTypeMarker6, 0},
    LeafType{"marker-8", 8, kKSTCredentialTypeMarker8, 0},
    LeafType{"continuity-unlock", 9, kKSTCredentialTypeContinuityUnlock, 0},
    LeafType{"passcode2", 10, kKSTCredentialTypePasscodeValidated2, 0},
    LeafType{"marker-11", 11, kKSTCredentialTypeMarker11, 0},
    LeafType{"kext-deny-list", 12, kKSTCredentialTypeKextDenyList, 0},
    LeafType{"user-output", kKSTRequirementTypeUserOutputDisplayed,
             kKSTCredentialTypeUserOutputDisplayed, kUserOutputSize},
    LeafType{"marker-4", 14, kKSTCredentialTypeMarker4, 0},
    LeafType{"marker-5", 15, kKSTCredentialTypeMarker5, 0},
    LeafType{"never", 16, LeafType::kNoCredential, 0},
};

} // namespace

std::span<const LeafType> leafTypes() {
    return kLeafTypes;
}

const LeafType* findLeafType(std::string_view name) {
    const auto* found = std::find_if(kLeafTypes.begin(), kLeafTypes.end(),
                                     [name](const LeafType& type) { return type.name == name; });
    return found == kLeafTypes.end() ? nullptr : found;
}

} // namespace keystrand
