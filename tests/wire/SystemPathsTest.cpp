#include "wire/SystemPaths.h"

#include <gtest/gtest.h>

namespace wire {
namespace {

TEST(SystemPathsTest, PathUnderARootWhoseSlashesDoNotMatter) {
    for (const char* const root : {"/srv/one", "/srv/one/", "/srv/one//"}) {
        EXPECT_EQ(underRoot(root, "/run/kstd"), "/srv/one/run/kstd");
        EXPECT_EQ(underRoot(root, "//run/kstd"), "/srv/one/run/kstd");
    }
    for (const char* const root : {"", "/", "//"}) {
        EXPECT_EQ(underRoot(root, kEventSocket), kEventSocket);
    }
    EXPECT_EQ(underRoot("/srv/one", "/"), "/srv/one/");
}

} // namespace
} // namespace wire
