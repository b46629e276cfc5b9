#pragma once

#include "platform/SystemLog.h"
#include "platform/Value.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace kstd {

/// Describes a type of values: its one-character type code, its size, and whether it is a number.
///
/// Where an operation says that it stops, the caller is broken: an error line is written to the log
/// and the process aborts. May be used from any thread.
class KSTDValueType {
  public:
    /// The type that a type code names. Stops for ":", which no type has.
    [[nodiscard]] static KSTDValueType typeForEncoding(std::string_view encoding,
                                                       platform::SystemLog& log);
    /// The type of the value's own kind; everything but numbers and booleans is an object.
    [[nodiscard]] static const KSTDValueType& typeForValue(const platform::Value& value);

    /// The value whose bytes, in this machine's order, are in memory: a number of exactly this
    /// type, or for an object the value that the pointer (const platform::Value*) in the bytes
    /// points to, null for a null pointer. Stops for every other type, and for too few bytes.
    [[nodiscard]] platform::Value objectWithBytes(std::span<const std::uint8_t> bytes,
                                                  platform::SystemLog& log) const;
    /// Makes `bytes` the bytes of the number or boolean in `forObject`, of its own kind and in this
    /// machine's order. Stops for everything else.
    void getBytes(platform::Bytes& bytes, const platform::Value& forObject,
                  platform::SystemLog& log) const;

    [[nodiscard]] std::uint64_t code() const { return code_; }
    [[nodiscard]] const std::string& encoding() const { return encoding_; }
    [[nodiscard]] const std::string& name() const { return name_; }
    /// Only for an object whose type code names its class.
    [[nodiscard]] const std::optional<std::string>& className() const { return className_; }
    /// In bytes; 0 when the type code alone does not say.
    [[nodiscard]] std::uint64_t size() const { return size_; }
    [[nodiscard]] std::uint64_t flags() const { return flags_; }

    [[nodiscard]] bool isNumber() const { return flags_ != 0; }
    [[nodiscard]] bool isIntegerNumber() const { return flags_ == kIntegerFlag; }
    [[nodiscard]] bool isFloatingPointNumber() const { return flags_ == kFloatingPointFlag; }
    [[nodiscard]] bool isObject() const { return code_ == kObjectCode; }

    static constexpr std::uint64_t kFloatCode = 10;
    static constexpr std::uint64_t kObjectCode = 15;
    static constexpr std::uint64_t kIntegerFlag = 1;
    static constexpr std::uint64_t kFloatingPointFlag = 2;

  private:
    static constexpr std::size_t kScalarTypeCount = 17;

    /// Each at the index that is its code.
    static const std::array<KSTDValueType, kScalarTypeCount>& scalarTypes();

    KSTDValueType(std::uint64_t code, std::string_view encoding, std::string_view name,
                  std::uint64_t size, std::uint64_t flags,
                  std::optional<std::string> className = std::nullopt);

    std::uint64_t code_;
    std::string encoding_;
    std::string name_;
    std::optional<std::string> className_;
    std::uint64_t size_;
    std::uint64_t flags_;
};

} // namespace kstd
