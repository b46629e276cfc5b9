#include "platform/fake/FakeSystemLog.h"
#include "tests/platform/contract/SystemLogContract.h"

namespace contract {

namespace {

class FakeSystemLogFixture final : public SystemLogFixture {
  public:
    platform::SystemLog& log() override { return log_; }
    std::vector<std::string> lines() override { return log_.texts(); }

  private:
    platform::FakeSystemLog log_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, SystemLogContract,
                         (fixtureOf<SystemLogFixture, FakeSystemLogFixture>()));

} // namespace contract
