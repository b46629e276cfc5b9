#pragma once

#include "base/NotCopied.h"
#include "kstd/Analytics/SQLite/DatabaseFile.h"

#include <functional>
#include <sqlite3.h>
#include <utility>

namespace kstd {

/// While it exists connections of the code under test never sleep: where one would wait for a lock,
/// `onSleep` is called with the time in microseconds.
class SleeplessFiles : private base::NotCopied {
  public:
    explicit SleeplessFiles(std::function<void(int microseconds)> onSleep) {
        onSleep_ = std::move(onSleep);
        files_->xSleep = [](sqlite3_vfs* /*files*/, int microseconds) {
            if (onSleep_) {
                onSleep_(microseconds);
            }
            return microseconds;
        };
    }
    ~SleeplessFiles() {
        files_->xSleep = sleep_;
        onSleep_ = nullptr;
    }

  private:
    static inline std::function<void(int)> onSleep_;
    sqlite3_vfs* const files_ = sqlite3_vfs_find(registerDatabaseFiles());
    decltype(sqlite3_vfs::xSleep) const sleep_ = files_->xSleep;
};

} // namespace kstd
