#include "platform/linux/RemoteHTTPSessions.h"
#include "tests/platform/https/CollectorSessionFixture.h"

namespace contract {

namespace {

/// The HTTPS client is the real program, started for each request.
class RemoteHTTPSessionFixture final : public CollectorSessionFixture {
  public:
    platform::HTTPSessions& sessions() override { return sessions_; }

  private:
    platform::RemoteHTTPSessions sessions_{
        {.program = {KSTD_HTTPS, "--trust-anchors", authority()}}};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Remote, HTTPSessionContract,
                         (fixtureOf<HTTPSessionFixture, RemoteHTTPSessionFixture>()));

} // namespace contract
