#include "platform/linux/LinuxSystemLog.h"
#include "tests/platform/contract/SystemLogContract.h"
#include "tests/platform/linux/RootDirectory.h"
#include "tests/platform/linux/StandardErrorCapture.h"

namespace contract {

namespace {

class LinuxSystemLogFixture final : public SystemLogFixture {
  public:
    platform::SystemLog& log() override { return log_; }
    std::vector<std::string> lines() override { return standardError_.lines(); }

  private:
    support::RootDirectory root_;
    support::StandardErrorCapture standardError_;
    platform::LinuxSystemLog log_{root_.paths()};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, SystemLogContract,
                         (fixtureOf<SystemLogFixture, LinuxSystemLogFixture>()));

} // namespace contract
