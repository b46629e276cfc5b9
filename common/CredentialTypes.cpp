#include "common/CredentialTypes.h"

#include "KSTLib/Credential.h"

#include <algorithm>
#include <array>

namespace kst {

namespace {

constexpr CredentialType kMarker{0, "dataLength == 0"};

/// By type, from 1.
constexpr std::array<CredentialType, kKSTCredentialTypeMax> kTypes = {{
    {sizeof(KSTCredentialDataPasscodeValidated),
     "dataLength == sizeof(KSTCredentialDataPasscodeValidated)"},
    {sizeof(KSTCredentialDataPassphraseEntered),
     "dataLength == sizeof(KSTCredentialDataPassphraseEntered)"},
    {sizeof(KSTCredentialDataBiometryMatched),
     "dataLength == sizeof(KSTCredentialDataBiometryMatched)"},
    kMarker,
    kMarker,
    kMarker,
    {sizeof(KSTCredentialDataUserOutputDisplayed),
     "dataLength == sizeof(KSTCredentialDataUserOutputDisplayed)"},
    kMarker,
    {sizeof(KSTCredentialDataContinuityUnlock),
     "dataLength == sizeof(KSTCredentialDataContinuityUnlock)"},
    {sizeof(KSTCredentialDataPasscodeValidated2),
     "dataLength == sizeof(KSTCredentialDataPasscodeValidated2)"},
    kMarker,
    {sizeof(KSTCredentialDataKextDenyList), "dataLength == sizeof(KSTCredentialDataKextDenyList)"},
}};

// The record in memory is the record on the wire.
static_assert(sizeof(KSTCredential) == 32);
static_assert(offsetof(KSTCredential, userId) == 12);
static_assert(offsetof(KSTCredential, word16) == 16);
static_assert(offsetof(KSTCredential, dataLength) == 28);
static_assert(sizeof(KSTCredentialDataPasscodeValidated) == 28);
static_assert(offsetof(KSTCredentialDataPasscodeValidated, property100) == 12);
static_assert(sizeof(KSTCredentialDataPassphraseEntered) == 136);
static_assert(sizeof(KSTCredentialDataBiometryMatched) == 88);
static_assert(offsetof(KSTCredentialDataBiometryMatched, property302) == 20);
static_assert(offsetof(KSTCredentialDataBiometryMatched, property301) == 36);
static_assert(offsetof(KSTCredentialDataBiometryMatched, property100) == 72);
static_assert(sizeof(KSTCredentialDataUserOutputDisplayed) == 56);
static_assert(sizeof(KSTCredentialDataContinuityUnlock) == 24);
static_assert(offsetof(KSTCredentialDataContinuityUnlock, property100) == 8);
static_assert(sizeof(KSTCredentialDataPasscodeValidated2) == 36);
static_assert(sizeof(KSTCredentialDataKextDenyList) == 8);

} // namespace

const CredentialType* findCredentialType(std::uint32_t type) noexcept {
    return isCredentialType(type) ? &kTypes[type - 1] : nullptr;
}

namespace {

constexpr const char* kIsPasscode = "credential->type == kKSTCredentialTypePasscodeValidated";
constexpr const char* kIsPassphrase = "credential->type == kKSTCredentialTypePassphraseEntered";
constexpr const char* kIsBiometry = "credential->type == kKSTCredentialTypeBiometryMatched";
constexpr const char* kIsOutput = "credential->type == kKSTCredentialTypeUserOutputDisplayed";
constexpr const char* kIsPasscode2 = "credential->type == kKSTCredentialTypePasscodeValidated2";
constexpr const char* kIsDenyList = "credential->type == kKSTCredentialTypeKextDenyList";

constexpr const char* kHas16 = "dataLength == 16";
constexpr const char* kHas24 = "dataLength == 24";
constexpr const char* kHas32 = "dataLength == 32";
constexpr const char* kHasUuid = "dataLength == sizeof(uuid_t)";

constexpr std::array<CredentialProperty, 19> kProperties = {{
    {1, 8, nullptr, nullptr, offsetof(KSTCredential, word16)},
    {2, 4, nullptr, nullptr, offsetof(KSTCredential, word24)},
    {3, 4, nullptr, nullptr, offsetof(KSTCredential, type)},
    {4, 4, nullptr, nullptr, offsetof(KSTCredential, word4)},
    {5, 4, nullptr, "dataLength == sizeof(uid_t)", offsetof(KSTCredential, userId)},
    {kIdentifierProperty, 16, kIsBiometry, kHas16},
    {101, 4, kIsPasscode2, "dataLength == sizeof(uint32_t)"},
    {102, 4, kIsPasscode, "dataLength == sizeof(int32_t)"},
    {kPassphraseProperty, kKSTPassphraseMaxLength, kIsPassphrase, "dataLength <= 128"},
    {201, 4, kIsPassphrase, "dataLength == sizeof(KSTPassphrasePurpose)"},
    {300, 16, kIsBiometry, kHas16},
    {301, 32, kIsBiometry, kHas32},
    {302, 16, kIsBiometry, kHas16},
    {400, 32, kIsOutput, kHas32},
    {401, 24, kIsOutput, kHas24},
    {501, 16, kIsPasscode2, kHasUuid},
    {502, 16, kIsPasscode2, kHasUuid},
    {601, 4, kIsDenyList, "dataLength == sizeof(KSTKextDenyListFormat)"},
    {602, 4, kIsDenyList, "dataLength == sizeof(KSTKextDenyListRevision)"},
}};

/// Both tables speak of the same properties, in the same lengths.
static_assert(std::all_of(kProperties.begin(), kProperties.end(), [](const auto& property) {
    const auto& fields = wire::kCredentialFields;
    const auto has = [&property](const auto& field) {
        return field.property == property.id;
    };
    return std::any_of(fields.begin(), fields.end(), has) !=
               (property.headerOffset != CredentialProperty::kInData) &&
           std::all_of(fields.begin(), fields.end(), [&](const auto& field) {
               return !has(field) || field.length == property.length;
           });
}));

} // namespace

const CredentialProperty* findCredentialProperty(std::uint32_t id) noexcept {
    const auto* property =
        std::find_if(kProperties.begin(), kProperties.end(),
                     [id](const CredentialProperty& candidate) { return candidate.id == id; });
    return property != kProperties.end() ? property : nullptr;
}

} // namespace kst
