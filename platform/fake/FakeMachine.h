#pragma once

#include "platform/fake/FakeAlarmStore.h"
#include "platform/fake/FakeClock.h"
#include "platform/fake/FakeDisk.h"
#include "platform/fake/FakeFiles.h"
#include "platform/fake/FakeKernel.h"

#include <string>

namespace platform {

/// What outlives a process. It begins with an empty state directory, as an installed system does.
struct FakeMachine {
    FakeMachine();
    FakeMachine(const FakeMachine&) = delete;
    FakeMachine& operator=(const FakeMachine&) = delete;
    ~FakeMachine();

    FakeClock clock;
    FakeAlarmStore alarms;
    FakeDisk disk;
    /// The real directory under which libraries find their files; without one they find nothing.
    std::string realRoot = FakeFiles::kNoRealRoot;
    FakeKernel kernel;
};

} // namespace platform
