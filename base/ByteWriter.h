#pragma once

#include "base/LittleEndian.h"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>

namespace base {

/// Writes little-endian integers and runs of bytes into a buffer that it does not own.
///
/// Every write compares what it wants with what is left. A write that does not fit returns false,
/// changes nothing and does not move the cursor.
class ByteWriter {
  public:
    ByteWriter(void* data, std::size_t capacity)
        : cursor_(static_cast<std::uint8_t*>(data)), left_(capacity) {}

    explicit ByteWriter(std::span<std::uint8_t> buffer)
        : ByteWriter(buffer.data(), buffer.size()) {}

    [[nodiscard]] std::size_t left() const { return left_; }
    [[nodiscard]] std::size_t written() const { return written_; }

    [[nodiscard]] bool writeU8(std::uint8_t value) { return writeInteger(value); }
    [[nodiscard]] bool writeU16(std::uint16_t value) { return writeInteger(value); }
    [[nodiscard]] bool writeU32(std::uint32_t value) { return writeInteger(value); }
    [[nodiscard]] bool writeU64(std::uint64_t value) { return writeInteger(value); }

    /// Copies `length` bytes from `data`, which may be null when `length` is 0.
    [[nodiscard]] bool writeBytes(const void* data, std::size_t length) {
        if (length > left_) {
            return false;
        }
        if (length > 0) {
            std::memcpy(cursor_, data, length);
        }
        advance(length);
        return true;
    }

    [[nodiscard]] bool writeText(std::string_view text) {
        return writeBytes(text.data(), text.size());
    }

  private:
    template <typename Integer>
    bool writeInteger(Integer value) {
        if (sizeof(Integer) > left_) {
            return false;
        }
        const Integer stored = littleEndian(value);
        std::memcpy(cursor_, &stored, sizeof stored);
        advance(sizeof(Integer));
        return true;
    }

    void advance(std::size_t length) {
        if (length > 0) {
            cursor_ += length;
            left_ -= length;
            written_ += length;
        }
    }

    std::uint8_t* cursor_;
    std::size_t left_;
    std::size_t written_ = 0;
};

} // namespace base
