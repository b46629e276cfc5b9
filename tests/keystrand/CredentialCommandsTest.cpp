#include "tests/keystrand/KernelFixture.h"

namespace keystrand::test {

namespace {

class CredentialCommandsTest : public KernelFixture {
  protected:
    void SetUp() override { createContext(); }

    static ByteVector with(const ByteVector& handleBytes, const ByteVector& credentialBytes,
                           std::uint32_t scope) {
        return Bytes().bytes(handleBytes).bytes(credentialBytes).u32(scope);
    }
    static ByteVector numbers(const ByteVector& handleBytes, std::uint32_t number,
                              std::uint32_t scope) {
        return Bytes().bytes(handleBytes).u32(number).u32(scope);
    }
    void add(const ByteVector& credentialBytes, std::uint32_t scope = 1) {
        ASSERT_EQ(run(5, with(handle(1), credentialBytes, scope)), 0);
    }

    static inline const ByteVector kYes = {1, 0, 0, 0};
    static inline const ByteVector kNo = {0, 0, 0, 0};
};

TEST_F(CredentialCommandsTest, EveryTypeIsAddedAndTakenOutAgain) {
    for (std::uint32_t type = 1; type <= 12; ++type) {
        EXPECT_EQ(run(5, with(handle(1), plainCredential(type), 1)), 0) << type;
        EXPECT_EQ(own(1), Types{type});
        EXPECT_EQ(result(4, numbers(handle(1), type, 0)).output, kYes);
        EXPECT_EQ(run(6, with(handle(1), plainCredential(type), 1)), 0);
        EXPECT_EQ(own(1), Types());
        EXPECT_EQ(result(4, numbers(handle(1), type, 0)).output, kNo);
    }
}

TEST_F(CredentialCommandsTest, ScopesAreApart) {
    add(plainCredential(4), 1);
    add(plainCredential(5), 2);
    EXPECT_EQ(run(5, with(kNoHandle, plainCredential(6), 2)), 0);
    EXPECT_EQ(own(1), Types{4});
    EXPECT_EQ(global(), (Types{5, 6}));
    EXPECT_EQ(run(9, numbers(handle(1), 5, 1)), 0);
    EXPECT_EQ(global(), (Types{5, 6}));
    EXPECT_EQ(run(9, numbers(kNoHandle, 5, 2)), 0);
    EXPECT_EQ(global(), Types{6});
    EXPECT_EQ(run(6, with(kNoHandle, plainCredential(6), 2)), 0);
    EXPECT_EQ(global(), Types());
    EXPECT_EQ(own(1), Types{4});
}

TEST_F(CredentialCommandsTest, ContainsQueriesAskTheirScope) {
    add(plainCredential(4), 1);
    add(passphrase("a", 3), 2);
    for (const std::uint32_t scope : {0U, 1U}) {
        EXPECT_EQ(result(4, numbers(handle(1), 4, scope)).output, kYes);
        EXPECT_EQ(result(4, numbers(handle(1), 2, scope)).output, kNo);
        EXPECT_EQ(result(13, numbers(handle(1), 3, scope)).output, kNo);
    }
    EXPECT_EQ(result(4, numbers(handle(1), 4, 2)).output, kNo);
    EXPECT_EQ(result(4, numbers(handle(1), 2, 2)).output, kYes);
    EXPECT_EQ(result(13, numbers(handle(1), 3, 2)).output, kYes);
    EXPECT_EQ(result(13, numbers(handle(1), 4, 2)).output, kNo);
    EXPECT_EQ(result(13, numbers(handle(1), 3, 2), 4).status, 0);
    EXPECT_EQ(result(13, numbers(handle(1), 3, 2), 3).status, -6008);
    EXPECT_EQ(result(4, numbers(handle(1), 3, 2), 3).status, -6008);
}

TEST_F(CredentialCommandsTest, PassphrasesAreReplacedAndRemovedByPurpose) {
    add(passphrase("a", 1));
    add(passphrase("b", 2));
    EXPECT_EQ(run(15, with(handle(1), passphrase("c", 1), 1)), 0);
    EXPECT_EQ(own(1), (Types{2, 2}));
    EXPECT_EQ(run(6, with(handle(1), passphrase("a", 1), 1)), 0);
    EXPECT_EQ(own(1), (Types{2, 2}));
    EXPECT_EQ(run(16, numbers(handle(1), 1, 1)), 0);
    EXPECT_EQ(own(1), Types{2});
    EXPECT_EQ(run(16, numbers(handle(1), 1, 1)), 0);
    EXPECT_EQ(run(15, with(handle(1), plainCredential(4), 1)), -6007);
    EXPECT_EQ(run(15, with(handle(9), plainCredential(4), 1)), -6007);
    EXPECT_EQ(own(1), Types{2});
}

TEST_F(CredentialCommandsTest, OneCredentialTooMany) {
    for (std::uint32_t user = 0; user < CredentialSet::kMaxCount; ++user) {
        add(plainCredential(4, user), 1);
        add(plainCredential(4, user), 2);
    }
    for (const std::uint32_t scope : {1U, 2U}) {
        EXPECT_EQ(run(5, with(handle(1), plainCredential(5), scope)), -6012);
        EXPECT_EQ(run(15, with(handle(1), passphrase("a"), scope)), -6012);
        EXPECT_EQ(run(5, with(handle(1), plainCredential(4, 0), scope)), 0);
    }
}

TEST_F(CredentialCommandsTest, HandlesAndScopes) {
    struct Case {
        ByteVector handleBytes;
        std::uint32_t scope;
        KernelStatus status;
    };
    const std::vector<Case> cases = {
        {handle(1), 1, 0},     {handle(1), 2, 0},     {kNoHandle, 2, 0},
        {kNoHandle, 1, -6010}, {handle(9), 1, -6010}, {handle(9), 2, -6010},
        {handle(1), 3, -6007}, {kNoHandle, 3, -6007}, {handle(1), 0xffffffff, -6007},
    };
    for (const auto& [handleBytes, scope, status] : cases) {
        SCOPED_TRACE(testing::Message() << int(handleBytes[0]) << " " << scope);
        for (const std::uint32_t code : {5U, 6U, 15U}) {
            EXPECT_EQ(run(code, with(handleBytes, passphrase("a"), scope)), status) << code;
        }
        for (const std::uint32_t code : {4U, 9U, 13U, 16U}) {
            EXPECT_EQ(run(code, numbers(handleBytes, 2, scope)), status) << code;
        }
    }
    for (const std::uint32_t code : {5U, 6U, 15U}) {
        EXPECT_EQ(run(code, with(handle(1), passphrase("a"), 0)), -6007) << code;
    }
    for (const std::uint32_t code : {9U, 16U}) {
        EXPECT_EQ(run(code, numbers(handle(1), 2, 0)), -6007) << code;
    }
}

TEST_F(CredentialCommandsTest, TypesThatDoNotExist) {
    for (const std::uint32_t type : {0U, 13U, 0xffffffffU}) {
        EXPECT_EQ(run(4, numbers(handle(1), type, 0)), -6007) << type;
        EXPECT_EQ(run(9, numbers(handle(1), type, 1)), -6007) << type;
        EXPECT_EQ(run(5, with(handle(1), credential(type, {}), 1)), -6007) << type;
    }
}

TEST_F(CredentialCommandsTest, PayloadsOfNumbersThatAreNotExact) {
    const ByteVector whole = numbers(handle(1), 2, 1);
    const ByteVector cut(whole.begin(), whole.end() - 1);
    for (const std::uint32_t code : {4U, 9U, 13U, 16U}) {
        EXPECT_EQ(run(code, whole), 0) << code;
        EXPECT_EQ(run(code, cut), -6007) << code;
        EXPECT_EQ(run(code, Bytes().bytes(whole).u8(0)), -6007) << code;
    }
}

TEST_F(CredentialCommandsTest, CredentialPayloadsThatAreNotExact) {
    const ByteVector whole = with(handle(1), passphrase("secret"), 1);
    ASSERT_EQ(whole.size(), 188U);
    for (const std::uint32_t code : {5U, 6U, 15U}) {
        for (std::size_t length = 0; length < whole.size(); ++length) {
            const ByteVector cut(whole.begin(), whole.begin() + static_cast<long>(length));
            EXPECT_EQ(run(code, cut), -6007) << code << " " << length;
        }
        EXPECT_EQ(run(code, Bytes().bytes(whole).u8(0)), -6007);
        EXPECT_EQ(run(code, Bytes().bytes(with(handle(1), plainCredential(4), 1)).u8(0)), -6007);
        EXPECT_EQ(run(code, with(handle(1), credential(2, ByteVector(135)), 1)), -6007);
    }
    EXPECT_EQ(own(1), Types());
}

} // namespace

} // namespace keystrand::test
