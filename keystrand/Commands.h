#pragma once

#include "KSTLib/Contexts.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/RequestSerialization.h"
#include "KSTLib/Serialization.h"
#include "base/ByteReader.h"
#include "base/NotCopied.h"
#include "keystrand/ContextTable.h"
#include "keystrand/CredentialSet.h"
#include "keystrand/DispatchTable.h"
#include "keystrand/PolicyTable.h"
#include "keystrand/Registry.h"
#include "keystrand/RestrictedModeController.h"

#include <cassert>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string_view>

namespace keystrand {

/// What the kernel service holds besides the restricted-mode timer.
struct KernelState {
    Registry registry;
    NumberedValues environment;
    ContextTable contexts;
    CredentialSet globalCredentials;
    PolicyTable policies;
    std::uint8_t logLevel = 40;
};

/// The time in seconds, which ages are counted in.
using Now = std::function<CredentialSet::Seconds()>;

/// The control codes of the kernel-control command. The table refers to its argument.
[[nodiscard]] DispatchTable makeKernelControls(RestrictedModeController& restrictedMode);

/// All commands of a frame. The table refers to the state and to the controls.
[[nodiscard]] DispatchTable makeCommands(KernelState& kernel, const Now& now,
                                         const DispatchTable& kernelControls);

/// The commands of a kernel side that keeps no credentials: environment variables and kernel
/// control. Those of contexts, credentials and policies are answered like any unknown one.
[[nodiscard]] DispatchTable makeServiceCommands(KernelState& kernel,
                                                const DispatchTable& kernelControls);

/// The groups of commands, a file of source for each.
void addContextCommands(DispatchTable& table, KernelState& kernel);
void addCredentialCommands(DispatchTable& table, KernelState& kernel, const Now& now);
void addPolicyCommands(DispatchTable& table, KernelState& kernel, const Now& now);
void addAccessListCommand(DispatchTable& table, KernelState& kernel);

/// A result whose output is a number: 1 for yes, 0 for no.
[[nodiscard]] inline CommandResult answeredWith(bool isYes) {
    const std::uint8_t flag = isYes ? 1 : 0;
    return {.status = kKernelSuccess, .output = {flag, 0, 0, 0}};
}

/// A result without output.
[[nodiscard]] inline CommandResult endedWith(KernelStatus status) {
    return {.status = status, .output = {}};
}

/// A payload that begins with the handle of a context. It has at least 16 bytes.
struct HandlePayload {
    explicit HandlePayload(std::span<const std::uint8_t> payload) : rest(payload) {
        [[maybe_unused]] const bool fits = rest.readBytes(handle.bytes, sizeof handle.bytes);
        assert(fits);
    }

    /// The next number; it is there.
    [[nodiscard]] std::uint32_t number() {
        std::uint32_t value = 0;
        [[maybe_unused]] const bool fits = rest.readU32(value);
        assert(fits);
        return value;
    }

    KSTHandle handle{};
    base::ByteReader rest;
};

/// Bytes that a deserialiser handed out.
struct ReceivedText : private base::NotCopied {
    ~ReceivedText() { DeallocDataBlob(data, length); }

    [[nodiscard]] std::string_view view() const {
        return data == nullptr ? std::string_view()
                               : std::string_view(static_cast<const char*>(data), length);
    }

    void* data = nullptr;
    std::uint32_t length = 0;
};

/// Parameters that a deserialiser handed out.
struct ReceivedParameters : private base::NotCopied {
    static constexpr KSTParameterType kUser = 4;
    static constexpr std::size_t kHeaderSize = sizeof(KSTParameterType) + sizeof(std::uint32_t);
    static constexpr std::size_t kMaxWireSize =
        kKSTMaxParameters * (kHeaderSize + kKSTParameterMaxDataLength);

    ~ReceivedParameters() { DeallocParameters(items, count); }

    [[nodiscard]] std::size_t wireSize() const;

    /// The user that the parameters name.
    [[nodiscard]] std::optional<std::uint32_t> user() const;
    /// Whether they name more than one.
    [[nodiscard]] bool disagreeAboutUser() const;

    KSTParameter* items = nullptr;
    std::uint32_t count = 0;
};

} // namespace keystrand
