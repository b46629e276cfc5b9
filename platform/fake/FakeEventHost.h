#pragma once

#include "platform/fake/FakeAlarmEvent.h"
#include "platform/fake/FakeAlarmStore.h"
#include "platform/fake/FakeClock.h"
#include "platform/fake/FakeEventStream.h"
#include "platform/fake/FakeMainRunLoop.h"
#include "platform/host/EventQueue.h"

#include <string>
#include <string_view>

namespace platform {

/// The events of one process: its streams, alarms, run loop and transactions over one queue and one
/// virtual clock. The clock and the alarm store belong to the machine: a second FakeEventHost on
/// the same ones is a process started later.
class FakeEventHost {
  public:
    FakeEventHost(FakeClock& clock, FakeAlarmStore& alarmStore);
    FakeEventHost(const FakeEventHost&) = delete;
    FakeEventHost& operator=(const FakeEventHost&) = delete;
    /// Destroys the handlers and what they hold first, while all that they may use is still there.
    ~FakeEventHost();

    [[nodiscard]] FakeEventStream& events() { return events_; }
    [[nodiscard]] FakeAlarmEvent& alarms() { return alarms_; }
    [[nodiscard]] FakeMainRunLoop& runLoop() { return runLoop_; }
    [[nodiscard]] FakeProcessTransactions& transactions() { return transactions_; }

    /// An event arrives from outside.
    void post(std::string_view stream, std::string_view name);

    /// The run loop has no source from now on; what is queued stays undelivered.
    void closeSources() { runLoop_.closeSources(); }

  private:
    EventQueue queue_;
    FakeEventStream events_;
    FakeAlarmEvent alarms_;
    FakeMainRunLoop runLoop_;
    FakeProcessTransactions transactions_;
};

} // namespace platform
