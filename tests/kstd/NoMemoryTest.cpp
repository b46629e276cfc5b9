// What the daemon does on the real host when memory ends while it handles a record. The program's
// operator new is told to fail, so this is a program of its own.

#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "platform/linux/LinuxHost.h"
#include "tests/kstd/DaemonFixture.h"
#include "tests/platform/linux/RootDirectory.h"
#include "tests/platform/linux/StandardErrorCapture.h"
#include "wire/RestrictedMode.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <new>
#include <regex>

namespace {

bool thereIsMemory = true;

/// Whether the next allocation that may fail without an exception fails.
bool refusesNext = false;
/// Whether there is no memory from that one on.
bool lasts = false;

/// Memory ends with the next allocation that may fail without an exception.
class EndOfMemory {
  public:
    explicit EndOfMemory(bool forGood) {
        refusesNext = true;
        lasts = forGood;
    }
    ~EndOfMemory() {
        thereIsMemory = true;
        refusesNext = false;
    }
    EndOfMemory(const EndOfMemory&) = delete;
    EndOfMemory& operator=(const EndOfMemory&) = delete;
};

} // namespace

void* operator new(std::size_t size) {
    if (void* memory = thereIsMemory ? std::malloc(size == 0 ? 1 : size) : nullptr) {
        return memory;
    }
    throw std::bad_alloc();
}

void* operator new[](std::size_t size, const std::nothrow_t& /*unused*/) noexcept {
    if (refusesNext) {
        refusesNext = false;
        thereIsMemory = !lasts;
        return nullptr;
    }
    return thereIsMemory ? std::malloc(size == 0 ? 1 : size) : nullptr;
}

void operator delete[](void* memory) noexcept {
    std::free(memory);
}

void operator delete[](void* memory, std::size_t /*size*/) noexcept {
    std::free(memory);
}

void* operator new[](std::size_t size) {
    return operator new(size);
}

void operator delete(void* memory) noexcept {
    std::free(memory);
}

void operator delete(void* memory, std::size_t /*size*/) noexcept {
    std::free(memory);
}

TEST(NoMemory, RecordThatCannotBeCopiedIsAFailureWithItsLines) {
    support::RootDirectory root;
    for (const char* const directory : {"/run/kstd", "/etc/kstd", "/var/lib/kstd", "/var/root"}) {
        root.makeDirectory(directory);
    }
    std::vector<std::uint8_t> record(wire::rm::kNotificationSize);
    record[0] = 1;
    const auto notification = kstd::KSTDRMDeamonNotification::fromBytes(record);
    ASSERT_TRUE(notification);
    platform::LinuxHost host({.paths = root.paths()});
    const auto service = kstd::DeviceRestrictedModeService::make(host.interfaces());
    support::StandardErrorCapture shown;
    KSTStatus status = 0;
    {
        const EndOfMemory end(true);
        status = service->onKextTimerRestarted(*notification);
        EXPECT_FALSE(thereIsMemory);
    }
    const std::string lines = std::regex_replace(shown.text(), std::regex(":[0-9]+\n"), ":#\n");
    EXPECT_EQ(status, kKSTErrorUnexpected);
    EXPECT_NE(lines.find("kstd: AssertMacros: stateBlob (value: 0x0),  file: "
                         "kstd/DeviceRestrictedMode/DeviceRestrictedModeService:#\n"
                         "kstd: -[DeviceRestrictedModeService onKextTimerRestarted:]: returning, "
                         "err = -5.\n"),
              std::string::npos)
        << lines;
    EXPECT_FALSE(std::filesystem::exists(root.paths().under("/var/root/.usbrestrictedmode_v2")));
}

namespace kstd {

using NoMemoryOnFakes = DaemonFixture;

TEST_F(NoMemoryOnFakes, NoMemoryForTheStateBlobIsAFailureOfItsOwn) {
    const auto service = makeService();
    putRecord("P", timerRecord(0));
    {
        const EndOfMemory end(false);
        service->onKextNotificationArrivedWithPropertyName("P");
        EXPECT_FALSE(refusesNext);
    }
    EXPECT_EQ(machine.disk.read(kStatePath), std::nullopt);
    EXPECT_THAT(requests(), testing::IsEmpty());
    const auto all = lines();
    EXPECT_THAT(
        std::vector<std::string>(all.end() - 4, all.end()),
        testing::ElementsAre(assertion("stateBlob", "0"),
                             "kstd: -[DeviceRestrictedModeService onKextTimerRestarted:]: "
                             "returning, err = -5.",
                             assertion("err == 0 ", "fffffffffffffffb"),
                             "kstd: -[DeviceRestrictedModeService "
                             "onKextNotificationArrivedWithPropertyName:]: returning, err = -5."));
}

} // namespace kstd
