#include "base/Saturate.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <vector>

namespace {

using base::saturate;
using base::saturatingAdd;
using base::saturatingMultiply;

constexpr double kInfinity = std::numeric_limits<double>::infinity();
constexpr std::int64_t kMax64 = std::numeric_limits<std::int64_t>::max();
constexpr std::int64_t kMin64 = std::numeric_limits<std::int64_t>::min();
constexpr std::uint64_t kMaxU64 = std::numeric_limits<std::uint64_t>::max();
constexpr std::uint32_t kMaxU32 = std::numeric_limits<std::uint32_t>::max();

/// Numbers in rising order, close together where a conversion could go wrong.
std::vector<double> risingDoubles() {
    std::vector<double> numbers{-kInfinity, -std::numeric_limits<double>::max()};
    for (int exponent = 70; exponent >= -2; --exponent) {
        const double power = -std::ldexp(1.0, exponent);
        numbers.insert(numbers.end(), {std::nextafter(power, -kInfinity), power,
                                       std::nextafter(power, kInfinity)});
    }
    numbers.insert(numbers.end(), {-0.0, 0.0});
    for (int exponent = -2; exponent <= 70; ++exponent) {
        const double power = std::ldexp(1.0, exponent);
        numbers.insert(numbers.end(), {std::nextafter(power, -kInfinity), power,
                                       std::nextafter(power, kInfinity)});
    }
    numbers.insert(numbers.end(), {std::numeric_limits<double>::max(), kInfinity});
    return numbers;
}

template <typename To>
void expectNeverDecreases() {
    const std::vector<double> numbers = risingDoubles();
    for (std::size_t i = 1; i < numbers.size(); ++i) {
        EXPECT_LE(saturate<To>(numbers[i - 1]), saturate<To>(numbers[i]))
            << numbers[i - 1] << " and " << numbers[i];
    }
    EXPECT_EQ(saturate<To>(numbers.front()), std::numeric_limits<To>::min());
    EXPECT_EQ(saturate<To>(numbers.back()), std::numeric_limits<To>::max());
}

} // namespace

TEST(SaturateFloating, NotANumberIsZero) {
    EXPECT_EQ(saturate<std::int64_t>(std::nan("")), 0);
    EXPECT_EQ(saturate<std::uint32_t>(-std::nan("")), 0U);
    EXPECT_EQ(saturate<std::int8_t>(std::numeric_limits<float>::quiet_NaN()), 0);
}

TEST(SaturateFloating, Infinities) {
    EXPECT_EQ(saturate<std::int64_t>(kInfinity), kMax64);
    EXPECT_EQ(saturate<std::int64_t>(-kInfinity), kMin64);
    EXPECT_EQ(saturate<std::uint32_t>(kInfinity), kMaxU32);
    EXPECT_EQ(saturate<std::uint32_t>(-kInfinity), 0U);
}

TEST(SaturateFloating, TruncatesTowardsZero) {
    EXPECT_EQ(saturate<std::int32_t>(1.9), 1);
    EXPECT_EQ(saturate<std::int32_t>(-1.9), -1);
    EXPECT_EQ(saturate<std::uint32_t>(0.999), 0U);
    EXPECT_EQ(saturate<std::uint32_t>(-0.999), 0U);
    EXPECT_EQ(saturate<std::uint32_t>(-1.0), 0U);
}

TEST(SaturateFloating, AroundTwoToThe32) {
    EXPECT_EQ(saturate<std::uint32_t>(4294967294.0), 4294967294U);
    EXPECT_EQ(saturate<std::uint32_t>(4294967295.0), kMaxU32);
    EXPECT_EQ(saturate<std::uint32_t>(4294967295.5), kMaxU32);
    EXPECT_EQ(saturate<std::uint32_t>(4294967296.0), kMaxU32);
    EXPECT_EQ(saturate<std::uint32_t>(4294967297.0), kMaxU32);
    EXPECT_EQ(saturate<std::int64_t>(4294967296.0), 4294967296);
    EXPECT_EQ(saturate<std::int32_t>(2147483647.5), 2147483647);
    EXPECT_EQ(saturate<std::int32_t>(2147483648.0), 2147483647);
    EXPECT_EQ(saturate<std::int32_t>(-2147483648.5), std::numeric_limits<std::int32_t>::min());
}

