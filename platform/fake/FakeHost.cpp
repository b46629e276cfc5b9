#include "platform/fake/FakeHost.h"

#include <string_view>

namespace platform {

FakeMachine::FakeMachine() {
    disk.makeDirectory("/var/root");
}

FakeMachine::~FakeMachine() = default;

namespace {

/// The stream on which a change of the managed settings is announced.
constexpr std::string_view kSettingsStream = "com.zerva.notifyd.matching";

} // namespace

FakeHost::FakeHost(FakeMachine& machine)
    : registry(machine.kernel),
      channel(machine.kernel, registry),
      settings([this] { events.post(kSettingsStream, kSettingsChangedEvent); }),
      files(machine.disk, machine.realRoot),
      events(machine.clock, machine.alarms),
      machine_(machine) {}

FakeHost::~FakeHost() = default;

Host FakeHost::host() {
    return {.log = log,
            .registry = registry,
            .channel = channel,
            .events = events.events(),
            .alarms = events.alarms(),
            .transactions = events.transactions(),
            .runLoop = events.runLoop(),
            .settings = settings,
            .files = files,
            .clock = machine_.clock,
            .propertyLists = propertyLists,
            .json = json,
            .defaults = defaults,
            .resources = resources,
            .version = version,
            .diagnostics = diagnostics,
            .queues = queues,
            .https = https};
}

} // namespace platform
