#include "bench/support/Comparison.h"
#include "bench/support/Peer.h"
#include "bench/support/SmallStack.h"
#include "bench/support/SystemCallCount.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <pthread.h>
#include <stdexcept>
#include <stdlib.h>
#include <string>
#include <sys/syscall.h>
#include <unistd.h>

namespace bench {
namespace {

TEST(Median, OddAndEvenCounts) {
    EXPECT_DOUBLE_EQ(median({7}), 7);
    EXPECT_DOUBLE_EQ(median({9, 1, 5}), 5);
    EXPECT_DOUBLE_EQ(median({4, 1, 9, 2}), 3);
}

TEST(Compare, RatiosAreThoseOfNeighbours) {
    const Comparison comparison = compare({{{1, 10, 100}, {2, 15, 110}}, 0}, 0, 1);
    EXPECT_DOUBLE_EQ(comparison.floorMedian, 10);
    EXPECT_DOUBLE_EQ(comparison.productMedian, 15);
    EXPECT_DOUBLE_EQ(comparison.ratioMedian, 1.5);
    EXPECT_DOUBLE_EQ(comparison.ratioMin, 1.1);
    EXPECT_DOUBLE_EQ(comparison.ratioMax, 2);
}

TEST(Compare, DisturbedWhenMoreThanATenthOfTheRoundsAre) {
    const std::vector<Samples> samples(2, Samples(10, 1));
    EXPECT_FALSE(compare({samples, 1}, 0, 1).disturbed);
    EXPECT_TRUE(compare({samples, 2}, 0, 1).disturbed);
}

TEST(Interleave, WorksTakeTurnsAndTheFirstRoundIsNotCounted) {
    std::string order;
    const auto samples = interleave(2, 3,
                                    {[&] { order += 'a'; },
                                     [&] {
                                         order += 'b';
                                     }})
                             .samples;
    EXPECT_EQ(order, "aaabbbaaabbbaaabbb");
    ASSERT_EQ(samples.size(), 2U);
    EXPECT_EQ(samples[0].size(), 2U);
    EXPECT_EQ(samples[1].size(), 2U);
}

TEST(CountSystemCalls, CallsOfTheWorkAndNoOthers) {
    const auto calls = countSystemCalls([] {
        ::syscall(SYS_getuid);
        return [] {
            for (int call = 0; call < 3; ++call) {
                ::syscall(SYS_getpid);
            }
        };
    });
    EXPECT_EQ(calls, (SystemCalls{{SYS_getpid, 3}}));
}

TEST(CountSystemCalls, WorkThatThrows) {
    EXPECT_THROW(static_cast<void>(countSystemCalls([]() -> Work {
                     return [] {
                         throw std::runtime_error("no");
                     };
                 })),
                 std::runtime_error);
}

TEST(RunOnStackOf, StackIsNoLarger) {
    std::size_t size = 0;
    runOnStackOf(std::size_t{128} << 10U, [&size] {
        pthread_attr_t attributes;
        void* lowest = nullptr;
        ASSERT_EQ(::pthread_getattr_np(::pthread_self(), &attributes), 0);
        ASSERT_EQ(::pthread_attr_getstack(&attributes, &lowest, &size), 0);
        ::pthread_attr_destroy(&attributes);
    });
    EXPECT_EQ(size, std::size_t{128} << 10U);
}

TEST(RunOnStackOf, WorkThatThrows) {
    EXPECT_THROW(runOnStackOf(std::size_t{128} << 10U, [] { throw std::runtime_error("no"); }),
                 std::runtime_error);
}

class PeerTest : public testing::Test {
  protected:
    PeerTest() {
        std::string pattern =
            (std::filesystem::temp_directory_path() / "kstd-bench.XXXXXX").string();
        directory = ::mkdtemp(pattern.data());
    }
    ~PeerTest() override { std::filesystem::remove_all(directory); }

    static Bytes request(wire::KernelOperation operation, std::uint64_t sequence) {
        const auto header = wire::encodeKernelRequestHeader({operation, sequence});
        return {header.begin(), header.end()};
    }

    std::filesystem::path directory;
};

TEST_F(PeerTest, AnswersWithThePreparedReply) {
    PeerScript script = basicScript();
    script.replies[wire::KernelOperation::structCall] =
        preparedReply(wire::KernelOperation::structCall, 5, Bytes(5, 1));
    const std::string path = directory / "s";
    const Peer peer(path, script);
    const Bytes sent = request(wire::KernelOperation::structCall, 77);
    BareExchange bare(path, sent);
    bare.roundTrip();
    bare.roundTrip();
    EXPECT_EQ(bare.roundTrips(), 2U);
    EXPECT_EQ(bare.replySize(), wire::kKernelReplyHeaderSize + 5);
    EXPECT_EQ(peer.structCalls(), 2U);
    EXPECT_EQ(peer.lastRequest(), sent);
}

TEST_F(PeerTest, HangsUpOnWhatItHasNoReplyFor) {
    const std::string path = directory / "s";
    const Peer peer(path, basicScript());
    BareExchange bare(path, request(wire::KernelOperation::copyProperty, 1));
    EXPECT_THROW(bare.roundTrip(), std::runtime_error);
    EXPECT_EQ(peer.structCalls(), 0U);
}

} // namespace
} // namespace bench
