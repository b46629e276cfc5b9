#pragma once

#include "base/Saturate.h"
#include "platform/Date.h"

#include <algorithm>
#include <cstdint>

namespace platform {

/// A wall clock that stands still until somebody moves it.
class FakeClock {
  public:
    /// 2023-11-14 22:13:20 UTC.
    static constexpr Date kStart{1'700'000'000 * kNanosecondsPerSecond};

    [[nodiscard]] Date now() const { return now_; }

    /// Sets the clock, forwards or backwards.
    void set(Date date) { now_ = date; }

    void advance(std::int64_t nanoseconds) {
        now_.nanosecondsSince1970 = base::saturatingAdd(now_.nanosecondsSince1970, nanoseconds);
    }

    /// Lets time pass until `date`; does nothing when that is past.
    void waitUntil(Date date) { now_ = std::max(now_, date); }

  private:
    Date now_ = kStart;
};

} // namespace platform
