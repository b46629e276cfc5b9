#include "keystrand/Commands.h"

#include "KSTLib/Command.h"
#include "base/ByteReader.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <cassert>
#include <optional>
#include <span>
#include <string_view>

namespace keystrand {

using namespace wire::rm;

namespace {

using Payload = std::span<const std::uint8_t>;

constexpr std::size_t kNumberSize = sizeof(std::uint32_t);

std::uint32_t numberOf(const KSTParameter& parameter) {
    std::uint32_t number = 0;
    base::ByteReader reader(parameter.parameterData, parameter.parameterDataLength);
    // The deserialisers let no user through that is of another length.
    static_cast<void>(reader.readU32(number));
    return number;
}

} // namespace

std::size_t ReceivedParameters::wireSize() const {
    std::size_t size = 0;
    for (const KSTParameter& parameter : std::span(items, count)) {
        size += kHeaderSize + parameter.parameterDataLength;
    }
    return size;
}

std::optional<std::uint32_t> ReceivedParameters::user() const {
    for (const KSTParameter& parameter : std::span(items, count)) {
        if (parameter.type == kUser) {
            return numberOf(parameter);
        }
    }
    return std::nullopt;
}

bool ReceivedParameters::disagreeAboutUser() const {
    const auto first = user();
    const std::span all(items, count);
    return std::any_of(all.begin(), all.end(), [&](const KSTParameter& parameter) {
        return parameter.type == kUser && numberOf(parameter) != first;
    });
}

namespace {

constexpr DispatchTable::Lengths exactly(std::size_t length) {
    return {.min = length, .max = length};
}

std::optional<bool> flagOf(std::uint8_t byte) {
    return byte <= 1 ? std::optional(byte == 1) : std::nullopt;
}

CommandResult daemonStarted(RestrictedModeController& restrictedMode, Payload payload) {
    const auto allowed = flagOf(payload[kDaemonStartedAllowedOffset]);
    const Payload reserved =
        payload.subspan(kDaemonStartedAllowedOffset + 1,
                        kDaemonStartedStateOffset - kDaemonStartedAllowedOffset - 1);
    if (!allowed || std::any_of(reserved.begin(), reserved.end(), [](auto b) { return b != 0; })) {
        return endedWith(kKernelBadPayload);
    }
    return {.status = kKernelSuccess,
            .output = {},
            .afterwards = restrictedMode.daemonStarted(
                *allowed, bytesAt<kStateBlobSize>(payload, kDaemonStartedStateOffset))};
}

CommandResult setAllowed(RestrictedModeController& restrictedMode, Payload payload) {
    const auto allowed = flagOf(payload.front());
    if (!allowed) {
        return endedWith(kKernelBadPayload);
    }
    restrictedMode.setAllowed(*allowed);
    return {};
}

/// A name that ends at the first zero, after which there are only zeros.
std::optional<std::string_view> zeroFilledName(Payload payload) {
    const std::string_view field(reinterpret_cast<const char*>(payload.data()), payload.size());
    const std::string_view name = field.substr(0, field.find('\0'));
    if (name.empty() || field.find_first_not_of('\0', name.size()) != std::string_view::npos) {
        return std::nullopt;
    }
    return name;
}

CommandResult acknowledge(RestrictedModeController& restrictedMode, Payload payload) {
    const auto name = zeroFilledName(payload);
    if (!name) {
        return endedWith(kKernelBadPayload);
    }
    restrictedMode.acknowledge(*name);
    return {};
}

} // namespace

DispatchTable makeKernelControls(RestrictedModeController& restrictedMode) {
    DispatchTable table;
    table.add(kKSTKernelControlRMDaemonStarted, exactly(kDaemonStartedPayloadSize),
              [&](Payload payload) { return daemonStarted(restrictedMode, payload); });
    table.add(kKSTKernelControlRMSetAllowed, exactly(kSetAllowedPayloadSize),
              [&](Payload payload) { return setAllowed(restrictedMode, payload); });
    table.add(kKSTKernelControlRMRestoreAnalytics, exactly(kAnalyticsBlobSize),
              [&](Payload payload) {
                  restrictedMode.restoreAnalytics(bytesAt<kAnalyticsBlobSize>(payload, 0));
                  return CommandResult{};
              });
    table.add(kKSTKernelControlRMNotificationAck, exactly(kNotificationAckPayloadSize),
              [&](Payload payload) { return acknowledge(restrictedMode, payload); });
    return table;
}

namespace {

/// Every command of this file begins with a number; the table has checked that it is there.
struct NumberedPayload {
    explicit NumberedPayload(Payload payload) {
        base::ByteReader reader(payload);
        [[maybe_unused]] const bool fits = reader.readU32(number);
        assert(fits);
        rest = reader.rest();
    }

    std::uint32_t number = 0;
    Payload rest;
};

CommandResult setVariable(NumberedValues& environment, Payload payload) {
    const NumberedPayload variable(payload);
    if (!environment.set(variable.number, variable.rest)) {
        return endedWith(kKernelTableFull);
    }
    return {};
}

CommandResult getVariable(const NumberedValues& environment, Payload payload) {
    const Payload value = environment.get(NumberedPayload(payload).number);
    return {.status = kKernelSuccess, .output = {value.begin(), value.end()}};
}

CommandResult kernelControl(const DispatchTable& controls, Payload payload) {
    const NumberedPayload control(payload);
    return controls.run(control.number, control.rest);
}

} // namespace

DispatchTable makeServiceCommands(KernelState& kernel, const DispatchTable& kernelControls) {
    DispatchTable table;
    table.add(kKSTCommandSetEnvironmentVariable,
              {.min = kNumberSize, .max = kNumberSize + kKSTEnvironmentVariableMaxSize},
              [&](Payload payload) { return setVariable(kernel.environment, payload); });
    table.add(kKSTCommandGetEnvironmentVariable, {.min = kNumberSize, .max = kNumberSize},
              [&](Payload payload) { return getVariable(kernel.environment, payload); });
    table.add(kKSTCommandKernelControl,
              {.min = kNumberSize, .max = kNumberSize + kKSTKernelControlMaxSize},
              [&](Payload payload) { return kernelControl(kernelControls, payload); });
    return table;
}

DispatchTable makeCommands(KernelState& kernel, const Now& now,
                           const DispatchTable& kernelControls) {
    DispatchTable table = makeServiceCommands(kernel, kernelControls);
    addContextCommands(table, kernel);
    addCredentialCommands(table, kernel, now);
    addPolicyCommands(table, kernel, now);
    addAccessListCommand(table, kernel);
    return table;
}

} // namespace keystrand
