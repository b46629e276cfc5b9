// Every system call of an alarm on disk, made to fail.

#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/alarms/AlarmStore.h"
#include "platform/linux/alarms/TimerAlarmWaker.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <cerrno>
#include <cstdarg>
#include <dirent.h>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <functional>
#include <poll.h>
#include <set>
#include <string>
#include <sys/stat.h>
#include <sys/timerfd.h>
#include <sys/types.h>
#include <utility>
#include <vector>

namespace {

/// Which of the next calls fails, counted from 1; 0 is none.
int theFailing = 0;
int theError = 0;
int theCalls = 0;
std::set<std::string> theNames;
/// How often the clock is set while a timer is armed.
int theCancelledArmings = 0;

/// Whether this call is the one; errno is set then.
bool fails(const char* name) {
    ++theCalls;
    if (theFailing != theCalls) {
        return false;
    }
    theNames.insert(name);
    errno = theError;
    return true;
}

} // namespace

// The names are the linker's: it resolves a call of x to __wrap_x, and __real_x to x.
// NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" {

int __real_open(const char* path, int flags, ...);
ssize_t __real_pwrite(int descriptor, const void* data, std::size_t size, off_t offset);
int __real_fstat(int descriptor, struct stat* status);
int __real_ftruncate(int descriptor, off_t size);
int __real_fdatasync(int descriptor);
int __real_mkdir(const char* path, mode_t mode);
int __real_fsync(int descriptor);
int __real_timerfd_settime(int descriptor, int flags, const itimerspec* time, itimerspec* former);
DIR* __real_opendir(const char* path);
dirent* __real_readdir(DIR* listing);

int __wrap_open(const char* path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
    va_end(arguments);
    return fails("open") ? -1 : __real_open(path, flags, mode);
}
ssize_t __wrap_pwrite(int descriptor, const void* data, std::size_t size, off_t offset) {
    if (!fails("pwrite")) {
        return __real_pwrite(descriptor, data, size, offset);
    }
    // 0 stands for a call that writes nothing and has no error.
    return theError == 0 ? 0 : -1;
}
int __wrap_fstat(int descriptor, struct stat* status) {
    return fails("fstat") ? -1 : __real_fstat(descriptor, status);
}
int __wrap_ftruncate(int descriptor, off_t size) {
    return fails("ftruncate") ? -1 : __real_ftruncate(descriptor, size);
}
int __wrap_fdatasync(int descriptor) {
    return fails("fdatasync") ? -1 : __real_fdatasync(descriptor);
}
int __wrap_mkdir(const char* path, mode_t mode) {
    return fails("mkdir") ? -1 : __real_mkdir(path, mode);
}
int __wrap_fsync(int descriptor) {
    return fails("fsync") ? -1 : __real_fsync(descriptor);
}
int __wrap_timerfd_settime(int descriptor, int flags, const itimerspec* time, itimerspec* former) {
    if (theCancelledArmings > 0) {
        --theCancelledArmings;
        errno = ECANCELED;
        return -1;
    }
    return __real_timerfd_settime(descriptor, flags, time, former);
}
DIR* __wrap_opendir(const char* path) {
    return fails("opendir") ? nullptr : __real_opendir(path);
}
dirent* __wrap_readdir(DIR* listing) {
    return fails("readdir") ? nullptr : __real_readdir(listing);
}

} // extern "C"
// NOLINTEND(bugprone-reserved-identifier)

namespace platform {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;

using Names = std::set<std::string>;

constexpr Date kDate{1'700'000'000'000'000'000};

class AlarmStoreSystemCallsTest : public testing::Test {
  protected:
    /// Saves once for each call that it takes, with that call failing, and once more without.
    void failEachCallOfASave(const std::function<void()>& arrange, int error,
                             const std::string& reason) {
        theNames.clear();
        for (int failing = 1; !HasFailure(); ++failing) {
            SCOPED_TRACE("call " + std::to_string(failing));
            std::filesystem::remove_all(directory.file("lib"));
            arrange();
            FakeSystemLog log;
            AlarmStore store(path, {"a"}, log);
            const bool isSaved =
                fail(failing, error, [&] { return store.save("stream", "a", kDate); });
            EXPECT_EQ(isSaved, !hasFailed);
            if (!hasFailed) {
                EXPECT_THAT(log.texts(), IsEmpty());
                return;
            }
            EXPECT_THAT(log.texts(),
                        ElementsAre("kstd: AlarmStore: cannot keep the alarm on disk: " + path +
                                    "/stream/a: " + reason + "."));
            EXPECT_TRUE(store.save("stream", "a", kDate)) << "it is tried again";
            EXPECT_THAT(store.load("stream"), ElementsAre(Pair("a", kDate)));
        }
    }

    bool fail(int failing, int error, const std::function<bool()>& act) {
        theCalls = 0;
        theError = error;
        theFailing = failing;
        const bool result = act();
        theFailing = 0;
        hasFailed = theCalls >= failing;
        return result;
    }

    void putAlarm(const std::string& text) const {
        std::filesystem::create_directories(path + "/stream");
        std::ofstream(path + "/stream/a") << text;
    }

