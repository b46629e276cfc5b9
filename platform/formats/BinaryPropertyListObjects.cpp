#include "platform/formats/BinaryPropertyListObjects.h"

#include "platform/formats/PropertyListCodec.h"

#include <algorithm>

namespace platform::binary_property_list {

namespace {

constexpr std::size_t kLargestWidth = sizeof(std::uint64_t);

std::uint64_t numberIn(Span bytes) {
    // Nearly every reference and offset of a small file is of one or two bytes.
    if (bytes.size() == 1) {
        return bytes[0];
    }
    if (bytes.size() == 2) {
        return (std::uint64_t{bytes[0]} << 8U) | bytes[1];
    }
    std::uint64_t number = 0;
    for (const std::uint8_t byte : bytes) {
        number = (number << 8U) | byte;
    }
    return number;
}

bool isWidth(std::size_t width) {
    return width >= 1 && width <= kLargestWidth;
}

bool beginsWithMagic(Span file) {
    return file.size() >= kMagicSize && std::equal(kBinaryPropertyListMagic.begin(),
                                                   kBinaryPropertyListMagic.end(), file.begin());
}

} // namespace

bool readNumber(base::ByteReader& reader, std::size_t width, std::uint64_t& number) {
    Span bytes;
    if (!reader.readSpan(bytes, width)) {
        return false;
    }
    number = numberIn(bytes);
    return true;
}

bool readElements(std::uint8_t marker, base::ByteReader& reader, std::size_t width,
                  Span& elements) {
    std::uint64_t count = marker & 0xfU;
    if (count == kCountFollows) {
        std::uint8_t countMarker = 0;
        if (!reader.readU8(countMarker) || kindOf(countMarker) != Kind::integer) {
            return false;
        }
        const std::size_t countWidth = std::size_t{1} << (countMarker & 0xfU);
        if (countWidth > kLargestWidth || !readNumber(reader, countWidth, count)) {
            return false;
        }
    }
    return count <= reader.left() / width && reader.readSpan(elements, count * width);
}

bool ObjectTable::open(Span file) {
    if (!beginsWithMagic(file) || file.size() < kMagicSize + kTrailerSize) {
        return false;
    }
    const std::size_t trailer = file.size() - kTrailerSize;
    const Span numbers = file.subspan(trailer + kUnusedTrailerSize);
    offsetWidth_ = numbers[0];
    referenceWidth_ = numbers[1];
    count_ = numberIn(numbers.subspan(2, 8));
    top_ = numberIn(numbers.subspan(10, 8));
    const std::uint64_t offsetTable = numberIn(numbers.subspan(18, 8));
    if (!isWidth(offsetWidth_) || !isWidth(referenceWidth_) || offsetTable < kMagicSize ||
        offsetTable > trailer || count_ > (trailer - offsetTable) / offsetWidth_) {
        return false;
    }
    objects_ = file.first(offsetTable);
    offsets_ = file.subspan(offsetTable, count_ * offsetWidth_);
    return true;
}

std::uint64_t ObjectTable::reference(Span references, std::size_t index) const {
    return numberIn(references.subspan(index * referenceWidth_, referenceWidth_));
}

bool ObjectTable::find(std::uint64_t object, std::uint8_t& marker, base::ByteReader& reader) const {
    if (object >= count_) {
        return false;
    }
    const std::uint64_t offset = numberIn(offsets_.subspan(object * offsetWidth_, offsetWidth_));
    if (offset < kMagicSize || offset >= objects_.size()) {
        return false;
    }
    reader = base::ByteReader(objects_.subspan(offset));
    return reader.readU8(marker);
}

} // namespace platform::binary_property_list
