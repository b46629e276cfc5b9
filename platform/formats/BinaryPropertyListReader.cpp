#include "base/ByteReader.h"
#include "platform/formats/BinaryPropertyListObjects.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/formats/UnicodeText.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <limits>
#include <map>
#include <string>
#include <utility>

namespace platform {

namespace {

using namespace binary_property_list;

/// A text as it stands in the file.
struct FileText {
    Span bytes;
    bool isUTF16 = false;

    /// The bytes as characters, of use when it is not in UTF-16.
    [[nodiscard]] std::string_view ascii() const {
        return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
    }
};

/// The references of one map.
struct Entries {
    std::size_t count;
    Span keys;
    Span values;
};

class Reader {
  public:
    Reader(const ObjectTable& objects, std::size_t size, ValueSink& sink, KnownKeys* known)
        : objects_(objects),
          size_(size),
          work_(propertyListWork(size)),
          sink_(sink),
          known_(known) {}

    [[nodiscard]] bool readObject(std::uint64_t object) {
        base::ByteReader reader{Span()};
        std::uint8_t marker = 0;
        if (!objects_.find(object, marker, reader)) {
            return false;
        }
        switch (kindOf(marker)) {
        case Kind::boolean:
            return readBoolean(marker);
        case Kind::integer:
            return readInteger(marker, reader);
        case Kind::real:
            return readReal(marker, reader);
        case Kind::date:
            return readDate(marker, reader);
        case Kind::bytes:
            return readBytes(marker, reader);
        case Kind::asciiText:
        case Kind::utf16Text:
            return readText(marker, reader);
        case Kind::list:
        case Kind::map:
            return readContainer(marker, reader);
        }
        return false;
    }

  private:
    bool spend(std::size_t work) {
        if (work > work_) {
            return false;
        }
        work_ -= work;
        return true;
    }

    bool readBoolean(std::uint8_t marker) {
        if (marker != kFalse && marker != kTrue) {
            return false;
        }
        sink_.boolean(marker == kTrue);
        return true;
    }

    bool readInteger(std::uint8_t marker, base::ByteReader& reader) {
        constexpr std::uint8_t kWidthBitsOfLarge = 4;
        const std::uint8_t widthBits = marker & 0xfU;
        if (widthBits >= kWidthBitsOfLarge) {
            return widthBits == kWidthBitsOfLarge && readLargeInteger(reader);
        }
        std::uint64_t number = 0;
        if (!readNumber(reader, 1UL << widthBits, number)) {
            return false;
        }
        sink_.integer(static_cast<std::int64_t>(number));
        return true;
    }

    /// One of 16 bytes.
    bool readLargeInteger(base::ByteReader& reader) {
        std::uint64_t high = 0;
        std::uint64_t low = 0;
        if (!readNumber(reader, 8, high) || !readNumber(reader, 8, low)) {
            return false;
        }
        const bool isAbove63Bits = (low >> 63U) != 0;
        if (high == 0 && isAbove63Bits) {
            sink_.largeInteger(low);
            return true;
        }
        const bool isExtendedSign =
            high == std::numeric_limits<std::uint64_t>::max() && isAbove63Bits;
        if (high != 0 && !isExtendedSign) {
            return false;
        }
        sink_.integer(static_cast<std::int64_t>(low));
        return true;
    }

    bool readReal(std::uint8_t marker, base::ByteReader& reader) {
        std::uint64_t bits = 0;
        if (marker == kFloat && readNumber(reader, sizeof(float), bits)) {
            sink_.real(std::bit_cast<float>(static_cast<std::uint32_t>(bits)));
            return true;
        }
        if (marker == kDouble && readNumber(reader, sizeof(double), bits)) {
            sink_.real(std::bit_cast<double>(bits));
            return true;
        }
        return false;
    }

    bool readDate(std::uint8_t marker, base::ByteReader& reader) {
        std::uint64_t bits = 0;
        if (marker != kDate || !readNumber(reader, sizeof(double), bits)) {
            return false;
        }
        sink_.date(Timestamp{std::bit_cast<double>(bits)});
        return true;
    }

