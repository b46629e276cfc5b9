#include "keystrand/Evaluation.h"

#include "keystrand/AccessLists.h"
#include "keystrand/PolicyRequirement.h"
#include "tests/keystrand/Credentials.h"

#include <gtest/gtest.h>

#include <tuple>

namespace keystrand::test {

namespace {

constexpr CredentialSet::Seconds kNow = 1000;

PolicyRequirement parse(const std::string& text) {
    TextParser parser(text);
    auto requirement = parseRequirement(parser);
    EXPECT_TRUE(requirement && parser.atEnd()) << text;
    return std::move(*requirement);
}

/// What is missing, as text: a leaf by its name, with '!' for one that is too old, a composite by
/// how many it still needs.
std::string textOf(const Missing& missing) {
    if (missing.requirement->kind == PolicyRequirement::Kind::leaf) {
        return std::string(missing.requirement->type->name) +
               (missing.state == Missing::State::tooOld ? "!" : "");
    }
    std::string text = std::to_string(missing.needed);
    for (const Missing& child : missing.children) {
        text += (&child == &missing.children.front() ? "(" : " ") + textOf(child);
    }
    return text + ")";
}

class EvaluationTest : public testing::Test {
  protected:
    static void add(CredentialSet& set, const ByteVector& bytes, CredentialSet::Seconds age) {
        EXPECT_TRUE(set.add(read(bytes), kNow - age));
    }

    [[nodiscard]] Situation situation() const {
        return {.own = own_,
                .global = global_,
                .maxGlobalAge = maxGlobalAge_,
                .user = user_,
                .now = now_};
    }

    /// What is missing of the requirement, "met" when nothing is.
    [[nodiscard]] std::string ask(const std::string& text) const {
        const PolicyRequirement requirement = parse(text);
        const auto missing = whatIsMissing(requirement, situation());
        return missing ? textOf(*missing) : "met";
    }

    /// The types of the credentials that are used up.
    [[nodiscard]] std::vector<std::uint32_t> used(const std::string& text) const {
        std::vector<std::uint32_t> types;
        const PolicyRequirement requirement = parse(text);
        for (const KSTCredential* credential : whatIsUsedUp(requirement, situation())) {
            types.push_back(credential->type);
        }
        return types;
    }

    void expect(const std::vector<std::pair<std::string, std::string>>& cases) const {
        for (const auto& [text, missing] : cases) {
            EXPECT_EQ(ask(text), missing) << text;
        }
    }

