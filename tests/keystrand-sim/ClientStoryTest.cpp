// The real library against the program, over the kernel socket.

#include "tests/keystrand-sim/LibraryClient.h"

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

using Words = std::vector<std::string>;

class ClientStoryTest : public LibraryClient {
  protected:
    void SetUp() override {
        LibraryClient::SetUp();
        startWith("policy open = any-of(passcode(age=60),\n"
                  "                     all-of(biometry, passphrase(purpose=1)))\n"
                  "policy pay = passphrase(once)\n");
    }
};

TEST_F(ClientStoryTest, FromWhatIsMissingToSatisfied) {
    KSTContextRef context = nullptr;
    ASSERT_EQ(KSTContextCreate(&context), 0);
    EXPECT_EQ(ask(context, "open"), "5(1 4(3 2))");

    const OwnedCredential biometry = make(kKSTCredentialTypeBiometryMatched);
    ASSERT_EQ(KSTContextAddCredential(context, biometry.get()), 0);
    EXPECT_EQ(ask(context, "open"), "5(1 4(2))");
    EXPECT_EQ(KSTContextContainsCredentialType(context, 3), 0);
    EXPECT_EQ(KSTContextContainsCredentialType(context, 1), kKSTErrorNotContained);

    const OwnedCredential passphrase = makePassphrase("open sesame", 1);
    ASSERT_EQ(KSTContextAddCredential(context, passphrase.get()), 0);
    EXPECT_EQ(ask(context, "open"), "satisfied");

    ASSERT_EQ(KSTContextRemoveCredentialsByType(context, 3), 0);
    EXPECT_EQ(ask(context, "open"), "5(1 4(3))");
    ASSERT_EQ(KSTContextAddCredential(context, make(1).get()), 0);
    EXPECT_EQ(ask(context, "open"), "satisfied");
    tell("clock advance 61");
    EXPECT_EQ(ask(context, "open"), "5(1! 4(3))");

    EXPECT_EQ(contexts(), 1U);
    EXPECT_EQ(KSTContextDelete(context, true), 0);
    EXPECT_EQ(contexts(), 0U);
}

TEST_F(ClientStoryTest, PreflightUsesNothingUp) {
    KSTContextRef context = nullptr;
    ASSERT_EQ(KSTContextCreate(&context), 0);
    ASSERT_EQ(KSTContextAddCredential(context, makePassphrase("a", 7).get()), 0);
    for (int i = 0; i < 2; ++i) {
        bool isSatisfied = false;
        ASSERT_EQ(KSTContextVerifyPolicyWithPreflight(
                      context, "pay", true,
                      [&](bool satisfied, const KSTRequirement*) { isSatisfied = satisfied; }),
                  0);
        EXPECT_TRUE(isSatisfied);
    }
    EXPECT_EQ(KSTContextContainsPassphraseCredentialWithPurpose(context, 7, 0), 0);
    EXPECT_EQ(ask(context, "pay"), "satisfied");
    EXPECT_EQ(ask(context, "pay"), "2");
    EXPECT_EQ(KSTContextDelete(context, true), 0);
}

TEST_F(ClientStoryTest, ContextIsHandedToAnotherConnection) {
    KSTContextRef context = nullptr;
    ASSERT_EQ(KSTContextCreate(&context), 0);
    const ByteVector form = externalForm(context);
    ASSERT_EQ(form.size(), 16U);
    const auto connections = [this] {
        return std::stoi(SimulatorProcess::ask("status", "connections"));
    };
    const int before = connections();

    connect();
    KSTContextRef same = KSTContextCreateWithExternalForm(form.data(), form.size());
    ASSERT_NE(same, nullptr);
    EXPECT_EQ(connections(), before + 1);
    EXPECT_EQ(contexts(), 1U);
    ASSERT_EQ(KSTContextAddCredential(same, make(1).get()), 0);
    EXPECT_EQ(ask(context, "open"), "satisfied");

    EXPECT_EQ(KSTContextDelete(same, true), 0);
    EXPECT_EQ(ask(context, "open"), "-6010");
    EXPECT_EQ(KSTContextCreateWithExternalForm(form.data(), form.size()), nullptr);
    EXPECT_EQ(KSTContextDelete(context, true), -6010);
    EXPECT_EQ(KSTContextDelete(context, false), 0);
}

