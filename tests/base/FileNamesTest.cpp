#include "base/FileNames.h"

#include <gtest/gtest.h>

using base::directoryOf;
using base::withoutDots;

TEST(FileNames, TheDirectoryIsWhatStandsBeforeTheLastName) {
    EXPECT_EQ(directoryOf("/a/b/c"), "/a/b");
    EXPECT_EQ(directoryOf("/a"), "/");
    EXPECT_EQ(directoryOf("a"), "/");
    EXPECT_EQ(directoryOf("/"), "/");
    EXPECT_EQ(directoryOf("/a/b/"), "/a/b");
}

TEST(FileNames, DotsAndSlashesTooManyGo) {
    EXPECT_EQ(withoutDots("/a/b/../b/x.db"), "/a/b/x.db");
    EXPECT_EQ(withoutDots("//a/.///b/./x.db"), "/a/b/x.db");
    EXPECT_EQ(withoutDots("/a/b/"), "/a/b");
    EXPECT_EQ(withoutDots("/a/b/../../c"), "/c");
    EXPECT_EQ(withoutDots("/a/b/.."), "/a");
}

TEST(FileNames, NothingIsAboveTheRoot) {
    EXPECT_EQ(withoutDots("/"), "/");
    EXPECT_EQ(withoutDots("/.."), "/");
    EXPECT_EQ(withoutDots("/../../a/../.."), "/");
    EXPECT_EQ(withoutDots("/../a"), "/a");
}

TEST(FileNames, NamesThatBeginWithDotsAreNames) {
    EXPECT_EQ(withoutDots("/.a/..b/...x"), "/.a/..b/...x");
}
