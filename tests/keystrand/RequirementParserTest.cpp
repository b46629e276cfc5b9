#include "keystrand/PolicyRequirement.h"

#include <gtest/gtest.h>

#include <tuple>

namespace keystrand::test {

namespace {

std::optional<PolicyRequirement> parseWhole(const std::string& text) {
    TextParser parser(text);
    auto requirement = parseRequirement(parser);
    return parser.atEnd() ? std::move(requirement) : std::nullopt;
}

std::string repeated(const std::string& text, std::size_t times) {
    std::string whole;
    for (std::size_t i = 0; i < times; ++i) {
        whole += text;
    }
    return whole;
}

std::string nested(std::size_t depth) {
    return repeated("any-of(", depth - 1) + "never" + repeated(")", depth - 1);
}

/// As many leaves of 16 bytes, in a node of 20.
std::string listOf(std::size_t leaves) {
    return "all-of(" + repeated("marker-4,", leaves - 1) + "marker-4)";
}

TEST(RequirementParserTest, TextsAndTheirPlainForm) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"passcode", "passcode"},
        {" \t passcode\r\n", "passcode"},
        {"passcode # for the door\n", "passcode"},
        {"passcode(user=0)", "passcode(user=0)"},
        {"passcode ( age = 300 , user = 1000 )", "passcode(user=1000, age=300)"},
        {"passphrase(once, purpose=4294967295, priority=2)",
         "passphrase(purpose=4294967295, priority=2, once)"},
        {"biometry(priority=0)", "biometry"},
        {"all-of(passcode)", "all-of(passcode)"},
        {"any-of(passcode,\n  # or\n  biometry)", "any-of(passcode, biometry)"},
        {"1-of(never)", "1-of(never)"},
        {"always", "always"},
        {"2-of(always, never, all-of(always))", "2-of(always, never, all-of(always))"},
        {"2-of(passcode, passphrase, all-of(user-output, kext-deny-list))",
         "2-of(passcode, passphrase, all-of(user-output, kext-deny-list))"},
    };
    for (const auto& [text, plain] : cases) {
        SCOPED_TRACE(text);
        const auto requirement = parseWhole(text);
        ASSERT_TRUE(requirement);
        EXPECT_EQ(toText(*requirement), plain);
        EXPECT_EQ(toText(*parseWhole(plain)), plain);
    }
}

TEST(RequirementParserTest, EveryLeafType) {
    const std::vector<std::tuple<std::string, std::uint32_t, std::uint32_t>> cases = {
        {"passcode", 1, 1},     {"passphrase", 2, 2},  {"biometry", 3, 3},
        {"marker-6", 6, 6},     {"marker-8", 8, 8},    {"continuity-unlock", 9, 9},
        {"passcode2", 10, 10},  {"marker-11", 11, 11}, {"kext-deny-list", 12, 12},
        {"user-output", 13, 7}, {"marker-4", 14, 4},   {"marker-5", 15, 5},
        {"never", 16, 0}};
    EXPECT_EQ(leafTypes().size(), cases.size());
    for (const auto& [name, requirement, credential] : cases) {
        const auto leaf = parseWhole(name);
        ASSERT_TRUE(leaf) << name;
        EXPECT_EQ(leaf->type->requirement, requirement) << name;
        EXPECT_EQ(leaf->type->credential, credential) << name;
    }
}

TEST(RequirementParserTest, TextsThatAreRefused) {
    const std::vector<std::tuple<std::string, std::size_t, std::string>> cases = {
        {"", 1, "requirement expected at the end"},
        {"\n\n# nothing\n", 4, "requirement expected at the end"},
        {"(", 1, "requirement expected before ("},
        {"\x01", 1, "requirement expected before a byte that is no text"},
        {"passwort", 1, "unknown requirement passwort"},
        {"\n passwort", 2, "unknown requirement passwort"},
        {"all-of", 1, "( expected at the end"},
        {"all-of()", 1, "requirement expected before )"},
        {"all-of(passcode", 1, ") expected at the end"},
        {"all-of(passcode,\n)", 2, "requirement expected before )"},
        {"all-of(passcode biometry)", 1, ") expected before biometry"},
        {"0-of(passcode)", 1, "0 of 1 cannot be asked for"},
        {"3-of(passcode,\nbiometry)", 2, "3 of 2 cannot be asked for"},
        {"x-of(passcode)", 1, "unknown requirement x-of"},
        {"4294967296-of(passcode)", 1, "unknown requirement 4294967296-of"},
        {"any-of(always(once))", 1, ") expected before ("},
        {"passcode()", 1, "option expected before )"},
        {"passcode(user)", 1, "= expected before )"},
        {"passcode(user=)", 1, "user expected before )"},
        {"passcode(user=me)", 1, "user is not a number: me"},
        {"passcode(user=4294967296)", 1, "user is not a number: 4294967296"},
        {"passcode(user=-1)", 1, "user is not a number: -1"},
        {"passcode(once=1)", 1, ") expected before ="},
        {"passcode(age=1, age=1)", 1, "age given twice"},
        {"passcode(once, once)", 1, "once given twice"},
        {"passcode(purpose=1)", 1, "passcode has no option purpose"},
        {"passcode(colour=1)", 1, "passcode has no option colour"},
        {nested(17), 1, "nested too deeply"},
        {listOf(255), 1, "the requirement is too large"},
    };
    for (const auto& [text, line, reason] : cases) {
        SCOPED_TRACE(text);
        TextParser parser(text);
        EXPECT_FALSE(parseRequirement(parser));
        ASSERT_TRUE(parser.error());
        EXPECT_EQ(parser.error()->reason, reason);
        EXPECT_EQ(parser.error()->line, line);
    }
}

TEST(RequirementParserTest, LargestRequirementsAreTaken) {
    EXPECT_TRUE(parseWhole(nested(16)));
    const auto largest = parseWhole(listOf(254));
    ASSERT_TRUE(largest);
    EXPECT_EQ(wireSize(*largest), 20U + 254U * 16U);
}

} // namespace

} // namespace keystrand::test
