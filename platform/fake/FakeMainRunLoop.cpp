#include "platform/fake/FakeMainRunLoop.h"

#include "base/Concat.h"
#include "platform/fake/FakeFormats.h"

#include <algorithm>

namespace platform {

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

} // namespace platform
