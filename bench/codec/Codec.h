#pragma once

#include "bench/support/Comparison.h"

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <span>
#include <string>

namespace bench {

/// One library's way of writing one payload and of reading it back. A work makes kCallsPerWork
/// calls; one that is empty is not measured.
struct Codec {
    std::string name;
    /// How many bytes it writes.
    std::size_t encodedSize = 0;
    /// What readFields of every value that was read back comes to.
    std::uint64_t fields = 0;
    /// Into a buffer that is kept from call to call, as are all objects on the way.
    Work encode;
    /// Into a buffer of its own for each call, and with new objects.
    Work encodeAnew;
    /// Every field is read. Objects that the library can use again are kept.
    Work decode;
    /// The same with new objects for each call.
    Work decodeAnew;
};

/// So many that the call through the work itself does not count.
inline constexpr int kCallsPerWork = 1000;

template <typename Call>
Work repeated(Call call) {
    return [call = std::move(call)] {
        for (int i = 0; i < kCallsPerWork; ++i) {
            call();
            // What was written counts as used, and what is read as unknown.
            asm volatile("" ::: "memory");
        }
    };
}

/// Keeps a value from being optimised away.
template <typename Value>
void use(const Value& value) {
    asm volatile("" ::"r"(value));
}

/// Memory for one encoded payload, not zeroed.
[[nodiscard]] inline std::unique_ptr<std::uint8_t[]> newBuffer(std::size_t size) {
    return std::make_unique_for_overwrite<std::uint8_t[]>(size);
}

/// Takes in the values that a reader finds, in the order of the fields.
class FieldSum {
  public:
    void add(std::uint64_t value) { sum_ = std::rotl(sum_, 5) + value; }

    void add(std::span<const std::uint8_t> bytes) {
        add(bytes.size());
        std::uint64_t word = 0;
        for (; bytes.size() >= sizeof word; bytes = bytes.subspan(sizeof word)) {
            std::memcpy(&word, bytes.data(), sizeof word);
            sum_ += word;
        }
        word = 0;
        if (!bytes.empty()) {
            std::memcpy(&word, bytes.data(), bytes.size());
        }
        sum_ += word;
    }

    void add(const void* data, std::size_t length) {
        add({static_cast<const std::uint8_t*>(data), length});
    }

    [[nodiscard]] std::uint64_t value() const { return sum_; }

  private:
    std::uint64_t sum_ = 0;
};

} // namespace bench
