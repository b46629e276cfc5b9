#pragma once

#include "platform/Clock.h"
#include "platform/EventStream.h"
#include "platform/fake/FakeAlarmStore.h"
#include "platform/host/AlarmRegistrations.h"
#include "platform/host/EventQueue.h"

#include <optional>
#include <string_view>

namespace platform {

/// The alarms of a process, on the registrations of its machine.
///
/// A registration ends when the handler of its event has returned, so that a process that ends in
/// between leaves an alarm that fires again. The registrations of a stream are taken up when the
/// stream gets its handler.
class FakeAlarmEvent final : public AlarmEvent {
  public:
    FakeAlarmEvent(FakeAlarmStore& store, Clock& clock, EventQueue& queue);

    void set(std::string_view stream, std::string_view event,
             const EventDictionary* dictionary) override;

    /// Takes up what the machine has registered for the stream.
    void restore(std::string_view stream);

    /// Queues the events of the alarms that are due, in the order of their dates.
    void fireDue();

    /// The event's handler has returned.
    void delivered(const Event& event);

    /// When the next alarm that has not fired is due.
    [[nodiscard]] std::optional<Date> next() const { return registrations_.next(); }

  private:
    using Name = AlarmRegistrations::Name;

    void cancel(const Name& name);

    FakeAlarmStore& store_;
    Clock& clock_;
    EventQueue& queue_;
    AlarmRegistrations registrations_;
};

} // namespace platform
