#pragma once

#include "KSTLib/Status.h"
#include "base/ByteReader.h"
#include "common/Allocation.h"

#include <cstddef>
#include <cstdint>

namespace kst {

/// A copy of bytes from a payload, released with the object unless it was handed out.
class ReceivedBlob {
  public:
    ReceivedBlob() = default;
    ReceivedBlob(const ReceivedBlob&) = delete;
    ReceivedBlob& operator=(const ReceivedBlob&) = delete;
    ~ReceivedBlob();

    /// Copies the next `length` bytes; none are a null pointer.
    ///
    /// The memory is had before the bytes are looked for: kKSTErrorOutOfMemory, with a line that
    /// says `memoryCheck`, comes before kKSTErrorBadParameter, with `sizeCheck`. A length that the
    /// payload does not have costs address space only, because nothing is cleared and nothing
    /// written then. To be called once.
    [[nodiscard]] KSTStatus read(base::ByteReader& reader, std::size_t length,
                                 const char* memoryCheck, const char* sizeCheck) noexcept;

    /// Reads a 32-bit length, kKSTErrorBadParameter when it is not there, and then as `read`.
    [[nodiscard]] KSTStatus readWithLength(base::ByteReader& reader, const char* memoryCheck,
                                           const char* sizeCheck) noexcept;

    [[nodiscard]] std::size_t length() const { return length_; }

    /// The caller owns the bytes from now on.
    [[nodiscard]] std::uint8_t* handOut() noexcept;

  private:
    std::uint8_t* bytes_ = nullptr;
    std::size_t length_ = 0;
    std::size_t written_ = 0;
    CallBuffer buffer_;
};

} // namespace kst
