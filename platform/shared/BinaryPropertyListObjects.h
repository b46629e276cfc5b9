#pragma once

#include "base/ByteReader.h"

#include <cstddef>
#include <cstdint>
#include <span>

/// How objects are found in a file of the binary form, which BinaryPropertyList.h describes. The
/// file may hold anything; every length is compared with what is left.
namespace platform::binary_property_list {

using Span = std::span<const std::uint8_t>;

/// Reads a number that has its high byte first, of at most 8 bytes.
[[nodiscard]] bool readNumber(base::ByteReader& reader, std::size_t width, std::uint64_t& number);

/// Reads the content of an object that has a count, in its marker or behind it: so many elements of
/// `width` bytes.
[[nodiscard]] bool readElements(std::uint8_t marker, base::ByteReader& reader, std::size_t width,
                                Span& elements);

/// The objects of a file, which must outlive it.
class ObjectTable {
  public:
    /// False when the file is none or its tables do not fit into it.
    [[nodiscard]] bool open(Span file);

    /// The number of the object that is the whole value.
    [[nodiscard]] std::uint64_t top() const { return top_; }

    [[nodiscard]] std::size_t referenceWidth() const { return referenceWidth_; }

    /// The object that the `index`-th of the references is to; there must be so many.
    [[nodiscard]] std::uint64_t reference(Span references, std::size_t index) const;

    /// Gives the object's marker, and in `reader` all that stands behind it in the object table.
    [[nodiscard]] bool find(std::uint64_t object, std::uint8_t& marker,
                            base::ByteReader& reader) const;

  private:
    /// All that stands before the offset table.
    Span objects_;
    Span offsets_;
    std::uint64_t count_ = 0;
    std::uint64_t top_ = 0;
    std::size_t offsetWidth_ = 0;
    std::size_t referenceWidth_ = 0;
};

} // namespace platform::binary_property_list
