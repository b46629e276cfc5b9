#pragma once

#include "platform/Clock.h"
#include "platform/PropertyLists.h"
#include "platform/SystemLog.h"

#include <chrono>
#include <map>
#include <string>
#include <string_view>
#include <utility>

struct sqlite3;

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

/// What is wrong with a database's file, told once at the level warning: the lines of single
/// failures are at a lower one, and are as many as there are statements.
///
/// A cause is told again when it comes back after a row could be written. Damage, and what else
/// does not pass by itself, is told once.
class DatabaseCauses {
  public:
    /// Of the database at `path`. Tells nothing when `log` is null.
    DatabaseCauses(platform::SystemLog* log, std::string path)
        : log_(log), path_(std::move(path)) {}

    /// A use of `db`, which may be null, has failed with SQLite's `code`.
    void tell(int code, sqlite3* db);
    /// The database's directory cannot be made.
    void tellOfDirectory(std::string_view description);
    /// While it is silent nothing is told.
    void setSilent(bool isSilent) { isSilent_ = isSilent; }
    /// A row was written.
    void wrote();

  private:
    enum class Duration { passing, lasting };

    void tellOnce(std::string line, Duration duration);

    platform::SystemLog* log_;
    std::string path_;
    std::map<std::string, Duration> told_;
    bool isSilent_ = false;
};

} // namespace kstd
