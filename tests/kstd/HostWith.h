#pragma once

#include "platform/Host.h"

namespace kstd {

/// What a test puts in the place of a host's own; null leaves the host's own.
struct HostParts {
    platform::SystemLog* log = nullptr;
    platform::EventStream* events = nullptr;
    platform::PropertyLists* propertyLists = nullptr;
};

inline platform::Host hostWith(const HostParts& parts, const platform::Host& host) {
    return {.log = parts.log != nullptr ? *parts.log : host.log,
            .registry = host.registry,
            .channel = host.channel,
            .events = parts.events != nullptr ? *parts.events : host.events,
            .alarms = host.alarms,
            .transactions = host.transactions,
            .runLoop = host.runLoop,
            .settings = host.settings,
            .files = host.files,
            .clock = host.clock,
            .propertyLists =
                parts.propertyLists != nullptr ? *parts.propertyLists : host.propertyLists,
            .json = host.json,
            .defaults = host.defaults,
            .resources = host.resources,
            .version = host.version,
            .diagnostics = host.diagnostics,
            .queues = host.queues,
            .https = host.https};
}

} // namespace kstd
