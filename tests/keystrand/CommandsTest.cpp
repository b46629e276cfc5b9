#include "keystrand/Commands.h"

#include "keystrand/DispatchTable.h"
#include "tests/keystrand/Bytes.h"
#include "tests/keystrand/SetClock.h"
#include "wire/CommandTable.h"

#include <gtest/gtest.h>

#include <tuple>

namespace keystrand::test {

namespace {

using Payload = std::vector<std::uint8_t>;

class SilentPoster : public EventPoster {
  public:
    bool post(std::string_view /*stream*/, std::string_view /*name*/) override { return true; }
};

class CommandsTest : public testing::Test {
  protected:
    KernelStatus run(std::uint32_t code, const Payload& payload) {
        return commands_.run(code, payload).status;
    }
    KernelStatus runControl(std::uint32_t code, const Payload& input) {
        return run(26, Bytes().u32(code).bytes(input));
    }

    KernelState kernel_;
    Registry& registry_ = kernel_.registry;
    SilentPoster poster_;
    SetClock clock_{1000};
    NotificationPublisher publisher_{registry_, poster_};
    RestrictedModeController restrictedMode_{{}, clock_, registry_, publisher_};
    DispatchTable controls_ = makeKernelControls(restrictedMode_);
    DispatchTable commands_ = makeCommands(
        kernel_, [] { return CredentialSet::Seconds{1000}; }, controls_);
};

TEST(CommandFrameTest, HeaderAloneIsAFrameWithoutPayload) {
    const auto decoded = decodeCommandFrame(frame(1, {}));
    ASSERT_TRUE(decoded);
    EXPECT_EQ(decoded->code, 1);
    EXPECT_TRUE(decoded->payload.empty());
}

TEST(CommandFrameTest, EveryTruncationOfTheHeaderIsRefused) {
    const Payload whole = frame(24, {});
    for (std::size_t length = 0; length < whole.size(); ++length) {
        EXPECT_FALSE(decodeCommandFrame(std::span(whole).first(length))) << length;
    }
}

TEST(CommandFrameTest, OtherMagicIsRefused) {
    for (std::size_t i = 0; i < 4; ++i) {
        Payload bytes = frame(24, {1, 2, 3, 4});
        bytes[i] ^= 1U;
        EXPECT_FALSE(decodeCommandFrame(bytes)) << i;
    }
}

TEST(CommandFrameTest, BytesFiveToSevenAreNotLookedAt) {
    Payload bytes = frame(24, {9});
    bytes[5] = bytes[6] = bytes[7] = 0xff;
    const auto decoded = decodeCommandFrame(bytes);
    ASSERT_TRUE(decoded);
    EXPECT_EQ(decoded->payload[0], 9);
}

TEST(CommandFrameTest, ControlCodeIsOnlyInKernelControl) {
    EXPECT_EQ(controlCodeOf(*decodeCommandFrame(control(7, {}))), 7U);
    EXPECT_FALSE(controlCodeOf(*decodeCommandFrame(frame(26, {7, 0, 0}))));
    EXPECT_FALSE(controlCodeOf(*decodeCommandFrame(frame(24, {7, 0, 0, 0}))));
}

TEST_F(CommandsTest, EveryCommandOfTheTableIsAnsweredAndNoOtherButTheContextsProperties) {
    constexpr std::uint32_t kGetProperty = 21;
    constexpr std::uint32_t kSetProperty = 22;
    for (std::uint32_t code = 0; code < 256; ++code) {
        const bool known =
            wire::findCommandKind(code) != nullptr || code == kGetProperty || code == kSetProperty;
        EXPECT_EQ(run(code, Payload(5000)) != kKernelUnknownCommand, known) << code;
    }
}

TEST_F(CommandsTest, WithoutCredentialsOnlyVariablesAndKernelControlAreAnswered) {
    const DispatchTable service = makeServiceCommands(kernel_, controls_);
    for (std::uint32_t code = 0; code < 256; ++code) {
        const bool known = code == 24 || code == 25 || code == 26;
        for (const std::size_t size : {0U, 5000U}) {
            EXPECT_EQ(service.run(code, Payload(size)).status != -6006, known) << code;
        }
    }
    ASSERT_EQ(service.run(24, Bytes().u32(5).u8(7).get()).status, 0);
    EXPECT_EQ(service.run(25, Bytes().u32(5).get()).output, Payload{7});
    EXPECT_EQ(service.run(26, Bytes().u32(5).u8(0).get()).status, 0);
    EXPECT_FALSE(restrictedMode_.timer().policy().allowed);
}

TEST_F(CommandsTest, UnknownCommands) {
    for (const std::uint32_t code : {0U, 7U, 8U, 10U, 12U, 14U, 17U, 23U, 27U, 255U}) {
        EXPECT_EQ(run(code, {1, 2, 3, 4}), -6006) << code;
    }
}

TEST_F(CommandsTest, UnknownControlCodes) {
    for (const std::uint32_t code : {0U, 1U, 2U, 4U, 8U, 0xffffffffU}) {
        EXPECT_EQ(runControl(code, {}), -6006) << code;
    }
}

/// Command, then the shortest and the longest payload that it takes.
class CommandLengthTest
    : public CommandsTest,
      public testing::WithParamInterface<std::tuple<std::uint32_t, std::size_t, std::size_t>> {};

TEST_P(CommandLengthTest, PayloadBelowOrAboveIsRefused) {
    const auto [code, min, max] = GetParam();
    EXPECT_EQ(run(code, Payload(min - 1)), -6007);
    EXPECT_EQ(run(code, Payload(max + 1)), -6007);
    EXPECT_NE(run(code, Payload(min)), -6007);
    EXPECT_EQ(run(code, Payload(max - 1)) == -6007, min == max);
    EXPECT_NE(run(code, Payload(max)), -6007);
}

INSTANTIATE_TEST_SUITE_P(All, CommandLengthTest,
                         testing::Values(std::tuple(2U, 16U, 16U), std::tuple(13U, 24U, 24U),
                                         std::tuple(18U, 16U, 16U), std::tuple(19U, 16U, 16U),
                                         std::tuple(21U, 20U, 20U), std::tuple(22U, 20U, 84U),
                                         std::tuple(24U, 4U, 68U), std::tuple(25U, 4U, 4U),
                                         std::tuple(26U, 4U, 260U)));

/// Control code and the one length of input that it takes.
class ControlLengthTest
    : public CommandsTest,
      public testing::WithParamInterface<std::tuple<std::uint32_t, std::size_t, std::uint8_t>> {};

TEST_P(ControlLengthTest, OnlyTheExactLengthIsTaken) {
    const auto [code, length, fill] = GetParam();
    EXPECT_EQ(runControl(code, Payload(length - 1, fill)), -6007);
    EXPECT_EQ(runControl(code, Payload(length, fill)), 0);
    EXPECT_EQ(runControl(code, Payload(length + 1, fill)), -6007);
}

INSTANTIATE_TEST_SUITE_P(All, ControlLengthTest,
                         testing::Values(std::tuple(3U, 16U, 0), std::tuple(5U, 1U, 1),
                                         std::tuple(6U, 32U, 0xff), std::tuple(7U, 64U, 'n')));

TEST_F(CommandsTest, SetVariableIsGotBack) {
    ASSERT_EQ(run(24, Bytes().u32(5).text("value")), 0);
    const CommandResult result = commands_.run(25, Bytes().u32(5).get());
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.output, Bytes().text("value").get());
    EXPECT_TRUE(commands_.run(25, Bytes().u32(6).get()).output.empty());
}

TEST_F(CommandsTest, OneVariableTooMany) {
    for (std::uint32_t id = 0; id < NumberedValues::kMaxCount; ++id) {
        ASSERT_EQ(run(24, Bytes().u32(id).u8(1)), 0);
    }
    EXPECT_EQ(run(24, Bytes().u32(1000).u8(1)), -6009);
}

TEST_F(CommandsTest, AllowedIsOneOrZero) {
    EXPECT_EQ(runControl(5, {0}), 0);
    EXPECT_FALSE(restrictedMode_.timer().policy().allowed);
    EXPECT_EQ(runControl(5, {2}), -6007);
    EXPECT_FALSE(restrictedMode_.timer().policy().allowed);
    EXPECT_EQ(runControl(5, {1}), 0);
    EXPECT_TRUE(restrictedMode_.timer().policy().allowed);
}

TEST_F(CommandsTest, DaemonStartedRestoresVersionStartAndLocked) {
    EXPECT_EQ(runControl(3, Bytes().u8(1).u16(0).u32(8).u64(900).u8(0)), 0);
    const TimerRestarted record = restrictedMode_.timer().timerRestarted();
    EXPECT_EQ(record.state.version, 8U);
    EXPECT_EQ(record.state.standardModeStart, 900U);
    EXPECT_EQ(record.alarm, 4500U);
}

TEST_F(CommandsTest, DaemonStartedWithBadHeadIsRefusedWhole) {
    EXPECT_EQ(runControl(3, Bytes().u8(2).u16(0).u32(8).u64(900).u8(0)), -6007);
    EXPECT_EQ(runControl(3, Bytes().u8(0).u16(1).u32(8).u64(900).u8(0)), -6007);
    EXPECT_EQ(runControl(3, Bytes().u8(0).u16(0x100).u32(8).u64(900).u8(0)), -6007);
    EXPECT_TRUE(restrictedMode_.timer().policy().allowed);
    EXPECT_FALSE(restrictedMode_.timer().locked());
}

TEST_F(CommandsTest, RestoredAnalyticsReachTheTimer) {
    const auto blob = Bytes().u64(800).u32(3).u32(4).u64(0).u32(1).u32(0).get();
    EXPECT_EQ(runControl(6, blob), 0);
    EXPECT_EQ(restrictedMode_.timer().figures().restrictedInPeriod, 3U);
}

TEST_F(CommandsTest, AcknowledgementDropsTheRecordThatWasRead) {
    ASSERT_TRUE(registry_.set("KSTRMTimerRestarted", Payload{1}));
    EXPECT_EQ(runControl(7, ackName("KSTRMTimerRestarted")), 0);
    EXPECT_EQ(registry_.count(), 1U);
    static_cast<void>(registry_.copy("KSTRMTimerRestarted"));
    EXPECT_EQ(runControl(7, ackName("KSTRMTimerRestarted")), 0);
    EXPECT_EQ(registry_.count(), 0U);
}

TEST_F(CommandsTest, AcknowledgementOfAnUnknownNameSucceeds) {
    EXPECT_EQ(runControl(7, ackName("unknown")), 0);
}

TEST_F(CommandsTest, AcknowledgementWithoutANameOrNotZeroFilledIsRefused) {
    EXPECT_EQ(runControl(7, Payload(64)), -6007);
    Payload name = ackName("KSTRMTimerRestarted");
    name.back() = 1;
    EXPECT_EQ(runControl(7, name), -6007);
}

} // namespace

} // namespace keystrand::test
