#include "platform/linux/LinuxSystemVersion.h"

#include "tests/platform/linux/RootDirectory.h"

#include <gtest/gtest.h>

#include <filesystem>

namespace {

using platform::valueInOsRelease;

TEST(OsReleaseTextTest, ValuesAreUnquoted) {
    const std::vector<std::pair<std::string, std::string>> values = {
        {"A=b", "b"},
        {"A=", ""},
        {"A=\"\"", ""},
        {"A=''", ""},
        {"A=\"Debian GNU/Linux\"", "Debian GNU/Linux"},
        {"A='Debian GNU/Linux'", "Debian GNU/Linux"},
        {R"(A="a\"b\\c\$d\`e")", R"(a"b\c$d`e)"},
        {R"(A="a\nb\'c")", R"(a\nb\'c)"},
        {R"(A='a\"b\\')", R"(a\"b\\)"},
        {R"(A='a"b')", R"(a"b)"},
        {R"(A="a'b")", R"(a'b)"},
        {R"(A=a\ b\"c\\)", R"(a b"c\)"},
        {R"(A=a"b c"'d e'f)", "ab cd ef"},
        {"A=a#b", "a#b"},
        {"A=\"#a\"", "#a"},
        {"A=a # comment", "a"},
        {"A=a #", "a"},
        {"A=\"a\"  \t", "a"},
        {"A=a\r", "a"},
        {"  \tA=a", "a"},
        {"A==b=", "=b="},
        {"A=a\nA=b\n", "b"},
        {"B=x\nA=a\nAA=y\n#A=z\n # A=z\n", "a"},
        {"\n\nA=a", "a"},
        {"A=a\nA=\"b\nA='c\nA=d e\nA=f\\", "a"},
        {"A=\u00e9", "\u00e9"},
    };
    for (const auto& [text, value] : values) {
        EXPECT_EQ(valueInOsRelease(text, "A"), value) << text;
    }
}

TEST(OsReleaseTextTest, WhatIsNoAssignmentGivesNone) {
    for (const std::string text :
         {"", "\n", "A", "A a", "#A=a", "AB=a", "BA=a", "A =a", "a=a", "export A=a", "A=\"a",
          "A='a", "A=a\\", "A=\"a\\\"", "A=a b", "A=\"a\"  b", "A='a' 'b'", "\"A\"=a"}) {
        EXPECT_EQ(valueInOsRelease(text, "A"), std::nullopt) << text;
    }
}

class LinuxSystemVersionTest : public testing::Test {
  protected:
    LinuxSystemVersionTest() {
        root_.makeDirectory("/etc");
        root_.makeDirectory("/usr/lib");
    }

    support::RootDirectory root_;
    platform::LinuxSystemVersion version_{root_.paths()};
};

TEST_F(LinuxSystemVersionTest, NoFileIsNotKnown) {
    EXPECT_EQ(version_.build(), std::nullopt);
    EXPECT_EQ(version_.product(), std::nullopt);
}

TEST_F(LinuxSystemVersionTest, BuildIsTheVersionOnASystemWithoutBuilds) {
    root_.put("/etc/os-release", "NAME=\"Debian GNU/Linux\"\nVERSION_ID=\"12\"\n");
    EXPECT_EQ(version_.build(), "12");
    EXPECT_EQ(version_.product(), "Debian GNU/Linux");
    root_.put("/etc/os-release", "VERSION_ID=12\nBUILD_ID=b1\n");
    EXPECT_EQ(version_.build(), "b1");
    EXPECT_EQ(version_.product(), std::nullopt);
    root_.put("/etc/os-release", "VERSION_ID=12\nBUILD_ID=\nNAME=''\n");
    EXPECT_EQ(version_.build(), "12");
    EXPECT_EQ(version_.product(), std::nullopt);
}

TEST_F(LinuxSystemVersionTest, VendorsFileIsReadWhenThereIsNoOther) {
    root_.put("/usr/lib/os-release", "NAME=Vendor\nBUILD_ID=v\n");
    EXPECT_EQ(version_.product(), "Vendor");
    EXPECT_EQ(version_.build(), "v");
    root_.put("/etc/os-release", "NAME=Local\n");
    EXPECT_EQ(version_.product(), "Local");
    EXPECT_EQ(version_.build(), std::nullopt);
    std::filesystem::remove(root_.real("/etc/os-release"));
    std::filesystem::create_symlink("../usr/lib/os-release", root_.real("/etc/os-release"));
    EXPECT_EQ(version_.product(), "Vendor");
}

TEST_F(LinuxSystemVersionTest, VendorsFileIsReadWhenTheOtherCannotBe) {
    root_.put("/usr/lib/os-release", "NAME=Vendor\n");
    root_.makeDirectory("/etc/os-release");
    EXPECT_EQ(version_.product(), "Vendor");
}

TEST_F(LinuxSystemVersionTest, LargestFileIsReadAndALargerOneIsNot) {
    const std::string start = "NAME=Large\n#";
    const std::size_t most = platform::LinuxSystemVersion::kMaxSize;
    root_.put("/etc/os-release", start + std::string(most - start.size(), 'x'));
    EXPECT_EQ(version_.product(), "Large");
    root_.put("/etc/os-release", start + std::string(most - start.size() + 1, 'x'));
    EXPECT_EQ(version_.product(), std::nullopt);
}

} // namespace