TEST(SaturateFloating, SecondsWhoseNanosecondsNoLongerFit) {
    EXPECT_EQ(saturate<std::int64_t>(9223372036.0), 9223372036);
    EXPECT_EQ(saturate<std::int64_t>(9223372037.0), 9223372037);
    EXPECT_EQ(saturate<std::uint32_t>(9223372037.0), kMaxU32);
    EXPECT_EQ(saturate<std::int64_t>(9223372037.0 * 1e9), kMax64);
}

TEST(SaturateFloating, TwoToThe53PlusOneHasNoDoubleOfItsOwn) {
    const std::uint64_t exact = (std::uint64_t{1} << 53U) + 1;
    EXPECT_EQ(saturate<std::int64_t>(static_cast<double>(exact)), std::int64_t{1} << 53U);
    EXPECT_EQ(saturate<std::int64_t>(std::ldexp(1.0, 53) + 2), (std::int64_t{1} << 53U) + 2);
}

TEST(SaturateFloating, AroundTwoToThe63) {
    const double edge = std::ldexp(1.0, 63);
    EXPECT_EQ(saturate<std::int64_t>(std::nextafter(edge, 0.0)), kMax64 - 1023);
    EXPECT_EQ(saturate<std::int64_t>(edge), kMax64);
    EXPECT_EQ(saturate<std::int64_t>(std::nextafter(edge, kInfinity)), kMax64);
    EXPECT_EQ(saturate<std::int64_t>(-edge), kMin64);
    EXPECT_EQ(saturate<std::int64_t>(std::nextafter(-edge, 0.0)), kMin64 + 1024);
    EXPECT_EQ(saturate<std::int64_t>(std::nextafter(-edge, -kInfinity)), kMin64);
    EXPECT_EQ(saturate<std::uint64_t>(edge), std::uint64_t{1} << 63U);
}

TEST(SaturateFloating, AroundTwoToThe64) {
    const double edge = std::ldexp(1.0, 64);
    EXPECT_EQ(saturate<std::uint64_t>(std::nextafter(edge, 0.0)), kMaxU64 - 2047);
    EXPECT_EQ(saturate<std::uint64_t>(edge), kMaxU64);
    EXPECT_EQ(saturate<std::uint64_t>(static_cast<double>(kMaxU64)), kMaxU64);
    EXPECT_EQ(saturate<std::int64_t>(static_cast<double>(kMaxU64)), kMax64);
}

TEST(SaturateFloating, FromFloatAndLongDouble) {
    EXPECT_EQ(saturate<std::uint64_t>(std::ldexp(1.0F, 64)), kMaxU64);
    EXPECT_EQ(saturate<std::int8_t>(127.9F), 127);
    EXPECT_EQ(saturate<std::int8_t>(128.0F), 127);
    EXPECT_EQ(saturate<std::int8_t>(-128.9F), -128);
    EXPECT_EQ(saturate<std::int64_t>(static_cast<long double>(kMax64)), kMax64);
    EXPECT_EQ(saturate<std::uint64_t>(static_cast<long double>(kMaxU64)), kMaxU64);
}

TEST(SaturateFloating, NeverDecreasesAsTheValueGrows) {
    expectNeverDecreases<std::int8_t>();
    expectNeverDecreases<std::uint8_t>();
    expectNeverDecreases<std::int16_t>();
    expectNeverDecreases<std::uint16_t>();
    expectNeverDecreases<std::int32_t>();
    expectNeverDecreases<std::uint32_t>();
    expectNeverDecreases<std::int64_t>();
    expectNeverDecreases<std::uint64_t>();
}

