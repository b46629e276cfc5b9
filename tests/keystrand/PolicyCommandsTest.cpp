#include "tests/keystrand/KernelFixture.h"

namespace keystrand::test {

namespace {

class PolicyCommandsTest : public KernelFixture {
  protected:
    void SetUp() override {
        createContext();
        definePolicies("policy door = all-of(passcode(once), marker-4)\n"
                       "policy window = marker-5(once)\n");
    }

    static ByteVector parameter(std::uint32_t type, const ByteVector& value) {
        return Bytes().u32(type).u32(value.size()).bytes(value);
    }

    struct Question {
        std::uint8_t preflight = 0;
        std::uint32_t maxGlobalAge = 0;
        std::vector<ByteVector> parameters = {};

        [[nodiscard]] ByteVector tail() const {
            Bytes bytes = Bytes().u32(maxGlobalAge).u32(parameters.size());
            for (const ByteVector& one : parameters) {
                bytes.bytes(one);
            }
            return bytes;
        }
    };

    static ByteVector policy(const ByteVector& handleBytes, const std::string& name,
                             const Question& question) {
        return Bytes()
            .bytes(handleBytes)
            .text(name)
            .u8(0)
            .u8(question.preflight)
            .bytes(question.tail());
    }
    static ByteVector constraint(const ByteVector& handleBytes, const std::string& text,
                                 const Question& question) {
        return Bytes()
            .bytes(handleBytes)
            .u32(text.size())
            .text(text)
            .u8(question.preflight)
            .bytes(question.tail());
    }

    [[nodiscard]] CommandResult ask(const std::string& name, const Question& question) const {
        return result(3, policy(handle(1), name, question));
    }

    void add(const ByteVector& credentialBytes, std::uint32_t scope = 1) {
        ASSERT_EQ(run(5, Bytes().bytes(handle(1)).bytes(credentialBytes).u32(scope)), 0);
    }

    static Bytes leaf(std::uint32_t type, std::uint32_t dataLength = 0) {
        return Bytes().u32(type).u32(1).u32(0).u32(dataLength);
    }

