#include "KSTLib/ContextCredentials.h"
#include "KSTLib/LibCall.h"
#include "tests/KSTLib/ChannelFixture.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <limits>

namespace {

using support::Bytes;
using support::Lines;
using support::ScriptedChannel;
using support::ScriptedGate;
using support::ScriptedRegistry;

using Open = support::ChannelFixture;

/// Keeps whether it was given deadlines, and is inherited until it is left.
template <typename Scripted>
class Noting : public Scripted {
  public:
    bool isInheritedOnce = false;
    std::vector<bool> deadlines;

    [[nodiscard]] bool isInherited() const noexcept override { return isInheritedOnce; }
    void leaveToParent() noexcept override { isInheritedOnce = false; }
    void
    setDeadline(std::optional<platform::KernelConnections::Deadline> deadline) noexcept override {
        deadlines.push_back(deadline.has_value());
    }
};

/// A channel whose connection is lost when the test says so.
class NotingChannel : public Noting<ScriptedChannel> {
  public:
    bool isLost = false;
    platform::Status postStatus = platform::kSuccess;
    std::size_t posts = 0;
    std::uint32_t postSelector = 4711;
    Bytes posted;

    [[nodiscard]] bool isConnected(platform::ConnectionHandle /*connection*/) const override {
        return !isLost;
    }
    platform::Status post(platform::ConnectionHandle /*connection*/, std::uint32_t selector,
                          const void* input, std::size_t inputSize) override {
        ++posts;
        postSelector = selector;
        const auto* in = static_cast<const std::uint8_t*>(input);
        posted = {in, in + inputSize};
        return postStatus;
    }
};

class NotingOpen : public support::LibraryFixture {
  protected:
    void SetUp() override {
        LibraryFixture::SetUp();
        kst::installPlatform({log, registry, channel});
        ASSERT_EQ(kst::init(), 0);
    }

    void TearDown() override {
        kst::removePlatform();
        LibraryFixture::TearDown();
    }

    /// KSTGlobalContextAddCredential whose time is up when its command has been sent: the context
    /// that it makes is deleted by a post. The level is 7.
    KSTStatus addGloballyTooLate() {
        static std::chrono::steady_clock::time_point now;
        static const kst::CallTime kTime{.limit = std::chrono::seconds(5), .now = [] {
                                             return now;
                                         }};
        kst::installPlatform({log, registry, channel, kTime});
        channel.reply = Bytes(17, 7);
        channel.duringStructCall = [&] {
            if (channel.structCalls.back().input.at(4) == 5) {
                channel.reply.clear();
                now += std::chrono::seconds(5);
            }
        };
        KSTCredential* credential = nullptr;
        EXPECT_EQ(KSTCredentialCreate(kKSTCredentialTypePasscodeValidated, &credential), 0);
        const KSTStatus status = KSTGlobalContextAddCredential(credential);
        kst::gLogLevel = 255;
        KSTCredentialDelete(credential);
        return status;
    }

    /// The lines of the function and those behind it.
    Lines linesFrom(const std::string& function) const {
        Lines lines = logged();
        const auto isOfIt = [&](const std::string& line) {
            return line.find(function + ": ") != std::string::npos;
        };
        lines.erase(lines.begin(), std::find_if(lines.begin(), lines.end(), isOfIt));
        return lines;
    }

    Noting<ScriptedRegistry> registry;
    NotingChannel channel;
};

/// The channel is open already.
class PerformCommand : public support::ChannelFixture {
  protected:
    void SetUp() override {
        ChannelFixture::SetUp();
        ASSERT_EQ(kst::init(), 0);
    }

    KSTStatus perform(const Bytes& payload, void* outData, std::size_t* sizeOfOut) {
        return kst::performCommand(26, 0, payload.data(), payload.size(), outData, sizeOfOut);
    }

    std::array<std::uint8_t, 16> out{};
    std::size_t outSize = out.size();
};

} // namespace

