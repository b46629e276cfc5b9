#pragma once

#include "KSTLib/Credential.h"

#include <cstddef>
#include <cstdint>
#include <span>

namespace kst {

/// What a type of credential prescribes.
struct CredentialType {
    std::uint32_t dataSize;
    /// The text of the check that a credential has that many bytes of data.
    const char* sizeCheck;
};

[[nodiscard]] constexpr bool isCredentialType(std::uint32_t type) noexcept {
    return type >= 1 && type <= kKSTCredentialTypeMax;
}

/// Null for a type that does not exist.
[[nodiscard]] const CredentialType* findCredentialType(std::uint32_t type) noexcept;

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
[[nodiscard]] std::uint32_t passphraseLength(const KSTCredential* credential) noexcept;

} // namespace kst
