#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "keystrand-linux/MachineClock.h"
#include "keystrand/EventLoop.h"

#include <functional>

namespace keystrand::usb {

/// CLOCK_BOOTTIME and CLOCK_REALTIME.
class SystemClocks : public MachineClock {
  public:
    [[nodiscard]] BootTime sinceStart() const override;
    [[nodiscard]] std::chrono::microseconds wall() const override;
};

/// Calls its handler each time that somebody sets the date, forwards, backwards, or to what it
/// shows already; never otherwise. Also after a sleep of the machine, which sets the date for the
/// kernel.
class DateWatch : private base::NotCopied {
  public:
    using Handler = std::function<void()>;

    /// The loop outlives it.
    DateWatch(EventLoop& loop, Handler handler);

    /// False where the kernel has no room for it; then nothing is told.
    [[nodiscard]] bool isWatching() const { return static_cast<bool>(source_); }

  private:
    [[nodiscard]] bool arm() const;
    void hear();

    base::FileDescriptor timer_;
    Handler handler_;
    EventSource source_;
};

} // namespace keystrand::usb
