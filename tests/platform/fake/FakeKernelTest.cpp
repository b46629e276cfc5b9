#include "platform/fake/FakeKernel.h"

#include <gmock/gmock.h>

#include <array>
#include <cerrno>
#include <vector>

namespace {

using platform::ConnectionHandle;
using platform::FakeKernel;
using platform::FakeKernelChannel;
using platform::FakeServiceRegistry;
using platform::FakeStructAnswer;
using platform::FakeStructCall;
using platform::kNoConnection;
using platform::kNoService;
using platform::kSuccess;
using platform::ServiceHandle;
using platform::statusFromErrno;
using testing::Each;
using testing::ElementsAre;

class FakeKernelTest : public testing::Test {
  protected:
    ConnectionHandle connect() {
        const ServiceHandle service = registry_.findByPath(kernel_.path);
        ConnectionHandle connection = kNoConnection;
        EXPECT_EQ(channel_.open(service, 0, &connection), kSuccess);
        registry_.release(service);
        return connection;
    }

    platform::Status call(ConnectionHandle connection, std::uint8_t input) {
        size_ = output_.size();
        output_.fill(0xee);
        return channel_.structCall(connection, 0, &input, 1, output_.data(), &size_);
    }

    FakeKernel kernel_;
    FakeServiceRegistry registry_{kernel_};
    FakeKernelChannel channel_{kernel_, registry_};
    std::array<std::uint8_t, 4> output_{};
    std::size_t size_ = 0;
};

TEST_F(FakeKernelTest, LiveReferencesAreCounted) {
    const ServiceHandle first = registry_.findByPath(kernel_.path);
    const ServiceHandle second = registry_.findByClassName(kernel_.className);
    EXPECT_EQ(registry_.liveReferences(), 2U);
    registry_.release(first);
    EXPECT_EQ(registry_.liveReferences(), 1U);
    registry_.release(second);
    registry_.release(second);
    EXPECT_EQ(registry_.liveReferences(), 0U);
}

TEST_F(FakeKernelTest, FindingNothingHoldsNothing) {
    kernel_.entryPresent = false;
    EXPECT_EQ(registry_.findByPath(kernel_.path), kNoService);
    EXPECT_EQ(registry_.liveReferences(), 0U);
}

TEST_F(FakeKernelTest, PropertyReadsAndOpensAreNoted) {
    const ServiceHandle service = registry_.findByPath(kernel_.path);
    static_cast<void>(registry_.copyProperty(service, "a"));
    static_cast<void>(registry_.copyProperty(service, "b"));
    EXPECT_THAT(kernel_.propertyReads, ElementsAre("a", "b"));
    connect();
    ASSERT_EQ(kernel_.opens.size(), 1U);
    EXPECT_EQ(kernel_.opens[0].path, kernel_.path);
    EXPECT_EQ(kernel_.opens[0].connectionType, 0U);
}

TEST_F(FakeKernelTest, AbsenceHasTheErrorThatTheTestGives) {
    const ServiceHandle service = registry_.findByPath(kernel_.path);
    const ConnectionHandle connection = connect();
    for (const int error : {ENOENT, ECONNREFUSED}) {
        kernel_.absence = error;
        ConnectionHandle other = kNoConnection;
        EXPECT_EQ(channel_.open(service, 0, &other), statusFromErrno(error));
        EXPECT_EQ(call(connection, 1), statusFromErrno(error));
    }
    EXPECT_EQ(kernel_.opens.size(), 1U);
    EXPECT_TRUE(kernel_.structCalls.empty());
}

TEST_F(FakeKernelTest, OpenOfAnEntryThatIsGoneIsRefusedByTheKernelSide) {
    const ServiceHandle service = registry_.findByPath(kernel_.path);
    kernel_.entryPresent = false;
    ConnectionHandle connection = kNoConnection;
    EXPECT_EQ(channel_.open(service, 0, &connection), -6002);
    EXPECT_EQ(connection, kNoConnection);
}

TEST_F(FakeKernelTest, AnswersAreTakenInTurnThenTheFunctionThenSuccess) {
    const ConnectionHandle connection = connect();
    kernel_.structAnswers = {{-1, {}, {}}, {-2, {}, {}}};
    EXPECT_EQ(call(connection, 1), -1);
    EXPECT_EQ(call(connection, 2), -2);
    EXPECT_EQ(call(connection, 3), kSuccess);
    EXPECT_EQ(size_, 0U);
    kernel_.onStructCall = [](const FakeStructCall& received) {
        return FakeStructAnswer{received.input.front(), {}, {}};
    };
    EXPECT_EQ(call(connection, 4), 4);
    ASSERT_EQ(kernel_.structCalls.size(), 4U);
    EXPECT_EQ(kernel_.structCalls[3].connection, connection);
    EXPECT_THAT(kernel_.structCalls[3].input, ElementsAre(4));
}

TEST_F(FakeKernelTest, ReportedSizeAboveTheOfferedIsToldAndNothingStored) {
    const ConnectionHandle connection = connect();
    kernel_.structAnswers = {{kSuccess, {1, 2}, 5}};
    EXPECT_EQ(call(connection, 1), kSuccess);
    EXPECT_EQ(size_, 5U);
    EXPECT_THAT(output_, Each(0xee));
}

TEST_F(FakeKernelTest, ReportedSizeOtherThanTheOutputsIsFilledUpOrCut) {
    const ConnectionHandle connection = connect();
    kernel_.structAnswers = {{kSuccess, {1, 2}, 3}, {kSuccess, {1, 2}, 1}};
    EXPECT_EQ(call(connection, 1), kSuccess);
    EXPECT_EQ(size_, 3U);
    EXPECT_THAT(output_, ElementsAre(1, 2, 0, 0xee));
    EXPECT_EQ(call(connection, 1), kSuccess);
    EXPECT_EQ(size_, 1U);
    EXPECT_THAT(output_, ElementsAre(1, 0xee, 0xee, 0xee));
}

} // namespace
