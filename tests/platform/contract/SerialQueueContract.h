#pragma once

#include "base/NotCopied.h"
#include "platform/SerialQueue.h"
#include "tests/platform/contract/ContractTest.h"

namespace contract {

struct SerialQueueFixture : private base::NotCopied {
    virtual ~SerialQueueFixture() = default;

    virtual platform::SerialQueues& queues() = 0;
};

class SerialQueueContract : public ContractTest<SerialQueueFixture> {
  protected:
    std::unique_ptr<platform::SerialQueue> queue_ = fixture().queues().make("queue of the test");
};

} // namespace contract
