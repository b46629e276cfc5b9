#pragma once

#include "base/ByteReader.h"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <endian.h>
#include <span>

/// The numbers of the binary form that both its writer and its reader need, and how objects are
/// found in a file; PropertyListCodec.h describes the form. The file may hold anything; every
/// length is compared with what is left. What an upload does for each key and value of each event
/// stands in this header, where it can become a part of its caller.
namespace platform::binary_property_list {

/// The high half of a marker byte.
enum class Kind : std::uint8_t {
    boolean = 0x0,
    integer = 0x1,
    real = 0x2,
    date = 0x3,
    bytes = 0x4,
    asciiText = 0x5,
    utf16Text = 0x6,
    list = 0xa,
    map = 0xd,
};

[[nodiscard]] constexpr std::uint8_t marker(Kind kind, std::uint8_t low) {
    return static_cast<std::uint8_t>((static_cast<unsigned>(kind) << 4U) | low);
}

[[nodiscard]] constexpr Kind kindOf(std::uint8_t marker) {
    return static_cast<Kind>(marker >> 4U);
}

inline constexpr std::uint8_t kFalse = marker(Kind::boolean, 8);
inline constexpr std::uint8_t kTrue = marker(Kind::boolean, 9);
inline constexpr std::uint8_t kFloat = marker(Kind::real, 2);
inline constexpr std::uint8_t kDouble = marker(Kind::real, 3);
inline constexpr std::uint8_t kDate = marker(Kind::date, 3);

/// The low half of a marker behind which the count follows.
inline constexpr std::uint8_t kCountFollows = 0xf;

inline constexpr std::size_t kMagicSize = 8;
inline constexpr std::size_t kUnusedTrailerSize = 6;
inline constexpr std::size_t kTrailerSize = kUnusedTrailerSize + 2 + 3 * sizeof(std::uint64_t);

using Span = std::span<const std::uint8_t>;

/// The number that has its high byte first, of at most 8 bytes.
[[nodiscard]] inline std::uint64_t numberIn(Span bytes) {
    // Nearly every reference and offset of a small file is of one or two bytes, every real of 8.
    if (bytes.size() == 1) {
        return bytes[0];
    }
    if (bytes.size() == 2) {
        return (std::uint64_t{bytes[0]} << 8U) | bytes[1];
    }
    if (bytes.size() == sizeof(std::uint64_t)) {
        std::uint64_t number = 0;
        std::memcpy(&number, bytes.data(), sizeof number);
        return be64toh(number);
    }
    std::uint64_t number = 0;
    for (const std::uint8_t byte : bytes) {
        number = (number << 8U) | byte;
    }
    return number;
}

/// Reads such a number.
[[nodiscard]] inline bool readNumber(base::ByteReader& reader, std::size_t width,
                                     std::uint64_t& number) {
    Span bytes;
    if (!reader.readSpan(bytes, width)) {
        return false;
    }
    number = numberIn(bytes);
    return true;
}

/// Reads the count behind a marker that says that it follows.
[[nodiscard]] bool readLargeCount(base::ByteReader& reader, std::uint64_t& count);

/// Reads the content of an object that has a count, in its marker or behind it: so many elements of
/// `width` bytes.
[[nodiscard]] inline bool readElements(std::uint8_t marker, base::ByteReader& reader,
                                       std::size_t width, Span& elements) {
    std::uint64_t count = marker & 0xfU;
    if (count == kCountFollows && !readLargeCount(reader, count)) {
        return false;
    }
    if (count > reader.left() / width) {
        return false;
    }
    static_cast<void>(reader.readSpan(elements, count * width));
    return true;
}

/// The objects of a file, which must outlive it.
class ObjectTable {
  public:
    /// False when the file is none or its tables do not fit into it.
    [[nodiscard]] bool open(Span file);

    /// The number of the object that is the whole value.
    [[nodiscard]] std::uint64_t top() const { return top_; }

    [[nodiscard]] std::size_t referenceWidth() const { return referenceWidth_; }

    /// The object that the `index`-th of the references is to; there must be so many.
    [[nodiscard]] std::uint64_t reference(Span references, std::size_t index) const {
        return numberIn({references.data() + index * referenceWidth_, referenceWidth_});
    }

    /// The object, and behind it all that follows in the object table. Nothing when there is none.
    [[nodiscard]] Span at(std::uint64_t object) const {
        if (object >= count_) {
            return {};
        }
        const std::uint64_t offset =
            numberIn({offsets_.data() + object * offsetWidth_, offsetWidth_});
        return offset >= kMagicSize && offset < objects_.size() ? objects_.subspan(offset) : Span();
    }

    /// Gives the object's marker, and in `reader` all that stands behind it in the object table.
    [[nodiscard]] bool find(std::uint64_t object, std::uint8_t& marker,
                            base::ByteReader& reader) const {
        reader = base::ByteReader(at(object));
        return reader.readU8(marker);
    }

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
