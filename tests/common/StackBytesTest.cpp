#include "common/PayloadMemory.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>
#include <new>
#include <span>
#include <vector>

namespace {

using kst::NumberedPayload;
using Bytes = std::vector<std::uint8_t>;

constexpr kst::AssertionContext kNoContext{nullptr, "KST", "common/LibCall"};

class StandardErrorLog : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        std::fwrite(text.data(), 1, text.size(), stderr);
        std::fflush(stderr);
    }
};

Bytes payloadOf(std::uint32_t number, const Bytes& data) {
    const NumberedPayload payload(number, data.empty() ? nullptr : data.data(), data.size(),
                                  kNoContext);
    return {payload.data(), payload.data() + payload.size()};
}

} // namespace

TEST(WipedBytes, ZeroBeforeAndAfter) {
    using Buffer = kst::WipedBytes<100>;
    alignas(Buffer) std::array<std::uint8_t, sizeof(Buffer)> storage;
    storage.fill(0xaa);
    const auto isZero = [](std::uint8_t byte) {
        return byte == 0;
    };

    auto* buffer = new (storage.data()) Buffer();
    EXPECT_EQ(buffer->size(), 100U);
    EXPECT_TRUE(std::all_of(buffer->data(), buffer->data() + 100, isZero));
    std::memset(buffer->data(), 0xbb, 100);
    const auto bytes =
        std::span(storage).subspan(static_cast<std::size_t>(buffer->data() - storage.data()), 100);
    buffer->~Buffer();
    EXPECT_TRUE(std::all_of(bytes.begin(), bytes.end(), isZero));
}

TEST(NumberedPayload, NumberThenData) {
    EXPECT_EQ(payloadOf(0x01020304, {}), (Bytes{4, 3, 2, 1}));
    EXPECT_EQ(payloadOf(0xffffffff, {5}), (Bytes{0xff, 0xff, 0xff, 0xff, 5}));
}

TEST(NumberedPayload, SizesAtTheirLimits) {
    for (const std::size_t size : {1U, 64U, 255U, 256U}) {
        Bytes expected{1, 0, 0, 0};
        expected.insert(expected.end(), size, 0x5c);
        EXPECT_EQ(payloadOf(1, Bytes(size, 0x5c)), expected);
    }
}

TEST(NumberedPayload, IsWiped) {
    alignas(NumberedPayload) std::array<std::uint8_t, sizeof(NumberedPayload)> storage;
    const Bytes secret(256, 0xcc);
    auto* payload =
        new (storage.data()) NumberedPayload(0xcccccccc, secret.data(), secret.size(), kNoContext);
    // Only the payload: beside it are addresses, which may hold any byte.
    const auto bytes = std::span(storage).subspan(
        static_cast<std::size_t>(payload->data() - storage.data()), payload->size());
    EXPECT_EQ(std::count(bytes.begin(), bytes.end(), 0xcc), 260);
    payload->~NumberedPayload();
    EXPECT_EQ(std::count(bytes.begin(), bytes.end(), 0), 260);
}

TEST(NumberedPayloadDeathTest, CursorThatIsNotAtTheEndStopsTheProcess) {
    StandardErrorLog log;
    const Bytes data(257);
    EXPECT_EXIT(NumberedPayload(1, data.data(), data.size(), {&log, "KST", "common/LibCallBlock"}),
                testing::KilledBySignal(SIGABRT),
                "KST: AssertMacros: commandCursor == commandBuffer \\+ sizeof\\(commandBuffer\\) "
                "\\(value: 0x0\\),  file: common/LibCallBlock:[0-9]+\n");
}

TEST(NumberedPayloadDeathTest, HugeSizeStopsTheProcess) {
    const std::uint8_t byte = 0;
    EXPECT_EXIT(NumberedPayload(1, &byte, SIZE_MAX, kNoContext), testing::KilledBySignal(SIGABRT),
                "");
}
