// What the daemon does on the real host when memory ends while it handles a record. The program's
// operator new is told to fail, so this is a program of its own.

#include "common/Allocation.h"
#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "platform/linux/LinuxHost.h"
#include "tests/platform/linux/RootDirectory.h"
#include "tests/platform/linux/StandardErrorCapture.h"
#include "wire/RestrictedMode.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <new>
#include <regex>

namespace {

bool thereIsMemory = true;

/// Refuses the library's allocations, and with the first of them there is no memory any more.
class EndOfMemory final : public kst::AllocationGate {
  public:
    EndOfMemory() : former_(kst::setAllocationGate(this)) {}
    ~EndOfMemory() override {
        thereIsMemory = true;
        kst::setAllocationGate(former_);
    }

    [[nodiscard]] bool admits(std::size_t /*size*/) override {
        thereIsMemory = false;
        return false;
    }
    void aboutToFree(std::span<const std::uint8_t> /*wiped*/) override {}

  private:
    kst::AllocationGate* former_;
};

} // namespace

void* operator new(std::size_t size) {
    if (void* memory = thereIsMemory ? std::malloc(size == 0 ? 1 : size) : nullptr) {
        return memory;
    }
    throw std::bad_alloc();
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
        const EndOfMemory end;
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
