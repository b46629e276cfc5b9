#include "kstctl/commands/EventNames.h"

#include "base/Concat.h"
#include "kstctl/ExitStatus.h"
#include "platform/ManagedSettings.h"
#include "wire/EventDatagram.h"
#include "wire/RestrictedMode.h"

#include <string_view>

namespace kstctl {

namespace {

using namespace wire::rm;

struct ShortName {
    std::string_view name;
    /// Put before what it stands for.
    std::string_view prefix;
    std::string_view whole;
    std::string_view stream = wire::kNotifydMatchingStream;
};

constexpr ShortName kEvents[] = {
    {"settings", "", platform::kSettingsChangedEvent},
    {"timer-restarted", kNotificationNamePrefix, kTimerRestartedProperty},
    {"analytics-collected", kNotificationNamePrefix, kAnalyticsCollectedProperty},
    {"save-analytics", kNotificationNamePrefix, kSaveAnalyticsProperty},
    {"timer-restarted-analytics", kNotificationNamePrefix,
     kTimerRestartedAnalyticsCollectedProperty},
    {"alarm", "", wire::kAlarmName, wire::kAlarmStream},
};

constexpr ShortName kStreams[] = {
    {"notifyd", "", wire::kNotifydMatchingStream},
    {"corvid", "", wire::kCorvidMatchingStream},
    {"alarm", "", wire::kAlarmStream},
};

template <std::size_t Count>
const ShortName* find(const ShortName (&names)[Count], std::string_view name) {
    for (const ShortName& candidate : names) {
        if (candidate.name == name) {
            return &candidate;
        }
    }
    return nullptr;
}

template <std::size_t Count>
platform::Result<std::string> wholeName(const ShortName (&names)[Count], const std::string& name,
                                        const char* what, bool isExact) {
    if (isExact) {
        return name;
    }
    if (const ShortName* const known = find(names, name)) {
        return base::concat(known->prefix, known->whole);
    }
    if (name.find('.') != std::string::npos) {
        return name;
    }
    return failure(ExitStatus::usage, base::concat("there is no ", what, ' ', name,
                                                   "; --exact sends it all the same"));
}

} // namespace

platform::Result<EventName> findEventName(const SendCommand& command) {
    auto name = wholeName(kEvents, command.name, "event", command.isExact);
    if (!name) {
        return name.error();
    }
    const ShortName* const known = find(kEvents, command.name);
    const std::string_view usual =
        known != nullptr ? known->stream : std::string_view(wire::kNotifydMatchingStream);
    auto stream = command.stream ? wholeName(kStreams, *command.stream, "stream", command.isExact)
                                 : platform::Result<std::string>(std::string(usual));
    if (!stream) {
        return stream.error();
    }
    return EventName{.stream = std::move(stream).value(), .name = std::move(name).value()};
}

} // namespace kstctl
