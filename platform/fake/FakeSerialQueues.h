#pragma once

#include "platform/SerialQueue.h"

#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace platform {

/// Real queues whose names and work are counted. Outlives its queues.
class FakeSerialQueues final : public SerialQueues {
  public:
    [[nodiscard]] std::unique_ptr<SerialQueue> make(const std::string& name) override;

    /// The names of all queues made so far, in the order of making.
    [[nodiscard]] std::vector<std::string> names() const;

    /// How many items have been submitted, to all queues together.
    [[nodiscard]] std::size_t workItems() const;

  private:
    class Queue;

    void noteWorkItem();

    mutable std::mutex mutex_;
    std::vector<std::string> names_;
    std::size_t workItems_ = 0;
};

} // namespace platform
