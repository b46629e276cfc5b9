#include "platform/https/LinuxHTTPSessions.h"
#include "tests/platform/https/CollectorSessionFixture.h"

namespace contract {

namespace {

class LinuxHTTPSessionFixture final : public CollectorSessionFixture {
  public:
    platform::HTTPSessions& sessions() override { return sessions_; }

  private:
    platform::LinuxHTTPSessions sessions_{{authority()}};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, HTTPSessionContract,
                         (fixtureOf<HTTPSessionFixture, LinuxHTTPSessionFixture>()));

} // namespace contract
