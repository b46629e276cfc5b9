#pragma once

#include <string_view>

namespace keystrand {

/// Where events for the daemon go.
class EventPoster {
  public:
    EventPoster() = default;
    EventPoster(const EventPoster&) = delete;
    EventPoster& operator=(const EventPoster&) = delete;
    virtual ~EventPoster() = default;

    /// Takes the event over, to be delivered after all those taken earlier. False, with nothing
    /// taken, when the names are not those of an event or too many events wait already.
    virtual bool post(std::string_view stream, std::string_view name) = 0;
};

} // namespace keystrand