    support::TemporaryDirectory directory;
    std::string path = directory.file("lib/alarms");
    bool hasFailed = false;
};

TEST_F(AlarmStoreSystemCallsTest, FirstRegistration) {
    failEachCallOfASave([] {}, ENOSPC, "No space left on device");
    EXPECT_EQ(theNames, (Names{"open", "mkdir", "fsync", "pwrite", "fstat", "fdatasync"}));
}

TEST_F(AlarmStoreSystemCallsTest, RegistrationInThePlaceOfAnother) {
    failEachCallOfASave([this] { putAlarm("00000000000000000001\n"); }, EIO, "Input/output error");
    EXPECT_EQ(theNames, (Names{"open", "pwrite", "fstat", "fdatasync", "fsync"}))
        << "whoever made it may have ended before its name was on disk";
}

TEST_F(AlarmStoreSystemCallsTest, RegistrationInThePlaceOfSomethingLonger) {
    failEachCallOfASave([this] { putAlarm(std::string(100, 'x')); }, EDQUOT, "Disk quota exceeded");
    EXPECT_EQ(theNames, (Names{"open", "pwrite", "fstat", "ftruncate", "fdatasync", "fsync"}));
}

TEST_F(AlarmStoreSystemCallsTest, NameIsSyncedOnceInAProcess) {
    putAlarm("00000000000000000001\n");
    FakeSystemLog log;
    AlarmStore store(path, {"a"}, log);
    EXPECT_TRUE(store.save("stream", "a", kDate));
    // Open, write, look at the size, sync, and nothing of the directory.
    EXPECT_TRUE(fail(5, EIO, [&] { return store.save("stream", "a", Date{1}); }));
    EXPECT_FALSE(hasFailed);
    // Made anew it has a new name.
    std::filesystem::remove(path + "/stream/a");
    theNames.clear();
    for (int failing = 1; theNames.count("fsync") == 0 && failing < 20; ++failing) {
        std::filesystem::remove(path + "/stream/a");
        static_cast<void>(fail(failing, EIO, [&] { return store.save("stream", "a", kDate); }));
    }
    EXPECT_EQ(theNames.count("fsync"), 1U);
}

TEST(RealTimeTimerSystemCallsTest, IsArmedThoughTheClockIsSetMeanwhile) {
    RealTimeTimer timer;
    theCancelledArmings = 3;
    timer.arm(Date{1});
    EXPECT_EQ(theCancelledArmings, 0);
    pollfd watched{timer.descriptor(), POLLIN, 0};
    EXPECT_EQ(::poll(&watched, 1, 30'000), 1);
    EXPECT_EQ(timer.acknowledge(), RealTimeTimer::Wake::due);
}

TEST_F(AlarmStoreSystemCallsTest, WriteThatWritesNothingHasAReasonOfItsOwn) {
    putAlarm("00000000000000000001\n");
    FakeSystemLog log;
    AlarmStore store(path, {"a"}, log);
    errno = EBADMSG;
    EXPECT_FALSE(fail(2, 0, [&] { return store.save("stream", "a", kDate); }));
    EXPECT_THAT(log.texts(), ElementsAre("kstd: AlarmStore: cannot keep the alarm on disk: " +
                                         path + "/stream/a: Input/output error."));
}

TEST_F(AlarmStoreSystemCallsTest, CancellationThatFailsIsSaidAndTriedAgain) {
    for (int failing = 1; failing <= 4 && !HasFailure(); ++failing) {
        SCOPED_TRACE("call " + std::to_string(failing));
        putAlarm(std::string(100, 'x'));
        FakeSystemLog log;
        AlarmStore store(path, {"a"}, log);
        const auto clear = [&] {
            store.clear("stream", "a");
            return true;
        };
        static_cast<void>(fail(failing, EROFS, clear));
        EXPECT_THAT(log.texts(), ElementsAre("kstd: AlarmStore: cannot cancel the alarm on disk: " +
                                             path + "/stream/a: Read-only file system."));
        clear();
        EXPECT_THAT(store.load("stream"), IsEmpty());
    }
}

TEST_F(AlarmStoreSystemCallsTest, ListingThatFailsStandsForAlarmsThatAreDue) {
    // The directory is opened, and has three names, of which two are its own and its parent's.
    for (int failing = 1; failing <= 5; ++failing) {
        SCOPED_TRACE("call " + std::to_string(failing));
        putAlarm("00000000000000000001\n");
        FakeSystemLog log;
        AlarmStore store(path, {"a", "b"}, log);
        std::vector<std::pair<std::string, Date>> alarms;
        static_cast<void>(fail(failing, EIO, [&] {
            alarms = store.load("stream");
            return true;
        }));
        EXPECT_THAT(alarms, ElementsAre(Pair("a", Date{0}), Pair("b", Date{0})));
        EXPECT_THAT(
            log.texts(),
            ElementsAre("kstd: AlarmStore: unreadable directory, every alarm taken as due: " +
                        path + "/stream: Input/output error."));
    }
}

TEST_F(AlarmStoreSystemCallsTest, FileThatCannotBeOpenedIsDue) {
    putAlarm("00000000000000000001\n");
    FakeSystemLog log;
    AlarmStore store(path, {"a"}, log);
    std::vector<std::pair<std::string, Date>> alarms;
    static_cast<void>(fail(6, EIO, [&] {
        alarms = store.load("stream");
        return true;
    }));
    EXPECT_TRUE(hasFailed);
    EXPECT_THAT(alarms, ElementsAre(Pair("a", Date{0})));
}

} // namespace
} // namespace platform
