#pragma once

#include "base/NotCopied.h"

#include <functional>
#include <memory>
#include <string>

namespace platform {

/// Work that runs one item at a time.
class SerialQueue : private base::NotCopied {
  public:
    virtual ~SerialQueue() = default;

    /// Runs `work` after all work submitted before it and returns when it has run. What it throws
    /// goes to the caller. From any thread, except from work of this very queue, which would wait
    /// for itself: that stops the process with a message that names the queue.
    virtual void sync(const std::function<void()>& work) = 0;

    /// Whether the caller is work of this queue.
    [[nodiscard]] virtual bool isCurrent() const = 0;
};

/// Makes queues. May be called from any thread.
class SerialQueues : private base::NotCopied {
  public:
    virtual ~SerialQueues() = default;

    /// The name is for messages.
    [[nodiscard]] virtual std::unique_ptr<SerialQueue> make(const std::string& name) = 0;
};

} // namespace platform
