#pragma once

#include "platform/Date.h"
#include "platform/Link.h"
#include "platform/Result.h"

#include <array>
#include <concepts>
#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace platform {

class Value;

/// Says that there is no value, where there must be one.
struct Null {
    friend bool operator==(const Null&, const Null&) = default;
};

/// 16 bytes that are unique by the way they were made.
struct UniqueIdentifier {
    std::array<std::uint8_t, 16> bytes{};

    friend bool operator==(const UniqueIdentifier&, const UniqueIdentifier&) = default;
};

using Bytes = std::vector<std::uint8_t>;
using ValueList = std::vector<Value>;
/// Sorted by the bytes of the keys, which are UTF-8.
using ValueMap = std::map<std::string, Value, std::less<>>;

namespace value_kinds {

template <typename Kind, typename Content>
inline constexpr bool isKind = false;
template <typename Kind, typename... Kinds>
inline constexpr bool isKind<Kind, std::variant<Kinds...>> = (std::same_as<Kind, Kinds> || ...);

} // namespace value_kinds

/// A value that knows its kind, numbers included: an unsigned 8-bit 1 is neither `true` nor a
/// 32-bit 1. Two values are equal when kind and content are.
class Value {
  public:
    using Content = std::variant<Null, bool, std::int8_t, std::int16_t, std::int32_t, std::int64_t,
                                 std::uint8_t, std::uint16_t, std::uint32_t, std::uint64_t, float,
                                 double, std::string, Bytes, Timestamp, UniqueIdentifier, Link,
                                 Error, ValueList, ValueMap>;

    // Written out in Value.cpp, so that not every source that has a value compiles them.
    Value();
    Value(const Value& other);
    Value(Value&& other) noexcept;
    Value& operator=(const Value& other);
    Value& operator=(Value&& other) noexcept;
    ~Value();

    /// Any of the kinds by its own type, with no conversion.
    // NOLINTBEGIN(google-explicit-constructor): maps of values are written as they read.
    template <typename Kind>
    requires value_kinds::isKind<Kind, Content> Value(Kind content);
    Value(const char* text);
    Value(std::string_view text);
    // NOLINTEND(google-explicit-constructor)

    /// The content when it is of that kind, else null.
    template <typename Kind>
    [[nodiscard]] const Kind* as() const {
        return std::get_if<Kind>(&content_);
    }

    template <typename Kind>
    [[nodiscard]] bool is() const {
        return std::holds_alternative<Kind>(content_);
    }

    [[nodiscard]] const Content& content() const { return content_; }

    friend bool operator==(const Value& left, const Value& right);

  private:
    Content content_;
};

/// The name of the value's kind, for messages: "null", "boolean", "integer", "real", "text",
/// "bytes", "date", "identifier", "link", "error", "list" or "map".
[[nodiscard]] std::string_view kindName(const Value& value);

} // namespace platform
