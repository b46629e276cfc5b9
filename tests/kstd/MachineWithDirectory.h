#pragma once

#include "platform/fake/FakeHost.h"
#include "tests/support/TemporaryDirectory.h"

namespace kstd {

/// A machine on which databases have a private directory.
struct MachineWithDirectory {
    MachineWithDirectory() { machine.realRoot = directory.path().string(); }

    support::TemporaryDirectory directory;
    platform::FakeMachine machine;
};

} // namespace kstd
