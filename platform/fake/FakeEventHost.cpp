#include "platform/fake/FakeEventHost.h"

namespace platform {

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
