#include "platform/host/SerialQueueOfOne.h"
#include "tests/platform/contract/SerialQueueContract.h"

namespace contract {

namespace {

class LinuxSerialQueueFixture final : public SerialQueueFixture {
  public:
    platform::SerialQueues& queues() override { return queues_; }

  private:
    platform::SerialQueuesOfOne queues_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, SerialQueueContract,
                         (fixtureOf<SerialQueueFixture, LinuxSerialQueueFixture>()));

} // namespace contract
