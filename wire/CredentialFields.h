#pragma once

#include "KSTLib/Credential.h"
#include "base/ByteReader.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <span>

/// Where the parts of a credential are: the record in memory is the record on the wire. The library
/// reads and writes properties by this table, and kstctl shows the fields by it.
namespace wire {

/// What a field of a data area is, and so how it is shown.
enum class CredentialForm { number, signedNumber, bytes, passphrase };

/// A field of the data area of one type of credential.
struct CredentialField {
    static constexpr std::uint32_t kNoProperty = 0;

    std::uint32_t type;
    /// By which number the library gives it, or kNoProperty.
    std::uint32_t property;
    const char* name;
    /// In the data area.
    std::size_t offset;
    /// Of a passphrase: how long it may be.
    std::size_t length;
    CredentialForm form;
};

namespace credential {

using Passcode = KSTCredentialDataPasscodeValidated;
using Passphrase = KSTCredentialDataPassphraseEntered;
using Biometry = KSTCredentialDataBiometryMatched;
using Output = KSTCredentialDataUserOutputDisplayed;
using Unlock = KSTCredentialDataContinuityUnlock;
using Passcode2 = KSTCredentialDataPasscodeValidated2;
using DenyList = KSTCredentialDataKextDenyList;

/// By types, and of one type in the order of the bytes.
inline constexpr CredentialField kFields[] = {
    {kKSTCredentialTypePasscodeValidated, 101, "property101", offsetof(Passcode, property101), 4,
     CredentialForm::number},
    {kKSTCredentialTypePasscodeValidated, 102, "property102", offsetof(Passcode, property102), 4,
     CredentialForm::signedNumber},
    {kKSTCredentialTypePasscodeValidated, CredentialField::kNoProperty, "dataWord8",
     offsetof(Passcode, word8), 4, CredentialForm::bytes},
    {kKSTCredentialTypePasscodeValidated, 100, "property100", offsetof(Passcode, property100), 16,
     CredentialForm::bytes},
    {kKSTCredentialTypePassphraseEntered, 201, "purpose", offsetof(Passphrase, purpose), 4,
     CredentialForm::number},
    {kKSTCredentialTypePassphraseEntered, CredentialField::kNoProperty, "passphraseLength",
     offsetof(Passphrase, passphraseLength), 4, CredentialForm::number},
    {kKSTCredentialTypePassphraseEntered, 200, "passphrase", offsetof(Passphrase, passphrase),
     kKSTPassphraseMaxLength, CredentialForm::passphrase},
    {kKSTCredentialTypeBiometryMatched, 101, "property101", offsetof(Biometry, property101), 4,
     CredentialForm::number},
    {kKSTCredentialTypeBiometryMatched, 300, "property300", offsetof(Biometry, property300), 16,
     CredentialForm::bytes},
    {kKSTCredentialTypeBiometryMatched, 302, "property302", offsetof(Biometry, property302), 16,
     CredentialForm::bytes},
    {kKSTCredentialTypeBiometryMatched, 301, "property301", offsetof(Biometry, property301), 32,
     CredentialForm::bytes},
    {kKSTCredentialTypeBiometryMatched, CredentialField::kNoProperty, "dataWord68",
     offsetof(Biometry, word68), 4, CredentialForm::bytes},
    {kKSTCredentialTypeBiometryMatched, 100, "property100", offsetof(Biometry, property100), 16,
     CredentialForm::bytes},
    {kKSTCredentialTypeUserOutputDisplayed, 400, "property400", offsetof(Output, property400), 32,
     CredentialForm::bytes},
    {kKSTCredentialTypeUserOutputDisplayed, 401, "property401", offsetof(Output, property401), 24,
     CredentialForm::bytes},
    {kKSTCredentialTypeContinuityUnlock, 101, "property101", offsetof(Unlock, property101), 4,
     CredentialForm::number},
    {kKSTCredentialTypeContinuityUnlock, CredentialField::kNoProperty, "dataWord4",
     offsetof(Unlock, word4), 4, CredentialForm::bytes},
    {kKSTCredentialTypeContinuityUnlock, 100, "property100", offsetof(Unlock, property100), 16,
     CredentialForm::bytes},
    {kKSTCredentialTypePasscodeValidated2, 101, "property101", offsetof(Passcode2, property101), 4,
     CredentialForm::number},
    {kKSTCredentialTypePasscodeValidated2, 501, "property501", offsetof(Passcode2, property501), 16,
     CredentialForm::bytes},
    {kKSTCredentialTypePasscodeValidated2, 502, "property502", offsetof(Passcode2, property502), 16,
     CredentialForm::bytes},
    {kKSTCredentialTypeKextDenyList, 601, "format", offsetof(DenyList, format), 4,
     CredentialForm::number},
    {kKSTCredentialTypeKextDenyList, 602, "revision", offsetof(DenyList, revision), 4,
     CredentialForm::number},
};

} // namespace credential

inline constexpr std::span<const CredentialField> kCredentialFields = credential::kFields;

/// Null when a credential of that type does not have the property in its data.
[[nodiscard]] constexpr const CredentialField* findCredentialField(std::uint32_t type,
                                                                   std::uint32_t property) {
    for (const CredentialField& field : kCredentialFields) {
        if (field.type == type && field.property == property) {
            return &field;
        }
    }
    return nullptr;
}

[[nodiscard]] constexpr bool isCredentialType(std::uint32_t type) noexcept {
    return type >= 1 && type <= kKSTCredentialTypeMax;
}

/// The bytes of a credential whose data area has `dataLength` bytes.
[[nodiscard]] constexpr std::size_t credentialSize(std::uint32_t dataLength) noexcept {
    return sizeof(KSTCredential) + dataLength;
}

[[nodiscard]] inline std::span<const std::uint8_t>
credentialBytes(const KSTCredential* credential) noexcept {
    return {reinterpret_cast<const std::uint8_t*>(credential),
            credentialSize(credential->dataLength)};
}

[[nodiscard]] inline std::span<const std::uint8_t>
credentialData(const KSTCredential* credential) noexcept {
    return credentialBytes(credential).subspan(sizeof(KSTCredential));
}

/// How much of the passphrase area is in use: never more than the area has.
[[nodiscard]] inline std::uint32_t passphraseLength(const KSTCredential* credential) noexcept {
    base::ByteReader reader(credentialData(credential));
    std::uint32_t length = 0;
    if (!reader.skip(offsetof(KSTCredentialDataPassphraseEntered, passphraseLength)) ||
        !reader.readU32(length)) {
        return 0;
    }
    const std::size_t room = std::min<std::size_t>(kKSTPassphraseMaxLength, reader.left());
    return std::min(length, static_cast<std::uint32_t>(room));
}

} // namespace wire
