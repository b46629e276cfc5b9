#include "platform/fake/FakeSerialQueues.h"
#include "tests/platform/contract/SerialQueueContract.h"

namespace contract {

namespace {

class FakeSerialQueueFixture final : public SerialQueueFixture {
  public:
    platform::SerialQueues& queues() override { return queues_; }

  private:
    platform::FakeSerialQueues queues_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, SerialQueueContract,
                         (fixtureOf<SerialQueueFixture, FakeSerialQueueFixture>()));

} // namespace contract