    CredentialSet own_;
    CredentialSet global_;
    std::uint32_t maxGlobalAge_ = 0;
    std::optional<std::uint32_t> user_;
    CredentialSet::Seconds now_ = kNow;
};

TEST_F(EvaluationTest, NothingIsThere) {
    expect({{"passcode", "passcode"},
            {"never", "never"},
            {"all-of(passcode, biometry)", "2(passcode biometry)"},
            {"any-of(passcode, biometry)", "1(passcode biometry)"},
            {"2-of(passcode, biometry, passphrase)", "2(passcode biometry passphrase)"},
            {"any-of(all-of(passcode, biometry), never)", "1(2(passcode biometry) never)"}});
}

TEST_F(EvaluationTest, EveryTypeOfCredentialMeetsItsOwnLeafOnly) {
    for (std::uint32_t type = 1; type <= 12; ++type) {
        own_ = CredentialSet();
        add(own_, plainCredential(type), 0);
        for (const LeafType& leaf : leafTypes()) {
            const std::string name(leaf.name);
            EXPECT_EQ(ask(name), leaf.credential == type ? "met" : name) << type;
        }
    }
}

TEST_F(EvaluationTest, AlwaysIsMetByNothingAndNeverMissing) {
    expect({{"always", "met"},
            {"all-of(always, always)", "met"},
            {"any-of(never, always)", "met"},
            {"all-of(always, passcode)", "1(passcode)"},
            {"any-of(all-of(always, never), passcode)", "1(1(never) passcode)"},
            {"2-of(passcode, always, biometry)", "1(passcode biometry)"}});
    using Types = std::vector<std::uint32_t>;
    EXPECT_EQ(used("always"), Types());
    EXPECT_EQ(used("any-of(always, passcode(once))"), Types());
    add(own_, plainCredential(1), 0);
    EXPECT_EQ(used("any-of(always, passcode(once))"), Types());
    EXPECT_EQ(used("all-of(always, passcode(once))"), Types{1});
}

TEST_F(EvaluationTest, CompositesOfWhatIsThereAndWhatIsNot) {
    add(own_, plainCredential(1), 0);
    add(own_, plainCredential(3), 0);
    expect({{"all-of(passcode, biometry)", "met"},
            {"all-of(passcode, never, biometry)", "1(never)"},
            {"any-of(never, biometry)", "met"},
            {"any-of(never, marker-4)", "1(never marker-4)"},
            {"2-of(never, passcode, marker-4, biometry)", "met"},
            {"3-of(never, passcode, marker-4, biometry)", "1(never marker-4)"},
            {"4-of(never, passcode, marker-4, biometry)", "2(never marker-4)"},
            {"all-of(any-of(never, passcode), 1-of(biometry), all-of(passcode))", "met"},
            {"all-of(any-of(never, marker-4), all-of(passcode, marker-5), biometry)",
             "2(1(never marker-4) 1(marker-5))"}});
}

TEST_F(EvaluationTest, OneCredentialMaySatisfySeveralLeaves) {
    add(own_, plainCredential(1), 0);
    expect({{"all-of(passcode, passcode(age=10))", "met"}, {"2-of(passcode, passcode)", "met"}});
}

TEST_F(EvaluationTest, AgeOfOwnCredentials) {
    add(own_, plainCredential(1), 60);
    expect({{"passcode", "met"},
            {"passcode(age=61)", "met"},
            {"passcode(age=60)", "met"},
            {"passcode(age=59)", "passcode!"},
            {"passcode(age=0)", "passcode!"},
            {"passcode(age=4294967295)", "met"},
            {"all-of(passcode(age=1), never)", "2(passcode! never)"}});
    add(own_, plainCredential(1, 7), 3);
    expect({{"passcode(age=3)", "met"}, {"passcode(age=2)", "passcode!"}});
}

TEST_F(EvaluationTest, ClockThatWasSetBackMakesNothingOld) {
    add(own_, plainCredential(1), 0);
    now_ = kNow - 500;
    expect({{"passcode(age=0)", "met"}});
}

TEST_F(EvaluationTest, Users) {
    add(own_, plainCredential(1, 1000), 9);
    add(own_, plainCredential(3), 0);
    expect({{"passcode(user=1000)", "met"},
            {"passcode(user=1001)", "passcode"},
            {"passcode(user=1001, age=1)", "passcode"},
            {"biometry(user=0)", "biometry"},
            {"biometry(user=4294967295)", "met"}});
    user_ = 1001;
    expect({{"passcode", "passcode"}, {"passcode(user=1000)", "met"}, {"biometry", "biometry"}});
    user_ = 1000;
    expect({{"passcode", "met"}, {"passcode(age=8)", "passcode!"}});
}

TEST_F(EvaluationTest, PurposeOfAPassphrase) {
    add(own_, passphrase("secret", 2), 0);
    expect({{"passphrase", "met"},
            {"passphrase(purpose=2)", "met"},
            {"passphrase(purpose=0)", "passphrase"}});
}

TEST_F(EvaluationTest, GlobalCredentialsWithinTheirLimit) {
    add(global_, plainCredential(1), 60);
    const std::vector<std::tuple<std::uint32_t, std::string, std::string>> cases = {
        {0, "passcode", "passcode"},
        {59, "passcode", "passcode!"},
        {60, "passcode", "met"},
        {61, "passcode", "met"},
        {0xfffffffe, "passcode", "met"},
        {0xffffffff, "passcode", "met"},
        {100, "passcode(age=59)", "passcode!"},
        {59, "passcode(age=100)", "passcode!"},
        {100, "passcode(age=60)", "met"},
    };
    for (const auto& [limit, text, missing] : cases) {
        maxGlobalAge_ = limit;
        EXPECT_EQ(ask(text), missing) << limit << " " << text;
    }
    add(own_, plainCredential(1), 500);
    maxGlobalAge_ = 0;
    EXPECT_EQ(ask("passcode"), "met");
}

TEST_F(EvaluationTest, VeryOldCredentialWithoutALimit) {
    add(global_, plainCredential(1), 0);
    now_ = kNow + 0x1'0000'0000;
    maxGlobalAge_ = 0xffffffff;
    EXPECT_EQ(ask("passcode"), "met");
    maxGlobalAge_ = 0xfffffffe;
    EXPECT_EQ(ask("passcode"), "passcode!");
}

TEST_F(EvaluationTest, WhatIsUsedUp) {
    add(own_, plainCredential(1), 0);
    add(own_, plainCredential(3), 0);
    using Types = std::vector<std::uint32_t>;
    EXPECT_EQ(used("passcode"), Types());
    EXPECT_EQ(used("passcode(once)"), Types{1});
    EXPECT_EQ(used("all-of(passcode, biometry(once))"), Types{3});
    EXPECT_EQ(used("any-of(never(once), biometry(once), passcode(once))"), Types{3});
    EXPECT_EQ(used("2-of(never(once), biometry(once), passcode(once), biometry(once))"),
              (Types{3, 1}));
    EXPECT_EQ(used("any-of(all-of(passcode(once), never), all-of(passcode, biometry(once)))"),
              Types{3});
}

TEST_F(EvaluationTest, OldestOwnCredentialIsUsedUpFirst) {
    add(global_, plainCredential(1), 90);
    add(own_, plainCredential(1, 5), 50);
    add(own_, plainCredential(1, 6), 10);
    maxGlobalAge_ = 0xffffffff;
    const auto usedUser = [this](const std::string& text) {
        const PolicyRequirement requirement = parse(text);
        return whatIsUsedUp(requirement, situation()).at(0)->userId;
    };
    EXPECT_EQ(usedUser("passcode(once)"), 5U);
    EXPECT_EQ(usedUser("passcode(once, age=20)"), 6U);
    EXPECT_EQ(usedUser("passcode(once, user=4294967295)"), kNoUser);
}

TEST(CharacteristicsTest, UsableAndIndispensableTypes) {
    constexpr std::uint32_t kAll = 0x1ffe;
    const std::vector<std::tuple<std::string, std::uint32_t, std::uint32_t>> cases = {
        {"passcode", 1U << 1U, 1U << 1U},
        {"user-output", 1U << 7U, 1U << 7U},
        {"never", 0, kAll},
        {"always", 0, 0},
        {"any-of(passcode, always)", 0x02, 0},
        {"all-of(passcode, always)", 0x02, 0x02},
        {"all-of(passcode, kext-deny-list)", 0x1002, 0x1002},
        {"any-of(passcode, biometry)", 0x0a, 0},
        {"any-of(passcode, never)", 0x02, 0x02},
        {"2-of(passcode, biometry, passphrase)", 0x0e, 0},
        {"2-of(passcode, passcode, passphrase)", 0x06, 0x02},
        {"3-of(passcode, biometry, passphrase)", 0x0e, 0x0e},
        {"any-of(all-of(passcode, biometry), all-of(passcode, passphrase))", 0x0e, 0x02},
    };
    for (const auto& [text, usable, indispensable] : cases) {
        const Characteristics expected{.usable = usable, .indispensable = indispensable};
        EXPECT_EQ(characteristicsOf(parse(text)), expected) << text;
    }
}

} // namespace

} // namespace keystrand::test
