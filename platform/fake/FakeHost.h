#pragma once

#include "platform/Host.h"
#include "platform/fake/FakeConfigurationResource.h"
#include "platform/fake/FakeEventHost.h"
#include "platform/fake/FakeFiles.h"
#include "platform/fake/FakeHTTPSessions.h"
#include "platform/fake/FakeInternalDiagnostics.h"
#include "platform/fake/FakeJSON.h"
#include "platform/fake/FakeKernelChannel.h"
#include "platform/fake/FakeMachine.h"
#include "platform/fake/FakeManagedSettings.h"
#include "platform/fake/FakePropertyLists.h"
#include "platform/fake/FakeSerialQueues.h"
#include "platform/fake/FakeServiceRegistry.h"
#include "platform/fake/FakeSystemLog.h"
#include "platform/fake/FakeSystemVersion.h"
#include "platform/fake/FakeUserDefaults.h"

namespace platform {

/// All that one process sees of a FakeMachine. A second FakeHost on the same machine is a process
/// started later: it finds the files, the alarms and the kernel side as the first one left them.
class FakeHost {
  public:
    explicit FakeHost(FakeMachine& machine);
    FakeHost(const FakeHost&) = delete;
    FakeHost& operator=(const FakeHost&) = delete;
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
