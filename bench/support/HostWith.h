#pragma once

#include "platform/Host.h"

namespace bench {

/// `host` with another log and another run loop.
[[nodiscard]] inline platform::Host hostWith(const platform::Host& host, platform::SystemLog& log,
                                             platform::MainRunLoop& runLoop) {
    return {.log = log,
            .registry = host.registry,
            .channel = host.channel,
            .events = host.events,
            .alarms = host.alarms,
            .transactions = host.transactions,
            .runLoop = runLoop,
            .settings = host.settings,
            .files = host.files,
            .clock = host.clock,
            .propertyLists = host.propertyLists,
            .json = host.json,
            .defaults = host.defaults,
            .resources = host.resources,
            .version = host.version,
            .diagnostics = host.diagnostics,
            .queues = host.queues,
            .https = host.https};
}

} // namespace bench
