// What the verify-policy, verify-ACL-constraint and process-ACL payloads have in common.

#include "tests/common/ParameterPayloads.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <limits>

namespace {

using support::append;
using support::Bytes;
using support::Cut;
using support::ExactBuffer;
using support::Lines;
using support::ParameterArray;
using support::ParameterValue;
using support::putU32;
using support::Said;
using support::ScriptedGate;

constexpr std::uint32_t kAge = 0x0a0b0c0d;

constexpr const char* kLengthCheck =
    "parametersLength + param->parameterDataLength > parametersLength";

/// Every type that can be written, at the limits of its length.
const std::vector<std::vector<ParameterValue>> kSamples = {
    {},
    {{1, {0xff, 0xff, 0xff, 0x7f}}},
    {{2, Bytes(16, 0x22)}, {3, {0x33}}, {4, {0xf5, 1, 0, 0}}},
    {{3, Bytes(1000, 0x33)}},
    {{5, Bytes(4, 0x55)}, {6, Bytes(16, 0x66)}, {7, Bytes(16, 0x77)}},
    std::vector<ParameterValue>(10, {3, {1, 2, 3}}),
    std::vector<ParameterValue>(10, {3, Bytes(1000, 0x99)}),
};

template <typename Kind>
class ParameterPayload : public support::SerializationFixture {
  protected:
    using Size = typename Kind::Size;

    /// A payload with these bytes behind the age.
    static Bytes payloadWith(std::uint32_t count, const Bytes& behindCount) {
        Bytes bytes = Kind::front();
        const std::size_t at = bytes.size();
        bytes.resize(at + 8);
        putU32(bytes, at, kAge);
        putU32(bytes, at + 4, count);
        append(bytes, behindCount);
        return bytes;
    }

    static Bytes payloadOf(const std::vector<ParameterValue>& parameters) {
        return payloadWith(static_cast<std::uint32_t>(parameters.size()),
                           support::wireOf(parameters));
    }

    std::optional<Said> read(const Bytes& bytes, KSTStatus expected = kKSTErrorSuccess) {
        const std::int64_t before = gAllocatedBytes;
        const ExactBuffer buffer(bytes);
        std::optional<Said> said;
        EXPECT_EQ(Kind::read(buffer, said), expected);
        EXPECT_EQ(gAllocatedBytes, before);
        return said;
    }

    void expectRefused(const Bytes& bytes, const Lines& lines) {
        EXPECT_FALSE(read(bytes, kKSTErrorBadParameter));
        this->expectLogged(lines);
    }

    /// Writes with `capacity` bytes of room, which must be refused and write nothing.
    void expectNotWritten(const KSTParameter* parameters, std::uint32_t count, std::size_t capacity,
                          const Lines& lines) {
        const ExactBuffer buffer(capacity);
        auto size = static_cast<Size>(capacity);
        EXPECT_EQ(Kind::write(kAge, parameters, count, buffer.data(), &size),
                  kKSTErrorBadParameter);
        EXPECT_EQ(size, capacity);
        EXPECT_EQ(buffer.bytes(), Bytes(capacity, 0xa5));
        this->expectLogged(lines);
    }

    /// Writing and announcing fail in the same way.
    void expectNotSized(ParameterArray& parameters, const Lines& lines) {
        Size size = 4711;
        EXPECT_EQ(Kind::announce(parameters.data(), parameters.count(), &size),
                  kKSTErrorBadParameter);
        EXPECT_EQ(size, 4711U);
        this->expectLogged(lines);
        Lines ofWriter = lines;
        ofWriter.push_back(this->failedCall());
        expectNotWritten(parameters.data(), parameters.count(), 20000, ofWriter);
    }

    static std::size_t announced(ParameterArray& parameters) {
        Size size = 0;
        EXPECT_EQ(Kind::announce(parameters.data(), parameters.count(), &size), 0);
        return size;
    }
};

using Kinds =
    testing::Types<support::VerifyPolicyKind, support::VerifyAclKind, support::ProcessAclKind>;
TYPED_TEST_SUITE(ParameterPayload, Kinds);

} // namespace