TEST(SaturateIntegral, BetweenSignedAndUnsigned) {
    EXPECT_EQ(saturate<std::int64_t>(kMaxU64), kMax64);
    EXPECT_EQ(saturate<std::int64_t>(std::uint64_t{1} << 63U), kMax64);
    EXPECT_EQ(saturate<std::int64_t>((std::uint64_t{1} << 63U) - 1), kMax64);
    EXPECT_EQ(saturate<std::int64_t>((std::uint64_t{1} << 63U) - 2), kMax64 - 1);
    EXPECT_EQ(saturate<std::uint64_t>(std::int64_t{-1}), 0U);
    EXPECT_EQ(saturate<std::uint64_t>(kMin64), 0U);
    EXPECT_EQ(saturate<std::uint64_t>(kMax64), static_cast<std::uint64_t>(kMax64));
}

TEST(SaturateIntegral, Narrowing) {
    EXPECT_EQ(saturate<std::uint32_t>(std::uint64_t{1} << 32U), kMaxU32);
    EXPECT_EQ(saturate<std::uint32_t>((std::uint64_t{1} << 32U) - 1), kMaxU32);
    EXPECT_EQ(saturate<std::uint32_t>(std::int64_t{-1}), 0U);
    EXPECT_EQ(saturate<std::int32_t>(std::int64_t{2147483648}), 2147483647);
    EXPECT_EQ(saturate<std::int32_t>(std::int64_t{-2147483649}),
              std::numeric_limits<std::int32_t>::min());
    EXPECT_EQ(saturate<std::uint16_t>(std::size_t{65536}), 65535U);
}

TEST(SaturatingMultiply, StaysInRange) {
    EXPECT_EQ(saturatingMultiply(6, -7), -42);
    EXPECT_EQ(saturatingMultiply(0, kMin64), 0);
    EXPECT_EQ(saturatingMultiply(kMax64, 1), kMax64);
    EXPECT_EQ(saturatingMultiply(kMin64, 1), kMin64);
}

TEST(SaturatingMultiply, HoldsAtTheEnds) {
    EXPECT_EQ(saturatingMultiply(9223372036, 1'000'000'000), 9223372036000000000);
    EXPECT_EQ(saturatingMultiply(9223372037, 1'000'000'000), kMax64);
    EXPECT_EQ(saturatingMultiply(-9223372037, 1'000'000'000), kMin64);
    EXPECT_EQ(saturatingMultiply(kMin64, -1), kMax64);
    EXPECT_EQ(saturatingMultiply(-1, kMin64), kMax64);
    EXPECT_EQ(saturatingMultiply(kMin64, kMin64), kMax64);
    EXPECT_EQ(saturatingMultiply(kMax64, kMin64), kMin64);
    EXPECT_EQ(saturatingMultiply(kMax64, 2), kMax64);
}

TEST(SaturatingMultiply, NeverDecreasesAsTheFactorGrows) {
    std::int64_t former = kMin64;
    for (std::int64_t seconds = -9223372039; seconds <= 9223372039; seconds += 3074457346) {
        for (std::int64_t step = 0; step < 4; ++step) {
            const std::int64_t product = saturatingMultiply(seconds + step, 1'000'000'000);
            EXPECT_LE(former, product) << seconds + step;
            former = product;
        }
    }
    EXPECT_EQ(former, kMax64);
}

TEST(SaturatingAdd, StaysInRangeOrHoldsAtTheEnds) {
    EXPECT_EQ(saturatingAdd(2, -3), -1);
    EXPECT_EQ(saturatingAdd(kMax64, 0), kMax64);
    EXPECT_EQ(saturatingAdd(kMax64 - 1, 1), kMax64);
    EXPECT_EQ(saturatingAdd(kMax64, 1), kMax64);
    EXPECT_EQ(saturatingAdd(1, kMax64), kMax64);
    EXPECT_EQ(saturatingAdd(kMin64, -1), kMin64);
    EXPECT_EQ(saturatingAdd(-1, kMin64), kMin64);
    EXPECT_EQ(saturatingAdd(kMin64 + 1, -1), kMin64);
    EXPECT_EQ(saturatingAdd(kMin64, kMax64), -1);
    EXPECT_EQ(saturatingAdd(kMax64, kMax64), kMax64);
    EXPECT_EQ(saturatingAdd(kMin64, kMin64), kMin64);
}

static_assert(saturate<std::uint32_t>(4294967296.0) == kMaxU32, "usable in constant expressions");
