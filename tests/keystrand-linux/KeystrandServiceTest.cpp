#include "keystrand-linux/KeystrandService.h"

#include "tests/keystrand-linux/MachineDoubles.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <fstream>

namespace keystrand::usb {
namespace {

class KeystrandServiceTest : public testing::Test {
  protected:
    KeystrandServiceTest() {
        for (const char* const directory : {"run/keystrand", "etc/keystrand"}) {
            std::filesystem::create_directories(directory_.file(directory));
        }
    }

    void policies(const std::string& text) {
        std::ofstream(directory_.file("etc/keystrand/policies")) << text;
    }

    std::unique_ptr<KeystrandService> make() {
        std::string error;
        auto service =
            KeystrandService::create(directory_.path(), base::FileDescriptor(), log_, error);
        EXPECT_TRUE(service) << error;
        return service;
    }

    support::TemporaryDirectory directory_;
    Log log_;
};

TEST_F(KeystrandServiceTest, GuardsThePortsAlsoWithPoliciesThatAreNotUnderstood) {
    policies("nonsense");
    EXPECT_TRUE(make());
    EXPECT_THAT(log_.lines, testing::Contains(testing::AllOf(
                                testing::StartsWith("keystrand: "),
                                testing::HasSubstr("/etc/keystrand/policies"),
                                testing::EndsWith("; contexts and credentials are not served"))));
}

TEST_F(KeystrandServiceTest, SaysNothingOfPoliciesThatAreNotThere) {
    EXPECT_TRUE(make());
    EXPECT_THAT(log_.lines, testing::Not(testing::Contains(testing::HasSubstr("policies"))));
}

} // namespace
} // namespace keystrand::usb
