#include "KSTLib/RequestSerialization.h"
#include "tests/common/ParameterPayloads.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <string>

namespace {

using support::Bytes;
using support::ExactBuffer;
using support::ScriptedGate;

constexpr const char* kLengthCheck = "policyLength <= 128";

/// Handle 1 to 16, policy "a", preflight 7, age 0x04030201, no parameters.
const Bytes kSmall = {1,  2,  3,   4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14,
                      15, 16, 'a', 0, 7, 1, 2, 3, 4, 0,  0,  0,  0};

class VerifyPolicy : public support::SerializationFixture {
  protected:
    struct Result {
        KSTHandle handle{};
        char* policyId = nullptr;
        std::uint8_t preflight = 0xee;
        std::uint32_t age = 0;
        KSTParameter* parameters = nullptr;
        std::uint32_t count = 0;
    };

    static KSTStatus read(const Bytes& bytes, Result& result) {
        const ExactBuffer buffer(bytes);
        return DeserializeVerifyPolicy(buffer.data(), buffer.size(), &result.handle,
                                       &result.policyId, &result.preflight, &result.age,
                                       &result.parameters, &result.count);
    }

    /// A payload of zeros around a policy of `length` bytes.
    static Bytes payloadWithPolicy(std::size_t length) {
        Bytes bytes(16);
        support::append(bytes, Bytes(length, 'p'));
        support::append(bytes, Bytes(10));
        return bytes;
    }

    const KSTHandle handle = support::countingHandle();
};

} // namespace

TEST_F(VerifyPolicy, SmallestPayload) {
    std::size_t size = 0;
    ASSERT_EQ(GetSerializedVerifyPolicySize(&handle, "a", 7, 0x04030201, nullptr, 0, &size), 0);
    EXPECT_EQ(size, 27U);
    const ExactBuffer buffer(size);
    ASSERT_EQ(SerializeVerifyPolicy(&handle, "a", 7, 0x04030201, nullptr, 0, buffer.data(), &size),
              0);
    EXPECT_EQ(size, 27U);
    EXPECT_EQ(buffer.bytes(), kSmall);
    expectLogged({});
}

TEST_F(VerifyPolicy, WithParameters) {
    const std::uint8_t values[] = {0x11, 0x12, 0x13, 0x14, 0x31};
    const KSTParameter parameters[] = {{1, values, 4}, {3, values + 4, 1}};
    const ExactBuffer buffer(48);
    std::size_t size = 48;
    ASSERT_EQ(SerializeVerifyPolicy(&handle, "", 0, 5, parameters, 2, buffer.data(), &size), 0);
    EXPECT_EQ(size, 47U);
    EXPECT_EQ(buffer.bytes(),
              (Bytes{1, 2, 3,    4,    5,    6,    7, 8, 9, 10, 11, 12, 13, 14, 15,   16,
                     0, 0, 5,    0,    0,    0,    2, 0, 0, 0,  1,  0,  0,  0,  4,    0,
                     0, 0, 0x11, 0x12, 0x13, 0x14, 3, 0, 0, 0,  1,  0,  0,  0,  0x31, 0xa5}));
}

TEST_F(VerifyPolicy, ReadsWhatIsThere) {
    Result result;
    ASSERT_EQ(read(kSmall, result), 0);
    EXPECT_EQ(Bytes(result.handle.bytes, result.handle.bytes + 16),
              Bytes(kSmall.begin(), kSmall.begin() + 16));
    EXPECT_STREQ(result.policyId, "a");
    EXPECT_EQ(result.preflight, 1);
    EXPECT_EQ(result.age, 0x04030201U);
    EXPECT_EQ(result.parameters, nullptr);
    EXPECT_EQ(result.count, 0U);
    DeallocDataBlob(result.policyId, 2);
}

TEST_F(VerifyPolicy, PreflightIsReadAsAFlag) {
    for (const int preflight : {0, 1, 7, 0x80, 0xff}) {
        Bytes bytes = kSmall;
        bytes[18] = static_cast<std::uint8_t>(preflight);
        Result result;
        ASSERT_EQ(read(bytes, result), 0);
        EXPECT_EQ(result.preflight, preflight != 0 ? 1 : 0);
        DeallocDataBlob(result.policyId, 2);
    }
}

TEST_F(VerifyPolicy, PolicyLengthsAtTheirLimit) {
    for (const std::size_t length : {0U, 1U, 127U, 128U}) {
        const std::string policy(length, 'p');
        std::size_t size = 0;
        EXPECT_EQ(GetSerializedVerifyPolicySize(&handle, policy.c_str(), 0, 0, nullptr, 0, &size),
                  0);
        EXPECT_EQ(size, length + 26);
        Bytes buffer(size);
        EXPECT_EQ(
            SerializeVerifyPolicy(&handle, policy.c_str(), 0, 0, nullptr, 0, buffer.data(), &size),
            0);
        EXPECT_EQ(size, length + 26);
        Result result;
        EXPECT_EQ(read(payloadWithPolicy(length), result), 0);
        EXPECT_EQ(result.policyId, policy);
        DeallocDataBlob(result.policyId, length + 1);
    }
    expectLogged({});
}