    static inline const ByteVector kSatisfied = {1, 0, 0, 0};
};

TEST_F(PolicyCommandsTest, UnmetPolicyIsAnsweredWithWhatIsMissing) {
    const CommandResult answer = ask("door", {});
    EXPECT_EQ(answer.status, 0);
    EXPECT_EQ(answer.output, Bytes()
                                 .u32(0)
                                 .bytes(leaf(4, 20))
                                 .u32(2)
                                 .bytes(leaf(1, 4))
                                 .u32(0xffffffff)
                                 .bytes(leaf(14))
                                 .get());
    add(plainCredential(1));
    EXPECT_EQ(ask("door", {}).output,
              Bytes().u32(0).bytes(leaf(4, 12)).u32(1).bytes(leaf(14)).get());
    EXPECT_EQ(own(1), Types{1});
}

TEST_F(PolicyCommandsTest, PreflightLeavesWhatOnceUsesUp) {
    add(plainCredential(1));
    add(plainCredential(4));
    for (const std::uint8_t preflight : ByteVector{1, 255}) {
        EXPECT_EQ(ask("door", {.preflight = preflight}).output, kSatisfied);
        EXPECT_EQ(own(1), (Types{1, 4}));
    }
    EXPECT_EQ(ask("door", {}).output, kSatisfied);
    EXPECT_EQ(own(1), Types{4});
    EXPECT_NE(ask("door", {}).output, kSatisfied);
}

TEST_F(PolicyCommandsTest, GlobalCredentialsCountAndAreUsedUp) {
    add(plainCredential(5), 2);
    now_ += 10;
    EXPECT_EQ(ask("window", {.maxGlobalAge = 0}).output, Bytes().u32(0).bytes(leaf(15)).get());
    EXPECT_NE(ask("window", {.maxGlobalAge = 9}).output, kSatisfied);
    EXPECT_EQ(ask("window", {.preflight = 1, .maxGlobalAge = 10}).output, kSatisfied);
    EXPECT_EQ(ask("window", {.maxGlobalAge = 0xffffffff}).output, kSatisfied);
    EXPECT_EQ(global(), Types());
}

TEST_F(PolicyCommandsTest, UserOfTheParameters) {
    add(plainCredential(5, 1000));
    const ByteVector right = parameter(4, Bytes().u32(1000));
    const ByteVector wrong = parameter(4, Bytes().u32(1001));
    const ByteVector other = parameter(3, Bytes().text("anything"));
    EXPECT_NE(ask("window", {.preflight = 1, .parameters = {wrong}}).output, kSatisfied);
    EXPECT_EQ(ask("window", {.parameters = {right, wrong}}).status, -6007);
    EXPECT_EQ(ask("window", {.preflight = 1, .parameters = {right, right}}).output, kSatisfied);
    EXPECT_EQ(ask("window", {.parameters = {other, right}}).output, kSatisfied);
}

TEST_F(PolicyCommandsTest, Parameters) {
    const ByteVector none = parameter(0, {});
    const ByteVector longest = parameter(3, ByteVector(1000));
    EXPECT_EQ(ask("door", {.parameters = std::vector(10, longest)}).status, 0);
    EXPECT_EQ(ask("door", {.parameters = std::vector(10, none)}).status, 0);
    EXPECT_EQ(ask("door", {.parameters = std::vector(11, none)}).status, -6007);
    EXPECT_EQ(ask("door", {.parameters = {parameter(3, ByteVector(1001))}}).status, -6007);
    EXPECT_EQ(ask("door", {.parameters = {parameter(8, {})}}).status, -6007);
}

TEST_F(PolicyCommandsTest, ContextsAndPoliciesThatAreNotThere) {
    EXPECT_EQ(run(3, policy(handle(2), "door", {})), -6010);
    EXPECT_EQ(run(3, policy(kNoHandle, "door", {})), -6010);
    EXPECT_EQ(run(11, constraint(kNoHandle, "never", {})), -6010);
    EXPECT_EQ(ask("doors", {}).status, -6013);
    EXPECT_EQ(ask("", {}).status, -6013);
    EXPECT_EQ(ask(std::string(128, 'x'), {}).status, -6013);
    EXPECT_EQ(ask(std::string(129, 'x'), {}).status, -6007);
}

TEST_F(PolicyCommandsTest, Constraints) {
    const std::vector<std::pair<std::string, KernelStatus>> cases = {
        {"policy door", 0},
        {"any-of(passcode(age=5),\n never)", 0},
        {"policy doors", -6013},
        {"door", -6014},
        {"", -6014},
        {"passcode passcode", -6014},
        {"passcode)", -6014},
        {std::string(4096 - 5, ' ') + "never", 0},
        {std::string(4096 - 4, ' ') + "never", -6007},
    };
    for (const auto& [text, status] : cases) {
        EXPECT_EQ(run(11, constraint(handle(1), text, {})), status) << text;
    }
    add(plainCredential(4));
    EXPECT_EQ(result(11, constraint(handle(1), "marker-4(once)", {.preflight = 1})).output,
              kSatisfied);
    EXPECT_EQ(result(11, constraint(handle(1), "marker-4(once)", {})).output, kSatisfied);
    EXPECT_EQ(own(1), Types());
    EXPECT_EQ(result(11, constraint(handle(1), "marker-4", {})).output,
              Bytes().u32(0).bytes(leaf(14)).get());
}

TEST_F(PolicyCommandsTest, PayloadsThatAreNotExact) {
    const Question question{.parameters = {parameter(3, Bytes().text("abc"))}};
    const std::vector<std::pair<std::uint32_t, ByteVector>> payloads = {
        {3, policy(handle(1), "door", question)},
        {11, constraint(handle(1), "policy door", question)},
    };
    for (const auto& [code, whole] : payloads) {
        ASSERT_EQ(run(code, whole), 0);
        for (std::size_t length = 0; length < whole.size(); ++length) {
            const ByteVector cut(whole.begin(), whole.begin() + static_cast<long>(length));
            EXPECT_EQ(run(code, cut), -6007) << code << " " << length;
        }
        EXPECT_EQ(run(code, Bytes().bytes(whole).u8(0)), -6007) << code;
        EXPECT_EQ(run(code, Bytes().bytes(whole).u32(0)), -6007) << code;
    }
}

TEST_F(PolicyCommandsTest, LengthsThatNobodySent) {
    constexpr std::size_t kLengthOffset = 16;
    const ByteVector whole = constraint(handle(1), "policy door", {});
    for (const std::uint32_t length : {0U, 10U, 12U, 1000U, 0x100000U}) {
        ByteVector bytes = whole;
        for (std::size_t i = 0; i < 4; ++i) {
            bytes[kLengthOffset + i] = static_cast<std::uint8_t>(length >> (8 * i));
        }
        EXPECT_EQ(run(11, bytes), -6007) << length;
        EXPECT_EQ(run(20, bytes), -6007) << length;
    }
}

TEST_F(PolicyCommandsTest, ParametersThatDisagreeAboutTheUser) {
    const ByteVector five = parameter(4, Bytes().u32(5));
    const ByteVector six = parameter(4, Bytes().u32(6));
    const Question one{.parameters = {five, five}};
    const Question two{.parameters = {five, six}};
    EXPECT_EQ(run(3, policy(handle(1), "door", one)), 0);
    EXPECT_EQ(run(3, policy(handle(1), "door", two)), -6007);
    EXPECT_EQ(run(11, constraint(handle(1), "policy door", one)), 0);
    EXPECT_EQ(run(11, constraint(handle(1), "policy door", two)), -6007);
}

TEST_F(PolicyCommandsTest, AnswerHasToFit) {
    add(plainCredential(5));
    const ByteVector question = policy(handle(1), "window", {});
    EXPECT_EQ(result(3, question, 3).status, -6008);
    EXPECT_EQ(own(1), Types{5});
    EXPECT_EQ(result(3, question, 4).output, kSatisfied);
}

class AccessListCommandTest : public PolicyCommandsTest {
  protected:
    static ByteVector acl(const ByteVector& handleBytes, const std::string& list,
                          const std::string& operation = "") {
        return Bytes()
            .bytes(handleBytes)
            .u32(list.size())
            .text(list)
            .u32(operation.size())
            .text(operation)
            .u32(0)
            .u32(0);
    }

