#pragma once

#include "platform/Clock.h"
#include "platform/PropertyLists.h"
#include "platform/SystemLog.h"

#include <chrono>

namespace kstd {

class DatabaseCauses;

/// What a database uses of the system. All of it outlives the database.
struct DatabaseEnvironment {
    platform::SystemLog& log;
    platform::Clock& clock;
    platform::PropertyLists& propertyLists;
    /// How long an operation waits for another connection's lock before it fails.
    std::chrono::milliseconds busyTimeout = std::chrono::minutes(5);
    /// Whether the cause of a failure is told once more, as a warning, when it is new.
    bool warnsOfCauses = false;
    /// The database's own, for its statements.
    DatabaseCauses* causes = nullptr;
};

} // namespace kstd