TYPED_TEST(ParameterPayload, ThereAndBackAgain) {
    for (const auto& parameters : kSamples) {
        SCOPED_TRACE(parameters.size());
        const Bytes golden = this->payloadOf(parameters);
        ParameterArray array(parameters);
        const std::size_t room = this->announced(array);
        EXPECT_EQ(room, golden.size() + TypeParam::kUnwrittenSize);
        const ExactBuffer written(room);
        auto size = static_cast<typename TypeParam::Size>(room);
        EXPECT_EQ(TypeParam::write(kAge, array.data(), array.count(), written.data(), &size), 0);
        EXPECT_EQ(size, golden.size());
        EXPECT_EQ(Bytes(written.data(), written.data() + size), golden);
        EXPECT_EQ(Bytes(written.data() + size, written.data() + room),
                  Bytes(TypeParam::kUnwrittenSize, 0xa5));

        const std::optional<Said> said = this->read(golden);
        ASSERT_TRUE(said);
        EXPECT_EQ(said->age, kAge);
        EXPECT_EQ(said->parameters, parameters);
    }
    this->expectLogged({});
}

TYPED_TEST(ParameterPayload, TrailingBytesAreIgnored) {
    for (const auto& parameters : kSamples) {
        Bytes bytes = this->payloadOf(parameters);
        append(bytes, Bytes(9, 0xff));
        const std::optional<Said> said = this->read(bytes);
        ASSERT_TRUE(said);
        EXPECT_EQ(said->parameters, parameters);
    }
    this->expectLogged({});
}

TYPED_TEST(ParameterPayload, EveryTruncation) {
    constexpr const char* kHeaderCut =
        "(size - offset) >= sizeof(KSTParameterType) + sizeof(uint32_t)";
    constexpr const char* kDataCut = "(size - offset) >= params[i].parameterDataLength";
    const Bytes whole = this->payloadOf({{1, {1, 2, 3, 4}}, {3, {5, 6}}});
    std::vector<Cut> cuts = TypeParam::cuts();
    const std::size_t behindCount = TypeParam::front().size() + 8;
    ASSERT_EQ(cuts.back().end, behindCount);
    cuts.push_back({behindCount + 8, kHeaderCut});
    cuts.push_back({behindCount + 12, kDataCut});
    cuts.push_back({behindCount + 20, kHeaderCut});
    cuts.push_back({behindCount + 22, kDataCut});
    ASSERT_EQ(cuts.back().end, whole.size());
    std::size_t length = 0;
    for (const Cut& cut : cuts) {
        for (; length < cut.end; ++length) {
            SCOPED_TRACE(length);
            this->expectRefused({whole.begin(), whole.begin() + static_cast<long>(length)},
                                {this->failedCheck(cut.check)});
        }
    }
    EXPECT_TRUE(this->read(whole));
}

TYPED_TEST(ParameterPayload, CountsAboveTheLimit) {
    const Bytes eleven = support::wireOf(std::vector<ParameterValue>(11, {3, {1}}));
    for (const std::uint32_t count : {11U, 0x80000000U, 0xffffffffU}) {
        this->expectRefused(this->payloadWith(count, eleven),
                            {this->failedCheck("paramsCount <= 10")});
    }
    EXPECT_TRUE(this->read(this->payloadWith(10, eleven)));
    const std::vector<ParameterValue> values(11, {3, {1}});
    ParameterArray array(values);
    this->expectNotWritten(array.data(), 11, 1000, {this->failedCheck("parametersCount <= 10")});
    this->expectNotWritten(array.data(), 0xffffffff, 1000,
                           {this->failedCheck("parametersCount <= 10")});
}

TYPED_TEST(ParameterPayload, LengthsThatAreNotThere) {
    for (const std::uint32_t length : {2U, 1000U, 1001U, 0x80000000U, 0xffffffffU}) {
        Bytes parameter = support::wireOf({{3, {1}}});
        putU32(parameter, 4, length);
        const ScriptedGate gate;
        this->expectRefused(
            this->payloadWith(1, parameter),
            {this->failedCheck("(size - offset) >= params[i].parameterDataLength")});
        EXPECT_EQ(gate.asked.size(), TypeParam::kBlobAllocations + 1);
    }
}