    const std::string kList = "allow open = policy door\nallow look = any-of(passcode, biometry)";
};

TEST_F(AccessListCommandTest, CharacteristicsOfEachRule) {
    EXPECT_EQ(result(20, acl(kNoHandle, kList)).output,
              Bytes().u32(2).u32(0x12).u32(0x12).u32(0x0a).u32(0).get());
    EXPECT_EQ(result(20, acl(handle(1), kList, "look")).output,
              Bytes().u32(1).u32(0x0a).u32(0).get());
    EXPECT_EQ(result(20, acl(kNoHandle, kList, "close")).output, Bytes().u32(0).get());
}

TEST_F(AccessListCommandTest, Refusals) {
    EXPECT_EQ(run(20, acl(handle(9), kList)), -6010);
    EXPECT_EQ(run(20, acl(kNoHandle, "allow open = policy doors")), -6013);
    EXPECT_EQ(run(20, acl(kNoHandle, "")), -6014);
    EXPECT_EQ(run(20, acl(kNoHandle, "open")), -6014);
    EXPECT_EQ(run(20, acl(kNoHandle, kList, std::string(256, 'x'))), 0);
    EXPECT_EQ(run(20, acl(kNoHandle, kList, std::string(257, 'x'))), -6007);
    std::string padded = kList;
    padded.resize(4096, ' ');
    EXPECT_EQ(run(20, acl(kNoHandle, padded)), 0);
    EXPECT_EQ(run(20, acl(kNoHandle, padded + " ")), -6007);
}

TEST_F(AccessListCommandTest, ParametersThatDisagreeAboutTheUser) {
    const auto withUsers = [&](std::uint32_t first, std::uint32_t second) {
        ByteVector bytes = acl(handle(1), kList);
        bytes.resize(bytes.size() - 4);
        return Bytes().bytes(bytes).u32(2).u32(4).u32(4).u32(first).u32(4).u32(4).u32(second).get();
    };
    EXPECT_EQ(run(20, withUsers(5, 5)), 0);
    EXPECT_EQ(run(20, withUsers(5, 6)), -6007);
}

TEST_F(AccessListCommandTest, PayloadsThatAreNotExact) {
    const ByteVector whole = acl(kNoHandle, kList, "open");
    for (std::size_t length = 0; length < whole.size(); ++length) {
        const ByteVector cut(whole.begin(), whole.begin() + static_cast<long>(length));
        EXPECT_EQ(run(20, cut), -6007) << length;
    }
    EXPECT_EQ(run(20, Bytes().bytes(whole).u32(0)), -6007);
}

} // namespace

} // namespace keystrand::test
