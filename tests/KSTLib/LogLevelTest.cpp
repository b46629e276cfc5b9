#include "KSTLib/KSTLib.h"
#include "tests/KSTLib/ChannelFixture.h"

#include <gtest/gtest.h>

#include <limits>

namespace {

using support::Lines;
using support::ScriptedChannel;

constexpr char kCalled[] = "KSTLib: KSTKernelControl: called.\n";
constexpr char kSucceeded[] = "KSTLib: KSTKernelControl: returning, err = 0.\n";
constexpr char kFailed[] = "KSTLib: KSTKernelControl: returning, err = -9.\n";
constexpr char kReturning[] = "KSTLib: updateLogLevel: returning.\n";

class LogLevel : public support::ChannelFixture {
  protected:
    /// The lines of one successful or failed call at `level`.
    Lines linesAt(int level, KSTStatus status) {
        log.clear();
        kst::gLogLevel = static_cast<std::uint8_t>(level);
        channel.structStatus = status;
        EXPECT_EQ(KSTKernelControl(1, nullptr, 0, nullptr), status);
        return logged();
    }

    Lines linesOfUpdate(std::vector<std::uint64_t> scalars) {
        log.clear();
        channel.scalars = std::move(scalars);
        kst::updateLogLevel();
        return logged();
    }
};

} // namespace

TEST_F(LogLevel, Successes) {
    for (const int level : {0, 29, 30}) {
        EXPECT_EQ(linesAt(level, 0), (Lines{kCalled, kSucceeded})) << level;
    }
    for (const int level : {31, 40, 70, 71, 255}) {
        EXPECT_EQ(linesAt(level, 0), Lines{}) << level;
    }
}

TEST_F(LogLevel, Failures) {
    const std::string check = failedCheck("err == 0 ", "0xfffffffffffffff7");
    const std::string transport = transportFailed(-9, "LibCallBlock");
    for (const int level : {0, 29, 30}) {
        EXPECT_EQ(linesAt(level, -9), (Lines{kCalled, check, transport, kFailed})) << level;
    }
    for (const int level : {31, 40, 69, 70}) {
        EXPECT_EQ(linesAt(level, -9), (Lines{check, transport, kFailed})) << level;
    }
    for (const int level : {71, 255}) {
        EXPECT_EQ(linesAt(level, -9), (Lines{check, transport})) << level;
    }
}

TEST_F(LogLevel, StandardOutputDoesNotAskTheLevel) {
    linesAt(255, -9);
    EXPECT_EQ(printed(), "KST: LibCall_KSTKernelControl_Block: returning, err = -9.\n");
}

TEST_F(LogLevel, LinesNameTheFunctionOnly) {
    linesAt(0, 0);
    ASSERT_EQ(log.lines().size(), 2U);
    for (const auto& line : log.lines()) {
        EXPECT_EQ(line.level, platform::LogLevel::info);
        EXPECT_EQ(line.function, "KSTKernelControl");
        EXPECT_EQ(line.line, 0);
    }
}

TEST_F(LogLevel, UpdateAsksTheKernel) {
    ASSERT_EQ(kst::init(), 0);
    linesOfUpdate({50});
    ASSERT_EQ(channel.scalarCalls.size(), 1U);
    const auto& call = channel.scalarCalls.front();
    EXPECT_EQ(call.connection, ScriptedChannel::kConnection);
    EXPECT_EQ(call.selector, 2U);
    EXPECT_EQ(call.inputCount, 0U);
    EXPECT_EQ(call.offeredCount, 1U);
    EXPECT_EQ(kst::gLogLevel, 50);
}

TEST_F(LogLevel, UpdateSaysLevelsBelow31) {
    for (const int level : {0, 1, 29, 30}) {
        EXPECT_EQ(
            linesOfUpdate({static_cast<std::uint64_t>(level)}),
            (Lines{"KSTLib: updateLogLevel: log level set to " + std::to_string(level) + ".\n",
                   kReturning}));
        EXPECT_EQ(kst::gLogLevel, level);
    }
    for (const int level : {31, 40, 70, 71, 255}) {
        EXPECT_EQ(linesOfUpdate({static_cast<std::uint64_t>(level)}), Lines{}) << level;
        EXPECT_EQ(kst::gLogLevel, level);
    }
}

TEST_F(LogLevel, UpdateTakesTheLowByte) {
    EXPECT_EQ(linesOfUpdate({0xffffffffffffff28}), Lines{});
    EXPECT_EQ(kst::gLogLevel, 0x28);
    EXPECT_EQ(linesOfUpdate({0x100}).size(), 2U);
    EXPECT_EQ(kst::gLogLevel, 0);
}

TEST_F(LogLevel, FailedUpdateChangesNothing) {
    channel.scalarStatus = -1110;
    const std::string check = failedCheck("err == 0 ", "0xfffffffffffffbaa");
    EXPECT_EQ(linesOfUpdate({10}), Lines{check});
    EXPECT_EQ(kst::gLogLevel, 40);

    kst::gLogLevel = 30;
    EXPECT_EQ(linesOfUpdate({10}), (Lines{check, kReturning}));
    EXPECT_EQ(kst::gLogLevel, 30);
}

TEST_F(LogLevel, UpdateThatGotNoNumberChangesNothing) {
    EXPECT_EQ(linesOfUpdate({}), Lines{failedCheck("outputCount == 1")});
    EXPECT_EQ(kst::gLogLevel, 40);
}

TEST_F(LogLevel, UpdateDoesNotOpenTheChannel) {
    linesOfUpdate({20});
    EXPECT_TRUE(registry.classesAsked.empty());
    EXPECT_TRUE(channel.opens.empty());
    EXPECT_FALSE(kst::gChannelOpen);
}
