#pragma once

#include "KSTLib/Credential.h"
#include "kstctl/Report.h"
#include "kstctl/decode/Decoded.h"

namespace kstctl::decode {

/// The fields of a valid credential. A passphrase is told by its length unless secrets are shown.
[[nodiscard]] Report credentialFields(const KSTCredential& credential, Secrets secrets);

/// The name of a type of credential, empty for a type that does not exist.
[[nodiscard]] const char* credentialTypeText(std::uint32_t type);

/// What a user id stands for when it is nobody's; else empty.
[[nodiscard]] const char* userText(std::uint32_t userId);

} // namespace kstctl::decode
