#pragma once

#include <cstddef>
#include <cstdint>

/// The numbers of the binary form that both its writer and its reader need; BinaryPropertyList.h
/// describes the form.
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

} // namespace platform::binary_property_list
