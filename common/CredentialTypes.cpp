#include "common/CredentialTypes.h"

#include "KSTLib/Credential.h"
#include "base/ByteReader.h"

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

std::uint32_t passphraseLength(const KSTCredential* credential) noexcept {
    base::ByteReader reader(credentialData(credential));
    std::uint32_t length = 0;
    if (!reader.skip(offsetof(KSTCredentialDataPassphraseEntered, passphraseLength)) ||
        !reader.readU32(length)) {
        return 0;
    }
    const std::size_t room = std::min<std::size_t>(kKSTPassphraseMaxLength, reader.left());
    return std::min(length, static_cast<std::uint32_t>(room));
}

namespace {

using Place = CredentialProperty::Place;
using Passcode = KSTCredentialDataPasscodeValidated;
using Passphrase = KSTCredentialDataPassphraseEntered;
using Biometry = KSTCredentialDataBiometryMatched;
using Output = KSTCredentialDataUserOutputDisplayed;
using Unlock = KSTCredentialDataContinuityUnlock;
using Passcode2 = KSTCredentialDataPasscodeValidated2;
using DenyList = KSTCredentialDataKextDenyList;

template <std::uint32_t Type, std::size_t Offset>
constexpr Place kOnlyPlace[] = {{Type, Offset}};

template <std::size_t Offset>
constexpr std::span<const Place> kHeader = kOnlyPlace<CredentialProperty::kEveryType, Offset>;

constexpr Place kPlacesOf100[] = {
    {kKSTCredentialTypePasscodeValidated, offsetof(Passcode, property100)},
    {kKSTCredentialTypeBiometryMatched, offsetof(Biometry, property100)},
    {kKSTCredentialTypeContinuityUnlock, offsetof(Unlock, property100)},
};

constexpr Place kPlacesOf101[] = {
    {kKSTCredentialTypePasscodeValidated, offsetof(Passcode, property101)},
    {kKSTCredentialTypeBiometryMatched, offsetof(Biometry, property101)},
    {kKSTCredentialTypeContinuityUnlock, offsetof(Unlock, property101)},
    {kKSTCredentialTypePasscodeValidated2, offsetof(Passcode2, property101)},
};

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
    {1, 8, nullptr, nullptr, kHeader<offsetof(KSTCredential, word16)>},
    {2, 4, nullptr, nullptr, kHeader<offsetof(KSTCredential, word24)>},
    {3, 4, nullptr, nullptr, kHeader<offsetof(KSTCredential, type)>},
    {4, 4, nullptr, nullptr, kHeader<offsetof(KSTCredential, word4)>},
    {5, 4, nullptr, "dataLength == sizeof(uid_t)", kHeader<offsetof(KSTCredential, userId)>},
    {kIdentifierProperty, 16, kIsBiometry, kHas16, kPlacesOf100},
    {101, 4, kIsPasscode2, "dataLength == sizeof(uint32_t)", kPlacesOf101},
    {102, 4, kIsPasscode, "dataLength == sizeof(int32_t)",
     kOnlyPlace<kKSTCredentialTypePasscodeValidated, offsetof(Passcode, property102)>},
    {kPassphraseProperty, kKSTPassphraseMaxLength, kIsPassphrase, "dataLength <= 128",
     kOnlyPlace<kKSTCredentialTypePassphraseEntered, offsetof(Passphrase, passphrase)>},
    {201, 4, kIsPassphrase, "dataLength == sizeof(KSTPassphrasePurpose)",
     kOnlyPlace<kKSTCredentialTypePassphraseEntered, offsetof(Passphrase, purpose)>},
    {300, 16, kIsBiometry, kHas16,
     kOnlyPlace<kKSTCredentialTypeBiometryMatched, offsetof(Biometry, property300)>},
    {301, 32, kIsBiometry, kHas32,
     kOnlyPlace<kKSTCredentialTypeBiometryMatched, offsetof(Biometry, property301)>},
    {302, 16, kIsBiometry, kHas16,
     kOnlyPlace<kKSTCredentialTypeBiometryMatched, offsetof(Biometry, property302)>},
    {400, 32, kIsOutput, kHas32,
     kOnlyPlace<kKSTCredentialTypeUserOutputDisplayed, offsetof(Output, property400)>},
    {401, 24, kIsOutput, kHas24,
     kOnlyPlace<kKSTCredentialTypeUserOutputDisplayed, offsetof(Output, property401)>},
    {501, 16, kIsPasscode2, kHasUuid,
     kOnlyPlace<kKSTCredentialTypePasscodeValidated2, offsetof(Passcode2, property501)>},
    {502, 16, kIsPasscode2, kHasUuid,
     kOnlyPlace<kKSTCredentialTypePasscodeValidated2, offsetof(Passcode2, property502)>},
    {601, 4, kIsDenyList, "dataLength == sizeof(KSTKextDenyListFormat)",
     kOnlyPlace<kKSTCredentialTypeKextDenyList, offsetof(DenyList, format)>},
    {602, 4, kIsDenyList, "dataLength == sizeof(KSTKextDenyListRevision)",
     kOnlyPlace<kKSTCredentialTypeKextDenyList, offsetof(DenyList, revision)>},
}};

} // namespace

const CredentialProperty* findCredentialProperty(std::uint32_t id) noexcept {
    const auto* property =
        std::find_if(kProperties.begin(), kProperties.end(),
                     [id](const CredentialProperty& candidate) { return candidate.id == id; });
    return property != kProperties.end() ? property : nullptr;
}

} // namespace kst
