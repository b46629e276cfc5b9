#pragma once

#include "KSTLib/Contexts.h"
#include "KSTLib/Credential.h"
#include "kstctl/Report.h"
#include "kstctl/decode/Decoded.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace kstctl::decode {

/// A command and what its payload is.
struct CommandPayload {
    std::uint8_t code = 0;
    std::string_view name = {};
    Decoder decode = nullptr;
};

/// All commands, by their codes.
[[nodiscard]] std::span<const CommandPayload> commandPayloads();

/// Null when there is no such command.
[[nodiscard]] const CommandPayload* findCommand(std::uint32_t code);

/// By its name or by its code in decimal; null when there is no such command.
[[nodiscard]] const CommandPayload* findCommand(std::string_view nameOrCode);

// The decoders of payloads that the library reads, too.
[[nodiscard]] Result decodeVerifyPolicy(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeVerifyAclConstraint(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeProcessAcl(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeCredentialCommand(Bytes bytes, Secrets secrets);

/// What an age limit of global credentials stands for when it is no number; else empty.
[[nodiscard]] inline const char* ageText(std::uint32_t maxGlobalCredentialAge) {
    return maxGlobalCredentialAge == 0xffffffffU ? "any age" : "";
}

/// Empty for a scope that does not exist.
[[nodiscard]] inline const char* scopeText(KSTScope scope) {
    switch (scope) {
    case kKSTScopeContext:
        return "context";
    case kKSTScopeGlobal:
        return "global";
    default:
        return "";
    }
}

/// The fields of a valid credential. A passphrase is told by its length unless secrets are shown.
[[nodiscard]] Report credentialFields(const KSTCredential& credential, Secrets secrets);

/// The name of a type of credential, empty for a type that does not exist.
[[nodiscard]] const char* credentialTypeText(std::uint32_t type);

/// What a user id stands for when it is nobody's; else empty.
[[nodiscard]] const char* userText(std::uint32_t userId);

} // namespace kstctl::decode
