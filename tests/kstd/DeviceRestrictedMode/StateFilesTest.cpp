#include "tests/kstd/DaemonFixture.h"

#include <gmock/gmock.h>

#include <cerrno>

namespace kstd {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr char kCalled[] =
    "kstd: -[DeviceRestrictedModeService saveDataBlob:data:]: called, filePath = "
    "/var/root/.usbrestrictedmode_v2.";
constexpr char kReturning[] =
    "kstd: -[DeviceRestrictedModeService saveDataBlob:data:]: returning, err = -5.";

class StateFilesTest : public DaemonFixture {
  protected:
    KSTStatus save(const Bytes& data, const std::string& path = kStatePath) {
        return service->saveDataBlob(path, data);
    }

    void expectNothingOpen() const {
        EXPECT_EQ(fake.files.openDescriptors(), 0U);
        EXPECT_EQ(fake.files.openStreams(), 0U);
    }

    std::shared_ptr<DeviceRestrictedModeService> service = makeService();
};

TEST_F(StateFilesTest, SaveOpensAttachesWritesSyncsAndClosesInThisOrder) {
    EXPECT_EQ(save(counting(13, 1)), 0);
    EXPECT_THAT(fake.files.calls(), ElementsAre("open /var/root/.usbrestrictedmode_v2", "attach",
                                                "write 13", "sync", "close"));
    EXPECT_THAT(lines(), ElementsAre(kCalled));
    EXPECT_EQ(fake.files.protectionOf(kStatePath),
              (platform::FakeFiles::Protection{platform::ProtectionClass::none, 0}));
    EXPECT_EQ(machine.disk.find(kStatePath)->mode, 0600U);
    expectNothingOpen();
}

TEST_F(StateFilesTest, SavedBytesSurviveAPowerCut) {
    EXPECT_EQ(save(counting(13, 1)), 0);
    fake.files.crash();
    EXPECT_EQ(machine.disk.read(kStatePath), counting(13, 1));
}

TEST_F(StateFilesTest, LongerFileKeepsItsTail) {
    machine.disk.put(kStatePath, counting(32, 0x80));
    EXPECT_EQ(save(counting(13, 1)), 0);
    Bytes expected = counting(32, 0x80);
    std::copy_n(counting(13, 1).begin(), 13, expected.begin());
    EXPECT_EQ(machine.disk.read(kStatePath), expected);
}

TEST_F(StateFilesTest, MissingDirectoryFailsAtTheOpen) {
    EXPECT_EQ(save(counting(13, 1), "/nowhere/file"), -5);
    EXPECT_THAT(lines(), ElementsAre("kstd: -[DeviceRestrictedModeService saveDataBlob:data:]: "
                                     "called, filePath = /nowhere/file.",
                                     assertion("fd >= 0", "0"), kReturning));
    EXPECT_THAT(fake.files.calls(), ElementsAre("open /nowhere/file"));
    // The text names what the check belongs to, the fields the source that holds it.
    const auto line = fake.log.lines()[1];
    EXPECT_EQ(line.file, "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.cpp");
    EXPECT_THAT(line.text, testing::EndsWith("  file: kstd/DeviceRestrictedMode/"
                                             "DeviceRestrictedModeService:" +
                                             std::to_string(line.line)));
}

TEST_F(StateFilesTest, FailedAttachLeavesTheDescriptorOpen) {
    fake.files.failures.attach = true;
    EXPECT_EQ(save(counting(13, 1)), -5);
    EXPECT_THAT(lines(), ElementsAre(kCalled, assertion("file", "0"), kReturning));
    EXPECT_THAT(fake.files.calls(), ElementsAre("open /var/root/.usbrestrictedmode_v2", "attach"));
    EXPECT_EQ(fake.files.openDescriptors(), 1U);
}

TEST_F(StateFilesTest, ShortWriteFailsAndClosesOnce) {
    fake.files.failures.writeAtMost = 12;
    EXPECT_EQ(save(counting(13, 1)), -5);
    EXPECT_THAT(lines(),
                ElementsAre(kCalled, assertion("written == data.length", "0"), kReturning));
    EXPECT_THAT(fake.files.calls(),
                ElementsAre("open /var/root/.usbrestrictedmode_v2", "attach", "write 13", "close"));
    expectNothingOpen();
}

TEST_F(StateFilesTest, FailedSyncShowsItsErrorAndClosesOnce) {
    fake.files.failures.sync = EIO;
    EXPECT_EQ(save(counting(13, 1)), -5);
    EXPECT_THAT(lines(), ElementsAre(kCalled, assertion("ferr == 0 ", "5"), kReturning));
    EXPECT_THAT(fake.files.calls(), ElementsAre("open /var/root/.usbrestrictedmode_v2", "attach",
                                                "write 13", "sync", "close"));
    expectNothingOpen();
}

TEST_F(StateFilesTest, FailedCloseIsClosedASecondTime) {
    fake.files.failures.close = ENOSPC;
    EXPECT_EQ(save(counting(13, 1)), -5);
    EXPECT_THAT(lines(), ElementsAre(kCalled, assertion("ferr == 0 ", "1c"), kReturning));
    EXPECT_THAT(fake.files.calls(), ElementsAre("open /var/root/.usbrestrictedmode_v2", "attach",
                                                "write 13", "sync", "close", "close"));
    expectNothingOpen();
}

TEST_F(StateFilesTest, SaveWorksAgainAfterAFailure) {
    fake.files.failures.sync = EIO;
    EXPECT_EQ(save(counting(13, 1)), -5);
    EXPECT_EQ(save(counting(13, 2)), 0);
    EXPECT_EQ(machine.disk.read(kStatePath), counting(13, 2));
}

TEST_F(StateFilesTest, EmptyBlobIsSaved) {
    machine.disk.put(kStatePath, counting(3, 0));
    EXPECT_EQ(save({}), 0);
    EXPECT_EQ(machine.disk.read(kStatePath), counting(3, 0));
}

TEST_F(StateFilesTest, MissingFileLoadsAsNoneAndEmptyFileAsEmpty) {
    EXPECT_EQ(service->loadDataBlob(kStatePath), std::nullopt);
    machine.disk.put(kStatePath, {});
    EXPECT_EQ(service->loadDataBlob(kStatePath), Bytes{});
    EXPECT_THAT(lines(),
                ElementsAre("kstd: -[DeviceRestrictedModeService loadDataBlob:]: called, filePath "
                            "= /var/root/.usbrestrictedmode_v2.",
                            "kstd: -[DeviceRestrictedModeService loadDataBlob:]: called, filePath "
                            "= /var/root/.usbrestrictedmode_v2."));
}

TEST_F(StateFilesTest, UnreadableFileLoadsAsNone) {
    machine.disk.put(kStatePath, counting(13, 0));
    fake.files.failures.load = true;
    EXPECT_EQ(service->loadDataBlob(kStatePath), std::nullopt);
}

TEST_F(StateFilesTest, WholeFileIsLoaded) {
    machine.disk.put(kStatePath, counting(200, 0));
    EXPECT_EQ(service->loadDataBlob(kStatePath), counting(200, 0));
}

/// A way to make a save fail.
struct Failure {
    const char* name;
    void (*order)(platform::FakeFileFailures&);
};

class FailedStateSaveTest : public StateFilesTest, public testing::WithParamInterface<Failure> {};

TEST_P(FailedStateSaveTest, AlarmIsUntouchedAndNothingAcknowledged) {
    machine.alarms.save({kAlarmStreamName, kAlarmEventName}, {123});
    for (const std::uint64_t alarm : {std::uint64_t{0}, std::uint64_t{1800000000}}) {
        GetParam().order(fake.files.failures);
        putRecord("KSTRMTimerRestarted", timerRecord(alarm));
        service->onKextNotificationArrivedWithPropertyName("KSTRMTimerRestarted");
        EXPECT_EQ(registeredAlarm(), 123);
        EXPECT_THAT(requests(), IsEmpty());
        const auto all = lines();
        EXPECT_THAT(std::vector<std::string>(all.end() - 5, all.end()),
                    ElementsAre(kReturning, assertion("err == 0 ", "fffffffffffffffb"),
                                "kstd: -[DeviceRestrictedModeService onKextTimerRestarted:]: "
                                "returning, err = -5.",
                                assertion("err == 0 ", "fffffffffffffffb"),
                                "kstd: -[DeviceRestrictedModeService "
                                "onKextNotificationArrivedWithPropertyName:]: returning, err = "
                                "-5."));
    }
}

INSTANTIATE_TEST_SUITE_P(Failures, FailedStateSaveTest,
                         testing::Values(Failure{"open",
                                                 [](auto& failures) {
                                                     failures.open = true;
                                                 }},
                                         Failure{"attach",
                                                 [](auto& failures) {
                                                     failures.attach = true;
                                                 }},
                                         Failure{"write",
                                                 [](auto& failures) {
                                                     failures.writeAtMost = 0;
                                                 }},
                                         Failure{"sync",
                                                 [](auto& failures) {
                                                     failures.sync = EIO;
                                                 }},
                                         Failure{"close",
                                                 [](auto& failures) {
                                                     failures.close = EIO;
                                                 }}),
                         [](const auto& test) { return std::string(test.param.name); });

} // namespace
} // namespace kstd
