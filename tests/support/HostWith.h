#pragma once

#include "platform/Host.h"

namespace support {

/// What goes into the place of a host's own; null leaves the host's own.
struct HostParts {
    platform::SystemLog* log = nullptr;
    platform::EventStream* events = nullptr;
    platform::AlarmEvent* alarms = nullptr;
    platform::MainRunLoop* runLoop = nullptr;
    platform::ManagedSettings* settings = nullptr;
    platform::Files* files = nullptr;
    platform::Clock* clock = nullptr;
    platform::PropertyLists* propertyLists = nullptr;
};

/// `host` with other parts, which must outlive its use too.
[[nodiscard]] inline platform::Host hostWith(const platform::Host& host, const HostParts& parts) {
    const auto chosen = [](auto* part, auto& own) -> auto& {
        return part != nullptr ? *part : own;
    };
    return {.log = chosen(parts.log, host.log),
            .registry = host.registry,
            .channel = host.channel,
            .events = chosen(parts.events, host.events),
            .alarms = chosen(parts.alarms, host.alarms),
            .transactions = host.transactions,
            .runLoop = chosen(parts.runLoop, host.runLoop),
            .settings = chosen(parts.settings, host.settings),
            .files = chosen(parts.files, host.files),
            .clock = chosen(parts.clock, host.clock),
            .propertyLists = chosen(parts.propertyLists, host.propertyLists),
            .json = host.json,
            .defaults = host.defaults,
            .resources = host.resources,
            .version = host.version,
            .diagnostics = host.diagnostics,
            .queues = host.queues,
            .https = host.https};
}

} // namespace support
