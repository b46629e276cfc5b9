#include "tests/platform/contract/ManagedSettingsContract.h"

#include <gtest/gtest.h>

namespace contract {

TEST_P(ManagedSettingsContract, NothingSetAllows) {
    EXPECT_TRUE(allowed());
}

TEST_P(ManagedSettingsContract, YesAllows) {
    fixture().put(true);
    EXPECT_TRUE(allowed());
}

TEST_P(ManagedSettingsContract, OnlyNoForbids) {
    fixture().put(false);
    EXPECT_FALSE(allowed());
}

TEST_P(ManagedSettingsContract, EveryQuestionIsAnsweredAnew) {
    fixture().put(false);
    EXPECT_FALSE(allowed());
    EXPECT_FALSE(allowed());
    fixture().put(true);
    EXPECT_TRUE(allowed());
    fixture().put(false);
    EXPECT_FALSE(allowed());
    fixture().put(std::nullopt);
    EXPECT_TRUE(allowed());
}

} // namespace contract
