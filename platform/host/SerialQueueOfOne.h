#pragma once

#include "platform/SerialQueue.h"

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>

namespace platform {

/// A queue without a thread of its own: work runs on the thread that submits it, which waits until
/// its turn has come. Turns are given out in the order of arrival.
class SerialQueueOfOne final : public SerialQueue {
  public:
    explicit SerialQueueOfOne(std::string name) : name_(std::move(name)) {}

    void sync(const std::function<void()>& work) override;
    [[nodiscard]] bool isCurrent() const override;

  private:
    class Turn;

    const std::string name_;
    std::mutex mutex_;
    std::condition_variable turnOver_;
    std::uint64_t arrived_ = 0;
    std::uint64_t served_ = 0;
    /// The thread whose turn it is.
    std::atomic<std::thread::id> worker_{};
};

class SerialQueuesOfOne final : public SerialQueues {
  public:
    [[nodiscard]] std::unique_ptr<SerialQueue> make(const std::string& name) override {
        return std::make_unique<SerialQueueOfOne>(name);
    }
};

} // namespace platform
