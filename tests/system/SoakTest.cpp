// Many notifications through one daemon process: nothing grows.

#include "KSTLib/AllocatedBytes.h"
#include "KSTLib/Platform.h"
#include "base/NotCopied.h"
#include "kstd/Analytics/Analytics.h"
#include "kstd/Daemon.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/LinuxHost.h"
#include "platform/linux/StopRequest.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/support/TerminationSignal.h"
#include "tests/system/SystemFixture.h"

#include <fcntl.h>
#include <fstream>
#include <malloc.h>
#include <sqlite3.h>
#include <thread>
#include <unistd.h>

namespace system_tests {
namespace {

constexpr int kRounds = KSTD_SOAK_NOTIFICATIONS / 4;
constexpr int kWarmUpRounds = 100;
static_assert(kRounds > kWarmUpRounds);

/// SQLite keeps up to 2000 KiB of the database's pages, and little else. Until so many events are
/// stored, which nobody uploads here, it gathers them.
constexpr std::size_t kDatabaseMemory = 2500UL * 1024;
[[maybe_unused]] constexpr std::size_t kDatabasePages = kDatabaseMemory / 4096;

/// What a process must not gather.
struct Footprint {
    std::size_t descriptors = support::countOpenDescriptors();
    std::size_t databaseMemory = static_cast<std::size_t>(::sqlite3_memory_used());
    /// Without what SQLite has asked for.
    std::size_t heap = ::mallinfo2().uordblks - databaseMemory;
    std::size_t residentPages = readResidentPages();

  private:
    static std::size_t readResidentPages() {
        std::size_t size = 0;
        std::size_t resident = 0;
        std::ifstream("/proc/self/statm") >> size >> resident;
        return resident;
    }
};

/// Sends what is written to standard error nowhere while it lives.
class QuietStandardError : private base::NotCopied {
  public:
    QuietStandardError() : saved_(::dup(STDERR_FILENO)) {
        const int nowhere = ::open("/dev/null", O_WRONLY | O_CLOEXEC);
        ::dup2(nowhere, STDERR_FILENO);
        ::close(nowhere);
    }
    ~QuietStandardError() {
        ::dup2(saved_, STDERR_FILENO);
        ::close(saved_);
    }

  private:
    int saved_;
};

class SoakTest : public SystemFixture {
  protected:
    /// Publishes one record of each type in every round and waits for the acknowledgements.
    void publish(int firstRound, int lastRound) {
        for (int round = firstRound; round < lastRound; ++round) {
            kernel("publish timer-restarted alarm=0 version=" + std::to_string(round));
            kernel("publish analytics-collected");
            kernel("publish save-analytics");
            kernel("publish timer-restarted-analytics total=60");
            kernel("wait acks=" + std::to_string(4 * (round + 1)));
        }
    }
};

TEST_F(SoakTest, NeitherMemoryNorDescriptorsGrow) {
    startKernel();
    const std::int64_t allocatedBefore = gAllocatedBytes;
    Footprint warm;
    Footprint end;
    {
        const QuietStandardError quiet;
        const support::TerminationSignal undone;
        const platform::StopRequest stop;
        const platform::Paths paths(root.path().string());
        platform::LinuxHost host({.paths = paths,
                                  .eventSocket = platform::makeEventSocket(paths.eventSocket()),
                                  .stop = &stop});
        const platform::Host interfaces = host.interfaces();
        kst::installPlatform({interfaces.log, interfaces.registry, interfaces.channel});
        const kstd::AnalyticsLifetime analytics;
        std::thread kernelSide([&] {
            publish(0, kWarmUpRounds);
            warm = Footprint();
            publish(kWarmUpRounds, kRounds);
            end = Footprint();
            support::TerminationSignal::send();
        });
        EXPECT_EQ(kstd::Daemon(interfaces, kstd::makeServices(interfaces)).run(), 0);
        kernelSide.join();
        kst::removePlatform();
    }
    EXPECT_EQ(kernelStatus("acks"), std::to_string(4 * kRounds));
    EXPECT_EQ(gAllocatedBytes, allocatedBefore);
    EXPECT_EQ(end.descriptors, warm.descriptors);
    EXPECT_LE(end.databaseMemory, kDatabaseMemory);
#ifndef KSTD_SANITIZED
    // A sanitizer keeps freed memory for a while on purpose.
    // The heap's own word for each of the database's pages, and a little.
    EXPECT_LE(end.heap, warm.heap + 16 * kDatabasePages + 4096);
    EXPECT_LE(end.residentPages, warm.residentPages + kDatabasePages + 64);
#endif
    RecordProperty("notifications", 4 * kRounds);
    RecordProperty("heapGrowthBytes", static_cast<int>(end.heap) - static_cast<int>(warm.heap));
    RecordProperty("databaseMemory", static_cast<int>(end.databaseMemory));
    RecordProperty("residentGrowthPages",
                   static_cast<int>(end.residentPages) - static_cast<int>(warm.residentPages));
}

} // namespace
} // namespace system_tests
