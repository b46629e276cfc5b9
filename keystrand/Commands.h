#pragma once

#include "KSTLib/Contexts.h"
#include "base/ByteReader.h"
#include "keystrand/DispatchTable.h"
#include "keystrand/KernelState.h"

#include <cassert>
#include <cstdint>
#include <functional>
#include <span>

namespace keystrand {

/// The time in seconds, which ages are counted in.
using Now = std::function<CredentialSet::Seconds()>;

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

} // namespace keystrand
