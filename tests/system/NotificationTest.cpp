// Notifications between the real programs, where they meet in unlucky ways.

#include "tests/system/SystemFixture.h"

#include <gmock/gmock.h>

#include <csignal>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace system_tests {
namespace {

using testing::ElementsAre;

const std::string kTimer = "KSTRMTimerRestarted";
const std::string kSave = "KSTRMSaveAnalytics";

/// A record of type 3 whose blob is one byte over and over.
std::string saveRecord(std::uint8_t byte) {
    return "03000000" + hex(std::vector<std::uint8_t>(32, byte));
}

class NotificationTest : public SystemFixture {
  protected:
    void SetUp() override {
        startKernel();
        daemon = startDaemon();
        kernel("requests clear");
    }

    std::unique_ptr<Program> daemon;
};

TEST_F(NotificationTest, RecordWhoseTypeDisagreesWithItsPropertyIsHandledByItsType) {
    kernel("property set " + kTimer + " " + saveRecord(7));
    kernel("post com.zerva.Keystrand." + kTimer);
    kernel("wait acks=1");
    EXPECT_THAT(requests(), ElementsAre(Request{7, ackPayload(kTimer), 0}));
    EXPECT_EQ(file(kAnalyticsFile), std::vector<std::uint8_t>(32, 7));
    EXPECT_EQ(file(kStateFile), std::nullopt);
}

TEST_F(NotificationTest, TwoNotificationsInOneBurstAreHandledInOrder) {
    kernel("publish save-analytics " + hex(std::vector<std::uint8_t>(32, 1)));
    kernel("publish timer-restarted-analytics total=60");
    kernel("wait acks=2");
    EXPECT_THAT(requests(),
                ElementsAre(Request{7, ackPayload(kSave), 0},
                            Request{7, ackPayload("KSTRMTimerRestartedAnalyticsCollected"), 0}));
}

TEST_F(NotificationTest, TwoPostingsOfOnePropertyGiveTwoHandlingsOfTheNewerRecord) {
    // Stopped, the daemon finds both events and the newer record.
    daemon->signal(SIGSTOP);
    kernel("publish save-analytics " + hex(std::vector<std::uint8_t>(32, 1)));
    kernel("publish save-analytics " + hex(std::vector<std::uint8_t>(32, 2)));
    daemon->signal(SIGCONT);
    kernel("wait acks=2");
    EXPECT_THAT(requests(),
                ElementsAre(Request{7, ackPayload(kSave), 0}, Request{7, ackPayload(kSave), 0}));
    EXPECT_EQ(file(kAnalyticsFile), std::vector<std::uint8_t>(32, 2));
    EXPECT_EQ(daemon->count("XXX Daemon: EMPTY IGNORING"), 0U);
    EXPECT_EQ(kernelStatus("properties"), "0");
}

TEST_F(NotificationTest, PropertyRepublishedWhileItIsHandledIsNotLost) {
    // The first record is handed out, and its way to the daemon takes long enough for a second one.
    kernel("fault operation=property delay=500 perform");
    kernel("publish save-analytics " + hex(std::vector<std::uint8_t>(32, 1)));
    while (kernel("property get " + kSave).back() == "handed-out 0") {
    }
    kernel("publish save-analytics " + hex(std::vector<std::uint8_t>(32, 2)));
    kernel("wait acks=2");
    EXPECT_EQ(file(kAnalyticsFile), std::vector<std::uint8_t>(32, 2));
}

TEST_F(NotificationTest, RecordOfAnotherLengthOrTypeIsNotAcknowledgedAndTheDaemonGoesOn) {
    for (const std::string& record :
         {saveRecord(1).substr(2), saveRecord(1) + "00", "00" + saveRecord(1).substr(2),
          "05" + saveRecord(1).substr(2), std::string("empty")}) {
        kernel("property set " + kSave + " " + record);
        kernel("post com.zerva.Keystrand." + kSave);
    }
    kernel("publish analytics-collected");
    kernel("wait acks=1");
    EXPECT_THAT(requests(), ElementsAre(Request{7, ackPayload("KSTRMAnalyticsCollected"), 0}));
    EXPECT_EQ(file(kAnalyticsFile), std::nullopt);
}

/// A way for the kernel side to spoil the acknowledgement.
struct Spoiled {
    const char* name;
    const char* fault;
    const char* status;
};

class SpoiledAckTest : public NotificationTest, public testing::WithParamInterface<Spoiled> {};

TEST_P(SpoiledAckTest, GivesItsStatusAndTheNextNotificationIsAcknowledged) {
    kernel("fault command=26 control=7 " + std::string(GetParam().fault));
    kernel("publish save-analytics " + hex(std::vector<std::uint8_t>(32, 9)));
    ASSERT_TRUE(daemon->awaitLine(
        "KSTLib: KSTKernelControl: returning, err = " + std::string(GetParam().status) + "."));
    ASSERT_TRUE(daemon->awaitLine("sendNotificationACKWithPropertyName:]: returning, err = -5."));
    EXPECT_EQ(file(kAnalyticsFile), std::vector<std::uint8_t>(32, 9));
    kernel("fault clear");
    const std::string before = kernelStatus("acks");
    kernel("publish analytics-collected");
    kernel("wait acks=" + std::to_string(std::stoi(before) + 1));
}

INSTANTIATE_TEST_SUITE_P(Ways, SpoiledAckTest,
                         testing::Values(Spoiled{"Status", "status=-42", "-42"},
                                         Spoiled{"HangUp", "hang-up", "-1104"},
                                         Spoiled{"WrongSequence", "wrong-sequence", "-1071"},
                                         Spoiled{"Garbage", "garbage=10", "-1071"},
                                         Spoiled{"MoreThanOffered", "reply=257", "-5"}),
                         [](const auto& test) { return std::string(test.param.name); });

TEST_F(NotificationTest, BrokenDatagramsAreDroppedAndTheDaemonGoesOn) {
    EXPECT_EQ(daemon->count("dropped"), 0U);
    const int socket = ::socket(AF_UNIX, SOCK_DGRAM, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    real("/run/kstd/events.sock").copy(address.sun_path, sizeof address.sun_path - 1);
    for (const std::size_t size : {0U, 1U, 11U, 12U, 4096U, 4097U}) {
        const std::vector<std::uint8_t> datagram(size, 'K');
        ::sendto(socket, datagram.data(), datagram.size(), 0,
                 reinterpret_cast<const sockaddr*>(&address), sizeof address);
    }
    ::close(socket);
    sendEvent("stray", "com.example.stream");
    sendEvent("after");
    ASSERT_TRUE(daemon->awaitLine("dropped oversized datagram, 4097 bytes."));
    ASSERT_TRUE(daemon->awaitLine("dropped event stray on unknown stream com.example.stream."));
    ASSERT_TRUE(daemon->awaitLine("Wisp Event: after (notifyd)."));
    EXPECT_EQ(daemon->count("dropped malformed datagram"), 5U);
}

} // namespace
} // namespace system_tests
