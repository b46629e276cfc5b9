#pragma once

#include "platform/PropertyLists.h"
#include "platform/Result.h"
#include "platform/Value.h"
#include "platform/ValueSink.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace platform {

/// The binary form of property lists, version 1.0.
///
///     magic            8 bytes: "bplist00"
///     object table     the objects, one behind the other, in any order
///     offset table     where each object begins, counted from the start of the magic; the n-th
///                      entry is of object n, and all entries are of one width
///     trailer          32 bytes:
///                        0  5  unused
///                        5  1  a sort version, which nobody uses
///                        6  1  width of an entry of the offset table, in bytes
///                        7  1  width of a reference, in bytes
///                        8  8  number of objects
///                       16  8  the number of the object that is the whole value
///                       24  8  where the offset table begins
///
/// All numbers have their high byte first. A reference is the number of an object. An object begins
/// with a marker byte: its kind in the high half, in the low half what the table shows as `n`.
///
///     08, 09   false, true
///     1n       integer in 2^n bytes: 1, 2 and 4 bytes are unsigned, 8 and 16 bytes signed
///     22, 23   real in 4 or 8 bytes (IEEE 754)
///     33       date: seconds since 2001-01-01 00:00:00 UTC, a real in 8 bytes
///     4n       n bytes
///     5n       text of n bytes in ASCII
///     6n       text of n units in UTF-16
///     An       list of n references
///     Dn       map of n entries: n references to the keys, then n to the values
///
/// An `n` of 15 says that the number follows as an integer object, and the content behind it.
///
/// Both functions may be called from any thread.

inline constexpr std::string_view kBinaryPropertyListMagic = "bplist00";

/// How deep lists and maps may lie in each other, the outermost one counted.
inline constexpr std::size_t kMaxPropertyListDepth = 128;

/// The value in the binary form: integers in the least width that holds them (8 bytes when
/// negative, 16 bytes from 2^63 up), reals in 8 bytes, references of the least width, a map's keys
/// in the order of their bytes. The same value always gives the same bytes.
///
/// Fails with an error of kGenericErrorDomain, whose description names the kind, when a null, an
/// identifier, a link or an error is anywhere in the value, or a text that is not UTF-8 or holds a
/// NUL; also when it is nested deeper than kMaxPropertyListDepth.
[[nodiscard]] Result<Bytes> writeBinaryPropertyList(const Value& value);

/// What a reader may spend on `size` bytes: kPropertyListWorkPerValue for every key and value, and
/// 1 for every byte of a text or of bytes, each as often as it is referred to. Without lists and
/// maps that are referred to more than once no file of usual shape comes near it.
[[nodiscard]] constexpr std::size_t propertyListWork(std::size_t size) {
    constexpr std::size_t kAnyFile = 1024UL * 1024;
    constexpr std::size_t kPerByte = 16;
    return kAnyFile + kPerByte * size;
}
inline constexpr std::size_t kPropertyListWorkPerValue = 16;

/// Reads what writeBinaryPropertyList writes and what others do: maps in any order, a key twice
/// (the later value counts), objects that are referred to more than once, 4-byte reals, texts of
/// ASCII characters in UTF-16, integers in more bytes than they need.
///
/// False for everything that the table above does not show, an integer outside the range from -2^63
/// to 2^64-1, a key that is not a text, a text with a NUL, a nesting deeper than
/// kMaxPropertyListDepth (an object that is inside itself is always that) and more work than
/// propertyListWork. The sink has then taken some part of the value. Never allocates more than what
/// the bytes at hand account for, and nothing at all when texts are in ASCII and maps are sorted.
///
/// With `known` a map that is the whole value, and whose keys are one of the sets there, costs no
/// second look at them; other keys that are in ASCII and sorted become a set there. All else is as
/// without it, and `known` holds no more of a file than its size.
[[nodiscard]] bool readBinaryPropertyList(std::span<const std::uint8_t> data, ValueSink& sink,
                                          KnownKeys* known = nullptr);

inline constexpr std::size_t kMaxXMLPropertyListSize = 1024UL * 1024;
/// Lists and maps in one file, empty ones and those in comments counted too.
inline constexpr std::size_t kMaxXMLPropertyListContainers = 10'000;

/// Reads a property list in the XML form, by libplist. Of a key that stands twice the later value
/// counts.
///
/// False for what libplist does not take for a property list, a text or key that is not UTF-8, and
/// anything beyond the limits above or deeper than kMaxPropertyListDepth. The sink has then taken
/// some part of it. Also false for everything when libplist, which the first call loads, is not
/// there.
///
/// libplist 2.2 is no judge of single values: an integer, real or date that is malformed becomes
/// some number or date (12abc is 12, abc is 0), an integer beyond 64 bits the nearest end or
/// anything, and what follows the value is not looked at. What is well-formed comes as it is
/// written: integers from -2^63 to 2^64-1 with their sign, reals, dates of any year to the second.
[[nodiscard]] bool readXMLPropertyList(std::span<const std::uint8_t> data, ValueSink& sink);

/// Property lists: what begins with the magic of the binary form is read as that, everything else
/// as the XML form, each as above.
class PropertyListCodec final : public PropertyLists {
  public:
    [[nodiscard]] Result<Bytes> binary(const Value& value) override {
        return writeBinaryPropertyList(value);
    }

    [[nodiscard]] bool read(std::span<const std::uint8_t> data, ValueSink& sink) override {
        return isBinary(data) ? readBinaryPropertyList(data, sink)
                              : readXMLPropertyList(data, sink);
    }

    [[nodiscard]] bool readKnowing(KnownKeys& known, std::span<const std::uint8_t> data,
                                   ValueSink& sink) override {
        return isBinary(data) ? readBinaryPropertyList(data, sink, &known)
                              : readXMLPropertyList(data, sink);
    }

  private:
    [[nodiscard]] static bool isBinary(std::span<const std::uint8_t> data) {
        const std::string_view start(reinterpret_cast<const char*>(data.data()), data.size());
        return start.starts_with(kBinaryPropertyListMagic);
    }
};

} // namespace platform
