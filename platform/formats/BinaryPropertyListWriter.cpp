#include "base/Concat.h"
#include "platform/formats/BinaryPropertyListObjects.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/formats/UnicodeText.h"

#include <algorithm>
#include <bit>
#include <cstring>

namespace platform {

namespace {

using namespace binary_property_list;

/// The least of 1, 2, 4 and 8 bytes that holds the number.
std::size_t unsignedWidth(std::uint64_t number) {
    if (number <= 0xff) {
        return 1;
    }
    if (number <= 0xffff) {
        return 2;
    }
    return number <= 0xffff'ffff ? 4 : 8;
}

template <std::integral Number>
std::size_t integerWidth(Number number) {
    if (std::cmp_less(number, 0)) {
        return 8;
    }
    return std::in_range<std::int64_t>(number) ? unsignedWidth(static_cast<std::uint64_t>(number))
                                               : 16;
}

/// The size of the marker of an object with a count.
std::size_t markerSize(std::size_t count) {
    return count < kCountFollows ? 1 : 2 + unsignedWidth(count);
}

/// Looks through a value: what it takes, and whether it can be written at all.
class Measurer {
  public:
    /// False when the value cannot be written; `problem` says why.
    bool add(const Value& value) { return std::visit(*this, value.content()); }

    [[nodiscard]] const std::string& problem() const { return problem_; }
    [[nodiscard]] std::size_t objects() const { return objects_; }
    [[nodiscard]] std::size_t references() const { return references_; }
    /// Of all objects, without their references.
    [[nodiscard]] std::size_t bytes() const { return bytes_; }
    /// Whether every text is in ASCII, as in most values.
    [[nodiscard]] bool isASCII() const { return isASCII_; }

    bool operator()(bool /*value*/) { return object(1); }
    bool operator()(std::integral auto value) { return object(1 + integerWidth(value)); }
    bool operator()(std::floating_point auto /*value*/) { return object(1 + sizeof(double)); }
    bool operator()(const Timestamp& /*value*/) { return object(1 + sizeof(double)); }
    bool operator()(const Bytes& value) { return object(markerSize(value.size()) + value.size()); }

    bool operator()(const std::string& text) {
        if (isPlainASCII(text)) {
            return object(markerSize(text.size()) + text.size());
        }
        isASCII_ = false;
        const std::optional<std::size_t> units = countUTF16(text);
        if (!units) {
            return refuse("a text that is not UTF-8 or has a NUL");
        }
        return object(markerSize(*units) + 2 * *units);
    }

    bool operator()(const ValueList& list) {
        return container(list.size(), list.size()) &&
               std::all_of(list.begin(), list.end(),
                           [this](const Value& value) { return add(value); }) &&
               leave();
    }

    bool operator()(const ValueMap& map) {
        return container(map.size(), 2 * map.size()) &&
               std::all_of(map.begin(), map.end(),
                           [this](const auto& entry) {
                               return (*this)(entry.first) && add(entry.second);
                           }) &&
               leave();
    }

    bool operator()(const Null& kind) { return refuseKind(kind); }
    bool operator()(const UniqueIdentifier& kind) { return refuseKind(kind); }
    bool operator()(const Link& kind) { return refuseKind(kind); }
    bool operator()(const Error& kind) { return refuseKind(kind); }

  private:
    bool object(std::size_t size) {
        ++objects_;
        bytes_ += size;
        return true;
    }

    bool container(std::size_t count, std::size_t references) {
        if (++depth_ > kMaxPropertyListDepth) {
            return refuse(base::concat("lists and maps more than ", kMaxPropertyListDepth,
                                       " deep in each other"));
        }
        references_ += references;
        return object(markerSize(count));
    }

    bool leave() {
        --depth_;
        return true;
    }

    template <typename Kind>
    bool refuseKind(const Kind& kind) {
        return refuse(base::concat("a value of the kind ", kindName(Value(kind))));
    }

    bool refuse(std::string_view what) {
        problem_ = base::concat("a property list cannot hold ", what);
        return false;
    }

    std::size_t objects_ = 0;
    std::size_t references_ = 0;
    std::size_t bytes_ = 0;
    std::size_t depth_ = 0;
    bool isASCII_ = true;
    std::string problem_;
};

/// Where the parts of a measured value lie and how wide its numbers are.
struct Layout {
    explicit Layout(const Measurer& measure)
        : isASCII(measure.isASCII()),
          objects(measure.objects()),
          referenceWidth(unsignedWidth(objects - 1)),
          offsetTable(kMagicSize + measure.bytes() + measure.references() * referenceWidth),
          offsetWidth(unsignedWidth(offsetTable)),
          trailer(offsetTable + objects * offsetWidth),
          size(trailer + kTrailerSize) {}

    bool isASCII;
    std::size_t objects;
    std::size_t referenceWidth;
    std::size_t offsetTable;
    std::size_t offsetWidth;
    std::size_t trailer;
    std::size_t size;
};

void putNumber(std::uint8_t* place, std::uint64_t number, std::size_t width) {
    for (std::size_t i = width; i > 0; --i) {
        place[i - 1] = static_cast<std::uint8_t>(number & 0xffU);
        number >>= 8U;
    }
}

/// Writes a value that was measured into room of just its size. Objects are numbered in the order
/// in which they are written, which is why a list or map leaves room for its references and fills
/// it when the object behind each begins.
class Writer {
  public:
    Writer(const Layout& layout, std::uint8_t* room)
        : layout_(layout), room_(room), cursor_(room), nextOffset_(room + layout.offsetTable) {}