TEST_F(Open, LooksForTheClassAndOpensType0) {
    EXPECT_EQ(kst::init(), 0);
    EXPECT_EQ(registry.classesAsked, std::vector<std::string>{"Keystrand"});
    EXPECT_TRUE(registry.pathsAsked.empty());
    ASSERT_EQ(channel.opens.size(), 1U);
    EXPECT_EQ(channel.opens.front().service, ScriptedRegistry::kEntry);
    EXPECT_EQ(channel.opens.front().connectionType, 0U);
    EXPECT_TRUE(kst::gChannelOpen);
    EXPECT_EQ(kst::gConnection, ScriptedChannel::kConnection);
    EXPECT_EQ(registry.held, 0);
    EXPECT_EQ(registry.releases, 1);
    EXPECT_TRUE(logged().empty());
}

TEST_F(Open, HappensOnce) {
    for (int call = 0; call < 100; ++call) {
        EXPECT_EQ(kst::channelTransport(nullptr, 26, 0, nullptr, 0, nullptr, nullptr), 0);
    }
    EXPECT_EQ(registry.classesAsked.size(), 1U);
    EXPECT_EQ(channel.opens.size(), 1U);
    EXPECT_EQ(channel.structCalls.size(), 100U);
}

TEST_F(Open, WithoutAServiceIsTriedAgain) {
    registry.present = false;
    EXPECT_EQ(kst::init(), kKSTErrorUnexpected);
    EXPECT_EQ(kst::init(), kKSTErrorUnexpected);
    EXPECT_EQ(logged(), (Lines{failedCheck("service"), failedCheck("service")}));
    EXPECT_TRUE(channel.opens.empty());
    EXPECT_EQ(registry.releases, 0);
    EXPECT_FALSE(kst::gChannelOpen);

    registry.present = true;
    EXPECT_EQ(kst::init(), 0);
    EXPECT_EQ(registry.classesAsked.size(), 3U);
    EXPECT_TRUE(kst::gChannelOpen);
}

TEST_F(Open, RefusedKeepsTheServiceAndIsTriedAgain) {
    channel.openStatus = -1013;
    EXPECT_EQ(kst::init(), -1013);
    EXPECT_EQ(logged(), Lines{failedCheck("err == 0 ", "0xfffffffffffffc0b")});
    EXPECT_EQ(registry.held, 1);
    EXPECT_EQ(registry.releases, 0);
    EXPECT_FALSE(kst::gChannelOpen);
    EXPECT_EQ(kst::gConnection, platform::kNoConnection);

    channel.openStatus = 0;
    EXPECT_EQ(kst::init(), 0);
    EXPECT_EQ(channel.opens.size(), 2U);
    EXPECT_EQ(registry.releases, 1);
}

TEST_F(Open, FailureIsTheTransportsStatus) {
    channel.openStatus = std::numeric_limits<std::int32_t>::min();
    EXPECT_EQ(kst::channelTransport(nullptr, 26, 0, nullptr, 0, nullptr, nullptr),
              std::numeric_limits<std::int32_t>::min());
    EXPECT_TRUE(channel.structCalls.empty());
    EXPECT_EQ(logged(), Lines{failedCheck("err == 0 ", "0xffffffff80000000")});
}

TEST_F(Open, WithoutAPlatformThereIsNoServiceAndNoLog) {
    kst::removePlatform();
    EXPECT_EQ(kst::init(), kKSTErrorUnexpected);
    EXPECT_EQ(kst::performCommand(1, 0, nullptr, 0, nullptr, nullptr), kKSTErrorUnexpected);
    kst::updateLogLevel();
    EXPECT_TRUE(logged().empty());
    EXPECT_TRUE(registry.classesAsked.empty());
    EXPECT_TRUE(channel.scalarCalls.empty());
}

TEST_F(Open, InstallingAPlatformStartsAnew) {
    ASSERT_EQ(kst::init(), 0);
    kst::gLogLevel = 10;
    kst::installPlatform({log, registry, channel});
    EXPECT_FALSE(kst::gChannelOpen);
    EXPECT_EQ(kst::gConnection, 0U);
    EXPECT_EQ(kst::gLogLevel, 40);
    EXPECT_EQ(kst::init(), 0);
    EXPECT_EQ(channel.opens.size(), 2U);

    kst::gLogLevel = 10;
    kst::removePlatform();
    EXPECT_FALSE(kst::gChannelOpen);
    EXPECT_EQ(kst::gConnection, 0U);
    EXPECT_EQ(kst::gLogLevel, 40);
    EXPECT_EQ(kst::installedPlatform(), nullptr);
}

