#pragma once

#include "base/LittleEndian.h"

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>

namespace base {

/// Reads little-endian integers and runs of bytes from a buffer that it does not own.
///
/// Every read compares what it wants with what is left. A read that does not fit returns false,
/// leaves its output alone and does not move the cursor.
class ByteReader {
  public:
    ByteReader(const void* data, std::size_t length)
        : cursor_(static_cast<const std::uint8_t*>(data)), left_(length) {}

    explicit ByteReader(std::span<const std::uint8_t> bytes)
        : ByteReader(bytes.data(), bytes.size()) {}

    [[nodiscard]] std::size_t left() const { return left_; }

    [[nodiscard]] bool readU8(std::uint8_t& value) { return readInteger(value); }
    [[nodiscard]] bool readU16(std::uint16_t& value) { return readInteger(value); }
    [[nodiscard]] bool readU32(std::uint32_t& value) { return readInteger(value); }
    [[nodiscard]] bool readU64(std::uint64_t& value) { return readInteger(value); }

    /// Any unsigned integer, by its own width.
    template <std::unsigned_integral Integer>
    [[nodiscard]] bool read(Integer& value) {
        return readInteger(value);
    }

    /// Copies `length` bytes to `out`. `out` may be null when `length` is 0.
    [[nodiscard]] bool readBytes(void* out, std::size_t length) {
        if (length > left_) {
            return false;
        }
        if (length > 0) {
            std::memcpy(out, cursor_, length);
        }
        advance(length);
        return true;
    }

    /// Points `text` at the next `length` bytes of the buffer, without copying them.
    [[nodiscard]] bool readText(std::string_view& text, std::size_t length) {
        std::span<const std::uint8_t> bytes;
        if (!readSpan(bytes, length)) {
            return false;
        }
        text = {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
        return true;
    }

    /// Points `bytes` at the next `length` bytes of the buffer, without copying them.
    [[nodiscard]] bool readSpan(std::span<const std::uint8_t>& bytes, std::size_t length) {
        if (length > left_) {
            return false;
        }
        bytes = {cursor_, length};
        advance(length);
        return true;
    }

    [[nodiscard]] bool skip(std::size_t length) {
        if (length > left_) {
            return false;
        }
        advance(length);
        return true;
    }

    /// What has not been read yet.
    [[nodiscard]] std::span<const std::uint8_t> rest() const { return {cursor_, left_}; }

  private:
    template <typename Integer>
    bool readInteger(Integer& value) {
        if (sizeof(Integer) > left_) {
            return false;
        }
        std::memcpy(&value, cursor_, sizeof value);
        value = littleEndian(value);
        advance(sizeof(Integer));
        return true;
    }

    void advance(std::size_t length) {
        if (length > 0) {
            cursor_ += length;
            left_ -= length;
        }
    }

    const std::uint8_t* cursor_;
    std::size_t left_;
};

} // namespace base
