#include "platform/host/SerialQueueOfOne.h"

#include "base/NotCopied.h"

#include <cstdio>
#include <cstdlib>

namespace platform {

namespace {

[[noreturn]] void stopForDeadlock(const std::string& name) {
    std::fprintf(stderr,
                 "work of the queue \"%s\" submits to its own queue and would wait for ever\n",
                 name.c_str());
    std::abort();
}

} // namespace

/// Begins when the caller's turn has come.
class SerialQueueOfOne::Turn : private base::NotCopied {
  public:
    explicit Turn(SerialQueueOfOne& queue) : queue_(queue) {
        std::unique_lock lock(queue_.mutex_);
        const std::uint64_t ticket = queue_.arrived_++;
        queue_.turnOver_.wait(lock, [&] { return queue_.served_ == ticket; });
        queue_.worker_ = std::this_thread::get_id();
    }

    ~Turn() {
        // Told with the lock held: the queue may be gone as soon as the last turn has let go of it.
        const std::lock_guard lock(queue_.mutex_);
        queue_.worker_ = std::thread::id();
        ++queue_.served_;
        queue_.turnOver_.notify_all();
    }

  private:
    SerialQueueOfOne& queue_;
};

void SerialQueueOfOne::sync(const std::function<void()>& work) {
    if (isCurrent()) {
        stopForDeadlock(name_);
    }
    const Turn turn(*this);
    work();
}

bool SerialQueueOfOne::isCurrent() const {
    return worker_ == std::this_thread::get_id();
}

} // namespace platform
