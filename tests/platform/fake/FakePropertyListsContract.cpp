#include "platform/fake/FakeFormats.h"
#include "tests/platform/contract/PropertyListsContract.h"

namespace contract {

namespace {

class FakePropertyListsFixture final : public PropertyListsFixture {
  public:
    platform::PropertyLists& propertyLists() override { return propertyLists_; }

  private:
    platform::FakePropertyLists propertyLists_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, PropertyListsContract,
                         (fixtureOf<PropertyListsFixture, FakePropertyListsFixture>()));

} // namespace contract
