#include "platform/fake/FakeEventHost.h"

#include "base/Concat.h"
#include "platform/fake/FakeFormats.h"

#include <algorithm>

namespace platform {

FakeAlarmEvent::FakeAlarmEvent(FakeAlarmStore& store, Clock& clock, EventQueue& queue)
    : store_(store), clock_(clock), queue_(queue) {}

void FakeAlarmEvent::set(std::string_view stream, std::string_view event,
                         const EventDictionary* dictionary) {
    const Name name(stream, event);
    queue_.drop(stream, event);
    if (const auto date = alarmDateIn(dictionary)) {
        store_.save(name, *date);
        registrations_.put(name, *date);
        fireDue();
    } else {
        cancel(name);
    }
}

void FakeAlarmEvent::cancel(const Name& name) {
    store_.clear(name);
    registrations_.erase(name);
}

void FakeAlarmEvent::restore(std::string_view stream) {
    for (const auto& [name, date] : store_.all()) {
        if (name.first == stream) {
            registrations_.putIfAbsent(name, date);
        }
    }
    fireDue();
}

void FakeAlarmEvent::fireDue() {
    for (auto& [stream, event] : registrations_.takeDue(clock_.now())) {
        queue_.push({stream, event});
    }
}

void FakeAlarmEvent::delivered(const Event& event) {
    const Name name(event.stream, event.name);
    if (registrations_.hasFired(name) && !queue_.holds(event.stream, event.name)) {
        cancel(name);
    }
}

void FakeProcessTransactions::begin(std::string_view label) {
    open_.emplace_back(label);
    begun_.emplace_back(label);
}

void FakeProcessTransactions::end(std::string_view label) {
    const auto found = std::find(open_.begin(), open_.end(), label);
    if (found == open_.end()) {
        testError(base::concat("the transaction \"", label, "\" was ended and never begun"));
    }
    open_.erase(found);
}

FakeMainRunLoop::FakeMainRunLoop(EventQueue& queue, FakeAlarmEvent& alarms, FakeClock& clock)
    : queue_(queue), alarms_(alarms), clock_(clock) {}

bool FakeMainRunLoop::runOnce(Date deadline) {
    if (closed_) {
        return false;
    }
    alarms_.fireDue();
    if (queue_.empty()) {
        wait(deadline);
    }
    if (!closed_ && !queue_.empty()) {
        deliverOne();
    }
    return true;
}

void FakeMainRunLoop::wait(Date deadline) {
    const Date wakeUp = std::min(deadline, alarms_.next().value_or(kDistantFuture));
    if (wakeUp == kDistantFuture) {
        idle();
    } else {
        clock_.waitUntil(wakeUp);
    }
    alarms_.fireDue();
}

void FakeMainRunLoop::idle() {
    if (!idle_) {
        testError("the run loop would wait for ever; close the sources or set an idle hook");
    }
    // A copy, because the hook may replace itself.
    const std::function<void()> hook = idle_;
    hook();
    if (!hasReasonToRun()) {
        testError("the idle hook has given the run loop nothing to do");
    }
}

bool FakeMainRunLoop::hasReasonToRun() const {
    return closed_ || !queue_.empty() || alarms_.next().value_or(kDistantFuture) < kDistantFuture;
}

void FakeMainRunLoop::deliverOne() {
    const Event event = queue_.front();
    static_cast<void>(queue_.deliverOne());
    alarms_.delivered(event);
}

FakeEventHost::FakeEventHost(FakeClock& clock, FakeAlarmStore& alarmStore)
    : events_(queue_), alarms_(alarmStore, clock, queue_), runLoop_(queue_, alarms_, clock) {
    events_.setHandlerObserver([this](std::string_view stream) { alarms_.restore(stream); });
}

FakeEventHost::~FakeEventHost() {
    queue_ = EventQueue();
}

void FakeEventHost::post(std::string_view stream, std::string_view name) {
    queue_.push({std::string(stream), std::string(name)});
}

} // namespace platform
