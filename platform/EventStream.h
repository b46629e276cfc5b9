#pragma once

#include "base/NotCopied.h"
#include "platform/Date.h"

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// What an event brings along. The name is the value of the stream's standard name key.
struct Event {
    std::string stream;
    std::string name;
};

/// The on-demand event streams of the process, delivered on the main queue: handlers run on the
/// main thread, from within MainRunLoop::runOnce, one event after the other in the order of their
/// arrival over all streams.
class EventStream : private base::NotCopied {
  public:
    using Handler = std::function<void(const Event&)>;

    virtual ~EventStream() = default;

    /// Makes `handler` the receiver of the stream's events. Events that the system queued before
    /// are delivered too, once the run loop runs. The handler and what it holds live until the
    /// EventStream is destroyed or the handler is replaced; it may register handlers and alarms.
    virtual void setHandler(std::string_view stream, Handler handler) = 0;
};

/// The values under which an event is registered.
using EventDictionary = std::map<std::string, Date, std::less<>>;

/// The key of an alarm's date.
inline constexpr char kAlarmDateKey[] = "Date";

/// The date under kAlarmDateKey; none when it is not there or `dictionary` is null.
[[nodiscard]] inline std::optional<Date> alarmDateIn(const EventDictionary* dictionary) {
    if (dictionary == nullptr) {
        return std::nullopt;
    }
    const auto date = dictionary->find(kAlarmDateKey);
    return date == dictionary->end() ? std::nullopt : std::optional(date->second);
}

/// Registration of events that the system fires at a date.
///
/// Called on the main thread only. There is one registration for a stream and event name. It is
/// kept by the system, not by the process: a process started later receives an alarm that became
/// due while nobody ran.
class AlarmEvent : private base::NotCopied {
  public:
    virtual ~AlarmEvent() = default;

    /// Registers the event with the date under kAlarmDateKey, or cancels it when `dictionary` is
    /// null or holds no date. A registration replaces the earlier one of the same name, and an
    /// event of the earlier one that was not delivered yet is dropped; cancelling what is not
    /// registered does nothing.
    ///
    /// The event is delivered once: at its date, at once when the date is past, and at the latest
    /// date that the system can express when the date lies beyond it. It follows the wall clock
    /// when that is set.
    virtual void set(std::string_view stream, std::string_view event,
                     const EventDictionary* dictionary) = 0;
};

} // namespace platform
