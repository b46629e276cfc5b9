#pragma once

#include "kstctl/Options.h"
#include "platform/Result.h"

#include <string>

namespace kstctl {

struct EventName {
    std::string stream;
    std::string name;
};

/// The names that a `send` means. A short name stands for its event and, unless the command says
/// otherwise, the stream on which that comes. Any other name must have a point in it or be sent
/// with --exact: it is a mistake otherwise (ExitStatus::usage), because the daemon drops what it
/// does not know.
[[nodiscard]] platform::Result<EventName> findEventName(const SendCommand& command);

} // namespace kstctl
