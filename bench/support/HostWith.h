#pragma once

#include "platform/Host.h"

namespace bench {

/// `host` with another log and another run loop.
[[nodiscard]] inline platform::Host hostWith(const platform::Host& host, platform::SystemLog& log,
                                             platform::MainRunLoop& runLoop) {
    return {log,     host.registry, host.channel, host.events, host.alarms, host.transactions,
            runLoop, host.settings, host.files};
}

} // namespace bench
