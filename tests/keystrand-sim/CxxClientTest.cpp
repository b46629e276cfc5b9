// What C++ has beside the functions, against the program, over the kernel socket.

#include "KSTLib/KSTLib.hpp"
#include "tests/keystrand-sim/LibraryClient.h"
#include "tests/support/MemoryScan.h"

#include <unistd.h>

namespace keystrand::sim::test {

namespace {

using support::MemoryScan;

constexpr MemoryScan::Turned kTurnedSecret = {0x21, 0x9d, 0x4e, 0xc3, 0x5a, 0x07, 0xf2, 0x6c,
                                              0xa5, 0x3b, 0x91, 0xe6, 0x2b, 0x7d, 0xd4, 0x83};

/// A pipe with the secret in it, of which the process keeps no copy.
int pipeWithSecret() {
    std::array<int, 2> ends{};
    EXPECT_EQ(::pipe(ends.data()), 0);
    for (const std::uint8_t turned : kTurnedSecret) {
        auto byte = static_cast<std::uint8_t>(~turned);
        EXPECT_EQ(::write(ends[1], &byte, 1), 1);
        ::explicit_bzero(&byte, 1);
    }
    ::close(ends[1]);
    return ends[0];
}

class CxxClientTest : public LibraryClient {
  protected:
    void SetUp() override {
        LibraryClient::SetUp();
        startWith("policy open = any-of(passcode(age=60),\n"
                  "                     all-of(biometry, passphrase(purpose=1)))\n"
                  "policy pay = passphrase(once)\n"
                  "policy mine = passphrase(purpose=3)\n"
                  "policy hers = passphrase(user=77)\n");
    }

    static std::string wordsOf(const kst::Requirement& tree) {
        std::string words;
        tree.walk([&](const kst::Requirement& node, std::size_t depth) {
            words += std::string(2 * depth, ' ') + node.words() + "\n";
        });
        return words;
    }

