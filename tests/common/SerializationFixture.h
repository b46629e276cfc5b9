#pragma once

#include "tests/support/LibraryFixture.h"

#include <algorithm>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace support {

using Bytes = std::vector<std::uint8_t>;
using Lines = std::vector<std::string>;

/// A copy of bytes in memory of exactly their number, so that a step over the end is found. Never
/// null.
class ExactBuffer {
  public:
    explicit ExactBuffer(std::size_t size) : bytes_(new std::uint8_t[size]), size_(size) {
        std::fill_n(bytes_.get(), size, std::uint8_t{0xa5});
    }
    explicit ExactBuffer(const Bytes& bytes) : ExactBuffer(bytes.size()) {
        std::copy(bytes.begin(), bytes.end(), bytes_.get());
    }

    [[nodiscard]] std::uint8_t* data() const { return bytes_.get(); }
    [[nodiscard]] std::size_t size() const { return size_; }
    [[nodiscard]] Bytes bytes() const { return {bytes_.get(), bytes_.get() + size_}; }

  private:
    std::unique_ptr<std::uint8_t[]> bytes_;
    std::size_t size_;
};

inline void putU32(Bytes& bytes, std::size_t offset, std::uint32_t value) {
    for (std::size_t i = 0; i < 4; ++i) {
        bytes[offset + i] = static_cast<std::uint8_t>(value >> (8 * i));
    }
}

inline void append(Bytes& bytes, const Bytes& more) {
    bytes.insert(bytes.end(), more.begin(), more.end());
}

class SerializationFixture : public LibraryFixture {
  protected:
    /// A failed check of the serialisers, as `logged` shows it.
    static std::string failedCheck(const std::string& condition, const std::string& value = "0x0") {
        std::string line = "KST: AssertMacros: ";
        line += condition;
        line += " (value: " + value + "),  file: common/LibSerialization:<n>\n";
        return line;
    }

    /// The line of a call that returned `status`, which must be -3 or -4.
    static std::string failedCall(std::int32_t status = -3) {
        return failedCheck("err == 0 ", status == -3 ? "0xfffffffffffffffd" : "0xfffffffffffffffc");
    }

    /// Looks at the log and empties it.
    void expectLogged(const Lines& lines) {
        EXPECT_EQ(logged(), lines);
        log.clear();
    }
};

} // namespace support
