#pragma once

#include "platform/Host.h"

namespace platform {

/// What goes into the place of a host's own; null leaves the host's own.
struct HostParts {
    SystemLog* log = nullptr;
    EventStream* events = nullptr;
    MainRunLoop* runLoop = nullptr;
    PropertyLists* propertyLists = nullptr;
};

/// `host` with other parts, which must outlive its use too.
[[nodiscard]] inline Host hostWith(const Host& host, const HostParts& parts) {
    const auto chosen = [](auto* part, auto& own) -> auto& {
        return part != nullptr ? *part : own;
    };
    return {.log = chosen(parts.log, host.log),
            .registry = host.registry,
            .channel = host.channel,
            .events = chosen(parts.events, host.events),
            .alarms = host.alarms,
            .transactions = host.transactions,
            .runLoop = chosen(parts.runLoop, host.runLoop),
            .settings = host.settings,
            .files = host.files,
            .clock = host.clock,
            .propertyLists = chosen(parts.propertyLists, host.propertyLists),
            .json = host.json,
            .defaults = host.defaults,
            .resources = host.resources,
            .version = host.version,
            .diagnostics = host.diagnostics,
            .queues = host.queues,
            .https = host.https};
}

} // namespace platform
