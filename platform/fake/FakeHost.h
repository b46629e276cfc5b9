#pragma once

#include "base/NotCopied.h"
#include "platform/Host.h"
#include "platform/fake/FakeClock.h"
#include "platform/fake/FakeConfiguration.h"
#include "platform/fake/FakeEventHost.h"
#include "platform/fake/FakeFiles.h"
#include "platform/fake/FakeFormats.h"
#include "platform/fake/FakeHTTPSessions.h"
#include "platform/fake/FakeKernel.h"
#include "platform/fake/FakeSerialQueues.h"
#include "platform/fake/FakeSystemLog.h"

#include <string>

namespace platform {

/// What outlives a process. It begins with an empty state directory, as an installed system does.
struct FakeMachine : private base::NotCopied {
    FakeMachine();
    ~FakeMachine();

    FakeClock clock;
    FakeAlarmStore alarms;
    FakeDisk disk;
    /// The real directory under which libraries find their files; without one they find nothing.
    std::string realRoot = FakeFiles::kNoRealRoot;
    FakeKernel kernel;
};

/// All that one process sees of a FakeMachine. A second FakeHost on the same machine is a process
/// started later: it finds the files, the alarms and the kernel side as the first one left them.
class FakeHost : private base::NotCopied {
  public:
    explicit FakeHost(FakeMachine& machine);
    ~FakeHost();

    /// The host as a program gets it. It lasts as long as this.
    [[nodiscard]] Host host();

    FakeSystemLog log;
    FakeServiceRegistry registry;
    FakeKernelChannel channel;
    FakeManagedSettings settings;
    FakeFiles files;
    FakePropertyLists propertyLists;
    FakeJSON json;
    FakeUserDefaults defaults;
    FakeConfigurationResource resources;
    FakeSystemVersion version;
    FakeInternalDiagnostics diagnostics;
    FakeSerialQueues queues;
    FakeHTTPSessions https;
    /// Last, because the handlers in it may use all the others until they are destroyed.
    FakeEventHost events;

  private:
    FakeMachine& machine_;
};

} // namespace platform
