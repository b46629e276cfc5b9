#include "tests/kstd/DaemonFixture.h"

#include <gmock/gmock.h>

#include <cerrno>

namespace kstd {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr char kCalledStart[] = "kstd: -[DeviceRestrictedModeService start]: called, .";
constexpr char kReturningStart[] = "kstd: -[DeviceRestrictedModeService start]: returning, .";
constexpr char kLoadAnalytics[] =
    "kstd: -[DeviceRestrictedModeService loadDataBlob:]: called, filePath = "
    "/var/root/.usbrestrictedmode_analytics.";
constexpr char kLoadState[] =
    "kstd: -[DeviceRestrictedModeService loadDataBlob:]: called, filePath = "
    "/var/root/.usbrestrictedmode_v2.";

std::string notified(const std::string& message) {
    return "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: " + message;
}

class LifecycleTest : public DaemonFixture {
  protected:
    /// The payload of request 3.
    static Bytes daemonStarted(bool allowed, const Bytes& stateBlob = Bytes(13, 0)) {
        return joined({{static_cast<std::uint8_t>(allowed ? 1 : 0), 0, 0}, stateBlob});
    }

    std::shared_ptr<DeviceRestrictedModeService> service = makeService();
};

TEST_F(LifecycleTest, StartWithoutFilesSendsOnlyRequest3WithZeros) {
    service->start();
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{3, daemonStarted(true)}));
    EXPECT_THAT(lines(), ElementsAre(kCalledStart, kLoadAnalytics,
                                     notified("Analytics blob not loaded (length = 0).."),
                                     kLoadState, notified("State blob not loaded (length = 0).."),
                                     notified("kstd started, restricted mode allowed: YES."),
                                     kReturningStart));
}

TEST_F(LifecycleTest, StartWithBothFilesSendsRequest6ThenRequest3) {
    machine.disk.put(kAnalyticsPath, counting(32, 0x40));
    machine.disk.put(kStatePath, counting(13, 0x70));
    fake.settings.put(false);
    service->start();
    EXPECT_THAT(requests(),
                ElementsAre(ControlRequest{6, counting(32, 0x40)},
                            ControlRequest{3, daemonStarted(false, counting(13, 0x70))}));
    EXPECT_THAT(lines(), ElementsAre(kCalledStart, kLoadAnalytics, kLoadState,
                                     notified("kstd started, restricted mode allowed: NO."),
                                     kReturningStart));
}

TEST_F(LifecycleTest, LongerFilesAreUsedByTheirLeadingBytes) {
    machine.disk.put(kAnalyticsPath, counting(40, 0x40));
    machine.disk.put(kStatePath, counting(14, 0x70));
    service->start();
    EXPECT_THAT(requests(),
                ElementsAre(ControlRequest{6, counting(32, 0x40)},
                            ControlRequest{3, daemonStarted(true, counting(13, 0x70))}));
}

TEST_F(LifecycleTest, FilesThatAreOneByteShortAreNotLoaded) {
    machine.disk.put(kAnalyticsPath, counting(31, 0x40));
    machine.disk.put(kStatePath, counting(12, 0x70));
    service->start();
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{3, daemonStarted(true)}));
    EXPECT_THAT(lines(),
                testing::IsSupersetOf({notified("Analytics blob not loaded (length = 31).."),
                                       notified("State blob not loaded (length = 12)..")}));
}

TEST_F(LifecycleTest, EmptyFilesAreNotLoaded) {
    machine.disk.put(kAnalyticsPath, {});
    machine.disk.put(kStatePath, {});
    service->start();
    EXPECT_THAT(lines(),
                testing::IsSupersetOf({notified("Analytics blob not loaded (length = 0).."),
                                       notified("State blob not loaded (length = 0)..")}));
}

