#pragma once

#include <array>
#include <cstddef>
#include <functional>
#include <string>
#include <string_view>

namespace keystrand::sessions {

/// What a line is about; docs/keystrand-linux.md and packaging/systemd/keystrand.catalog explain
/// each.
enum class SessionsLine { logindAway, logindBack, asleepUntold, noDelay, noBus };

struct SessionsLineClass {
    SessionsLine about;
    /// By which lines of the class are found in the journal. Never given to another class.
    std::string_view messageId;
    /// By the numbers of syslog.
    int level;
};

inline constexpr int kWarning = 4;
inline constexpr int kInformation = 6;

/// The one list of the classes, in the order of the enumeration.
inline constexpr std::array<SessionsLineClass, 5> kSessionsLineClasses = {{
    {SessionsLine::logindAway, "93ee35aacbbe4f35b674c357f2add522", kWarning},
    {SessionsLine::logindBack, "3fe2f39080d9433e9ea02fb50dc4e103", kInformation},
    {SessionsLine::asleepUntold, "4d9a4c2e34ae4dcf9385ca305c87f3d5", kWarning},
    {SessionsLine::noDelay, "f78e002d36434f03ab73b882e2976c57", kWarning},
    {SessionsLine::noBus, "6efd24d9741043abb6767b6b8ffa8a64", kWarning},
}};

[[nodiscard]] constexpr const SessionsLineClass& classOf(SessionsLine about) {
    return kSessionsLineClasses[static_cast<std::size_t>(about)];
}

/// Takes a line for the log, without the name of the program.
using SessionsLog = std::function<void(SessionsLine about, const std::string& line)>;

} // namespace keystrand::sessions
