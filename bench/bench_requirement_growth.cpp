// How the time for a tree of requirements grows with its nodes and with its depth. This one fails
// when the time for each node grows: a walk that goes back over what it has done would take 100
// times as long in the largest tree.

#include "KSTLib/RequirementSerialization.h"
#include "base/Concat.h"
#include "bench/codec/Samples.h"
#include "bench/support/Benchmark.h"
#include "bench/support/Comparison.h"
#include "bench/support/SmallStack.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <limits>
#include <stdexcept>
#include <time.h>

namespace {

constexpr int kDefaultRounds = 50;
/// Three frames for each of 100,000 levels would not fit, however small they are.
constexpr std::size_t kStackSize = std::size_t{128} << 10U;
constexpr double kBudget = 10;

constexpr std::array<std::size_t, 3> kSizes = {10, 1000, 100000};
constexpr std::size_t kNodesPerWork = kSizes.back();

using bench::Bytes;
/// For each of kSizes, nanoseconds for each node.
using Times = std::array<double, kSizes.size()>;

void require(KSTStatus status) {
    if (status != kKSTErrorSuccess) {
        throw std::runtime_error(base::concat("the library fails, status ", status));
    }
}

/// A tree of `nodes` nodes that is as wide as it is deep.
// NOLINTNEXTLINE(misc-no-recursion)
bench::SampleRequirement wideRequirement(std::size_t nodes) {
    constexpr std::size_t kMaxChildren = 10;
    if (nodes == 1) {
        return {.type = kKSTRequirementTypePasscodeValidated, .data = Bytes(4)};
    }
    bench::SampleRequirement requirement{.type = kKSTRequirementTypeAnd};
    std::size_t left = nodes - 1;
    for (std::size_t slots = std::min(left, kMaxChildren); slots > 0; --slots) {
        requirement.children.push_back(wideRequirement(left / slots));
        left -= left / slots;
    }
    return requirement;
}

/// The bytes of `depth` nodes, each the only child of the one before.
Bytes deepBytes(std::size_t depth) {
    const Bytes leaf =
        bench::wireBytes({.type = kKSTRequirementTypePasscodeValidated, .data = Bytes(8)});
    Bytes level = bench::wireBytes({.type = kKSTRequirementTypeAnd, .children = {{}}});
    level.resize(level.size() - sizeof(KSTRequirement));
    Bytes bytes;
    for (std::size_t i = 1; i < depth; ++i) {
        bytes.insert(bytes.end(), level.begin(), level.end());
    }
    bytes.insert(bytes.end(), leaf.begin(), leaf.end());
    return bytes;
}

void encode(const KSTRequirement* tree, Bytes& buffer) {
    std::size_t size = 0;
    require(GetSerializedRequirementSize(tree, &size));
    require(SerializeRequirement(tree, buffer.data(), &size));
    if (size != buffer.size()) {
        throw std::runtime_error("a tree has another size than its bytes");
    }
}

/// `work` as often as it takes to have seen kNodesPerWork nodes.
bench::Work timesOver(std::size_t nodes, bench::Work work) {
    return [calls = kNodesPerWork / nodes, work = std::move(work)] {
        for (std::size_t call = 0; call < calls; ++call) {
            work();
        }
    };
}

void printRow(const std::string& name, const Times& times) {
    const double growth = times.back() / *std::min_element(times.begin(), times.end() - 1);
    std::printf("%-24s", name.c_str());
    for (const double time : times) {
        std::printf(" %7.2f ns", time);
    }
    std::printf(" %7.2f %7.2f %s\n", growth, kBudget, growth <= kBudget ? "met" : "missed");
    std::fflush(stdout);
    if (growth > kBudget) {
        throw std::runtime_error(base::concat(name, ": the time for each node grows"));
    }
}

/// How long this thread has been on a CPU, in nanoseconds.
double threadTime() {
    timespec time{};
    ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
    return static_cast<double>(time.tv_sec) * 1e9 + static_cast<double>(time.tv_nsec);
}

/// The least that each node took: what disturbs the machine only ever adds to it.
void measureGrowth(const std::string& name, int rounds, const std::vector<bench::Work>& works) {
    Times times;
    times.fill(std::numeric_limits<double>::infinity());
    for (int round = 0; round < rounds; ++round) {
        for (std::size_t i = 0; i < times.size(); ++i) {
            const double before = threadTime();
            works[i]();
            const double time = (threadTime() - before) / static_cast<double>(kNodesPerWork);
            times.at(i) = std::min(times.at(i), time);
        }
    }
    printRow(name, times);
}

template <typename MakeBytes>
void measureShape(const std::string& shape, int rounds, MakeBytes makeBytes) {
    std::vector<Bytes> samples;
    std::vector<bench::Tree> trees;
    std::vector<bench::Work> encodes;
    std::vector<bench::Work> decodes;
    samples.reserve(kSizes.size());
    for (const std::size_t size : kSizes) {
        Bytes& bytes = samples.emplace_back(makeBytes(size));
        trees.push_back(bench::treeOf(bytes));
        encodes.push_back(
            timesOver(size, [tree = trees.back().get(), &bytes] { encode(tree, bytes); }));
        decodes.push_back(timesOver(size, [&bytes] { static_cast<void>(bench::treeOf(bytes)); }));
    }
    measureGrowth(shape + ", encode", rounds, encodes);
    measureGrowth(shape + ", decode", rounds, decodes);
}

void measure(const bench::Options& options, const std::filesystem::path& /*directory*/) {
    std::printf(
        "Time for each node of a tree with 10, 1,000 and 100,000 nodes or levels, the least "
        "of %d rounds,\nall on a stack of %zu KiB\n",
        options.rounds, kStackSize >> 10U);
    std::printf("%-24s %10zu %10zu %10zu %7s %7s\n", "", kSizes[0], kSizes[1], kSizes[2], "growth",
                "budget");
    bench::runOnStackOf(kStackSize, [&options] {
        measureShape("nodes", options.rounds,
                     [](std::size_t nodes) { return bench::wireBytes(wideRequirement(nodes)); });
        measureShape("levels", options.rounds, deepBytes);
    });
}

} // namespace

int main(int argc, char** argv) {
    return bench::runBenchmark(argc, argv, "How the time for a tree of requirements grows.",
                               {.rounds = kDefaultRounds}, measure);
}
