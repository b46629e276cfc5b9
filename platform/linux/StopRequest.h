#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"

namespace platform {

/// SIGTERM as something to look at. From the construction on the signal ends nothing by itself: it
/// is noted whenever it comes, and acted on by whoever looks. It stays noted for good, also when
/// this is gone.
///
/// Made before the process has other threads, because these take over what is blocked. When no
/// descriptor can be had, the signal goes on ending the process at once.
class StopRequest : private base::NotCopied {
  public:
    StopRequest();

    /// Any thread.
    [[nodiscard]] bool isMade() const;

    /// Readable from the request on, for every waiter and for ever: it is polled together with
    /// what a wait is for, and never read from. -1, which poll passes over, when there is none.
    [[nodiscard]] int descriptor() const { return signal_.get(); }

    /// Why there is no descriptor, an errno value; otherwise 0.
    [[nodiscard]] int failure() const { return failure_; }

  private:
    base::FileDescriptor signal_;
    int failure_ = 0;
};

} // namespace platform
