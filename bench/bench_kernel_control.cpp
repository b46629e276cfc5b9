// One kernel control through the library and the Linux channel, against a bare exchange of the same
// bytes with the same peer.

#include "KSTLib/KSTLib.h"
#include "KSTLib/Platform.h"
#include "base/Concat.h"
#include "base/NotCopied.h"
#include "bench/support/AllocationCount.h"
#include "bench/support/Benchmark.h"
#include "bench/support/Comparison.h"
#include "bench/support/Peer.h"
#include "bench/support/SystemCallCount.h"
#include "platform/linux/LinuxKernelChannel.h"
#include "platform/linux/LinuxServiceRegistry.h"
#include "platform/linux/LinuxSystemLog.h"
#include "platform/linux/Paths.h"
#include "wire/RestrictedMode.h"

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <stdexcept>
#include <sys/syscall.h>

namespace {

constexpr int kDefaultRounds = 2000;
constexpr int kCallsPerRound = 100;
constexpr int kCountedCalls = 1000;
constexpr double kTarget = 1.10;

struct Case {
    std::size_t inputSize;
    std::size_t outputSize;
};

/// The library on the Linux channel, with its connection open.
class Product : private base::NotCopied {
  public:
    Product(const std::string& socketPath, const Case& sizes)
        : log_(platform::Paths("/")),
          registry_(socketPath, log_),
          channel_(socketPath, registry_, log_),
          input_(sizes.inputSize, 0x5A),
          outputSize_(sizes.outputSize) {
        kst::installPlatform({log_, registry_, channel_});
        call();
    }
    ~Product() { kst::removePlatform(); }

    void call() {
        std::size_t received = 0;
        const KSTStatus status = KSTKernelControl(
            wire::rm::kKSTKernelControlRMNotificationAck, input_.data(), input_.size(),
            [&received](const void*, std::size_t length) { received = length; });
        if (status != kKSTErrorSuccess || received != outputSize_) {
            throw std::runtime_error(base::concat("the kernel control failed, status ", status));
        }
    }

  private:
    platform::LinuxSystemLog log_;
    platform::LinuxServiceRegistry registry_;
    platform::LinuxKernelChannel channel_;
    bench::Bytes input_;
    std::size_t outputSize_;
};

bench::PeerScript scriptFor(const Case& sizes) {
    using wire::KernelOperation;
    bench::PeerScript script = bench::basicScript();
    script.replies[KernelOperation::structCall] = bench::preparedReply(
        KernelOperation::structCall, static_cast<std::uint32_t>(sizes.outputSize),
        bench::Bytes(sizes.outputSize, 0xA5));
    return script;
}

void compareTimes(int rounds, const std::string& socketPath, const Case& sizes) {
    const bench::Peer peer(socketPath, scriptFor(sizes));
    Product product(socketPath, sizes);
    bench::BareExchange bare(socketPath, peer.lastRequest());
    const auto measured = bench::interleave(rounds, kCallsPerRound,
                                            {[&bare] { bare.roundTrip(); },
                                             [&product] {
                                                 product.call();
                                             }});
    bench::printRow(base::concat(sizes.inputSize, " bytes in, ", sizes.outputSize, " out (packets ",
                                 bare.requestSize(), ", ", bare.replySize(), ")"),
                    bench::compare(measured, 0, 1), kTarget);
}

/// `work`, kCountedCalls times over.
bench::Work counted(bench::Work work) {
    return [work = std::move(work)] {
        for (int call = 0; call < kCountedCalls; ++call) {
            work();
        }
    };
}

double perCall(std::uint64_t count) {
    return static_cast<double>(count) / kCountedCalls;
}

void printSystemCalls(const char* name, const bench::SystemCalls& calls) {
    std::uint64_t total = 0;
    for (const auto& [number, count] : calls) {
        total += count;
    }
    const auto countOf = [&calls](long number) {
        const auto found = calls.find(number);
        return found == calls.end() ? 0 : found->second;
    };
    const std::uint64_t sent = countOf(SYS_sendmsg) + countOf(SYS_sendto);
    const std::uint64_t received = countOf(SYS_recvmsg) + countOf(SYS_recvfrom);
    std::printf("system calls per call, %-8s %.3f (sending %.3f, receiving %.3f, other %.3f)\n",
                name, perCall(total), perCall(sent), perCall(received),
                perCall(total - sent - received));
}

void reportSystemCalls(const std::string& socketPath, const Case& sizes) {
    const bench::Peer peer(socketPath, scriptFor(sizes));
    bench::Bytes request;
    {
        const Product first(socketPath, sizes);
        request = peer.lastRequest();
    }
    printSystemCalls("product:", bench::countSystemCalls([&]() -> bench::Work {
                         const auto product = std::make_shared<Product>(socketPath, sizes);
                         return counted([product] { product->call(); });
                     }));
    printSystemCalls("bare:", bench::countSystemCalls([&]() -> bench::Work {
                         const auto bare =
                             std::make_shared<bench::BareExchange>(socketPath, request);
                         return counted([bare] { bare->roundTrip(); });
                     }));
}

/// A counter that is not called would report an excellent product.
void requireThatAllocationsAreCounted() {
    const bench::AllocationCount before = bench::allocationCount();
    void* volatile zeroed = std::calloc(1, 1);
    const auto* volatile number = new int(1);
    const bench::AllocationCount after = bench::allocationCount();
    std::free(zeroed);
    delete number;
    if (after.calloc != before.calloc + 1 || after.other != before.other + 1) {
        throw std::runtime_error("allocations are not counted");
    }
}

void reportAllocations(const std::string& socketPath, const Case& sizes) {
    requireThatAllocationsAreCounted();
    const bench::Peer peer(socketPath, scriptFor(sizes));
    Product product(socketPath, sizes);
    const bench::Work calls = counted([&product] { product.call(); });
    const bench::AllocationCount before = bench::allocationCount();
    calls();
    const bench::AllocationCount after = bench::allocationCount();
    std::printf("allocations per call,  product: calloc %.3f, other %.3f\n",
                perCall(after.calloc - before.calloc), perCall(after.other - before.other));
}

void measure(const bench::Options& options, const std::filesystem::path& directory) {
    constexpr Case kCases[] = {{256, 256}, {256, 0}, {64, 0}};
    bench::printHead(base::concat("KSTKernelControl against a bare send and recv of its packets, ",
                                  options.rounds, " rounds of ", kCallsPerRound, " calls, ",
                                  options.pinned ? "one CPU" : "any CPU"));
    int number = 0;
    const auto nextSocket = [&] {
        return (directory / base::concat("kernel", ++number, ".sock")).string();
    };
    for (const Case& sizes : kCases) {
        compareTimes(options.rounds, nextSocket(), sizes);
    }
    reportSystemCalls(nextSocket(), kCases[0]);
    reportAllocations(nextSocket(), kCases[0]);
}

} // namespace

int main(int argc, char** argv) {
    return bench::runBenchmark(argc, argv,
                               "The cost of a kernel control over that of its two packets.",
                               {.rounds = kDefaultRounds}, measure);
}