TEST_F(ClientStoryTest, GlobalCredentials) {
    ASSERT_EQ(KSTGlobalContextAddCredential(make(1).get()), 0);
    EXPECT_EQ(contexts(), 0U);
    std::string answer;
    KSTGlobalContextVerifyPolicy(
        "open", false, nullptr, 0,
        [&](KSTStatus status, bool satisfied, const KSTRequirement* requirement) {
            answer =
                std::to_string(status) + (satisfied ? " satisfied " : " ") + textOf(requirement);
        });
    EXPECT_EQ(answer, "0 satisfied none");
    KSTContextRef context = nullptr;
    ASSERT_EQ(KSTContextCreate(&context), 0);
    EXPECT_EQ(ask(context, "open"), "5(1 4(3 2))");
    ASSERT_EQ(KSTGlobalContextRemoveCredentialsByType(1), 0);
    EXPECT_EQ(tell("credentials").lines, Words());
    EXPECT_EQ(KSTContextDelete(context, true), 0);
}

TEST_F(ClientStoryTest, PassphrasesAreReplacedAndRemoved) {
    KSTContextRef context = nullptr;
    ASSERT_EQ(KSTContextCreate(&context), 0);
    ASSERT_EQ(KSTContextAddCredential(context, makePassphrase("old", 1).get()), 0);
    const OwnedCredential renewed = makePassphrase("new", 1);
    ASSERT_EQ(KSTContextReplacePassphraseCredentialsWithScope(context, renewed.get(), 1), 0);
    ASSERT_EQ(KSTContextRemoveCredentialsByValue(context, makePassphrase("old", 1).get()), 0);
    EXPECT_EQ(KSTContextContainsPassphraseCredentialWithPurpose(context, 1, 0), 0);
    ASSERT_EQ(KSTContextRemoveCredentialsByValue(context, renewed.get()), 0);
    EXPECT_EQ(KSTContextContainsPassphraseCredentialWithPurpose(context, 1, 0),
              kKSTErrorNotContained);
    ASSERT_EQ(KSTContextAddCredential(context, renewed.get()), 0);
    ASSERT_EQ(KSTContextRemovePassphraseCredentialsByPurposeAndScope(context, 1, 1), 0);
    EXPECT_EQ(KSTContextContainsCredentialType(context, 2), kKSTErrorNotContained);
    EXPECT_EQ(KSTContextDelete(context, true), 0);
}

TEST_F(ClientStoryTest, ConstraintsAndAccessLists) {
    KSTContextRef context = nullptr;
    ASSERT_EQ(KSTContextCreate(&context), 0);
    const auto verify = [context](const std::string& constraint) {
        std::string answer;
        KSTContextVerifyAclConstraint(
            context, constraint.data(), constraint.size(), false, nullptr, 0, 0,
            [&](KSTStatus status, bool satisfied, const KSTRequirement* requirement) {
                answer = std::to_string(status) + (satisfied ? " satisfied" : "") +
                         (requirement == nullptr ? "" : " " + textOf(requirement));
            });
        return answer;
    };
    EXPECT_EQ(verify("policy pay"), "0 2");
    EXPECT_EQ(verify("2-of(marker-4, marker-5, never)"), "0 7(14 15 16)");
    ASSERT_EQ(KSTContextAddCredential(context, make(4).get()), 0);
    EXPECT_EQ(verify("marker-4"), "0 satisfied");
    EXPECT_EQ(verify("policy no-such-policy"), "-6013");
    EXPECT_EQ(verify("open sesame"), "-6014");
    const std::string acl = "allow sign = policy pay";
    ByteVector characteristics;
    EXPECT_EQ(KSTParseAclAndCopyConstraintCharacteristics(
                  acl.data(), acl.size(),
                  [&](KSTStatus, const void* data, std::size_t length) {
                      characteristics = bytesAt(data, length);
                  }),
              0);
    EXPECT_EQ(characteristics, Bytes().u32(1).u32(4).u32(4).get());
    EXPECT_EQ(KSTContextDelete(context, true), 0);
}

TEST_F(ClientStoryTest, FaultReachesTheCaller) {
    KSTContextRef context = nullptr;
    tell("fault command=1 reply=16");
    EXPECT_EQ(KSTContextCreate(&context), kKSTErrorUnexpected);
    ASSERT_EQ(KSTContextCreate(&context), 0);
    tell("fault command=3 reply=3");
    EXPECT_EQ(ask(context, "open"), std::to_string(kKSTErrorUnexpected));
    tell("fault command=5 status=-42");
    EXPECT_EQ(KSTContextAddCredential(context, make(4).get()), -42);
    EXPECT_EQ(KSTContextDelete(context, true), 0);
}

} // namespace

} // namespace keystrand::sim::test
