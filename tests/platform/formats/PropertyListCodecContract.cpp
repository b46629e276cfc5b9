#include "platform/formats/PropertyListCodec.h"
#include "tests/platform/contract/PropertyListsContract.h"

namespace contract {

namespace {

class PropertyListCodecFixture final : public PropertyListsFixture {
  public:
    platform::PropertyLists& propertyLists() override { return propertyLists_; }

  private:
    platform::PropertyListCodec propertyLists_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, PropertyListsContract,
                         (fixtureOf<PropertyListsFixture, PropertyListCodecFixture>()));

} // namespace contract