    bool readBytes(std::uint8_t marker, base::ByteReader& reader) {
        Span bytes;
        if (!readElements(marker, reader, 1, bytes) || !spend(bytes.size())) {
            return false;
        }
        sink_.bytes(bytes);
        return true;
    }

    bool readText(std::uint8_t marker, base::ByteReader& reader) {
        FileText text;
        if (!readFileText(marker, reader, text)) {
            return false;
        }
        if (!text.isUTF16) {
            if (!isPlainASCII(text.ascii())) {
                return false;
            }
            sink_.text(text.ascii());
            return true;
        }
        converted_.clear();
        if (!appendUTF8(text.bytes, converted_)) {
            return false;
        }
        sink_.text(converted_);
        return true;
    }

    bool readContainer(std::uint8_t marker, base::ByteReader& reader) {
        if (depth_ == kMaxPropertyListDepth) {
            return false;
        }
        ++depth_;
        const bool read =
            kindOf(marker) == Kind::list ? readList(marker, reader) : readMap(marker, reader);
        --depth_;
        return read;
    }

    bool readList(std::uint8_t marker, base::ByteReader& reader) {
        Span references;
        if (!readElements(marker, reader, objects_.referenceWidth(), references)) {
            return false;
        }
        const std::size_t count = references.size() / objects_.referenceWidth();
        if (!spend(count * kPropertyListWorkPerValue)) {
            return false;
        }
        sink_.beginList();
        for (std::size_t i = 0; i < count; ++i) {
            if (!readObject(objects_.reference(references, i))) {
                return false;
            }
        }
        sink_.endList();
        return true;
    }

    bool readMap(std::uint8_t marker, base::ByteReader& reader) {
        Span references;
        if (!readElements(marker, reader, 2 * objects_.referenceWidth(), references)) {
            return false;
        }
        const Span keys = references.first(references.size() / 2);
        const Entries entries{keys.size() / objects_.referenceWidth(), keys,
                              references.last(keys.size())};
        if (!spend(2 * entries.count * kPropertyListWorkPerValue)) {
            return false;
        }
        if (KnownKeys::Set* const known = knownKeysOf(entries)) {
            return readKnownEntries(entries, *known);
        }
        bool isSorted = false;
        if (!lookAtKeys(entries, isSorted)) {
            return false;
        }
        if (isSorted && mayKnowKeys()) {
            keepKeys(entries);
        }
        sink_.beginMap();
        if (!(isSorted ? readSortedEntries(entries) : readOtherEntries(entries))) {
            return false;
        }
        sink_.endMap();
        return true;
    }

    [[nodiscard]] bool mayKnowKeys() const { return known_ != nullptr && depth_ == 1; }

    /// The set of keys that the map at hand has, if it is known.
    [[nodiscard]] KnownKeys::Set* knownKeysOf(const Entries& entries) const {
        if (!mayKnowKeys()) {
            return nullptr;
        }
        for (KnownKeys::Set& keys : known_->sets) {
            if (hasKeys(entries, keys)) {
                return &keys;
            }
        }
        return nullptr;
    }

    [[nodiscard]] bool hasKeys(const Entries& entries, const KnownKeys::Set& keys) const {
        if (entries.count != keys.size()) {
            return false;
        }
        for (std::size_t i = 0; i < entries.count; ++i) {
            const Span object = objects_.at(objects_.reference(entries.keys, i));
            const std::string& known = keys[i].object;
            if (object.size() < known.size() ||
                std::memcmp(object.data(), known.data(), known.size()) != 0) {
                return false;
            }
        }
        return true;
    }

    bool readKnownEntries(const Entries& entries, KnownKeys::Set& keys) {
        sink_.beginMap();
        for (std::size_t i = 0; i < entries.count; ++i) {
            // As much as two looks at the key would be.
            if (!spend(2 * keys[i].textSize)) {
                return false;
            }
            sink_.repeatedKey(keys[i].text(), keys[i].form);
            if (!readObject(objects_.reference(entries.values, i))) {
                return false;
            }
        }
        sink_.endMap();
        return true;
    }

