#pragma once

#include "base/Saturate.h"
#include "platform/Clock.h"

#include <algorithm>
#include <cstdint>
#include <mutex>

namespace platform {

/// A wall clock that stands still until somebody moves it. May be moved from any thread.
class FakeClock final : public Clock {
  public:
    /// 2023-11-14 22:13:20 UTC.
    static constexpr Date kStart{1'700'000'000 * kNanosecondsPerSecond};

    [[nodiscard]] Date now() override {
        const std::lock_guard lock(mutex_);
        return now_;
    }

    /// Sets the clock, forwards or backwards.
    void set(Date date) {
        const std::lock_guard lock(mutex_);
        now_ = date;
    }

    void advance(std::int64_t nanoseconds) {
        const std::lock_guard lock(mutex_);
        now_.nanosecondsSince1970 = base::saturatingAdd(now_.nanosecondsSince1970, nanoseconds);
    }

    /// Lets time pass until `date`; does nothing when that is past.
    void waitUntil(Date date) {
        const std::lock_guard lock(mutex_);
        now_ = std::max(now_, date);
    }

  private:
    std::mutex mutex_;
    Date now_ = kStart;
};

} // namespace platform
