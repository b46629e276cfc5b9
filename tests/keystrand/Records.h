#pragma once

#include "keystrand/NotificationRecord.h"
#include "tests/keystrand/Bytes.h"

#include <cstdint>
#include <vector>

namespace keystrand::test {

/// The four records, written out field by field.
inline ByteVector timerRestarted(std::uint64_t alarm, std::uint32_t version, std::uint64_t start,
                                 std::uint8_t locked) {
    return Bytes().u32(1).u64(alarm).u32(version).u64(start).u8(locked).fill(11, 0);
}

inline ByteVector analyticsCollected(std::uint32_t period, std::uint32_t restricted,
                                     std::uint8_t mode, std::uint8_t passcode = 0,
                                     std::uint8_t bootArg = 0, std::uint8_t quorvane = 0) {
    return Bytes()
        .u32(2)
        .u32(period)
        .u32(restricted)
        .u32(0)
        .u8(mode)
        .u8(passcode)
        .u8(bootArg)
        .u8(quorvane)
        .fill(16, 0);
}

inline ByteVector figuresBlob(std::uint64_t periodStart, std::uint32_t inPeriod,
                              std::uint32_t total, std::uint64_t since) {
    return Bytes().u64(periodStart).u32(inPeriod).u32(total).u64(since).u32(1).u32(0);
}

inline ByteVector saveAnalytics(const ByteVector& blob) {
    return Bytes().u32(3).bytes(blob);
}

inline ByteVector timerRestartedAnalytics(std::uint32_t total) {
    return Bytes().u32(4).u32(total).fill(28, 0);
}

/// What the records of notifications are, in their order.
inline std::vector<ByteVector> recordsOf(const std::vector<Notification>& notifications) {
    std::vector<ByteVector> records;
    for (const Notification& notification : notifications) {
        records.emplace_back(notification.record.begin(), notification.record.end());
    }
    return records;
}

template <std::size_t N>
std::array<std::uint8_t, N> arrayOf(const ByteVector& bytes) {
    return bytesAt<N>(bytes, 0);
}

} // namespace keystrand::test