    /// False when a key is no text. `isSorted` says whether the keys are in ASCII and ascending, as
    /// in every file of our own.
    bool lookAtKeys(const Entries& entries, bool& isSorted) {
        isSorted = true;
        std::string_view last;
        for (std::size_t i = 0; i < entries.count; ++i) {
            FileText key;
            if (!readKey(objects_.reference(entries.keys, i), key) ||
                (!key.isUTF16 && !isPlainASCII(key.ascii()))) {
                return false;
            }
            isSorted = isSorted && !key.isUTF16 && (i == 0 || last < key.ascii());
            last = key.ascii();
        }
        return true;
    }

    bool readSortedEntries(const Entries& entries) {
        for (std::size_t i = 0; i < entries.count; ++i) {
            FileText key;
            if (!readKey(objects_.reference(entries.keys, i), key)) {
                return false;
            }
            sink_.key(key.ascii());
            if (!readObject(objects_.reference(entries.values, i))) {
                return false;
            }
        }
        return true;
    }

    bool readOtherEntries(const Entries& entries) {
        // Of two equal keys the last one counts.
        std::map<std::string, std::uint64_t> sorted;
        for (std::size_t i = 0; i < entries.count; ++i) {
            FileText key;
            std::string text;
            if (!readKey(objects_.reference(entries.keys, i), key)) {
                return false;
            }
            if (!key.isUTF16) {
                text = key.ascii();
            } else if (!appendUTF8(key.bytes, text)) {
                return false;
            }
            sorted.insert_or_assign(std::move(text), objects_.reference(entries.values, i));
        }
        return std::all_of(sorted.begin(), sorted.end(), [this](const auto& entry) {
            sink_.key(entry.first);
            return readObject(entry.second);
        });
    }

    /// Keeps the keys of the map at hand, which were looked at, for the maps of other files; but
    /// not those that overlap so much that they would take more than the file.
    void keepKeys(const Entries& entries) {
        KnownKeys::Set keys;
        std::size_t left = size_;
        for (std::size_t i = 0; i < entries.count; ++i) {
            const Span object = objects_.at(objects_.reference(entries.keys, i));
            base::ByteReader reader(object);
            std::uint8_t marker = 0;
            Span text;
            static_cast<void>(reader.readU8(marker));
            static_cast<void>(readElements(marker, reader, 1, text));
            const std::size_t size = object.size() - reader.left();
            if (size > left) {
                return;
            }
            left -= size;
            const Span key = object.first(size);
            keys.push_back({std::string(key.begin(), key.end()), text.size(), {}});
        }
        known_->sets[known_->oldest] = std::move(keys);
        known_->oldest = (known_->oldest + 1) % known_->sets.size();
    }

    bool readKey(std::uint64_t object, FileText& key) {
        base::ByteReader reader{Span()};
        std::uint8_t marker = 0;
        return objects_.find(object, marker, reader) && readFileText(marker, reader, key);
    }

    /// Whether the bytes are good text is not looked at.
    bool readFileText(std::uint8_t marker, base::ByteReader& reader, FileText& text) {
        const auto kind = kindOf(marker);
        text.isUTF16 = kind == Kind::utf16Text;
        return (text.isUTF16 || kind == Kind::asciiText) &&
               readElements(marker, reader, text.isUTF16 ? 2 : 1, text.bytes) &&
               spend(text.bytes.size());
    }

    const ObjectTable& objects_;
    /// That of the whole file.
    const std::size_t size_;
    std::size_t work_;
    ValueSink& sink_;
    KnownKeys* const known_;
    std::size_t depth_ = 0;
    /// The UTF-8 form of the text at hand, here so that its memory is used again.
    std::string converted_;
};

} // namespace

bool readBinaryPropertyList(std::span<const std::uint8_t> data, ValueSink& sink, KnownKeys* known) {
    ObjectTable objects;
    return objects.open(data) &&
           Reader(objects, data.size(), sink, known).readObject(objects.top());
}

} // namespace platform
