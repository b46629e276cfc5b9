#include "platform/formats/JSONCodec.h"
#include "tests/platform/contract/JSONContract.h"

namespace contract {

namespace {

class JSONCodecFixture final : public JSONFixture {
  public:
    platform::JSON& json() override { return json_; }

  private:
    platform::JSONCodec json_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, JSONContract, (fixtureOf<JSONFixture, JSONCodecFixture>()));

} // namespace contract
