#include "platform/fake/FakeHost.h"

#include <string_view>

namespace platform {

namespace {

/// The stream on which a change of the managed settings is announced.
constexpr std::string_view kSettingsStream = "com.zerva.notifyd.matching";

} // namespace

FakeHost::FakeHost(FakeMachine& machine)
    : registry(machine.kernel),
      channel(machine.kernel, registry),
      settings([this] { events.post(kSettingsStream, kSettingsChangedEvent); }),
      files(machine.disk, machine.realRoot),
      events(machine.clock, machine.alarms) {}

Host FakeHost::host() {
    return {log,
            registry,
            channel,
            events.events(),
            events.alarms(),
            events.transactions(),
            events.runLoop(),
            settings,
            files};
}

} // namespace platform
