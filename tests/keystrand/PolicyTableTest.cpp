#include "keystrand/PolicyTable.h"

#include "keystrand/AccessLists.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <fstream>
#include <tuple>

namespace keystrand::test {

namespace {

using Lines = std::vector<std::string>;

class PolicyTableTest : public testing::Test {
  protected:
    std::string write(const std::string& text) {
        std::ofstream(path_, std::ios::binary) << text;
        return path_;
    }

    [[nodiscard]] Lines lines() const {
        Lines found;
        for (const auto& [name, requirement] : table_.all()) {
            found.push_back(name + " = " + toText(requirement));
        }
        return found;
    }

    support::TemporaryDirectory directory_;
    std::string path_ = directory_.file("policies.conf");
    PolicyTable table_;
};

std::string policies(std::size_t count) {
    std::string text;
    for (std::size_t i = 0; i < count; ++i) {
        text += "policy p" + std::to_string(i) + " = never\n";
    }
    return text;
}

TEST_F(PolicyTableTest, FileWithPolicies) {
    ASSERT_EQ(table_.load(write("# Doors\npolicy door = passcode\n"
                                "policy com.example_b-2 =\n  any-of(\n    biometry,\n"
                                "    passcode)\npolicy policy = never policy all-of = never")),
              std::nullopt);
    EXPECT_EQ(lines(), (Lines{"all-of = never", "com.example_b-2 = any-of(biometry, passcode)",
                              "door = passcode", "policy = never"}));
    EXPECT_NE(table_.find("door"), nullptr);
    EXPECT_EQ(table_.find("doo"), nullptr);
}

TEST_F(PolicyTableTest, ExampleFile) {
    ASSERT_EQ(table_.load(EXAMPLE_POLICIES), std::nullopt);
    EXPECT_EQ(lines(), (Lines{"com.example.pay = 2-of(passcode(user=1000), biometry(user=1000, "
                              "priority=1), passphrase(user=1000, purpose=2, once))",
                              "com.example.public = always", "com.example.retired = never",
                              "com.example.settings = any-of(passcode(age=300), all-of(biometry, "
                              "passphrase))",
                              "unlock = passphrase(purpose=1)"}));
}

TEST_F(PolicyTableTest, EmptyFileHasNoPolicies) {
    EXPECT_EQ(table_.load(write("")), std::nullopt);
    EXPECT_EQ(table_.load(write("# nothing yet")), std::nullopt);
    EXPECT_TRUE(table_.all().empty());
}

TEST_F(PolicyTableTest, FilesThatAreRefused) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"door = passcode", ":1: policy expected before door"},
        {"policy", ":1: name expected at the end"},
        {"policy = passcode", ":1: name expected before ="},
        {"policy door passcode", ":1: = expected before passcode"},
        {"policy door =\n", ":2: requirement expected at the end"},
        {"policy a = never\npolicy b = nevver\npolicy c = x", ":2: unknown requirement nevver"},
        {"policy a = never\n\npolicy a = never", ":3: there is a policy a already"},
        {"policy a = never;", ":1: policy expected before ;"},
        {"policy a/b = never", ":1: = expected before /"},
        {"policy " + std::string(129, 'x') + " = never", ":1: the name is too long"},
        {policies(257), ":256: too many policies"},
        {std::string(256 * 1024 + 1, ' '), ": cannot be read, or is too large"},
    };
    ASSERT_EQ(table_.load(write("policy kept = never")), std::nullopt);
    for (const auto& [text, reason] : cases) {
        SCOPED_TRACE(text.substr(0, 80));
        EXPECT_EQ(table_.load(write(text)), path_ + reason);
        EXPECT_EQ(lines(), Lines{"kept = never"});
    }
}

TEST_F(PolicyTableTest, LargestFilesAreTaken) {
    EXPECT_EQ(table_.load(write("policy " + std::string(128, 'x') + " = never")), std::nullopt);
    EXPECT_EQ(table_.load(write(policies(256))), std::nullopt);
    EXPECT_EQ(table_.all().size(), 256U);
    EXPECT_EQ(table_.load(write(std::string(256 * 1024, ' '))), std::nullopt);
    EXPECT_TRUE(table_.all().empty());
}

TEST_F(PolicyTableTest, FileThatIsNoneIsRefused) {
    EXPECT_EQ(table_.load(path_), path_ + ": cannot be read, or is too large");
    const std::string directory = directory_.path().string();
    EXPECT_EQ(table_.load(directory), directory + ": cannot be read, or is too large");
}

TEST_F(PolicyTableTest, ReloadReadsTheFileThatWasLastLoaded) {
    EXPECT_EQ(table_.reload(), "no file was loaded");
    ASSERT_EQ(table_.load(write("policy a = never")), std::nullopt);
    EXPECT_NE(table_.load(directory_.file("other")), std::nullopt);
    write("policy b = passcode");
    EXPECT_EQ(table_.reload(), std::nullopt);
    EXPECT_EQ(lines(), Lines{"b = passcode"});
    write("policy");
    EXPECT_EQ(table_.reload(), path_ + ":1: name expected at the end");
    EXPECT_EQ(lines(), Lines{"b = passcode"});
}

TEST_F(PolicyTableTest, ConstraintIsAPolicyOrARequirement) {
    ASSERT_EQ(table_.load(write("policy door = passcode")), std::nullopt);
    const std::vector<std::tuple<std::string, bool, std::string>> cases = {
        {"policy door", true, "passcode"},
        {"any-of(biometry, never)", true, "any-of(biometry, never)"},
        {"policy window", true, ""},
        {"door", false, ""},
        {"policy", false, ""},
        {"", false, ""},
    };
    for (const auto& [text, isTaken, requirement] : cases) {
        SCOPED_TRACE(text);
        TextParser parser(text);
        const auto constraint = parseConstraint(parser);
        ASSERT_EQ(constraint.has_value(), isTaken);
        const PolicyRequirement* found = isTaken ? resolve(*constraint, table_) : nullptr;
        EXPECT_EQ(found == nullptr ? "" : toText(*found), requirement);
    }
}

TEST(AccessListTest, ListsAndWhatIsWrongWithThem) {
    std::string many;
    for (int i = 0; i < 65; ++i) {
        many += "allow o" + std::to_string(i) + " = never\n";
    }
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"allow open = passcode", ""},
        {"allow open = policy door\nallow close = any-of(passcode, biometry)", ""},
        {many.substr(0, many.find("allow o64")), ""},
        {"", "allow expected at the end"},
        {"open = passcode", "allow expected before open"},
        {"allow = passcode", "operation expected before ="},
        {"allow open passcode", "= expected before passcode"},
        {"allow open = ", "requirement expected at the end"},
        {"allow open = passcode passcode", "allow expected before passcode"},
        {"allow open = never allow open = never", "there is a rule for open already"},
        {many, "too many rules"},
    };
    for (const auto& [text, reason] : cases) {
        SCOPED_TRACE(text.substr(0, 80));
        TextParser parser(text);
        EXPECT_EQ(parseAccessList(parser).has_value(), reason.empty());
        EXPECT_EQ(parser.error() ? parser.error()->reason : "", reason);
    }
}

} // namespace

} // namespace keystrand::test
