#pragma once

#include "base/NotCopied.h"
#include "platform/EventStream.h"
#include "platform/MainRunLoop.h"
#include "platform/ManagedSettings.h"
#include "platform/ProcessTransaction.h"
#include "tests/platform/contract/ContractTest.h"

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace contract {

/// A process with its events, on a system that keeps alarms. Its run loop has a source from the
/// start.
struct EventHostFixture : private base::NotCopied {
    virtual ~EventHostFixture() = default;

    virtual platform::EventStream& events() = 0;
    virtual platform::AlarmEvent& alarms() = 0;
    virtual platform::MainRunLoop& runLoop() = 0;
    virtual platform::ProcessTransactions& transactions() = 0;

    [[nodiscard]] virtual platform::Date now() = 0;

    /// An event arrives from outside the process. The streams are the two matching streams.
    virtual void post(std::string_view stream, std::string_view name) = 0;

    /// A device management changes the setting while the process runs.
    virtual void changeSetting(bool restrictedModeAllowed) = 0;
    virtual platform::ManagedSettings& settings() = 0;

    /// Whether a transaction is in hand.
    [[nodiscard]] virtual bool hasTransactions() = 0;

    /// Takes the run loop's sources away, as the end of an idle process does.
    virtual void closeSources() = 0;

    /// Ends the process and starts another one on the same system. What the functions above gave
    /// before is gone.
    virtual void restart() = 0;
};

class EventHostContract : public ContractTest<EventHostFixture> {
  protected:
    /// Notes the events of a stream in `delivered`.
    void listen(std::string_view stream);

    void post(std::string_view stream, std::string_view name) { fixture().post(stream, name); }

    /// Registers an alarm `nanoseconds` from now, or in the past when negative.
    void setAlarm(std::string_view event, std::int64_t nanoseconds);
    void setAlarmAt(std::string_view event, platform::Date date);
    void cancelAlarm(std::string_view event);

    /// Runs the loop until `count` events have been delivered in all. False when that takes too
    /// long or the loop cannot be run.
    [[nodiscard]] bool runUntilDelivered(std::size_t count);

    /// Runs the loop until an event that is posted now has been delivered, and takes it out of
    /// `delivered` again: whatever was to come before it has come.
    void drain();

    /// Lets the loop run for this long.
    void runFor(std::int64_t nanoseconds);

    /// Stream and name, with a slash between them.
    std::vector<std::string> delivered;

  private:
    [[nodiscard]] bool runUntil(const std::function<bool()>& done);
};

} // namespace contract
