#pragma once

#include "KSTLib/Command.h"
#include "KSTLib/Status.h"
#include "base/ByteReader.h"
#include "base/NotCopied.h"
#include "common/Allocation.h"
#include "common/Failure.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string.h>

namespace kst {

static_assert(sizeof KST_COMMAND_MAGIC - 1 == kKSTCommandMagicSize);

/// Writes bytes 0 to 6 of a command frame. `frame` has room for the header; its byte 7 is left
/// alone.
inline void writeCommandHeader(std::uint8_t* frame, std::uint8_t code, std::uint8_t secondByte,
                               std::uint8_t thirdByte) noexcept {
    std::memcpy(frame, KST_COMMAND_MAGIC, kKSTCommandMagicSize);
    frame[kKSTCommandCodeOffset] = code;
    frame[kKSTCommandSecondByteOffset] = secondByte;
    frame[kKSTCommandThirdByteOffset] = thirdByte;
}

/// A buffer on the stack for bytes that may be secret: zero at first, overwritten with zeros at the
/// end of the scope.
template <std::size_t Size>
class WipedBytes : private base::NotCopied {
  public:
    ~WipedBytes() { ::explicit_bzero(bytes_.data(), bytes_.size()); }

    [[nodiscard]] std::uint8_t* data() { return bytes_.data(); }
    [[nodiscard]] const std::uint8_t* data() const { return bytes_.data(); }
    [[nodiscard]] std::size_t size() const { return Size; }

  private:
    std::array<std::uint8_t, Size> bytes_{};
    CallBuffer buffer_{bytes_.data(), Size};
};

/// The payload of a command that is a 32-bit number and the data behind it, on the stack and wiped.
class NumberedPayload {
  public:
    static constexpr std::size_t kMaxDataSize = kKSTKernelControlMaxSize;

    /// Copies `dataSize` bytes at `data`, which may be null when `dataSize` is 0. More than
    /// kMaxDataSize bytes stop the process, with a line through `context`.
    NumberedPayload(std::uint32_t number, const void* data, std::size_t dataSize,
                    const AssertionContext& context) noexcept;

    [[nodiscard]] const std::uint8_t* data() const { return bytes_.data(); }
    [[nodiscard]] std::size_t size() const { return size_; }

  private:
    WipedBytes<sizeof(std::uint32_t) + kMaxDataSize> bytes_;
    std::size_t size_;
};

/// The payload of a command as a pair of serialisers makes it, in memory of the library's.
class BuiltPayload {
  public:
    /// Asks `measure` for the size, allocates it and has `write` fill it. To be called once.
    ///
    /// `measure` takes a `Size*`; `write` takes the memory and a `Size*` with its size, and sets
    /// that to what it wrote, which may be less. What they fail with is reported through `context`
    /// and returned; kKSTErrorOutOfMemory.
    template <typename Size, typename Measure, typename Write>
    [[nodiscard]] KSTStatus build(const AssertionContext& context, Measure measure,
                                  Write write) noexcept {
        Size size = 0;
        KSTStatus err = measure(&size);
        if (err != kKSTErrorSuccess) {
            return failCall(context, err);
        }
        memory_.emplace(size);
        if (memory_->bytes() == nullptr) {
            return fail(context, "inputBuffer", 0, kKSTErrorOutOfMemory);
        }
        err = write(memory_->bytes(), &size);
        if (err != kKSTErrorSuccess) {
            return failCall(context, err);
        }
        size_ = size;
        return kKSTErrorSuccess;
    }

    /// After success.
    [[nodiscard]] const std::uint8_t* bytes() const { return memory_->bytes(); }
    /// What was written.
    [[nodiscard]] std::size_t size() const { return size_; }

  private:
    std::optional<AllocatedMemory> memory_;
    std::size_t size_ = 0;
};

/// A copy of bytes from a payload, released with the object unless it was handed out.
class ReceivedBlob : private base::NotCopied {
  public:
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
