// The library with a hostile kernel side behind a real socket.

#include "KSTLib/Platform.h"
#include "base/Concat.h"
#include "fuzz/ClientCalls.h"
#include "platform/linux/LinuxKernelChannel.h"
#include "platform/linux/LinuxServiceRegistry.h"
#include "tests/neighbours/Batches.h"
#include "tests/neighbours/KernelSide.h"
#include "tests/support/TemporaryDirectory.h"

#include <atomic>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sys/eventfd.h>
#include <thread>
#include <unistd.h>

namespace neighbours {

namespace {

/// A silent kernel side costs no more.
constexpr kst::CallTime kCallTime{std::chrono::milliseconds(250)};

class CountingLog final : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        ++lines;
        require(text.size() <= 1024, base::concat("a line of ", text.size(), " bytes"));
    }

    std::uint64_t lines = 0;
};

/// Outputs of commands to begin with.
std::vector<Bytes> requirements() {
    std::vector<Bytes> found;
    std::vector<std::filesystem::path> paths;
    for (const auto& entry : std::filesystem::directory_iterator(KSTD_CORPORA "/requirement")) {
        paths.push_back(entry.path());
    }
    // In the same order everywhere.
    std::sort(paths.begin(), paths.end());
    for (const auto& path : paths) {
        std::ifstream stream(path, std::ios::binary);
        found.emplace_back(std::istreambuf_iterator<char>(stream),
                           std::istreambuf_iterator<char>());
    }
    require(!found.empty(), "no requirements to begin with");
    return found;
}

/// A kernel side on a thread of its own.
class ServedKernelSide : private base::NotCopied {
  public:
    ServedKernelSide(const std::string& path, std::uint64_t seed, std::size_t silences)
        : kernel(path, [](const std::string&, const std::optional<Bytes>&, bool) {}),
          ideas_(seed),
          stop_(::eventfd(0, EFD_CLOEXEC)) {
        kernel.outputs = requirements();
        kernel.beHostile(&ideas_, silences);
        thread_ = std::thread([this] { run(); });
    }
    ~ServedKernelSide() { stop(); }

    /// What was wrong with a request, if anything.
    std::string stop() {
        const std::uint64_t one = 1;
        if (thread_.joinable()) {
            static_cast<void>(::write(stop_.get(), &one, sizeof one));
            thread_.join();
        }
        return fault_;
    }

    /// The next answers are proper ones.
    void behave() { behaves_ = true; }

    KernelSide kernel;

  private:
    void run() try {
        std::vector<pollfd> watched;
        for (;;) {
            watched.assign(1, {stop_.get(), POLLIN, 0});
            kernel.addTo(watched);
            while (::poll(watched.data(), watched.size(), -1) < 0) {
            }
            if (watched.front().revents != 0) {
                return;
            }
            if (behaves_) {
                kernel.beHostile(nullptr);
            }
            kernel.serve(watched);
        }
    } catch (const Fault& fault) {
        fault_ = fault.what();
    }

    Random ideas_;
    base::FileDescriptor stop_;
    std::atomic<bool> behaves_ = false;
    std::string fault_;
    std::thread thread_;
};

struct Result {
    std::uint64_t exchanges = 0;
    std::uint64_t calls = 0;
    std::uint64_t lines = 0;
};

/// One process's life with the library, as far as a process matters to it.
Result callOften(std::uint64_t seed, std::size_t silences) {
    constexpr std::size_t kScripts = 250;
    const support::TemporaryDirectory directory;
    const std::string path = directory.file("service.sock");
    ServedKernelSide served(path, seed, silences);
    CountingLog log;
    platform::LinuxServiceRegistry registry(path, log);
    platform::LinuxKernelChannel channel(path, registry, log);
    kst::installPlatform({log, registry, channel, kCallTime});
    Random random(~seed);
    Result result;
    bool isOtherCreation = false;
    for (std::size_t i = 0; i < kScripts; ++i) {
        const Bytes input = random.bytes(600);
        fuzz::Script script(input);
        const fuzz::SizeLimit limit;
        fuzz::Client client(script, isOtherCreation);
        for (std::size_t actions = 0; actions < 8 && !script.isOver(); ++actions) {
            client.act();
            ++result.calls;
        }
    }
    served.behave();
    // The first one may still get an answer that was on its way.
    static_cast<void>(KSTKernelControl(3, nullptr, 0, nullptr));
    const KSTStatus status = KSTKernelControl(3, nullptr, 0, nullptr);
    require(status == 0, base::concat("status ", status, " from a kernel side that behaves"));
    kst::removePlatform();
    const std::string fault = served.stop();
    require(fault.empty(), fault);
    result.exchanges = served.kernel.exchanges();
    result.lines = log.lines;
    return result;
}

} // namespace

void runLibrary(const RunOptions& options) {
    /// A call checks what it sends and what it gets, and each check can fail once.
    constexpr std::uint64_t kMostLinesPerExchange = 40;
    // The LibCall functions print their failures.
    const base::FileDescriptor said(::dup(STDOUT_FILENO));
    require(std::freopen("/dev/null", "w", stdout) != nullptr, "no /dev/null");
    Batches batches(options, "library");
    Growth growth(mostGrowth(100));
    Result all;
    batches.guard([&] {
        do {
            const Result result = callOften(batches.seed(), batches.silences());
            all = {all.exchanges + result.exchanges, all.calls + result.calls,
                   all.lines + result.lines};
            require(all.lines <= (all.exchanges + all.calls) * kMostLinesPerExchange,
                    base::concat(all.lines, " lines for ", all.calls, " calls"));
            growth.look(Footprint::ofThis());
        } while (batches.end(all.exchanges));
    });
    ::dprintf(
        said.get(), "%s",
        batches.text(base::concat(all.calls, " calls, ", all.lines, " lines, ", growth.text()))
            .c_str());
}

} // namespace neighbours
