#pragma once

#include "kstctl/Environment.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Options.h"

/// What the program can be asked to do. Each shows its results on the environment's output and
/// returns what the program ends with.
namespace kstctl {

[[nodiscard]] ExitStatus run(const StatusCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const EventsListCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const EventsShowCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const EventsExportCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const UploadCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const SendCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const DecodeCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const SimCommand& command, const Environment& environment);

} // namespace kstctl
