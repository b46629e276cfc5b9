#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <utility>
#include <vector>

namespace keystrand::test {

using ByteVector = std::vector<std::uint8_t>;

/// Bytes put together by hand, so that a test does not lean on the code that it checks.
class Bytes {
  public:
    Bytes& u8(std::uint64_t value) { return integer(value, 1); }
    Bytes& u16(std::uint64_t value) { return integer(value, 2); }
    Bytes& u32(std::uint64_t value) { return integer(value, 4); }
    Bytes& u64(std::uint64_t value) { return integer(value, 8); }
    Bytes& text(std::string_view value) {
        bytes_.insert(bytes_.end(), value.begin(), value.end());
        return *this;
    }
    Bytes& fill(std::size_t count, std::uint8_t value) {
        bytes_.insert(bytes_.end(), count, value);
        return *this;
    }
    Bytes& bytes(const std::vector<std::uint8_t>& value) {
        bytes_.insert(bytes_.end(), value.begin(), value.end());
        return *this;
    }

    // NOLINTNEXTLINE(google-explicit-constructor): stands for its bytes wherever bytes are wanted
    operator std::vector<std::uint8_t>() const { return bytes_; }
    [[nodiscard]] std::vector<std::uint8_t> get() const { return bytes_; }

  private:
    Bytes& integer(std::uint64_t value, int width) {
        for (int i = 0; i < width; ++i) {
            bytes_.push_back(static_cast<std::uint8_t>(value >> (8 * i)));
        }
        return *this;
    }

    std::vector<std::uint8_t> bytes_;
};

/// The input of a struct call: a command frame.
inline std::vector<std::uint8_t> frame(std::uint8_t code,
                                       const std::vector<std::uint8_t>& payload) {
    return Bytes().text("DRCS").u8(code).u8(0).u8(0).u8(0xaa).bytes(payload);
}

inline std::vector<std::uint8_t> control(std::uint32_t code,
                                         const std::vector<std::uint8_t>& input) {
    return frame(26, Bytes().u32(code).bytes(input));
}

/// The input of an acknowledgement: a name, zero-filled to 64 bytes or cut there.
inline std::vector<std::uint8_t> ackName(std::string_view name) {
    std::vector<std::uint8_t> bytes = Bytes().text(name);
    bytes.resize(64);
    return bytes;
}

inline std::vector<std::uint8_t> request(std::uint8_t operation, std::uint64_t sequence,
                                         const std::vector<std::uint8_t>& body) {
    return Bytes().text("KSTQ").u8(1).u8(operation).u16(0).u64(sequence).bytes(body);
}

inline std::vector<std::uint8_t> structCall(std::uint64_t sequence, std::uint32_t offered,
                                            const std::vector<std::uint8_t>& input) {
    return request(5, sequence, Bytes().u32(0).u32(offered).bytes(input));
}

inline std::vector<std::uint8_t> reply(std::uint8_t operation, std::uint64_t sequence,
                                       std::int32_t status, std::uint32_t reported,
                                       const std::vector<std::uint8_t>& body = {}) {
    return Bytes()
        .text("KSTR")
        .u8(1)
        .u8(operation)
        .u16(0)
        .u64(sequence)
        .u32(static_cast<std::uint32_t>(status))
        .u32(reported)
        .bytes(body);
}

} // namespace keystrand::test
