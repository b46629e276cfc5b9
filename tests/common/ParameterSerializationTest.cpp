#include "KSTLib/LibCall.h"
#include "KSTLib/RequestSerialization.h"
#include "tests/common/ParameterPayloads.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <limits>

namespace {

using support::ParameterArray;
using support::ParameterValue;

constexpr const char* kGrowthCheck =
    "parametersLength + param->parameterDataLength > parametersLength";

using Parameter = support::SerializationFixture;

} // namespace

TEST_F(Parameter, LengthsOfEveryType) {
    const struct {
        std::uint32_t least;
        std::uint32_t most;
        const char* check;
    } kRules[] = {
        {0, 0, "!param->parameterDataLength"},
        {4, 4, "param->parameterDataLength == sizeof(int32_t)"},
        {16, 16, "param->parameterDataLength == 16"},
        {1, 1000, "param->parameterDataLength && (param->parameterDataLength <= 1000)"},
        {4, 4, "param->parameterDataLength == sizeof(uid_t)"},
        {4, 4, "param->parameterDataLength == sizeof(int32_t)"},
        {16, 16, "param->parameterDataLength == 16"},
        {16, 16, "param->parameterDataLength == 16"},
    };
    for (std::uint32_t type = 0; type < 8; ++type) {
        const auto& rule = kRules[type];
        for (const std::uint32_t length :
             {0U, 1U, 3U, 4U, 5U, 15U, 16U, 17U, 999U, 1000U, 1001U, 0x80000000U, 0xffffffffU}) {
            SCOPED_TRACE(testing::Message() << "type " << type << ", length " << length);
            const KSTParameter parameter{type, nullptr, length};
            const bool isValid = length >= rule.least && length <= rule.most;
            EXPECT_EQ(ValidateParameter(&parameter), isValid ? 0 : -3);
            expectLogged(isValid ? support::Lines{} : support::Lines{failedCheck(rule.check)});
        }
    }
}

TEST_F(Parameter, TypesOutside) {
    for (const std::uint32_t type : {8U, 0x80000000U, 0xffffffffU}) {
        const KSTParameter parameter{type, nullptr, 0};
        EXPECT_EQ(ValidateParameter(&parameter), -3);
        expectLogged({failedCheck("0")});
    }
    EXPECT_EQ(ValidateParameter(nullptr), -3);
    expectLogged({failedCheck("param")});
}

TEST_F(Parameter, LengthOfAList) {
    const std::vector<ParameterValue> values = {
        {1, {1, 2, 3, 4}}, {3, {1}}, {2, support::Bytes(16)}};
    ParameterArray array(values);
    std::uint32_t length = 4711;
    EXPECT_EQ(GetSerializedParametersLength(array.data(), 3, &length), 0);
    EXPECT_EQ(length, 8U + 4 + 8 + 1 + 8 + 16);
    EXPECT_EQ(GetSerializedParametersLength(array.data(), 0, &length), 0);
    EXPECT_EQ(length, 0U);
    length = 4711;
    EXPECT_EQ(GetSerializedParametersLength(nullptr, 0, &length), 0);
    EXPECT_EQ(length, 0U);
    expectLogged({});
}

TEST_F(Parameter, LengthOfAListThatIsNotThere) {
    std::uint32_t length = 4711;
    EXPECT_EQ(GetSerializedParametersLength(nullptr, 1, &length), -3);
    EXPECT_EQ(length, 0U);
    expectLogged({failedCheck("param"), failedCall()});
    const KSTParameter parameter{1, nullptr, 4};
    EXPECT_EQ(GetSerializedParametersLength(&parameter, 1, nullptr), -3);
    expectLogged({failedCheck("paramsLength")});
}

TEST_F(Parameter, LengthStaysZeroAfterAFailure) {
    const std::vector<ParameterValue> values = {{1, {1, 2, 3, 4}}, {1, {1}}};
    ParameterArray array(values);
    std::uint32_t length = 4711;
    EXPECT_EQ(GetSerializedParametersLength(array.data(), 2, &length), -3);
    EXPECT_EQ(length, 0U);
    expectLogged({failedCheck("param->parameterDataLength == sizeof(int32_t)"), failedCall()});
}

TEST_F(Parameter, ValueOfNoBytesDoesNotMakeTheSumGrow) {
    const KSTParameter parameter{0, nullptr, 0};
    std::uint32_t length = 4711;
    EXPECT_EQ(GetSerializedParametersLength(&parameter, 1, &length), -3);
    EXPECT_EQ(length, 0U);
    expectLogged({failedCheck(kGrowthCheck)});
}

TEST_F(Parameter, SumOfThirtyTwoBits) {
    // 4260880 times 1008 is 256 below 2^32.
    constexpr std::uint32_t kMost = 4260880;
    const std::vector<KSTParameter> parameters(kMost + 1, {3, nullptr, 1000});
    std::uint32_t length = 0;
    EXPECT_EQ(GetSerializedParametersLength(parameters.data(), kMost, &length), 0);
    EXPECT_EQ(length, 0xffffff00U);
    const KSTHandle handle{};
    std::size_t size = 0;
    EXPECT_EQ(GetSerializedVerifyPolicySize(&handle, "a", 0, 0, parameters.data(), kMost, &size),
              0);
    EXPECT_EQ(size, 0xffffff00U + std::size_t{27});
    expectLogged({});
    EXPECT_EQ(GetSerializedParametersLength(parameters.data(), kMost + 1, &length), -3);
    EXPECT_EQ(length, 0U);
    expectLogged({failedCheck(kGrowthCheck)});
}

TEST_F(Parameter, ReleaseOfNothing) {
    const support::ScriptedGate gate;
    DeallocParameters(nullptr, 3);
    DeallocDataBlob(nullptr, 3);
    EXPECT_TRUE(gate.freed.empty());
    expectLogged({});
}

TEST_F(Parameter, FrameIsReleasedAsABlob) {
    std::size_t size = 0;
    std::uint8_t* frame = LibCall_BuildCommand(1, 0, 0, "abc", 3, &size);
    ASSERT_NE(frame, nullptr);
    const support::ScriptedGate gate;
    DeallocDataBlob(frame, size);
    EXPECT_EQ(gate.freed, std::vector<std::size_t>{11});
    EXPECT_TRUE(gate.everyFreeWasWiped);
}
