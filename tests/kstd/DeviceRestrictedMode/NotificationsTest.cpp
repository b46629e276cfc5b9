#include "tests/kstd/DaemonFixture.h"

#include <gmock/gmock.h>

#include <cerrno>

namespace kstd {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

std::string arrived(const std::string& message) {
    return "kstd: -[DeviceRestrictedModeService onKextNotificationArrivedWithPropertyName:]: " +
           message;
}

std::string acknowledging(const std::string& message) {
    return "kstd: -[DeviceRestrictedModeService sendNotificationACKWithPropertyName:]: " + message;
}

class NotificationsTest : public DaemonFixture {
  protected:
    void arrive(const std::string& property) {
        service->onKextNotificationArrivedWithPropertyName(property);
    }

    std::shared_ptr<DeviceRestrictedModeService> service = makeService();
};

TEST_F(NotificationsTest, MissingPropertyIsIgnoredAndNotAcknowledged) {
    arrive("KSTRMTimerRestarted");
    EXPECT_THAT(lines(), ElementsAre(assertion("result", "0", "kstd/KSTService"),
                                     arrived("XXX Daemon: EMPTY IGNORING KSTRMTimerRestarted.")));
    EXPECT_THAT(requests(), IsEmpty());
}

TEST_F(NotificationsTest, EmptyPropertyIsIgnoredAndNotAcknowledged) {
    putRecord("P", {});
    arrive("P");
    EXPECT_THAT(lines(), ElementsAre(arrived("XXX Daemon: EMPTY IGNORING P.")));
    EXPECT_THAT(requests(), IsEmpty());
}

TEST_F(NotificationsTest, AbsentKernelIsIgnored) {
    machine.kernel.absence = ENOENT;
    arrive("P");
    EXPECT_THAT(lines(), ElementsAre(assertion("entry", "0", "kstd/KSTService"),
                                     arrived("XXX Daemon: EMPTY IGNORING P.")));
}

class WrongLengthTest : public NotificationsTest,
                        public testing::WithParamInterface<std::size_t> {};

TEST_P(WrongLengthTest, IsDroppedBeforeDispatch) {
    putRecord("P", Bytes(GetParam(), 1));
    arrive("P");
    EXPECT_THAT(
        lines(),
        ElementsAre(assertion("propertyData.length == sizeof(KSTDRMDeamonNotification)", "0"),
                    arrived("returning, err = -5.")));
    EXPECT_THAT(requests(), IsEmpty());
}

INSTANTIATE_TEST_SUITE_P(Lengths, WrongLengthTest, testing::Values(1, 35, 37, 72));

class UnknownTypeTest : public NotificationsTest,
                        public testing::WithParamInterface<std::uint32_t> {};

TEST_P(UnknownTypeTest, IsDroppedWithMinus3) {
    putRecord("P", record(GetParam()));
    arrive("P");
    EXPECT_THAT(lines(), ElementsAre(arrived("XXX Daemon: PROCESSING P."), assertion("0", "0"),
                                     arrived("returning, err = -3.")));
    EXPECT_THAT(requests(), IsEmpty());
}

INSTANTIATE_TEST_SUITE_P(Types, UnknownTypeTest,
                         testing::Values(0U, 5U, 256U, 0x01000000U, 0x80000001U, UINT32_MAX));

TEST_F(NotificationsTest, HandledRecordIsAcknowledgedWithoutAReturningLine) {
    putRecord("P", record(2));
    arrive("P");
    EXPECT_THAT(
        lines(),
        ElementsAre(arrived("XXX Daemon: PROCESSING P."),
                    "kstd: -[DeviceRestrictedModeService onKextAnalyticsCollected:]: called, .",
                    acknowledging("XXX Daemon: SENDING ACK P.")));
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, ackPayload("P")}));
}

TEST_F(NotificationsTest, Type4IsAcknowledged) {
    putRecord("P", record(4));
    arrive("P");
    EXPECT_THAT(lines(), Contains("kstd: -[DeviceRestrictedModeService "
                                  "onKextTimerRestartedAnalyticsCollected:]: called, ."));
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, ackPayload("P")}));
}

TEST_F(NotificationsTest, TheTypeDecidesAndTheAcknowledgementNamesTheProperty) {
    putRecord("KSTRMTimerRestarted", record(3, counting(32, 0x20)));
    arrive("KSTRMTimerRestarted");
    EXPECT_EQ(machine.disk.read(kAnalyticsPath), counting(32, 0x20));
    EXPECT_EQ(machine.disk.read(kStatePath), std::nullopt);
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, ackPayload("KSTRMTimerRestarted")}));
}