TEST(LibraryCommand, WritesSevenBytesAndNoMore) {
    std::array<std::uint8_t, 9> frame{};
    frame.fill(0xaa);
    EXPECT_EQ(kst::buildCommand(frame.data(), 26, 3), 0);
    EXPECT_EQ(frame, (std::array<std::uint8_t, 9>{'D', 'R', 'C', 'S', 26, 0, 3, 0xaa, 0xaa}));
}

TEST_F(Open, CommandWithoutAFrame) {
    EXPECT_EQ(kst::buildCommand(nullptr, 26, 0), kKSTErrorBadParameter);
    EXPECT_EQ(logged(), Lines{failedCheck("cmd")});
}

TEST_F(PerformCommand, WithoutPayloadSendsTheHeaderOnly) {
    EXPECT_EQ(kst::performCommand(1, 0, nullptr, 0, nullptr, nullptr), 0);
    ASSERT_EQ(channel.structCalls.size(), 1U);
    const auto& call = channel.structCalls.front();
    EXPECT_EQ(call.connection, ScriptedChannel::kConnection);
    EXPECT_EQ(call.selector, 0U);
    EXPECT_EQ(call.input, (Bytes{'D', 'R', 'C', 'S', 1, 0, 0, 0}));
    EXPECT_EQ(call.output, nullptr);
    EXPECT_EQ(call.offeredSize.value_or(0), 0U);
    EXPECT_TRUE(logged().empty());
}

TEST_F(PerformCommand, FramesThePayload) {
    channel.reply = {1, 2, 3};
    EXPECT_EQ(kst::performCommand(255, 7, "ab", 2, out.data(), &outSize), 0);
    const auto& call = channel.structCalls.front();
    EXPECT_EQ(call.input, (Bytes{'D', 'R', 'C', 'S', 255, 0, 7, 0, 'a', 'b'}));
    EXPECT_EQ(call.output, out.data());
    EXPECT_EQ(call.offeredSize, 16U);
    EXPECT_EQ(outSize, 3U);
    EXPECT_EQ(Bytes(out.begin(), out.begin() + 4), (Bytes{1, 2, 3, 0}));
}

TEST_F(PerformCommand, LargePayload) {
    const Bytes payload(100000, 0x42);
    EXPECT_EQ(perform(payload, nullptr, nullptr), 0);
    EXPECT_EQ(channel.structCalls.front().input.size(), 100008U);
    EXPECT_EQ(channel.structCalls.front().input.back(), 0x42);
}

TEST_F(PerformCommand, OutputSizeZeroNeedsNoBuffer) {
    outSize = 0;
    EXPECT_EQ(perform({1}, nullptr, &outSize), 0);
    EXPECT_EQ(outSize, 0U);
    EXPECT_TRUE(logged().empty());
}

TEST_F(PerformCommand, BufferWithoutASizeOffersNothing) {
    EXPECT_EQ(perform({1}, out.data(), nullptr), 0);
    EXPECT_EQ(channel.structCalls.front().offeredSize.value_or(0), 0U);
}

TEST_F(PerformCommand, OutputSizeWithoutABufferFailsBeforeAllocating) {
    const ScriptedGate gate;
    outSize = 1;
    EXPECT_EQ(perform({1}, nullptr, &outSize), kKSTErrorBadParameter);
    EXPECT_EQ(outSize, 1U);
    EXPECT_TRUE(gate.asked.empty());
    EXPECT_TRUE(channel.structCalls.empty());
    EXPECT_EQ(logged(), Lines{failedCheck("outData")});
}

TEST_F(PerformCommand, InputSizeWithoutInputFailsAfterAllocating) {
    const ScriptedGate gate;
    EXPECT_EQ(kst::performCommand(26, 0, nullptr, 3, nullptr, nullptr), kKSTErrorBadParameter);
    EXPECT_EQ(gate.asked, std::vector<std::size_t>{11});
    EXPECT_EQ(gate.freed, std::vector<std::size_t>{11});
    EXPECT_TRUE(gate.everyFreeWasWiped);
    EXPECT_TRUE(channel.structCalls.empty());
    EXPECT_EQ(logged(), Lines{failedCheck("inData")});
}

