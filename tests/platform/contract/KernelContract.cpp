#include "tests/platform/contract/KernelContract.h"

#include <gmock/gmock.h>

#include <array>
#include <cerrno>

namespace contract {

namespace {

using platform::ConnectionHandle;
using platform::kNoConnection;
using platform::kNoService;
using platform::kSuccess;
using platform::ServiceHandle;
using platform::Status;
using platform::statusFromErrno;
using testing::AnyOf;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Optional;

using Bytes = std::vector<std::uint8_t>;
using StructCall = KernelFixture::StructCall;
using ScalarCall = KernelFixture::ScalarCall;

constexpr char kPath[] = "IOService:/IOResources/Keystrand";
constexpr char kClass[] = "Keystrand";
constexpr char kProperty[] = "KSTRMTimerRestarted";
constexpr std::uint8_t kUntouched = 0xee;

/// A kernel side that is not there.
auto isAbsence() {
    return AnyOf(statusFromErrno(ENOENT), statusFromErrno(ECONNREFUSED));
}

bool isPlatformStatus(Status status) {
    return status <= -1001 && status >= -5095;
}

} // namespace

ServiceHandle KernelContract::find() {
    return registry().findByPath(kPath);
}

ConnectionHandle KernelContract::connect() {
    const ServiceHandle service = find();
    ConnectionHandle connection = kNoConnection;
    EXPECT_EQ(channel().open(service, 0, &connection), kSuccess);
    EXPECT_NE(connection, kNoConnection);
    registry().release(service);
    return connection;
}

KernelContract::Outcome KernelContract::call(ConnectionHandle connection, const Bytes& input,
                                             std::size_t offered) {
    Outcome outcome{kSuccess, Bytes(offered, kUntouched), offered};
    outcome.status = channel().structCall(connection, 0, input.data(), input.size(),
                                          outcome.buffer.data(), &outcome.size);
    return outcome;
}

TEST_P(KernelContract, EntryIsFoundByItsPath) {
    EXPECT_NE(registry().findByPath(kPath), kNoService);
}

TEST_P(KernelContract, EntryIsFoundByItsClassName) {
    EXPECT_NE(registry().findByClassName(kClass), kNoService);
}

TEST_P(KernelContract, OtherNamesFindNothing) {
    EXPECT_EQ(registry().findByPath("IOService:/IOResources"), kNoService);
    EXPECT_EQ(registry().findByPath(kClass), kNoService);
    EXPECT_EQ(registry().findByPath(""), kNoService);
    EXPECT_EQ(registry().findByPath(std::string(100000, 'p')), kNoService);
    EXPECT_EQ(registry().findByClassName("keystrand"), kNoService);
    EXPECT_EQ(registry().findByClassName("Keystrand2"), kNoService);
    EXPECT_EQ(registry().findByClassName(kPath), kNoService);
    EXPECT_EQ(registry().findByClassName(""), kNoService);
    EXPECT_EQ(registry().findByClassName(std::string(100000, 'n')), kNoService);
    EXPECT_NE(registry().findByPath(kPath), kNoService) << "the registry works on";
}

TEST_P(KernelContract, UnreachableRegistryHasNothingThatCanBeOpened) {
    fixture().setReachable(false);
    EXPECT_EQ(registry().findByPath(kPath), kNoService);
    const ServiceHandle service = registry().findByClassName(kClass);
    ConnectionHandle connection = kNoConnection;
    EXPECT_TRUE(isPlatformStatus(channel().open(service, 0, &connection)));
    EXPECT_EQ(connection, kNoConnection);
    registry().release(service);
}

TEST_P(KernelContract, EntryIsLookedUpAnewOnEveryCall) {
    fixture().setEntryPresent(false);
    EXPECT_EQ(registry().findByPath(kPath), kNoService);
    fixture().setEntryPresent(true);
    EXPECT_NE(registry().findByPath(kPath), kNoService);
    fixture().setReachable(false);
    EXPECT_EQ(registry().findByPath(kPath), kNoService);
    fixture().setReachable(true);
    EXPECT_NE(registry().findByPath(kPath), kNoService);
}

TEST_P(KernelContract, PropertyIsCopiedAsItStandsNow) {
    const ServiceHandle entry = find();
    fixture().setProperty(kProperty, Bytes{1, 2, 3});
    EXPECT_THAT(registry().copyProperty(entry, kProperty), Optional(Bytes{1, 2, 3}));
    fixture().setProperty(kProperty, Bytes(36, 9));
    EXPECT_THAT(registry().copyProperty(entry, kProperty), Optional(Bytes(36, 9)));
}

TEST_P(KernelContract, AbsentPropertyIsNoneAndAnEmptyOneIsEmpty) {
    const ServiceHandle entry = find();
    EXPECT_EQ(registry().copyProperty(entry, kProperty), std::nullopt);
    fixture().setProperty(kProperty, Bytes());
    EXPECT_THAT(registry().copyProperty(entry, kProperty), Optional(Bytes()));
    fixture().setProperty(kProperty, std::nullopt);
    EXPECT_EQ(registry().copyProperty(entry, kProperty), std::nullopt);
}

TEST_P(KernelContract, LongPropertyIsCopiedWhole) {
    Bytes value(100000);
    for (std::size_t i = 0; i < value.size(); ++i) {
        value[i] = static_cast<std::uint8_t>(i * 31);
    }
    fixture().setProperty(kProperty, value);
    EXPECT_EQ(registry().copyProperty(find(), kProperty), value);
}

TEST_P(KernelContract, OtherNamesGiveNoProperty) {
    fixture().setProperty(kProperty, Bytes{1});
    const ServiceHandle entry = find();
    EXPECT_EQ(registry().copyProperty(entry, "KSTRMTimerRestarted2"), std::nullopt);
    EXPECT_EQ(registry().copyProperty(entry, "kstrmtimerrestarted"), std::nullopt);
    EXPECT_EQ(registry().copyProperty(entry, ""), std::nullopt);
    EXPECT_EQ(registry().copyProperty(entry, std::string(100000, 'n')), std::nullopt);
    EXPECT_THAT(registry().copyProperty(entry, kProperty), Optional(Bytes{1}));
}

TEST_P(KernelContract, PropertyOfAnEntryThatIsGoneIsNone) {
    fixture().setProperty(kProperty, Bytes{1});
    const ServiceHandle entry = find();
    fixture().setEntryPresent(false);
    EXPECT_EQ(registry().copyProperty(entry, kProperty), std::nullopt);
    fixture().setEntryPresent(true);
    fixture().setReachable(false);
    EXPECT_EQ(registry().copyProperty(entry, kProperty), std::nullopt);
    fixture().setReachable(true);
    EXPECT_THAT(registry().copyProperty(entry, kProperty), Optional(Bytes{1}));
}

TEST_P(KernelContract, EachReferenceIsReleasedByItself) {
    fixture().setProperty(kProperty, Bytes{1});
    const ServiceHandle first = registry().findByPath(kPath);
    const ServiceHandle second = registry().findByClassName(kClass);
    registry().release(first);
    EXPECT_THAT(registry().copyProperty(second, kProperty), Optional(Bytes{1}));
    registry().release(second);
    EXPECT_EQ(registry().copyProperty(second, kProperty), std::nullopt);
    EXPECT_EQ(registry().copyProperty(first, kProperty), std::nullopt);
}

TEST_P(KernelContract, HandlesThatAreNotHeldAreIgnored) {
    fixture().setProperty(kProperty, Bytes{1});
    registry().release(kNoService);
    registry().release(12345);
    EXPECT_EQ(registry().copyProperty(kNoService, kProperty), std::nullopt);
    EXPECT_EQ(registry().copyProperty(12345, kProperty), std::nullopt);
    const ServiceHandle entry = find();
    registry().release(12345);
    EXPECT_THAT(registry().copyProperty(entry, kProperty), Optional(Bytes{1}));
}

TEST_P(KernelContract, OpenCarriesTheConnectionType) {
    ConnectionHandle connection = kNoConnection;
    EXPECT_EQ(channel().open(find(), 0, &connection), kSuccess);
    EXPECT_NE(connection, kNoConnection);
    EXPECT_THAT(fixture().openedTypes(), ElementsAre(0U));
}

TEST_P(KernelContract, RefusedOpenGivesTheKernelsStatusAndNoConnection) {
    fixture().setOpenStatus(-6004);
    ConnectionHandle connection = 77;
    EXPECT_EQ(channel().open(find(), 3, &connection), -6004);
    EXPECT_EQ(connection, 77U);
    EXPECT_THAT(fixture().openedTypes(), ElementsAre(3U));
}

TEST_P(KernelContract, OpenOfAnEntryThatIsNotHeldIsRefusedHere) {
    ConnectionHandle connection = 77;
    EXPECT_TRUE(isPlatformStatus(channel().open(kNoService, 0, &connection)));
    EXPECT_TRUE(isPlatformStatus(channel().open(12345, 0, &connection)));
    EXPECT_EQ(connection, 77U);
    EXPECT_THAT(fixture().openedTypes(), IsEmpty());
}

TEST_P(KernelContract, OpenOfAnAbsentKernelSideFailsUntilItIsBack) {
    const ServiceHandle service = find();
    fixture().setReachable(false);
    ConnectionHandle connection = 77;
    EXPECT_THAT(channel().open(service, 0, &connection), isAbsence());
    EXPECT_EQ(connection, 77U);
    fixture().setReachable(true);
    EXPECT_EQ(channel().open(service, 0, &connection), kSuccess);
}

TEST_P(KernelContract, StructCallCarriesSelectorInputAndOfferedSize) {
    const ConnectionHandle connection = connect();
    const Bytes input = {'D', 'R', 'C', 'S', 26, 0, 0, 0, 3};
    std::array<std::uint8_t, 5> output{};
    std::size_t size = output.size();
    EXPECT_EQ(channel().structCall(connection, 9, input.data(), input.size(), output.data(), &size),
              kSuccess);
    EXPECT_THAT(fixture().structCalls(), ElementsAre(StructCall{9, input, 5}));
    EXPECT_EQ(size, 0U);
}

TEST_P(KernelContract, CallWithoutOutputOffersNone) {
    const ConnectionHandle connection = connect();
    const Bytes input = {1};
    EXPECT_EQ(channel().structCall(connection, 0, input.data(), input.size(), nullptr, nullptr),
              kSuccess);
    std::size_t size = 0;
    EXPECT_EQ(channel().structCall(connection, 0, input.data(), input.size(), nullptr, &size),
              kSuccess);
    EXPECT_EQ(size, 0U);
    EXPECT_THAT(fixture().structCalls(),
                ElementsAre(StructCall{0, input, 0}, StructCall{0, input, 0}));
}

TEST_P(KernelContract, CallWithoutInputIsCarried) {
    const ConnectionHandle connection = connect();
    EXPECT_EQ(channel().structCall(connection, 0, nullptr, 0, nullptr, nullptr), kSuccess);
    EXPECT_THAT(fixture().structCalls(), ElementsAre(StructCall{0, {}, 0}));
}

TEST_P(KernelContract, ReplyOfExactlyTheOfferedSizeFits) {
    const ConnectionHandle connection = connect();
    fixture().answerStructCall({kSuccess, Bytes(17, 4)});
    const Outcome outcome = call(connection, {1}, 17);
    EXPECT_EQ(outcome.status, kSuccess);
    EXPECT_EQ(outcome.size, 17U);
    EXPECT_EQ(outcome.buffer, Bytes(17, 4));
}

TEST_P(KernelContract, ShorterReplyGivesItsSizeAndLeavesTheRestAlone) {
    const ConnectionHandle connection = connect();
    fixture().answerStructCall({kSuccess, {1, 2, 3}});
    const Outcome outcome = call(connection, {1}, 5);
    EXPECT_EQ(outcome.status, kSuccess);
    EXPECT_EQ(outcome.size, 3U);
    EXPECT_EQ(outcome.buffer, (Bytes{1, 2, 3, kUntouched, kUntouched}));
}

TEST_P(KernelContract, ReplyBeyondTheOfferedSizeIsToldAndNotStored) {
    const ConnectionHandle connection = connect();
    fixture().answerStructCall({kSuccess, Bytes(6, 4)});
    const Outcome outcome = call(connection, {1}, 5);
    EXPECT_EQ(outcome.status, kSuccess);
    EXPECT_EQ(outcome.size, 6U);
    EXPECT_EQ(outcome.buffer, Bytes(5, kUntouched));
}

TEST_P(KernelContract, ReplyWhereNoneWasOfferedIsRefused) {
    const ConnectionHandle connection = connect();
    fixture().answerStructCall({kSuccess, {1}});
    EXPECT_EQ(channel().structCall(connection, 0, nullptr, 0, nullptr, nullptr),
              statusFromErrno(EMSGSIZE));
}

TEST_P(KernelContract, SizeOfferedWithoutABufferIsRefusedBeforeAnythingIsSent) {
    const ConnectionHandle connection = connect();
    std::size_t size = 1;
    EXPECT_EQ(channel().structCall(connection, 0, "x", 1, nullptr, &size), statusFromErrno(EINVAL));
    EXPECT_EQ(size, 1U);
    EXPECT_TRUE(fixture().structCalls().empty());
}

TEST_P(KernelContract, StatusOfTheKernelSideIsPassedOnUnchanged) {
    const ConnectionHandle connection = connect();
    for (const Status status : {-6005, 1, 0x7fffffff, -0x7fffffff - 1, -3, -1001}) {
        fixture().answerStructCall({status, {}});
        const Outcome outcome = call(connection, {1}, 4);
        EXPECT_EQ(outcome.status, status);
        EXPECT_EQ(outcome.size, 4U);
        EXPECT_EQ(outcome.buffer, Bytes(4, kUntouched));
    }
}

TEST_P(KernelContract, LongestInputIsCarriedWholeAndOneMoreIsRefused) {
    const ConnectionHandle connection = connect();
    const std::size_t longest = fixture().maxStructInput();
    for (const std::size_t length : {longest - 1, longest}) {
        EXPECT_EQ(call(connection, Bytes(length, 7), 0).status, kSuccess) << length;
    }
    ASSERT_EQ(fixture().structCalls().size(), 2U);
    EXPECT_EQ(fixture().structCalls().back().input, Bytes(longest, 7));
    for (const std::size_t length : {longest + 1, longest + 1000, longest * 4}) {
        EXPECT_EQ(call(connection, Bytes(length, 7), 0).status, statusFromErrno(EMSGSIZE))
            << length;
    }
    EXPECT_EQ(fixture().structCalls().size(), 2U);
    EXPECT_EQ(call(connection, {1}, 0).status, kSuccess) << "the next call works";
}

TEST_P(KernelContract, CallOnWhatIsNoConnectionDoesNotReachTheKernelSide) {
    EXPECT_TRUE(isPlatformStatus(call(kNoConnection, {1}, 4).status));
    EXPECT_TRUE(isPlatformStatus(call(12345, {1}, 4).status));
    EXPECT_TRUE(isPlatformStatus(channel().scalarCall(12345, 2, nullptr, 0, nullptr, nullptr)));
    EXPECT_THAT(fixture().structCalls(), IsEmpty());
    EXPECT_THAT(fixture().scalarCalls(), IsEmpty());
}

TEST_P(KernelContract, CallFailsWhileTheKernelSideIsGoneAndWorksWhenItIsBack) {
    const ConnectionHandle connection = connect();
    ASSERT_EQ(call(connection, {1}, 4).status, kSuccess);
    fixture().setReachable(false);
    const Outcome outcome = call(connection, {2}, 4);
    EXPECT_TRUE(isPlatformStatus(outcome.status)) << outcome.status;
    EXPECT_EQ(outcome.size, 4U);
    EXPECT_EQ(outcome.buffer, Bytes(4, kUntouched));
    fixture().setReachable(true);
    EXPECT_EQ(call(connection, {3}, 4).status, kSuccess);
    EXPECT_THAT(fixture().structCalls(), ElementsAre(StructCall{0, {1}, 4}, StructCall{0, {3}, 4}));
}

TEST_P(KernelContract, TwoConnectionsWorkSideBySide) {
    const ConnectionHandle first = connect();
    const ConnectionHandle second = connect();
    EXPECT_NE(first, second);
    EXPECT_EQ(call(first, {1}, 0).status, kSuccess);
    EXPECT_EQ(call(second, {2}, 0).status, kSuccess);
    EXPECT_EQ(call(first, {3}, 0).status, kSuccess);
}

TEST_P(KernelContract, ScalarCallCarriesNumbersBothWays) {
    const ConnectionHandle connection = connect();
    fixture().answerScalarCall(kSuccess, {30, 0xffffffffffffffffU});
    const std::array<std::uint64_t, 2> inputs = {1, 0x8000000000000000U};
    std::array<std::uint64_t, 3> outputs = {5, 5, 5};
    std::uint32_t count = outputs.size();
    EXPECT_EQ(
        channel().scalarCall(connection, 2, inputs.data(), inputs.size(), outputs.data(), &count),
        kSuccess);
    EXPECT_EQ(count, 2U);
    EXPECT_THAT(outputs, ElementsAre(30U, 0xffffffffffffffffU, 5U));
    EXPECT_THAT(fixture().scalarCalls(),
                ElementsAre(ScalarCall{2, {inputs.begin(), inputs.end()}, 3}));
}

TEST_P(KernelContract, ScalarCallWithoutNumbersIsCarried) {
    const ConnectionHandle connection = connect();
    EXPECT_EQ(channel().scalarCall(connection, 2, nullptr, 0, nullptr, nullptr), kSuccess);
    EXPECT_THAT(fixture().scalarCalls(), ElementsAre(ScalarCall{2, {}, 0}));
}

TEST_P(KernelContract, MoreNumbersThanOfferedAreToldAndNotStored) {
    const ConnectionHandle connection = connect();
    fixture().answerScalarCall(kSuccess, {1, 2});
    std::uint64_t output = 5;
    std::uint32_t count = 1;
    EXPECT_EQ(channel().scalarCall(connection, 2, nullptr, 0, &output, &count), kSuccess);
    EXPECT_EQ(output, 5U);
    EXPECT_EQ(count, 2U);
    fixture().answerScalarCall(kSuccess, {1});
    EXPECT_EQ(channel().scalarCall(connection, 2, nullptr, 0, nullptr, nullptr),
              statusFromErrno(EMSGSIZE));
}

TEST_P(KernelContract, ScalarStatusIsPassedOnUnchanged) {
    const ConnectionHandle connection = connect();
    fixture().answerScalarCall(-6004, {});
    std::uint64_t output = 5;
    std::uint32_t count = 1;
    EXPECT_EQ(channel().scalarCall(connection, 2, nullptr, 0, &output, &count), -6004);
    EXPECT_EQ(output, 5U);
    EXPECT_EQ(count, 1U);
}

TEST_P(KernelContract, SixteenNumbersAreCarriedAndNoMore) {
    const ConnectionHandle connection = connect();
    const std::vector<std::uint64_t> numbers(17, 3);
    for (const std::uint32_t inputs : {15U, 16U}) {
        EXPECT_EQ(channel().scalarCall(connection, 2, numbers.data(), inputs, nullptr, nullptr),
                  kSuccess);
    }
    EXPECT_TRUE(isPlatformStatus(
        channel().scalarCall(connection, 2, numbers.data(), 17, nullptr, nullptr)));
    fixture().answerScalarCall(kSuccess, std::vector<std::uint64_t>(16, 8));
    std::vector<std::uint64_t> outputs(17);
    std::uint32_t count = 16;
    EXPECT_EQ(channel().scalarCall(connection, 2, nullptr, 0, outputs.data(), &count), kSuccess);
    EXPECT_EQ(count, 16U);
    count = 17;
    EXPECT_TRUE(
        isPlatformStatus(channel().scalarCall(connection, 2, nullptr, 0, outputs.data(), &count)));
    EXPECT_EQ(count, 17U);
}

} // namespace contract