TEST_F(LifecycleTest, FailedRequest6EndsTheStartBeforeTheStateFileAndTheSettings) {
    machine.disk.put(kAnalyticsPath, counting(32, 0));
    machine.disk.put(kStatePath, counting(13, 0));
    failRequest(6, -42);
    testing::internal::CaptureStdout();
    EXPECT_EQ(service->notifyDaemonStarted(), -5);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "KST: LibCall_KSTKernelControl_Block: returning, err = -42.\n");
    EXPECT_EQ(requests().size(), 1U);
    EXPECT_EQ(fake.settings.questions(), 0U);
    EXPECT_THAT(fake.files.calls(), ElementsAre("load /var/root/.usbrestrictedmode_analytics"));
    EXPECT_THAT(lines(),
                ElementsAre(kLoadAnalytics,
                            "KSTLib: AssertMacros: err == 0  (value: 0xffffffffffffffd6),  file: "
                            "KSTLib/KSTLib:#",
                            "KST: AssertMacros: err == 0  (value: 0xffffffffffffffd6),  file: "
                            "common/LibCallBlock:#",
                            "KSTLib: KSTKernelControl: returning, err = -42.",
                            assertion("err == 0 ", "ffffffffffffffd6"),
                            notified("returning, err = -5.")));
}

TEST_F(LifecycleTest, FailedRequest3GivesMinus5AndTheKernelsOwnCodeInTheLog) {
    failRequest(3, 77);
    testing::internal::CaptureStdout();
    EXPECT_EQ(service->notifyDaemonStarted(), -5);
    static_cast<void>(testing::internal::GetCapturedStdout());
    const auto all = lines();
    EXPECT_THAT(std::vector<std::string>(all.end() - 2, all.end()),
                ElementsAre(assertion("err == 0 ", "4d"), notified("returning, err = -5.")));
}

TEST_F(LifecycleTest, SettingIsAskedOnceAndAfterBothFilesWereLoaded) {
    service->start();
    EXPECT_EQ(fake.settings.questions(), 1U);
    EXPECT_THAT(fake.files.calls(), ElementsAre("load /var/root/.usbrestrictedmode_analytics",
                                                "load /var/root/.usbrestrictedmode_v2"));
}

// Every line as it must be, with the one that goes to standard output in its place.
TEST_F(LifecycleTest, StartWithAnAnalyticsFileWhileTheKernelIsAbsent) {
    machine.disk.put(kAnalyticsPath, counting(32, 0));
    machine.kernel.absence = ENOENT;
    testing::internal::CaptureStdout();
    service->start();
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "KST: LibCall_KSTKernelControl_Block: returning, err = -5.\n");
    EXPECT_THAT(
        lines(),
        ElementsAre("kstd: -[DeviceRestrictedModeService start]: called, .",
                    "kstd: -[DeviceRestrictedModeService loadDataBlob:]: called, filePath = "
                    "/var/root/.usbrestrictedmode_analytics.",
                    "KSTLib: AssertMacros: service (value: 0x0),  file: KSTLib/KSTLib:#",
                    "KST: AssertMacros: err == 0  (value: 0xfffffffffffffffb),  file: "
                    "common/LibCallBlock:#",
                    "KSTLib: KSTKernelControl: returning, err = -5.",
                    "kstd: AssertMacros: err == 0  (value: 0xfffffffffffffffb),  file: "
                    "kstd/DeviceRestrictedMode/DeviceRestrictedModeService:#",
                    "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: returning, err = "
                    "-5.",
                    "kstd: -[DeviceRestrictedModeService start]: returning, ."));
}

TEST_F(LifecycleTest, StopWritesItsTwoLinesAndDoesNothingElse) {
    service->stop();
    for (const auto& line : fake.log.lines()) {
        EXPECT_EQ(line.level, platform::LogLevel::info);
    }
    EXPECT_THAT(lines(), ElementsAre("kstd: -[DeviceRestrictedModeService stop]: called, .",
                                     "kstd: -[DeviceRestrictedModeService stop]: returning, ."));
    EXPECT_THAT(requests(), IsEmpty());
}

