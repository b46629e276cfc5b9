#include "keystrand/KernelControls.h"

#include "wire/RestrictedMode.h"

#include <algorithm>
#include <optional>
#include <string_view>

namespace keystrand {

using namespace wire::rm;

namespace {

using Payload = std::span<const std::uint8_t>;

constexpr DispatchTable::Lengths exactly(std::size_t length) {
    return {.min = length, .max = length};
}

CommandResult refuse() {
    return {.status = kKernelBadPayload, .output = {}};
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
        return refuse();
    }
    return {.status = kKernelSuccess,
            .output = {},
            .afterwards = restrictedMode.daemonStarted(
                *allowed, bytesAt<kStateBlobSize>(payload, kDaemonStartedStateOffset))};
}

CommandResult setAllowed(RestrictedModeController& restrictedMode, Payload payload) {
    const auto allowed = flagOf(payload.front());
    if (!allowed) {
        return refuse();
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
        return refuse();
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

} // namespace keystrand
