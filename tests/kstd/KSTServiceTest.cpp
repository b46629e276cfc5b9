#include "kstd/KSTService.h"

#include "tests/kstd/DaemonFixture.h"

#include <gmock/gmock.h>

#include <cerrno>

namespace kstd {
namespace {

using testing::ElementsAre;

class Plain final : public KSTService {
  public:
    using KSTService::KSTService;
    [[nodiscard]] std::string description() const override { return "plain"; }
};

class KSTServiceTest : public DaemonFixture {
  protected:
    Plain service{fake.host()};
};

TEST_F(KSTServiceTest, PropertyIsCopiedAndTheEntryReleased) {
    putRecord("P", {1, 2, 3});
    EXPECT_EQ(service.KSTPropertyWithName("P"), (Bytes{1, 2, 3}));
    EXPECT_THAT(lines(), ElementsAre());
    EXPECT_EQ(fake.registry.liveReferences(), 0U);
}

TEST_F(KSTServiceTest, EmptyPropertyIsNotNone) {
    putRecord("P", {});
    EXPECT_EQ(service.KSTPropertyWithName("P"), Bytes{});
    EXPECT_THAT(lines(), ElementsAre());
}

TEST_F(KSTServiceTest, AbsentKernelServiceGivesOneEntryLineAndNone) {
    machine.kernel.absence = ENOENT;
    EXPECT_EQ(service.KSTPropertyWithName("P"), std::nullopt);
    EXPECT_THAT(lines(), ElementsAre(assertion("entry", "0", "kstd/KSTService")));
}

TEST_F(KSTServiceTest, AbsentEntryGivesOneEntryLineAndNone) {
    machine.kernel.entryPresent = false;
    EXPECT_EQ(service.KSTPropertyWithName("P"), std::nullopt);
    EXPECT_THAT(lines(), ElementsAre(assertion("entry", "0", "kstd/KSTService")));
}

TEST_F(KSTServiceTest, AbsentPropertyGivesOneResultLineAndNoneAndTheEntryIsReleased) {
    EXPECT_EQ(service.KSTPropertyWithName("P"), std::nullopt);
    EXPECT_THAT(lines(), ElementsAre(assertion("result", "0", "kstd/KSTService")));
    EXPECT_EQ(fake.registry.liveReferences(), 0U);
}

TEST_F(KSTServiceTest, TheEntryIsLookedUpAnewOnEveryCall) {
    machine.kernel.absence = ECONNREFUSED;
    EXPECT_EQ(service.KSTPropertyWithName("P"), std::nullopt);
    machine.kernel.absence = 0;
    putRecord("P", {1});
    EXPECT_EQ(service.KSTPropertyWithName("P"), Bytes{1});
    putRecord("P", {2});
    EXPECT_EQ(service.KSTPropertyWithName("P"), Bytes{2});
}

TEST_F(KSTServiceTest, OnlyTheEntryAtTheKernelServicesPathIsAsked) {
    putRecord("P", {1});
    machine.kernel.path = "IOService:/IOResources/Other";
    EXPECT_EQ(service.KSTPropertyWithName("P"), std::nullopt);
    EXPECT_THAT(lines(), ElementsAre(assertion("entry", "0", "kstd/KSTService")));
}

} // namespace
} // namespace kstd
