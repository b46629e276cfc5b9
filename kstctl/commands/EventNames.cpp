#include "kstctl/commands/EventNames.h"

#include "base/Concat.h"
#include "kstctl/ExitStatus.h"
#include "platform/ManagedSettings.h"
#include "wire/EventDatagram.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>
#include <iterator>
#include <span>
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

constexpr ShortName kOtherEvents[] = {
    {"settings", "", platform::kSettingsChangedEvent},
    {"alarm", "", wire::kAlarmName, wire::kAlarmStream},
};

/// The kernel service's notifications and the events of others.
constexpr auto kEvents = [] {
    std::array<ShortName, std::size(kNotificationKinds) + std::size(kOtherEvents)> events{};
    auto* next = std::copy(std::begin(kOtherEvents), std::end(kOtherEvents), events.begin());
    for (const NotificationKind& kind : kNotificationKinds) {
        *next++ = {kind.shortName, kNotificationNamePrefix, kind.property};
    }
    return events;
}();

constexpr std::array kStreams = {
    ShortName{"notifyd", "", wire::kNotifydMatchingStream},
    ShortName{"corvid", "", wire::kCorvidMatchingStream},
    ShortName{"alarm", "", wire::kAlarmStream},
};

const ShortName* find(std::span<const ShortName> names, std::string_view name) {
    for (const ShortName& candidate : names) {
        if (candidate.name == name) {
            return &candidate;
        }
    }
    return nullptr;
}

platform::Result<std::string> wholeName(std::span<const ShortName> names, const std::string& name,
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