    static kst::Credential passphrase(const std::string& text, KSTPassphrasePurpose purpose) {
        return *kst::Credential::create(*kst::Passphrase::from(text.data(), text.size()), purpose);
    }
};

TEST_F(CxxClientTest, FromWhatIsMissingToSatisfied) {
    const std::int64_t before = gAllocatedBytes;
    {
        auto context = kst::Context::create();
        ASSERT_TRUE(context);
        auto answer = context->verify("open");
        ASSERT_TRUE(answer);
        EXPECT_FALSE(answer->satisfied);
        ASSERT_TRUE(answer->missing);
        EXPECT_EQ(wordsOf(*answer->missing), "any of\n"
                                             "  a passcode of the last 60 seconds\n"
                                             "  all of\n"
                                             "    a biometric match\n"
                                             "    a passphrase for purpose 1\n");
        EXPECT_TRUE(context->add(*kst::Credential::create(3)));
        EXPECT_TRUE(context->add(passphrase("open sesame", 1)));
        const auto again = context->verify("open");
        ASSERT_TRUE(again);
        EXPECT_TRUE(again->satisfied);
        EXPECT_FALSE(again->missing);
        EXPECT_EQ(contexts(), 1U);
    }
    EXPECT_EQ(contexts(), 0U) << "a context that was created here ends with its value";
    EXPECT_EQ(gAllocatedBytes, before + 1) << "what the library says that a context leaves";
}

TEST_F(CxxClientTest, TheSameLeafStaysMissingForAnothersPassphrase) {
    auto context = *kst::Context::create();
    const auto first = *context.verify("hers");
    ASSERT_TRUE(first.missing);
    ASSERT_TRUE(context.add(passphrase("mine", *first.missing->purpose())));
    const auto second = *context.verify("hers");
    EXPECT_FALSE(second.satisfied);
    EXPECT_EQ(first.missing, second.missing);

    const std::uint32_t user = 77;
    ASSERT_TRUE(context.add(*kst::Credential::create(*kst::Passphrase::from("x", 1), 0, user)));
    EXPECT_TRUE(context.verify("hers")->satisfied);
    const KSTParameter hers = kst::userParameter(user);
    kst::Question question;
    question.parameters = &hers;
    question.parametersCount = 1;
    EXPECT_TRUE(context.verify("pay", question)->satisfied);
    const auto used = context.verify("pay", question);
    ASSERT_TRUE(used);
    EXPECT_FALSE(used->satisfied) << "the parameter names a user whose passphrase was used up";
}

TEST_F(CxxClientTest, PreflightAndAgesAreHandedOn) {
    auto context = *kst::Context::create();
    ASSERT_TRUE(context.add(passphrase("a", 3)));
    kst::Question preflight;
    preflight.preflight = true;
    EXPECT_TRUE(context.verify("pay", preflight)->satisfied);
    EXPECT_TRUE(context.verify("pay")->satisfied);
    EXPECT_FALSE(context.verify("pay")->satisfied);

    ASSERT_TRUE(kst::addGlobally(passphrase("b", 3)));
    EXPECT_FALSE(context.verify("mine")->satisfied);
    kst::Question global;
    global.maxGlobalCredentialAge = 10;
    EXPECT_TRUE(context.verify("mine", global)->satisfied);
    tell("clock advance 11");
    const auto old = context.verify("mine", global);
    ASSERT_TRUE(old && old->missing);
    EXPECT_EQ(wordsOf(*old->missing), "a passphrase for purpose 3, too old\n");
    EXPECT_TRUE(kst::verifyGlobally("mine")->satisfied);
    ASSERT_TRUE(kst::removeGlobally(2));
    EXPECT_FALSE(kst::verifyGlobally("mine")->satisfied);
}

TEST_F(CxxClientTest, CredentialsGoInAndOut) {
    auto context = *kst::Context::create();
    EXPECT_FALSE(*context.contains(2));
    ASSERT_TRUE(context.add(passphrase("old", 1)));
    EXPECT_TRUE(*context.contains(2));
    EXPECT_TRUE(*context.containsPassphrase(1));
    EXPECT_FALSE(*context.containsPassphrase(2));
    ASSERT_TRUE(context.replacePassphrases(passphrase("new", 1)));
    ASSERT_TRUE(context.remove(passphrase("old", 1)));
    EXPECT_TRUE(*context.contains(2));
    ASSERT_TRUE(context.remove(passphrase("new", 1)));
    EXPECT_FALSE(*context.contains(2));
    ASSERT_TRUE(context.add(passphrase("a", 4)));
    ASSERT_TRUE(context.removePassphrases(4));
    EXPECT_FALSE(*context.contains(2));
    ASSERT_TRUE(context.add(*kst::Credential::create(1), kKSTScopeGlobal));
    EXPECT_FALSE(*context.contains(1));
    EXPECT_TRUE(*context.contains(1, kKSTScopeGlobal));
    ASSERT_TRUE(context.remove(1, kKSTScopeGlobal));
    EXPECT_FALSE(*context.contains(1, kKSTScopeGlobal));
}

TEST_F(CxxClientTest, AContextThatWasOpenedStaysForTheOthers) {
    auto owner = *kst::Context::create();
    auto form = owner.externalForm();
    ASSERT_TRUE(form);
    {
        auto same = kst::Context::open(*form);
        ASSERT_TRUE(same);
        EXPECT_TRUE(same->add(passphrase("a", 3)));
    }
    EXPECT_EQ(contexts(), 1U);
    EXPECT_TRUE(owner.verify("mine")->satisfied);
    EXPECT_TRUE(owner.destroy());
    EXPECT_EQ(contexts(), 0U);
    EXPECT_EQ(owner.get(), nullptr);
    EXPECT_EQ(owner.destroy().error().value(), kKSTErrorBadParameter);
    EXPECT_EQ(owner.externalForm().error().value(), kKSTErrorUnexpected);
    EXPECT_EQ(kst::Context::open(*form).error().value(), kKSTKernelErrorNoSuchContext);

    auto kept = *kst::Context::create();
    kept = *kst::Context::create();
    EXPECT_EQ(contexts(), 1U) << "what an assignment replaces is destroyed";
    kept.destroyAtTheEnd(false);
    kept = *kst::Context::create();
    EXPECT_EQ(contexts(), 2U);
}

TEST_F(CxxClientTest, ConstraintsAndAccessLists) {
    auto context = *kst::Context::create();
    const std::string constraint = "any-of(passcode(age=300), biometry)";
    const auto answer = context.verifyConstraint(constraint.data(), constraint.size());
    ASSERT_TRUE(answer && answer->missing);
    EXPECT_EQ(answer->missing->children().size(), 2U);
    EXPECT_EQ(context.verifyConstraint(nullptr, 0).error().value(), -3);
    EXPECT_EQ(context.verifyConstraint("?", 1).error().value(), kKSTKernelErrorBadConstraint);
    const std::string list = "allow sign = passcode";
    const auto characteristics = kst::constraintCharacteristics(list.data(), list.size());
    ASSERT_TRUE(characteristics);
    EXPECT_EQ(characteristics->size(), 12U);
    EXPECT_EQ(kst::constraintCharacteristics(nullptr, 0).error().value(), -3);
}

TEST_F(CxxClientTest, EveryStatusIsHandedOn) {
    auto context = *kst::Context::create();
    const auto nobody = context.verify("no such policy").error();
    EXPECT_EQ(nobody.value(), kKSTKernelErrorNoSuchPolicy);
    EXPECT_EQ(nobody.message(), "no such policy");
    EXPECT_EQ(context.verify(nullptr).error(), std::errc::invalid_argument);
    const auto after = [this](const std::string& fault) {
        ASSERT_TRUE(tell("fault " + fault).ok);
    };
    after("command=3 status=-42");
    EXPECT_EQ(context.verify("mine").error().value(), -42);
    after("command=3 reply=2");
    EXPECT_EQ(context.verify("mine").error().value(), kKSTErrorUnexpected);
    after("command=3 reply=24");
    EXPECT_EQ(context.verify("mine").error().value(), kKSTErrorBadParameter);
    after("command=4 status=-42");
    EXPECT_EQ(context.contains(2).error().value(), -42);
    after("command=20 status=-42");
    EXPECT_EQ(kst::constraintCharacteristics("x", 1).error().value(), -42);
    after("command=1 status=-42");
    EXPECT_EQ(kst::Context::create().error().value(), -42);
    after("command=1 status=-42");
    EXPECT_EQ(kst::verifyGlobally("mine").error().value(), -42);
    after("command=5 hang-up");
    const auto hungUp = context.add(passphrase("a", 1)).error();
    EXPECT_EQ(hungUp, std::errc::connection_reset);
    EXPECT_EQ(hungUp.message(), "the kernel service hung up instead of answering");
    EXPECT_TRUE(context.add(passphrase("a", 1)));
    after("command=2 status=-42");
    EXPECT_EQ(context.destroy().error().value(), -42);
    EXPECT_TRUE(context.destroy());
}

TEST_F(CxxClientTest, NoCopyOfAPassphraseStays) {
    auto scan = std::make_unique<MemoryScan>(kTurnedSecret);
    const int input = pipeWithSecret();
    EXPECT_EQ(scan->places(), 0U);
    {
        auto context = *kst::Context::create();
        {
            auto passphrase = kst::Passphrase::read("", input);
            ASSERT_TRUE(passphrase);
            ASSERT_EQ(passphrase->size(), kTurnedSecret.size());
            EXPECT_EQ(scan->places(), 1U) << "the one place where it is";
            kst::Passphrase moved = *std::move(passphrase);
            EXPECT_EQ(scan->places(), 1U) << "it was moved and not copied";
            auto credential = *kst::Credential::create(moved, 3);
            EXPECT_EQ(scan->places(), 2U) << "in the credential, too";
            ASSERT_TRUE(context.add(credential));
            ASSERT_TRUE(context.verify("mine")->satisfied);
            EXPECT_EQ(scan->places(), 2U) << "what was sent is wiped";
        }
        EXPECT_EQ(scan->places(), 0U);
    }
    EXPECT_EQ(scan->places(), 0U);
    ::close(input);
}

} // namespace
} // namespace keystrand::sim::test
