#include "common/CredentialTypes.h"

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

} // namespace kst
