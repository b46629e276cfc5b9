#include "platform/formats/BinaryPropertyListObjects.h"

#include "platform/formats/PropertyListCodec.h"

#include <algorithm>

namespace platform::binary_property_list {

namespace {

constexpr std::size_t kLargestWidth = sizeof(std::uint64_t);

bool isWidth(std::size_t width) {
    return width >= 1 && width <= kLargestWidth;
}

bool beginsWithMagic(Span file) {
    return file.size() >= kMagicSize && std::equal(kBinaryPropertyListMagic.begin(),
                                                   kBinaryPropertyListMagic.end(), file.begin());
}

} // namespace

bool readLargeCount(base::ByteReader& reader, std::uint64_t& count) {
    std::uint8_t marker = 0;
    if (!reader.readU8(marker) || kindOf(marker) != Kind::integer) {
        return false;
    }
    const std::size_t width = std::size_t{1} << (marker & 0xfU);
    return width <= kLargestWidth && readNumber(reader, width, count);
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

} // namespace platform::binary_property_list
