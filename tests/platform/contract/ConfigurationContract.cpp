#include "tests/platform/contract/ConfigurationContract.h"

#include <gtest/gtest.h>

namespace contract {

namespace {

using platform::Value;
using platform::ValueList;
using platform::ValueMap;

constexpr char kDomain[] = "com.zerva.keystrand.analytics";
constexpr char kComponent[] = "Keystrand";
constexpr char kResource[] = "KSTDAnalyticsLogging";

TEST_P(UserDefaultsContract, NothingSetIsEmpty) {
    EXPECT_EQ(fixture().defaults().load(kDomain), ValueMap());
}

TEST_P(UserDefaultsContract, DomainIsLoadedWhole) {
    const ValueMap content = {{"topic", "kst"}, {"insecure", true}};
    fixture().put(kDomain, content);
    fixture().put("com.zerva.other", {{"topic", "other"}});
    EXPECT_EQ(fixture().defaults().load(kDomain), content);
    EXPECT_EQ(fixture().defaults().load("com.zerva.other"), (ValueMap{{"topic", "other"}}));
    EXPECT_EQ(fixture().defaults().load("com.zerva.third"), ValueMap());
    EXPECT_EQ(fixture().defaults().load(""), ValueMap());
}

TEST_P(UserDefaultsContract, EveryCallReadsAnew) {
    for (const ValueMap& content : {ValueMap{{"topic", "one"}}, {{"topic", "two"}}, {}}) {
        fixture().put(kDomain, content);
        EXPECT_EQ(fixture().defaults().load(kDomain), content);
    }
}

TEST_P(ConfigurationResourceContract, MissingResourceIsNone) {
    EXPECT_EQ(fixture().resources().load(kComponent, kResource), std::nullopt);
}

TEST_P(ConfigurationResourceContract, ResourceIsLoadedWhole) {
    const ValueMap content = {{"list", ValueList{true, 1.5}}, {"splunk_topic", "kst"}};
    fixture().put(kComponent, kResource, content);
    EXPECT_EQ(fixture().resources().load(kComponent, kResource), content);
    EXPECT_EQ(fixture().resources().load(kComponent, "Other"), std::nullopt);
    EXPECT_EQ(fixture().resources().load("Other", kResource), std::nullopt);
}

TEST_P(ConfigurationResourceContract, EmptyResourceIsAResource) {
    fixture().put(kComponent, kResource, ValueMap());
    EXPECT_EQ(fixture().resources().load(kComponent, kResource), ValueMap());
}

TEST_P(ConfigurationResourceContract, EveryCallReadsAnew) {
    fixture().put(kComponent, kResource, ValueMap{{"a", true}});
    EXPECT_EQ(fixture().resources().load(kComponent, kResource), (ValueMap{{"a", true}}));
    fixture().put(kComponent, kResource, ValueMap{{"a", false}});
    EXPECT_EQ(fixture().resources().load(kComponent, kResource), (ValueMap{{"a", false}}));
    fixture().put(kComponent, kResource, std::nullopt);
    EXPECT_EQ(fixture().resources().load(kComponent, kResource), std::nullopt);
}

TEST_P(SystemVersionContract, NothingKnownIsNone) {
    EXPECT_EQ(fixture().version().build(), std::nullopt);
    EXPECT_EQ(fixture().version().product(), std::nullopt);
}

TEST_P(SystemVersionContract, BuildAndProductAreApart) {
    fixture().put("B1", "The Product");
    EXPECT_EQ(fixture().version().build(), "B1");
    EXPECT_EQ(fixture().version().product(), "The Product");
    fixture().put("B2", std::nullopt);
    EXPECT_EQ(fixture().version().build(), "B2");
    EXPECT_EQ(fixture().version().product(), std::nullopt);
    fixture().put(std::nullopt, "P");
    EXPECT_EQ(fixture().version().build(), std::nullopt);
    EXPECT_EQ(fixture().version().product(), "P");
}

TEST_P(InternalDiagnosticsContract, SubsystemsAreOffUntilSwitchedOn) {
    EXPECT_FALSE(fixture().diagnostics().isEnabled("analytics"));
    fixture().put("analytics", true);
    EXPECT_TRUE(fixture().diagnostics().isEnabled("analytics"));
    EXPECT_FALSE(fixture().diagnostics().isEnabled("other"));
    EXPECT_FALSE(fixture().diagnostics().isEnabled(""));
    fixture().put("analytics", false);
    EXPECT_FALSE(fixture().diagnostics().isEnabled("analytics"));
}

} // namespace

} // namespace contract
