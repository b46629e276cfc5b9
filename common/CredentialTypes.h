#pragma once

#include "KSTLib/Credential.h"
#include "wire/CredentialFields.h"

#include <cstddef>
#include <cstdint>

namespace kst {

/// What a type of credential prescribes.
struct CredentialType {
    std::uint32_t dataSize;
    /// The text of the check that a credential has that many bytes of data.
    const char* sizeCheck;
};

/// Null for a type that does not exist.
[[nodiscard]] const CredentialType* findCredentialType(std::uint32_t type) noexcept;

using wire::credentialBytes;
using wire::credentialData;
using wire::credentialSize;
using wire::isCredentialType;
using wire::passphraseLength;

/// The passphrase, whose length may be less than its place has.
inline constexpr std::uint32_t kPassphraseProperty = 200;
/// The identifier, which reads as nothing while it is all zeros.
inline constexpr std::uint32_t kIdentifierProperty = 100;

/// One property of a credential.
struct CredentialProperty {
    static constexpr std::size_t kInData = SIZE_MAX;

    std::uint32_t id;
    std::size_t length;
    /// The text of the check that the credential's type has the property. Null in the header.
    const char* typeCheck;
    /// The text of the check of a length to be set. Null: the property cannot be set.
    const char* lengthCheck;
    /// kInData: it is in the data area, where wire::kCredentialFields says.
    std::size_t headerOffset = kInData;

    [[nodiscard]] bool isInHeader() const { return headerOffset != kInData; }
};

/// Null when there is none of that number.
[[nodiscard]] const CredentialProperty* findCredentialProperty(std::uint32_t id) noexcept;

} // namespace kst
