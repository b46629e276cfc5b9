#pragma once

#include "kstctl/decode/Decoded.h"

#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace kstctl::decode {

/// A command and what its payload is.
struct CommandPayload {
    std::uint8_t code;
    std::string_view name;
    Decoder decode;
};

/// All commands, by their codes.
[[nodiscard]] std::span<const CommandPayload> commandPayloads();

/// Null when there is no such command.
[[nodiscard]] const CommandPayload* findCommand(std::uint32_t code);

/// By its name or by its code in decimal; null when there is no such command.
[[nodiscard]] const CommandPayload* findCommand(std::string_view nameOrCode);

// What the decoders of the table are, one for each layout.
[[nodiscard]] Result decodeNoPayload(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeHandle(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeVerifyPolicy(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeVerifyAclConstraint(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeProcessAcl(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeCredentialCommand(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeContainsCredentialType(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeRemoveCredentialsByType(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeContainsPassphrase(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeRemovePassphrases(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeSetEnvironmentVariable(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeGetEnvironmentVariable(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeKernelControl(Bytes bytes, Secrets secrets);

} // namespace kstctl::decode
