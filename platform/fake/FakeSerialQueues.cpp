#include "platform/fake/FakeSerialQueues.h"

#include "platform/host/SerialQueueOfOne.h"

namespace platform {

class FakeSerialQueues::Queue final : public SerialQueue {
  public:
    Queue(FakeSerialQueues& queues, const std::string& name) : queues_(queues), queue_(name) {}

    void sync(const std::function<void()>& work) override {
        queues_.noteWorkItem();
        queue_.sync(work);
    }

    [[nodiscard]] bool isCurrent() const override { return queue_.isCurrent(); }

  private:
    FakeSerialQueues& queues_;
    SerialQueueOfOne queue_;
};

std::unique_ptr<SerialQueue> FakeSerialQueues::make(const std::string& name) {
    const std::lock_guard lock(mutex_);
    names_.push_back(name);
    return std::make_unique<Queue>(*this, name);
}

std::vector<std::string> FakeSerialQueues::names() const {
    const std::lock_guard lock(mutex_);
    return names_;
}

std::size_t FakeSerialQueues::workItems() const {
    const std::lock_guard lock(mutex_);
    return workItems_;
}

void FakeSerialQueues::noteWorkItem() {
    const std::lock_guard lock(mutex_);
    ++workItems_;
}

} // namespace platform
