#pragma once

#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace kstctl {

struct StatusCommand {};

struct EventsListCommand {
    /// The last so many; all of them without it.
    std::optional<std::uint64_t> limit;
    /// Only events of this type.
    std::optional<std::string> type;
};

struct EventsShowCommand {
    std::int64_t id = 0;
};

struct EventsExportCommand {
    /// A file that is not there yet; standard output without it.
    std::optional<std::string> output;
};

struct UploadCommand {
    bool isDryRun = false;
    /// Instead of that: the next upload is due.
    bool isNow = false;
    /// Milliseconds since 1970-01-01 UTC; now without it.
    std::optional<double> postTime;
};

struct SendCommand {
    std::string name;
    /// A stream or the short name of one.
    std::optional<std::string> stream{};
    std::optional<std::string> payload{};
    std::optional<std::string> date{};
    /// The name is sent as it is, known or not.
    bool isExact = false;
};

struct DecodeCommand {
    std::vector<std::string> digits;
    std::optional<std::string> kind;
    std::optional<std::string> payloadOf;
    /// "-" is standard input.
    std::optional<std::string> file;
    bool isHex = false;
    bool showSecrets = false;
};

struct SimCommand {
    std::vector<std::string> words;
};

struct DevicesCommand {
    /// The port of the device to let in; without it they are shown.
    std::optional<std::string> toAccept;
};

struct OpenCommand {
    /// 0 ends it.
    std::uint32_t seconds = 0;
};

struct LockCommand {
    /// The user's session is locked now, or is not any more.
    bool isLocked = true;
};

/// What the command line asks for.
struct CommandLine {
    std::string root = "/";
    bool isJSON = false;
    /// The longest wait for a database that is locked or a socket that is full.
    std::chrono::milliseconds patience{2000};
    std::variant<StatusCommand, EventsListCommand, EventsShowCommand, EventsExportCommand,
                 UploadCommand, SendCommand, DecodeCommand, SimCommand, DevicesCommand, OpenCommand,
                 LockCommand>
        command;
};

/// None when there is nothing to run; `status` is then the program's status, and what is to be said
/// has been said.
[[nodiscard]] std::optional<CommandLine> parseCommandLine(int argc, const char* const* argv,
                                                          ExitStatus& status);

/// What the program can be asked to do. Each shows its results on the environment's output and
/// returns what the program ends with.

[[nodiscard]] ExitStatus run(const StatusCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const EventsListCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const EventsShowCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const EventsExportCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const UploadCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const SendCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const DecodeCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const SimCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const DevicesCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const OpenCommand& command, const Environment& environment);
[[nodiscard]] ExitStatus run(const LockCommand& command, const Environment& environment);

} // namespace kstctl
