#pragma once

#include "platform/Clock.h"
#include "platform/SystemLog.h"
#include "platform/linux/Paths.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace notify {

/// One event for the daemon.
struct Notice {
    std::string stream;
    std::string name;
    std::vector<std::uint8_t> payload;

    friend bool operator==(const Notice&, const Notice&) = default;
};

/// The managed settings have changed.
[[nodiscard]] Notice settingsNotice();

/// One for each registered alarm. One that is due carries its date and fires. One that is not
/// carries the present date, which fires nothing: the daemon then arms the alarm again.
[[nodiscard]] std::vector<Notice> alarmNotices(const platform::Paths& paths, platform::Clock& clock,
                                               platform::SystemLog& log);

/// The notices of one subject, "alarm" or "settings"; none when there is no such subject.
[[nodiscard]] std::optional<std::vector<Notice>> noticesOf(std::string_view subject,
                                                           const platform::Paths& paths,
                                                           platform::Clock& clock,
                                                           platform::SystemLog& log);

} // namespace notify
