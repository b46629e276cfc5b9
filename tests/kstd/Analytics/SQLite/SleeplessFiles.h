#pragma once

#include <functional>
#include <sqlite3.h>
#include <utility>

namespace kstd {

/// Connections that are opened while it exists never sleep: where one would wait for a lock,
/// `onSleep` is called with the time in microseconds. They may outlive it.
class SleeplessFiles {
  public:
    explicit SleeplessFiles(std::function<void(int microseconds)> onSleep) {
        onSleep_ = std::move(onSleep);
        files_ = *sqlite3_vfs_find(nullptr);
        files_.zName = "sleepless";
        files_.xSleep = [](sqlite3_vfs* /*files*/, int microseconds) {
            if (onSleep_) {
                onSleep_(microseconds);
            }
            return microseconds;
        };
        sqlite3_vfs_register(&files_, 1);
    }
    SleeplessFiles(const SleeplessFiles&) = delete;
    SleeplessFiles& operator=(const SleeplessFiles&) = delete;
    ~SleeplessFiles() {
        sqlite3_vfs_unregister(&files_);
        onSleep_ = nullptr;
    }

  private:
    static inline std::function<void(int)> onSleep_;
    static inline sqlite3_vfs files_{};
};

} // namespace kstd
