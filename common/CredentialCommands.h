#pragma once

#include "KSTLib/Contexts.h"
#include "KSTLib/Credential.h"
#include "common/CommandSender.h"

#include <cstddef>
#include <cstdint>

/// The commands that concern the credentials of a context, for the library and for its LibCall
/// twins.
namespace kst {

/// A command whose payload carries a credential.
struct CredentialCommand {
    std::uint32_t code;
    KSTStatus (*getSize)(const KSTHandle* handle, const KSTCredential* credential, KSTScope scope,
                         std::size_t* outSize);
    KSTStatus (*serialize)(const KSTHandle* handle, const KSTCredential* credential, KSTScope scope,
                           void* outBuffer, std::size_t* outSize);
};

extern const CredentialCommand kAddCredential;
extern const CredentialCommand kRemoveCredential;
extern const CredentialCommand kReplacePassphrase;

/// Only the global scope needs no context. Otherwise kKSTErrorBadParameter.
[[nodiscard]] KSTStatus checkScope(const AssertionContext& report, KSTContextRef context,
                                   KSTScope scope) noexcept;

/// `checkScope`, and there must be a credential.
[[nodiscard]] KSTStatus checkCredential(const AssertionContext& report, KSTContextRef context,
                                        const KSTCredential* credential, KSTScope scope) noexcept;

/// Sends `command`. kKSTErrorOutOfMemory; or what its payload, or the transport, fails with.
[[nodiscard]] KSTStatus sendCredential(const CommandSender& sender,
                                       const CredentialCommand& command, KSTContextRef context,
                                       const KSTCredential* credential, KSTScope scope) noexcept;

/// Sends a command whose payload is the handle, or zeros, and two numbers. kKSTErrorOutOfMemory, or
/// what the transport fails with.
[[nodiscard]] KSTStatus sendNumbers(const CommandSender& sender, std::uint32_t code,
                                    KSTContextRef context, std::uint32_t first,
                                    std::uint32_t second, void* outData,
                                    std::size_t* outSize) noexcept;

} // namespace kst
