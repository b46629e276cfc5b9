#pragma once

#include "base/NotCopied.h"
#include "platform/Clock.h"
#include "platform/Date.h"
#include "platform/EventStream.h"
#include "platform/MainRunLoop.h"
#include "platform/ProcessTransaction.h"
#include "platform/fake/FakeClock.h"
#include "platform/host/AlarmRegistrations.h"
#include "platform/host/EventQueue.h"

#include <cstddef>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace platform {

/// The alarm registrations of a machine, which outlive its processes.
class FakeAlarmStore {
  public:
    /// Stream and event.
    using Name = std::pair<std::string, std::string>;

    void save(const Name& name, Date date) { dates_.insert_or_assign(name, date); }
    void clear(const Name& name) { dates_.erase(name); }

    /// The date registered for an event, or none.
    [[nodiscard]] std::optional<Date> date(std::string_view stream, std::string_view event) const {
        const auto found = dates_.find(Name(stream, event));
        return found == dates_.end() ? std::nullopt : std::optional(found->second);
    }

    [[nodiscard]] const std::map<Name, Date>& all() const { return dates_; }

  private:
    std::map<Name, Date> dates_;
};

/// The streams of a process over the queue that its host fills.
class FakeEventStream final : public EventStream {
  public:
    using HandlerObserver = std::function<void(std::string_view stream)>;

    explicit FakeEventStream(EventQueue& queue) : queue_(queue) {}

    void setHandler(std::string_view stream, Handler handler) override {
        queue_.setHandler(stream, std::move(handler));
        if (handlerSet_) {
            handlerSet_(stream);
        }
    }

    /// Called after a stream has got its handler.
    void setHandlerObserver(HandlerObserver observer) { handlerSet_ = std::move(observer); }

  private:
    EventQueue& queue_;
    HandlerObserver handlerSet_;
};

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

/// The events of one process: its streams, alarms, run loop and transactions over one queue and one
/// virtual clock. The clock and the alarm store belong to the machine: a second FakeEventHost on
/// the same ones is a process started later.
class FakeEventHost : private base::NotCopied {
  public:
    FakeEventHost(FakeClock& clock, FakeAlarmStore& alarmStore);
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