TYPED_TEST(ParameterPayload, ParametersThatAreNotValid) {
    const struct {
        ParameterValue parameter;
        const char* check;
    } kInvalid[] = {
        {{0, {1}}, "!param->parameterDataLength"},
        {{1, {1, 2, 3}}, "param->parameterDataLength == sizeof(int32_t)"},
        {{1, {1, 2, 3, 4, 5}}, "param->parameterDataLength == sizeof(int32_t)"},
        {{3, {}}, "param->parameterDataLength && (param->parameterDataLength <= 1000)"},
        {{3, Bytes(1001)}, "param->parameterDataLength && (param->parameterDataLength <= 1000)"},
        {{4, {}}, "param->parameterDataLength == sizeof(uid_t)"},
        {{7, Bytes(17)}, "param->parameterDataLength == 16"},
        {{8, {1}}, "0"},
        {{0xffffffff, {1}}, "0"},
    };
    for (const auto& invalid : kInvalid) {
        SCOPED_TRACE(invalid.parameter.type);
        const std::vector<ParameterValue> parameters = {{1, {1, 2, 3, 4}}, invalid.parameter};
        this->expectRefused(this->payloadOf(parameters),
                            {this->failedCheck(invalid.check), this->failedCall()});
        ParameterArray array(parameters);
        this->expectNotSized(array, {this->failedCheck(invalid.check), this->failedCall(),
                                     this->failedCheck("err == kKSTErrorSuccess")});
    }
}

TYPED_TEST(ParameterPayload, ParameterWithoutAValueIsReadButNotWritten) {
    const std::vector<ParameterValue> parameters = {{0, {}}};
    const std::optional<Said> said = this->read(this->payloadOf(parameters));
    ASSERT_TRUE(said);
    EXPECT_EQ(said->parameters, parameters);
    this->expectLogged({});
    ParameterArray array(parameters);
    this->expectNotSized(
        array, {this->failedCheck(kLengthCheck), this->failedCheck("err == kKSTErrorSuccess")});
}

TYPED_TEST(ParameterPayload, LengthWithoutAPointer) {
    const std::vector<ParameterValue> parameters = {{1, {1, 2, 3, 4}}, {3, {1}}};
    for (std::size_t i = 0; i < parameters.size(); ++i) {
        ParameterArray array(parameters);
        array[i].parameterData = nullptr;
        this->expectNotWritten(
            array.data(), 2, 1000,
            {this->failedCheck("param->parameterData || !param->parameterDataLength")});
        this->log.clear();
    }
}

TYPED_TEST(ParameterPayload, CountAndArrayOnlyTogether) {
    const Lines lines = {
        this->failedCheck("(parameters && parametersCount) || (!parameters && !parametersCount)")};
    const KSTParameter parameter{};
    this->expectNotWritten(&parameter, 0, 1000, lines);
    this->expectNotWritten(nullptr, 3, 1000, lines);
    this->expectNotWritten(nullptr, 11, 1000, lines);
}

TYPED_TEST(ParameterPayload, RoomAtItsLimit) {
    for (const auto& parameters : kSamples) {
        ParameterArray array(parameters);
        const std::size_t room = this->announced(array);
        for (const std::size_t capacity : {std::size_t{0}, room - 5, room - 4, room - 1}) {
            this->expectNotWritten(array.data(), array.count(), capacity,
                                   {this->failedCheck("*outSize >= requiredSize")});
        }
    }
}

TYPED_TEST(ParameterPayload, EveryAllocationFails) {
    constexpr const char* kChecks[] = {"params", "params[i].parameterData",
                                       "params[i].parameterData"};
    const Bytes bytes = this->payloadOf({{1, {1, 2, 3, 4}}, {3, {5, 6}}});
    for (std::size_t i = 0; i < 3; ++i) {
        const ScriptedGate gate(TypeParam::kBlobAllocations + i);
        EXPECT_FALSE(this->read(bytes, kKSTErrorOutOfMemory));
        EXPECT_EQ(gate.asked.size(), TypeParam::kBlobAllocations + i + 1);
        EXPECT_TRUE(gate.everyFreeWasWiped);
        this->expectLogged({this->failedCheck(kChecks[i])});
    }
    const ScriptedGate gate;
    EXPECT_TRUE(this->read(bytes));
    EXPECT_EQ(gate.asked.size(), TypeParam::kBlobAllocations + 3);
    EXPECT_EQ(gate.freed.size(), TypeParam::kBlobAllocations + 3);
    EXPECT_TRUE(gate.everyFreeWasWiped);
}
