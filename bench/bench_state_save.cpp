// The state file saved by the daemon's service, against a bare write and sync of the same bytes to
// the same kind of file on the same disk.

#include "base/Concat.h"
#include "bench/support/BareFile.h"
#include "bench/support/Benchmark.h"
#include "bench/support/Comparison.h"
#include "bench/support/PrivateRoot.h"
#include "bench/support/Quiet.h"
#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "platform/linux/LinuxHost.h"
#include "tests/support/HostWith.h"
#include "wire/RestrictedMode.h"

#include <memory>
#include <stdexcept>
#include <vector>

namespace {

constexpr int kDefaultRounds = 2000;
constexpr double kTarget = 1.15;

using kstd::DeviceRestrictedModeService;

void save(DeviceRestrictedModeService& service, const char* path,
          const std::vector<std::uint8_t>& record) {
    if (service.saveDataBlob(path, record) != kKSTErrorSuccess) {
        throw std::runtime_error(base::concat("cannot save ", path));
    }
}

void measure(const bench::Options& options, const std::filesystem::path& directory) {
    const bench::QuietStandardError quiet;
    const platform::Paths paths = bench::makePrivateRoot(directory);
    const std::vector<std::uint8_t> record(wire::rm::kStateBlobSize, 0x5A);
    const auto bareFile = [&](const char* path) {
        return bench::BareFile(paths.under(path), record.size(),
                               bench::BareFile::Sync::dataAndTimes);
    };
    // Each has a file of its own: one that is written twice in a round is synced faster the second
    // time.
    bench::BareFile opened = bareFile("/var/root/opened");
    bench::BareFile held = bareFile("/var/root/held");
    bench::NullLog noLog;
    platform::LinuxHost linuxHost({.paths = paths});
    const platform::Host host = linuxHost.interfaces();
    const auto service = DeviceRestrictedModeService::make(host);
    const auto silent = DeviceRestrictedModeService::make(support::hostWith(host, {.log = &noLog}));

    bench::printHead(base::concat("saveDataBlob of 13 bytes against a bare pwrite and fsync, ",
                                  options.rounds, " rounds, ",
                                  options.pinned ? "one CPU" : "any CPU"));
    const auto measured = bench::interleave(options.rounds, 1,
                                            {[&] { opened.openAndSave(); },
                                             [&] { save(*service, kstd::kStateFilePath, record); },
                                             [&] { held.save(); },
                                             [&] {
                                                 save(*silent, "/var/root/silent", record);
                                             }});
    const auto row = [&measured](const char* name, std::size_t floor, std::size_t product) {
        bench::printRow(name, bench::compare(measured, floor, product), kTarget);
    };
    row("against open, pwrite, fsync, close", 0, 1);
    row("against pwrite, fsync of an open file", 2, 1);
    row("no log, against open to close", 0, 3);
    row("no log, against an open file", 2, 3);
}

} // namespace

int main(int argc, char** argv) {
    return bench::runBenchmark(argc, argv,
                               "The cost of saving the state file over that of its write and sync.",
                               {.rounds = kDefaultRounds}, measure);
}