TEST_F(PerformCommand, MissingOutputBufferIsFoundBeforeMissingInput) {
    EXPECT_EQ(kst::performCommand(26, 0, nullptr, 3, nullptr, &outSize), kKSTErrorBadParameter);
    EXPECT_EQ(logged(), Lines{failedCheck("outData")});
}

TEST_F(PerformCommand, FailedAllocation) {
    {
        const ScriptedGate gate(0);
        EXPECT_EQ(perform({1}, out.data(), &outSize), kKSTErrorOutOfMemory);
        EXPECT_TRUE(gate.freed.empty());
    }
    EXPECT_EQ(outSize, 16U);
    EXPECT_TRUE(channel.structCalls.empty());
    EXPECT_EQ(logged(), Lines{failedCheck("cmd")});
    EXPECT_EQ(perform({1}, out.data(), &outSize), 0);
}

TEST_F(PerformCommand, SizesThatWrapOrThatNoMemoryHas) {
    const std::uint8_t byte = 0;
    Lines expected;
    for (const std::size_t size : {SIZE_MAX, SIZE_MAX - 7, SIZE_MAX - 8, SIZE_MAX / 2}) {
        EXPECT_EQ(kst::performCommand(26, 0, &byte, size, nullptr, nullptr), kKSTErrorOutOfMemory);
        expected.push_back(failedCheck("cmd"));
    }
    EXPECT_EQ(logged(), expected);
    EXPECT_TRUE(channel.structCalls.empty());
}

TEST_F(PerformCommand, FrameIsCountedDuringTheCallAndWipedAfter) {
    const std::int64_t before = gAllocatedBytes;
    std::int64_t during = 0;
    channel.duringStructCall = [&] {
        during = gAllocatedBytes;
    };
    const ScriptedGate gate;
    EXPECT_EQ(perform(Bytes(20, 0x55), nullptr, nullptr), 0);
    EXPECT_EQ(during, before + 28);
    EXPECT_EQ(gAllocatedBytes, before);
    EXPECT_EQ(gate.asked, std::vector<std::size_t>{28});
    EXPECT_EQ(gate.freed, std::vector<std::size_t>{28});
    EXPECT_TRUE(gate.everyFreeWasWiped);
}

TEST_F(PerformCommand, FailureWipesTheFrameToo) {
    const ScriptedGate gate;
    channel.structStatus = -1104;
    EXPECT_EQ(perform(Bytes(20, 0x55), nullptr, nullptr), -1104);
    EXPECT_EQ(gate.freed, std::vector<std::size_t>{28});
    EXPECT_TRUE(gate.everyFreeWasWiped);
}

TEST_F(PerformCommand, StatusesPassThroughAndLeaveTheSize) {
    const std::vector<std::pair<KSTStatus, std::string>> statuses{
        {std::numeric_limits<KSTStatus>::min(), "0xffffffff80000000"},
        {-6006, "0xffffffffffffe88a"},
        {-1110, "0xfffffffffffffbaa"},
        {-1, "0xffffffffffffffff"},
        {1, "0x1"},
        {std::numeric_limits<KSTStatus>::max(), "0x7fffffff"}};
    Lines expected;
    for (const auto& [status, text] : statuses) {
        channel.structStatus = status;
        EXPECT_EQ(perform({1}, out.data(), &outSize), status);
        EXPECT_EQ(outSize, 16U);
        expected.push_back(failedCheck("err == 0 ", text));
    }
    EXPECT_EQ(logged(), expected);
}

TEST_F(PerformCommand, ReplySizes) {
    for (const std::size_t size : {0U, 1U, 15U, 16U}) {
        channel.reply = Bytes(size, 0x66);
        outSize = out.size();
        EXPECT_EQ(perform({1}, out.data(), &outSize), 0);
        EXPECT_EQ(outSize, size);
    }
}

