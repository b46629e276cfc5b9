#pragma once

#include "platform/MainRunLoop.h"
#include "platform/ProcessTransaction.h"
#include "platform/fake/FakeAlarmEvent.h"
#include "platform/fake/FakeClock.h"
#include "platform/host/EventQueue.h"

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace platform {

/// Transactions that are counted and remembered. Ending one that was not begun is an error in the
/// test or in what it tests.
class FakeProcessTransactions final : public ProcessTransactions {
  public:
    void begin(std::string_view label) override;
    void end(std::string_view label) override;

    [[nodiscard]] std::size_t count() const { return open_.size(); }

    /// The labels of those that have begun and not ended, in the order of their beginning.
    [[nodiscard]] const std::vector<std::string>& open() const { return open_; }

    /// The labels of all that ever began.
    [[nodiscard]] const std::vector<std::string>& begun() const { return begun_; }

  private:
    std::vector<std::string> open_;
    std::vector<std::string> begun_;
};

/// A run loop that delivers one queued event a turn and, with none queued, lets the clock jump to
/// the next alarm or the deadline, whichever comes first.
///
/// With no event, no alarm and no deadline to wait for, it calls the idle hook, which must post an
/// event, set an alarm or close the sources. Without a hook that is an error in the test.
class FakeMainRunLoop final : public MainRunLoop {
  public:
    FakeMainRunLoop(EventQueue& queue, FakeAlarmEvent& alarms, FakeClock& clock);

    [[nodiscard]] bool runOnce(Date deadline) override;

    /// The loop has no source from now on: it delivers nothing any more.
    void closeSources() { closed_ = true; }

    void onIdle(std::function<void()> hook) { idle_ = std::move(hook); }

  private:
    void wait(Date deadline);
    void idle();
    [[nodiscard]] bool hasReasonToRun() const;
    void deliverOne();

    EventQueue& queue_;
    FakeAlarmEvent& alarms_;
    FakeClock& clock_;
    std::function<void()> idle_;
    bool closed_ = false;
};

} // namespace platform
