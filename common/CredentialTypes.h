#pragma once

#include "KSTLib/Credential.h"

#include <algorithm>
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

/// The passphrase, whose length may be less than its place has.
inline constexpr std::uint32_t kPassphraseProperty = 200;
/// The identifier, which reads as nothing while it is all zeros.
inline constexpr std::uint32_t kIdentifierProperty = 100;

/// One property of a credential.
struct CredentialProperty {
    struct Place {
        /// kEveryType: the place is in the header.
        std::uint32_t type;
        /// In the data area, or in the header.
        std::size_t offset;
    };
    static constexpr std::uint32_t kEveryType = 0;

    std::uint32_t id;
    std::size_t length;
    /// The text of the check that the credential's type has the property. Null in the header.
    const char* typeCheck;
    /// The text of the check of a length to be set. Null: the property cannot be set.
    const char* lengthCheck;
    std::span<const Place> places;

    [[nodiscard]] bool isInHeader() const { return places.front().type == kEveryType; }

    /// Null when a credential of that type does not have it.
    [[nodiscard]] const Place* placeIn(std::uint32_t type) const {
        const auto place =
            std::find_if(places.begin(), places.end(),
                         [type](const Place& candidate) { return candidate.type == type; });
        return place != places.end() ? &*place : nullptr;
    }
};

/// Null when there is none of that number.
[[nodiscard]] const CredentialProperty* findCredentialProperty(std::uint32_t id) noexcept;

} // namespace kst