    void writeAll(const Value& value) {
        putBytes(kBinaryPropertyListMagic.data(), kMagicSize);
        write(value);
        cursor_ = room_ + layout_.trailer + kUnusedTrailerSize;
        putNumber(layout_.offsetWidth, 1);
        putNumber(layout_.referenceWidth, 1);
        putNumber(layout_.objects, 8);
        putNumber(0, 8);
        putNumber(layout_.offsetTable, 8);
    }

    void operator()(bool value) { putNumber(value ? kTrue : kFalse, 1); }

    template <std::integral Number>
    void operator()(Number number) {
        const std::size_t width = integerWidth(number);
        putNumber(marker(Kind::integer, static_cast<std::uint8_t>(std::countr_zero(width))), 1);
        if (width == 16) {
            putNumber(0, 8);
        }
        putNumber(static_cast<std::uint64_t>(number), std::min<std::size_t>(width, 8));
    }

    void operator()(std::floating_point auto value) {
        putNumber(kDouble, 1);
        putNumber(std::bit_cast<std::uint64_t>(static_cast<double>(value)), sizeof(double));
    }

    void operator()(const Timestamp& date) {
        putNumber(kDate, 1);
        putNumber(std::bit_cast<std::uint64_t>(date.secondsSince2001), sizeof(double));
    }

    void operator()(const Bytes& bytes) {
        putMarker(Kind::bytes, bytes.size());
        putBytes(bytes.data(), bytes.size());
    }

    void operator()(const std::string& text) {
        if (layout_.isASCII || isPlainASCII(text)) {
            putMarker(Kind::asciiText, text.size());
            putBytes(text.data(), text.size());
        } else {
            putMarker(Kind::utf16Text, countUTF16(text).value_or(0));
            putUTF16(text);
        }
    }

    void operator()(const ValueList& list) {
        putMarker(Kind::list, list.size());
        std::uint8_t* reference = leaveRoomForReferences(list.size());
        for (const Value& value : list) {
            refer(reference);
            write(value);
        }
    }

    void operator()(const ValueMap& map) {
        putMarker(Kind::map, map.size());
        std::uint8_t* keyReference = leaveRoomForReferences(map.size());
        std::uint8_t* valueReference = leaveRoomForReferences(map.size());
        for (const auto& [key, value] : map) {
            refer(keyReference);
            beginObject();
            (*this)(key);
            refer(valueReference);
            write(value);
        }
    }

    // The measurer refuses these kinds.
    void operator()(const Null& /*value*/) {}
    void operator()(const UniqueIdentifier& /*value*/) {}
    void operator()(const Link& /*value*/) {}
    void operator()(const Error& /*value*/) {}

  private:
    void write(const Value& value) {
        beginObject();
        std::visit(*this, value.content());
    }

    void beginObject() {
        platform::putNumber(nextOffset_, static_cast<std::uint64_t>(cursor_ - room_),
                            layout_.offsetWidth);
        nextOffset_ += layout_.offsetWidth;
        ++begun_;
    }

    /// Puts a reference to the object that begins next.
    void refer(std::uint8_t*& reference) const {
        platform::putNumber(reference, begun_, layout_.referenceWidth);
        reference += layout_.referenceWidth;
    }

    std::uint8_t* leaveRoomForReferences(std::size_t count) {
        std::uint8_t* const references = cursor_;
        cursor_ += count * layout_.referenceWidth;
        return references;
    }

    void putMarker(Kind kind, std::size_t count) {
        if (count < kCountFollows) {
            putNumber(marker(kind, static_cast<std::uint8_t>(count)), 1);
        } else {
            putNumber(marker(kind, kCountFollows), 1);
            (*this)(count);
        }
    }

    void putUTF16(std::string_view text) {
        while (const std::optional<char32_t> character = takeUTF8(text)) {
            if (*character < 0x10000) {
                putNumber(*character, 2);
            } else {
                putNumber(0xd7c0U + (*character >> 10U), 2);
                putNumber(0xdc00U + (*character & 0x3ffU), 2);
            }
        }
    }

    void putNumber(std::uint64_t number, std::size_t width) {
        platform::putNumber(cursor_, number, width);
        cursor_ += width;
    }

    void putBytes(const void* bytes, std::size_t size) {
        if (size > 0) {
            std::memcpy(cursor_, bytes, size);
            cursor_ += size;
        }
    }

    const Layout& layout_;
    std::uint8_t* room_;
    std::uint8_t* cursor_;
    std::uint8_t* nextOffset_;
    std::size_t begun_ = 0;
};

} // namespace

Result<Bytes> writeBinaryPropertyList(const Value& value) {
    Measurer measurer;
    if (!measurer.add(value)) {
        return Error{kGenericErrorDomain, 0, measurer.problem()};
    }
    const Layout layout(measurer);
    Bytes bytes(layout.size);
    Writer(layout, bytes.data()).writeAll(value);
    return bytes;
}

} // namespace platform