TEST_F(LifecycleTest, SettingsChangeSendsRequest5WithTheNewAnswer) {
    fake.settings.put(false);
    service->handleWispEventWithName("com.zerva.quorvane.effectivesettingschanged");
    fake.settings.put(true);
    EXPECT_EQ(service->onQuorvaneChanged(), 0);
    EXPECT_THAT(requests(), ElementsAre(ControlRequest{5, {0}}, ControlRequest{5, {1}}));
    EXPECT_THAT(
        lines(),
        ElementsAre("kstd: -[DeviceRestrictedModeService handleWispEventWithName:]: called, "
                    "eventName=com.zerva.quorvane.effectivesettingschanged.",
                    "kstd: -[DeviceRestrictedModeService onQuorvaneChanged]: called, .",
                    "kstd: -[DeviceRestrictedModeService onQuorvaneChanged]: Quorvane Changed "
                    "Restricted Mode Allowed: NO.",
                    "kstd: -[DeviceRestrictedModeService handleWispEventWithName:]: returning, .",
                    "kstd: -[DeviceRestrictedModeService onQuorvaneChanged]: called, .",
                    "kstd: -[DeviceRestrictedModeService onQuorvaneChanged]: Quorvane Changed "
                    "Restricted Mode Allowed: YES."));
}

TEST_F(LifecycleTest, FailedRequest5GivesMinus5) {
    failRequest(5, -9);
    testing::internal::CaptureStdout();
    EXPECT_EQ(service->onQuorvaneChanged(), -5);
    static_cast<void>(testing::internal::GetCapturedStdout());
    const auto all = lines();
    EXPECT_THAT(std::vector<std::string>(all.end() - 2, all.end()),
                ElementsAre(assertion("err == 0 ", "fffffffffffffff7"),
                            "kstd: -[DeviceRestrictedModeService onQuorvaneChanged]: returning, "
                            "err = -5."));
}

class EventNameTest : public LifecycleTest, public testing::WithParamInterface<const char*> {};

TEST_P(EventNameTest, NameThatIsNotExactlyKnownDoesNothing) {
    const std::string name = GetParam();
    service->handleWispEventWithName(name);
    EXPECT_THAT(
        lines(),
        ElementsAre("kstd: -[DeviceRestrictedModeService handleWispEventWithName:]: called, "
                    "eventName=" +
                        name + ".",
                    "kstd: -[DeviceRestrictedModeService handleWispEventWithName:]: returning, ."));
    EXPECT_THAT(requests(), IsEmpty());
    EXPECT_THAT(machine.kernel.propertyReads, IsEmpty());
}

INSTANTIATE_TEST_SUITE_P(
    Names, EventNameTest,
    testing::Values("", "com.zerva.Keystrand.", "com.zerva.Keystrand.KSTRMTimerRestarte",
                    "com.zerva.Keystrand.KSTRMTimerRestarted2",
                    "com.zerva.keystrand.KSTRMTimerRestarted", "KSTRMTimerRestarted",
                    "com.zerva.quorvane.effectivesettingschange",
                    "com.zerva.Quorvane.effectivesettingschanged", "com.zerva.kstd.alarm"));

class NotificationNameTest : public LifecycleTest,
                             public testing::WithParamInterface<const char*> {};

TEST_P(NotificationNameTest, ReadsThePropertyOfItsName) {
    const std::string property = GetParam();
    service->handleWispEventWithName("com.zerva.Keystrand." + property);
    EXPECT_THAT(machine.kernel.propertyReads, ElementsAre(property));
}

INSTANTIATE_TEST_SUITE_P(Names, NotificationNameTest,
                         testing::Values("KSTRMTimerRestarted", "KSTRMAnalyticsCollected",
                                         "KSTRMSaveAnalytics",
                                         "KSTRMTimerRestartedAnalyticsCollected"));

} // namespace
} // namespace kstd
