#include "kstd-notify/Notice.h"

#include "base/ByteWriter.h"
#include "platform/ManagedSettings.h"
#include "platform/linux/alarms/AlarmStore.h"
#include "wire/EventDatagram.h"

#include <algorithm>

namespace notify {

namespace {

std::vector<std::uint8_t> bytesOf(platform::Date date) {
    std::vector<std::uint8_t> bytes(sizeof date.nanosecondsSince1970);
    base::ByteWriter writer(bytes);
    static_cast<void>(writer.writeU64(static_cast<std::uint64_t>(date.nanosecondsSince1970)));
    return bytes;
}

} // namespace

Notice settingsNotice() {
    return {wire::kNotifydMatchingStream, platform::kSettingsChangedEvent, {}};
}

std::vector<Notice> alarmNotices(const platform::Paths& paths, platform::Clock& clock,
                                 platform::SystemLog& log) {
    std::vector<Notice> notices;
    const platform::Date now = clock.now();
    for (const auto& [event, date] :
         platform::AlarmStore(paths.alarmDirectory(), {wire::kAlarmName}, log)
             .load(wire::kAlarmStream)) {
        notices.push_back({wire::kAlarmStream, event, bytesOf(std::min(date, now))});
    }
    return notices;
}

std::optional<std::vector<Notice>> noticesOf(std::string_view subject, const platform::Paths& paths,
                                             platform::Clock& clock, platform::SystemLog& log) {
    if (subject == "settings") {
        return std::vector{settingsNotice()};
    }
    if (subject == "alarm") {
        return alarmNotices(paths, clock, log);
    }
    return std::nullopt;
}

} // namespace notify