TEST_F(PerformCommand, ReplyBeyondWhatWasOfferedIsRefused) {
    channel.reportedSize = 17;
    EXPECT_EQ(perform({1}, out.data(), &outSize), kKSTErrorUnexpected);
    EXPECT_EQ(outSize, 16U);
    EXPECT_EQ(perform({1}, nullptr, nullptr), kKSTErrorUnexpected);
    EXPECT_EQ(logged(), (Lines{failedCheck("replySize <= offeredSize"),
                               failedCheck("replySize <= offeredSize")}));
}

TEST_F(PerformCommand, TransportSendsTheLowBytesAndIgnoresItsContext) {
    EXPECT_EQ(kst::channelTransport(&outSize, 26, 9, "a", 1, out.data(), &outSize), 0);
    EXPECT_EQ(channel.structCalls.front().input, (Bytes{'D', 'R', 'C', 'S', 26, 0, 9, 0, 'a'}));
    EXPECT_EQ(outSize, 0U);
    const KSTTransport transport = kst::channelTransport;
    EXPECT_EQ(transport(nullptr, 0xffffff19, 0x100, nullptr, 0, nullptr, nullptr), 0);
    EXPECT_EQ(channel.structCalls.back().input, (Bytes{'D', 'R', 'C', 'S', 0x19, 0, 0, 0}));
}

TEST_F(Open, WantOfMemoryIsTheLibrarysStatus) {
    channel.openStatus = platform::statusFromErrno(ENOMEM);
    EXPECT_EQ(kst::init(), kKSTErrorOutOfMemory);
    channel.openStatus = 0;
    channel.structStatus = platform::statusFromErrno(ENOMEM);
    EXPECT_EQ(kst::channelTransport(nullptr, 26, 0, nullptr, 0, nullptr, nullptr),
              kKSTErrorOutOfMemory);
    EXPECT_EQ(logged(), (Lines{failedCheck("err == 0 ", "0xfffffffffffffffc"),
                               failedCheck("err == 0 ", "0xfffffffffffffffc")}));
}

TEST_F(NotingOpen, ReplyThatDoesNotFitTellsOfALostConnection) {
    channel.reportedSize = 1;
    EXPECT_EQ(kst::performCommand(26, 0, nullptr, 0, nullptr, nullptr), kKSTErrorUnexpected);
    EXPECT_FALSE(kst::isConnectionLost());
    channel.isLost = true;
    EXPECT_EQ(kst::performCommand(26, 0, nullptr, 0, nullptr, nullptr), kKSTErrorUnexpected);
    EXPECT_TRUE(kst::isConnectionLost());
    // Whoever begins anew has lost nothing yet.
    kst::closeChannel();
    EXPECT_FALSE(kst::isConnectionLost());
}

TEST_F(NotingOpen, DeadlineOfACallEndsWithIt) {
    {
        const kst::CallScope outer;
        const kst::CallScope inner;
    }
    EXPECT_EQ(channel.deadlines, (std::vector<bool>{true, true, true, false}));
    EXPECT_EQ(registry.deadlines, channel.deadlines);
}

TEST_F(NotingOpen, PostedCommand) {
    EXPECT_EQ(kst::postCommand(2, "a", 1), 0);
    {
        const ScriptedGate gate(0);
        EXPECT_EQ(kst::postCommand(2, "a", 1), kKSTErrorOutOfMemory);
    }
    EXPECT_EQ(channel.posts, 1U);
    channel.postStatus = platform::statusFromErrno(ENOMEM);
    EXPECT_EQ(kst::postCommand(2, "a", 1), kKSTErrorOutOfMemory);
    channel.postStatus = -9;
    EXPECT_EQ(kst::postCommand(2, "a", 1), -9);
    EXPECT_EQ(channel.posts, 3U);
    EXPECT_EQ(logged(), (Lines{failedCheck("cmd"), failedCheck("err == 0 ", "0xfffffffffffffffc"),
                               failedCheck("err == 0 ", "0xfffffffffffffff7")}));
    kst::removePlatform();
    EXPECT_EQ(kst::postCommand(2, "a", 1), kKSTErrorUnexpected);
    EXPECT_EQ(channel.posts, 3U);
}

