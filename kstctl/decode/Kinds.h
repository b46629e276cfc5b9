#pragma once

#include "kstctl/decode/Decoded.h"

#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace kstctl::decode {

/// Something that has a byte format of its own.
struct Kind {
    std::string_view name;
    /// For messages: "a notification record".
    std::string_view description;
    Decoder decode;
    /// Whether bytes may be of this kind as far as their length and first bytes tell. Null for a
    /// kind that nothing tells.
    bool (*mayBe)(Bytes bytes) = nullptr;
    /// Whether whatever passes `mayBe` is of this kind, well-formed or not.
    bool isCertain = false;
};

[[nodiscard]] std::span<const Kind> kinds();

/// Null when there is none of that name.
[[nodiscard]] const Kind* findKind(std::string_view name);

/// The kinds that the bytes can be, from their first to their last one.
[[nodiscard]] std::vector<const Kind*> kindsOf(Bytes bytes);

[[nodiscard]] std::vector<std::string> kindNames();

/// Names and codes.
[[nodiscard]] std::vector<std::string> commandNames();

} // namespace kstctl::decode