TEST_F(NotificationsTest, FailedHandlerIsReportedAndNotAcknowledged) {
    putRecord("P", record(3));
    fake.files.failures.open = true;
    arrive("P");
    EXPECT_THAT(
        lines(),
        ElementsAre(
            arrived("XXX Daemon: PROCESSING P."),
            "kstd: -[DeviceRestrictedModeService onKextSaveAnalytics:]: called, .",
            "kstd: -[DeviceRestrictedModeService saveDataBlob:data:]: called, filePath = "
            "/var/root/.usbrestrictedmode_analytics.",
            assertion("fd >= 0", "0"),
            "kstd: -[DeviceRestrictedModeService saveDataBlob:data:]: returning, err = -5.",
            assertion("err == 0 ", "fffffffffffffffb"),
            "kstd: -[DeviceRestrictedModeService onKextSaveAnalytics:]: returning, err = -5.",
            assertion("err == 0 ", "fffffffffffffffb"), arrived("returning, err = -5.")));
    EXPECT_THAT(requests(), IsEmpty());
}

TEST_F(NotificationsTest, FailedAcknowledgementGivesMinus5WithTheKernelsCodeInTheLog) {
    failRequest(7, -300);
    testing::internal::CaptureStdout();
    EXPECT_EQ(service->sendNotificationACKWithPropertyName("P"), -5);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "KST: LibCall_KSTKernelControl_Block: returning, err = -300.\n");
    EXPECT_THAT(lines(),
                ElementsAre(acknowledging("XXX Daemon: SENDING ACK P."),
                            "KSTLib: AssertMacros: err == 0  (value: 0xfffffffffffffed4),  file: "
                            "KSTLib/KSTLib:#",
                            "KST: AssertMacros: err == 0  (value: 0xfffffffffffffed4),  file: "
                            "common/LibCallBlock:#",
                            "KSTLib: KSTKernelControl: returning, err = -300.",
                            assertion("err == 0 ", "fffffffffffffed4"),
                            acknowledging("returning, err = -5.")));
}

TEST_F(NotificationsTest, FailedAcknowledgementLeavesWhatTheHandlerDid) {
    failRequest(7, -300);
    putRecord("P", timerRecord(1700000000));
    testing::internal::CaptureStdout();
    arrive("P");
    static_cast<void>(testing::internal::GetCapturedStdout());
    EXPECT_EQ(machine.disk.read(kStatePath), defaultStateBlob());
    EXPECT_EQ(registeredAlarm(), 1700000000000000000);
    // The failure is the acknowledgement's alone.
    EXPECT_THAT(lines(), testing::Not(Contains(testing::HasSubstr(
                             "onKextNotificationArrivedWithPropertyName:]: returning"))));
}

TEST_F(NotificationsTest, AcknowledgementHoldsAtMost64BytesOfTheName) {
    for (const std::size_t length : {1U, 63U, 64U, 65U, 200U}) {
        machine.kernel.structCalls.clear();
        const std::string name(length, 'n');
        EXPECT_EQ(service->sendNotificationACKWithPropertyName(name), 0);
        Bytes expected(std::min<std::size_t>(length, 64), 'n');
        expected.resize(64, 0);
        EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, expected})) << length;
    }
}

TEST_F(NotificationsTest, EmptyNameIsAcknowledgedWithZeros) {
    EXPECT_EQ(service->sendNotificationACKWithPropertyName(""), 0);
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, Bytes(64, 0)}));
}

TEST_F(NotificationsTest, NameMayBeCutInsideACharacter) {
    std::string name(63, 'n');
    name += "\xc3\xa4";
    EXPECT_EQ(service->sendNotificationACKWithPropertyName(name), 0);
    EXPECT_EQ(requests().front().payload.back(), 0xc3);
}

TEST_F(NotificationsTest, TwoPostingsBeforeTheFirstIsHandledGiveTwoHandlingsOfTheNewerRecord) {
    putRecord("KSTRMSaveAnalytics", record(3, counting(32, 1)));
    putRecord("KSTRMSaveAnalytics", record(3, counting(32, 2)));
    arrive("KSTRMSaveAnalytics");
    arrive("KSTRMSaveAnalytics");
    EXPECT_EQ(machine.disk.read(kAnalyticsPath), counting(32, 2));
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{7, ackPayload("KSTRMSaveAnalytics")},
                                        ControlRequest{7, ackPayload("KSTRMSaveAnalytics")}));
}

} // namespace
} // namespace kstd