TEST_F(NotingOpen, ChildDeletesItsTemporaryContextsToo) {
    channel.isInheritedOnce = true;
    // Its handle, and the level.
    channel.reply = Bytes(17, 40);
    KSTCredential* credential = nullptr;
    ASSERT_EQ(KSTCredentialCreate(kKSTCredentialTypePasscodeValidated, &credential), 0);
    static_cast<void>(KSTGlobalContextAddCredential(credential));
    KSTCredentialDelete(credential);
    EXPECT_FALSE(channel.isInheritedOnce);
    ASSERT_FALSE(channel.structCalls.empty());
    EXPECT_EQ(channel.structCalls.front().input.at(4), 1);
    EXPECT_EQ(channel.structCalls.back().input.at(4), 2);
    gAllocatedBytes -= 1;
}

TEST_F(NotingOpen, TemporaryContextOfACallWhoseTimeIsUpIsDeletedByAPost) {
    EXPECT_EQ(addGloballyTooLate(), 0);
    EXPECT_EQ(channel.posts, 1U);
    EXPECT_EQ(channel.postSelector, 0U);
    Bytes frame = {'D', 'R', 'C', 'S', 2, 0, 0, 0};
    frame.insert(frame.end(), 16, 7);
    EXPECT_EQ(channel.posted, frame);
    EXPECT_EQ(linesFrom("KSTContextDelete"),
              (Lines{"KSTLib: KSTContextDelete: called.\n",
                     "KSTLib: KSTContextDelete: returning, err = 0.\n",
                     "KSTLib: KSTGlobalContextAddCredential: returning, err = 0.\n"}));
    gAllocatedBytes -= 1;
}

TEST_F(NotingOpen, TemporaryContextThatCannotBePostedGoesAlone) {
    channel.postStatus = -9;
    EXPECT_EQ(addGloballyTooLate(), 0);
    EXPECT_EQ(channel.posts, 1U);
    EXPECT_EQ(linesFrom("KSTContextDelete"),
              (Lines{"KSTLib: KSTContextDelete: called.\n",
                     failedCheck("err == 0 ", "0xfffffffffffffff7"),
                     "KSTLib: KSTContextDelete: returning, err = -9.\n",
                     "KSTLib: KSTContextDelete: called.\n",
                     "KSTLib: KSTContextDelete: returning, err = 0.\n",
                     "KSTLib: KSTGlobalContextAddCredential: returning, err = 0.\n"}));
    gAllocatedBytes -= 1;
}

TEST_F(NotingOpen, LookupThatIsAParentsIsLeftToIt) {
    registry.isInheritedOnce = true;
    EXPECT_EQ(kst::init(), 0);
    EXPECT_FALSE(registry.isInheritedOnce);
    EXPECT_EQ(channel.opens.size(), 2U);
}

TEST_F(NotingOpen, CallFromABlockHasLostNothing) {
    channel.isLost = true;
    channel.structStatus = -9;
    channel.scalars = {40};
    bool wasLost = false;
    KSTGlobalContextVerifyPolicy("p", false, nullptr, 0,
                                 [&](KSTStatus err, bool, const KSTRequirement*) {
                                     EXPECT_EQ(err, -9);
                                     EXPECT_TRUE(channel.scalarCalls.empty());
                                     EXPECT_EQ(KSTContextCreate(nullptr), -3);
                                     wasLost = kst::isConnectionLost();
                                 });
    EXPECT_EQ(channel.scalarCalls.size(), 1U);
    EXPECT_TRUE(wasLost);
}

TEST_F(NotingOpen, TimeOfNoCallIsNotUp) {
    EXPECT_FALSE(kst::isTimeUp());
}

TEST_F(Open, InstalledPlatformHasTheLog) {
    kst::setLibraryLog(nullptr);
    kst::installPlatform({log, registry, channel});
    registry.present = false;
    EXPECT_EQ(kst::init(), kKSTErrorUnexpected);
    EXPECT_EQ(logged(), Lines{failedCheck("service")});
}

TEST(CallTime, IsFiveSecondsInAll) {
    EXPECT_EQ(kst::CallTime().limit, std::chrono::seconds(5));
}