TEST_F(VerifyPolicy, PolicyLengthsAboveTheLimit) {
    for (const std::size_t length : {129U, 130U, 5000U}) {
        const std::string policy(length, 'p');
        std::size_t size = 4711;
        EXPECT_EQ(GetSerializedVerifyPolicySize(&handle, policy.c_str(), 0, 0, nullptr, 0, &size),
                  -3);
        EXPECT_EQ(size, 4711U);
        expectLogged({failedCheck(kLengthCheck)});
        Bytes buffer(size);
        EXPECT_EQ(
            SerializeVerifyPolicy(&handle, policy.c_str(), 0, 0, nullptr, 0, buffer.data(), &size),
            -3);
        EXPECT_EQ(buffer, Bytes(4711));
        expectLogged({failedCheck(kLengthCheck), failedCall()});
        Result result;
        EXPECT_EQ(read(payloadWithPolicy(length), result), -3);
        expectLogged({failedCheck("(policyLength <= 128)")});
    }
}

TEST_F(VerifyPolicy, TextWithoutAnEnd) {
    Result result;
    Bytes bytes(16 + 128, 'p');
    const ScriptedGate gate;
    EXPECT_EQ(read(bytes, result), -3);
    EXPECT_TRUE(gate.asked.empty());
    expectLogged({failedCheck("(size - offset) >= (policyLength + 1)")});
    bytes.push_back('p');
    EXPECT_EQ(read(bytes, result), -3);
    expectLogged({failedCheck("(policyLength <= 128)")});
}

TEST_F(VerifyPolicy, UnterminatedPolicyOfACallerIsNotReadPastItsLimit) {
    const ExactBuffer policy(129);
    std::size_t size = 0;
    EXPECT_EQ(GetSerializedVerifyPolicySize(&handle, reinterpret_cast<const char*>(policy.data()),
                                            0, 0, nullptr, 0, &size),
              -3);
    expectLogged({failedCheck(kLengthCheck)});
}

TEST_F(VerifyPolicy, MissingArgumentsOfTheWriters) {
    std::size_t size = 100;
    std::uint8_t buffer[100];
    const KSTParameter parameter{};
    EXPECT_EQ(GetSerializedVerifyPolicySize(nullptr, nullptr, 0, 0, nullptr, 0, nullptr), -3);
    EXPECT_EQ(GetSerializedVerifyPolicySize(&handle, nullptr, 0, 0, nullptr, 0, nullptr), -3);
    EXPECT_EQ(GetSerializedVerifyPolicySize(&handle, "a", 0, 0, nullptr, 0, nullptr), -3);
    expectLogged({failedCheck("handle"), failedCheck("policyId"), failedCheck("outSize")});
    EXPECT_EQ(SerializeVerifyPolicy(nullptr, nullptr, 0, 0, &parameter, 0, nullptr, nullptr), -3);
    EXPECT_EQ(SerializeVerifyPolicy(&handle, nullptr, 0, 0, &parameter, 0, nullptr, nullptr), -3);
    EXPECT_EQ(SerializeVerifyPolicy(&handle, "a", 0, 0, &parameter, 0, nullptr, nullptr), -3);
    EXPECT_EQ(SerializeVerifyPolicy(&handle, "a", 0, 0, &parameter, 11, nullptr, nullptr), -3);
    EXPECT_EQ(SerializeVerifyPolicy(&handle, "a", 0, 0, nullptr, 0, nullptr, nullptr), -3);
    EXPECT_EQ(SerializeVerifyPolicy(&handle, "a", 0, 0, nullptr, 0, buffer, nullptr), -3);
    EXPECT_EQ(SerializeVerifyPolicy(&handle, "a", 0, 0, nullptr, 0, nullptr, &size), -3);
    expectLogged(
        {failedCheck("handle"), failedCheck("policyId"),
         failedCheck("(parameters && parametersCount) || (!parameters && !parametersCount)"),
         failedCheck("parametersCount <= 10"), failedCheck("outBuffer"), failedCheck("outSize"),
         failedCheck("outBuffer")});
}

TEST_F(VerifyPolicy, SizeLooksNeitherAtTheCountNorAtThePair) {
    const std::vector<KSTParameter> parameters(11, {3, "x", 1});
    std::size_t size = 0;
    EXPECT_EQ(GetSerializedVerifyPolicySize(&handle, "a", 0, 0, parameters.data(), 11, &size), 0);
    EXPECT_EQ(size, 27U + 11 * 9);
    EXPECT_EQ(GetSerializedVerifyPolicySize(&handle, "a", 0, 0, parameters.data(), 0, &size), 0);
    EXPECT_EQ(size, 27U);
    EXPECT_EQ(GetSerializedVerifyPolicySize(&handle, "a", 0, 0, nullptr, 2, &size), -3);
    expectLogged({failedCheck("param"), failedCall(), failedCheck("err == kKSTErrorSuccess")});
}

TEST_F(VerifyPolicy, MissingArgumentsOfTheReader) {
    Result r;
    const auto readWith = [&](int missing) {
        const auto given = [&](int number, auto* pointer) {
            return number == missing ? nullptr : pointer;
        };
        return DeserializeVerifyPolicy(
            given(0, kSmall.data()), kSmall.size(), given(1, &r.handle), given(2, &r.policyId),
            given(3, &r.preflight), given(4, &r.age), given(5, &r.parameters), given(6, &r.count));
    };
    int missing = 0;
    for (const char* name : {"buffer", "handle", "policyId", "preflight", "maxGlobalCredentialAge",
                             "parameters", "parametersCount"}) {
        EXPECT_EQ(readWith(missing++), -3);
        expectLogged({failedCheck(name)});
    }
    EXPECT_EQ(r.policyId, nullptr);
}

TEST_F(VerifyPolicy, FailedAllocationOfThePolicy) {
    const ScriptedGate gate(0);
    Result result;
    EXPECT_EQ(read(kSmall, result), -4);
    EXPECT_EQ(gate.asked, std::vector<std::size_t>{2});
    EXPECT_EQ(result.policyId, nullptr);
    expectLogged({failedCheck("policy")});
}
