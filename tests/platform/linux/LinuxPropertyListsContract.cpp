#include "platform/linux/LinuxPropertyLists.h"
#include "tests/platform/contract/PropertyListsContract.h"

namespace contract {

namespace {

class LinuxPropertyListsFixture final : public PropertyListsFixture {
  public:
    platform::PropertyLists& propertyLists() override { return propertyLists_; }

  private:
    platform::LinuxPropertyLists propertyLists_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, PropertyListsContract,
                         (fixtureOf<PropertyListsFixture, LinuxPropertyListsFixture>()));

} // namespace contract
