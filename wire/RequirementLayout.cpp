#include "wire/RequirementLayout.h"

#include <array>

namespace wire {

namespace {

constexpr std::uint32_t kEveryType = RequirementProperty::kEveryType;
constexpr std::size_t kData = sizeof(KSTRequirement);

constexpr const char* kIsBiometry = "requirement->type == kKSTRequirementTypeBiometryMatched";
/// Named after the credential, unlike the others.
constexpr const char* kIsPassphrase = "requirement->type == kKSTCredentialTypePassphraseEntered";
constexpr const char* kIsOutput = "requirement->type == kKSTRequirementTypeUserOutputDisplayed";
constexpr const char* kIsKofN = "requirement->type == kKSTRequirementTypeKofN";

constexpr std::array<RequirementProperty, 11> kProperties = {{
    {1, kEveryType, offsetof(KSTRequirement, type), 4, 4, nullptr},
    {2, kEveryType, offsetof(KSTRequirement, state), 4, 4, nullptr},
    {3, kEveryType, offsetof(KSTRequirement, priority), 4, 4, nullptr},
    {100, kKSTRequirementTypePasscodeValidated, kData, 4, 4, kIsBiometry},
    {100, kKSTRequirementTypeBiometryMatched, kData, 4, 4, kIsBiometry},
    {200, kKSTRequirementTypePassphraseEntered, kData, 4, 4, kIsPassphrase},
    {300, kKSTRequirementTypeBiometryMatched, kData + 4, 16, 8, kIsBiometry},
    {302, kKSTRequirementTypeBiometryMatched, kData + 20, 16, 8, kIsBiometry},
    {301, kKSTRequirementTypeBiometryMatched, kData + 36, 32, 8, kIsBiometry},
    {400, kKSTRequirementTypeUserOutputDisplayed, kData, 32, 0, kIsOutput},
    {700, kKSTRequirementTypeKofN, kData + offsetof(KSTRequirementDataKofN, k), 4, 4, kIsKofN},
}};

} // namespace

std::span<const RequirementProperty> requirementProperties() noexcept {
    return kProperties;
}

} // namespace wire
