#pragma once

#include "base/NotCopied.h"
#include "keystrand/NotificationRecord.h"
#include "keystrand/Registry.h"

#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

namespace keystrand {

/// Where events for the daemon go.
class EventPoster : private base::NotCopied {
  public:
    virtual ~EventPoster() = default;

    /// Takes the event over, to be delivered after all those taken earlier. False, with nothing
    /// taken, when the names are not those of an event or too many events wait already.
    virtual bool post(std::string_view stream, std::string_view name) = 0;
};

/// Puts records into their properties and posts the events that announce them. The registry and
/// the poster outlive it.
class NotificationPublisher {
  public:
    NotificationPublisher(Registry& registry, EventPoster& events)
        : registry_(registry), events_(events) {}

    /// False when the record could not be put into the registry or its event was not taken.
    bool publish(const Notification& notification);

    /// The records that are not acknowledged, in the order in which they were published.
    [[nodiscard]] std::vector<Registry::Record> unacknowledged() const {
        return registry_.records();
    }

    /// Posts the event of each of these records again that is still there. It announces nothing
    /// anew: the first acknowledgement drops the record, whatever other events are on their way.
    void postAgain(const std::vector<Registry::Record>& records);

    [[nodiscard]] std::uint64_t publishedCount() const { return publishedCount_; }

    /// What the last records of types 1 and 3 gave the daemon to keep.
    [[nodiscard]] const std::optional<StateBytes>& lastState() const { return lastState_; }
    [[nodiscard]] const std::optional<AnalyticsBytes>& lastAnalytics() const {
        return lastAnalytics_;
    }

  private:
    bool postEventOf(std::string_view property);
    void rememberKept(const Notification& notification);

    Registry& registry_;
    EventPoster& events_;
    std::uint64_t publishedCount_ = 0;
    std::optional<StateBytes> lastState_;
    std::optional<AnalyticsBytes> lastAnalytics_;
};

} // namespace keystrand
