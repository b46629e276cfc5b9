#include "platform/fake/FakeFormats.h"
#include "tests/platform/contract/JSONContract.h"

namespace contract {

namespace {

class FakeJSONFixture final : public JSONFixture {
  public:
    platform::JSON& json() override { return json_; }

  private:
    platform::FakeJSON json_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, JSONContract, (fixtureOf<JSONFixture, FakeJSONFixture>()));

} // namespace contract
