#include "kstd/Analytics/SQLite/KSTDValueType.h"

#include "kstd/Analytics/SQLite/DatabaseTexts.h"

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <type_traits>
#include <utility>

namespace kstd {

namespace {

/// The type codes in the order of the table, and behind them the one that has no row.
constexpr std::string_view kScalarEncodings = "csilqCSILQfdBv*@#:";
constexpr std::uint64_t kPointerSize = 8;

struct EncodingNamer {
    char operator()(bool /*value*/) const { return 'B'; }
    char operator()(std::int8_t /*value*/) const { return 'c'; }
    char operator()(std::int16_t /*value*/) const { return 's'; }
    char operator()(std::int32_t /*value*/) const { return 'i'; }
    char operator()(std::int64_t /*value*/) const { return 'q'; }
    char operator()(std::uint8_t /*value*/) const { return 'C'; }
    char operator()(std::uint16_t /*value*/) const { return 'S'; }
    char operator()(std::uint32_t /*value*/) const { return 'I'; }
    char operator()(std::uint64_t /*value*/) const { return 'Q'; }
    char operator()(float /*value*/) const { return 'f'; }
    char operator()(double /*value*/) const { return 'd'; }
    template <typename Object>
    requires(!std::is_arithmetic_v<Object>) char operator()(const Object& /*value*/) const {
        return '@';
    }
};

/// The bytes of a number or of a boolean; false for everything else.
struct ByteCopier {
    platform::Bytes& bytes;

    template <typename Kind>
    bool operator()(const Kind& content) const {
        if constexpr (std::is_arithmetic_v<Kind>) {
            bytes.resize(sizeof(content));
            std::memcpy(bytes.data(), &content, sizeof(content));
        }
        return std::is_arithmetic_v<Kind>;
    }
};

[[noreturn]] void stop(platform::SystemLog& log, const std::string& message) {
    log.write(platform::LogLevel::error, message, {});
    std::abort();
}

/// Makes a value of bytes, of which there are enough.
using Boxer = platform::Value (*)(std::span<const std::uint8_t>);

template <typename Kind>
Kind contentOf(std::span<const std::uint8_t> bytes) {
    Kind content{};
    // A pointer is read like any other content. NOLINTNEXTLINE(bugprone-sizeof-expression)
    std::memcpy(&content, bytes.data(), sizeof(content));
    return content;
}

template <typename Kind>
platform::Value number(std::span<const std::uint8_t> bytes) {
    return contentOf<Kind>(bytes);
}

platform::Value boolean(std::span<const std::uint8_t> bytes) {
    // Not copied into a bool, which holds no byte but 0 and 1.
    return contentOf<std::uint8_t>(bytes) != 0;
}

platform::Value object(std::span<const std::uint8_t> bytes) {
    const auto* const value = contentOf<const platform::Value*>(bytes);
    return value == nullptr ? platform::Value() : *value;
}

/// Null for a type that cannot be boxed.
Boxer boxerFor(std::uint64_t code) {
    constexpr Boxer kBoxersByCode[] = {
        number<std::int8_t>,
        number<std::int16_t>,
        number<std::int32_t>,
        number<std::int64_t>,
        number<std::int64_t>,
        number<std::uint8_t>,
        number<std::uint16_t>,
        number<std::uint32_t>,
        number<std::uint64_t>,
        number<std::uint64_t>,
        number<float>,
        number<double>,
        boolean,
    };
    if (code == KSTDValueType::kObjectCode) {
        return object;
    }
    return code < std::size(kBoxersByCode) ? kBoxersByCode[code] : nullptr;
}

/// The class name in @"name", or none.
std::optional<std::string> quotedClassName(std::string_view encoding) {
    constexpr std::size_t kShortest = 4;
    if (encoding.size() < kShortest || !encoding.starts_with("@\"") || !encoding.ends_with('"')) {
        return std::nullopt;
    }
    return std::string(encoding.substr(2, encoding.size() - 3));
}

} // namespace

KSTDValueType::KSTDValueType(std::uint64_t code, std::string_view encoding, std::string_view name,
                             std::uint64_t size, std::uint64_t flags,
                             std::optional<std::string> className)
    : code_(code),
      encoding_(encoding),
      name_(name),
      className_(std::move(className)),
      size_(size),
      flags_(flags) {}

const std::array<KSTDValueType, KSTDValueType::kScalarTypeCount>& KSTDValueType::scalarTypes() {
    static const std::array<KSTDValueType, kScalarTypeCount> types = {
        KSTDValueType(0, "c", "char", 1, kIntegerFlag),
        KSTDValueType(1, "s", "short", 2, kIntegerFlag),
        KSTDValueType(2, "i", "int", 4, kIntegerFlag),
        KSTDValueType(3, "l", "long", 8, kIntegerFlag),
        KSTDValueType(4, "q", "long long", 8, kIntegerFlag),
        KSTDValueType(5, "C", "unsigned char", 1, kIntegerFlag),
        KSTDValueType(6, "S", "unsigned short", 2, kIntegerFlag),
        KSTDValueType(7, "I", "unsigned int", 4, kIntegerFlag),
        KSTDValueType(8, "L", "unsigned long", 8, kIntegerFlag),
        KSTDValueType(9, "Q", "unsigned long long", 8, kIntegerFlag),
        KSTDValueType(kFloatCode, "f", "float", 4, kFloatingPointFlag),
        KSTDValueType(11, "d", "double", 8, kFloatingPointFlag),
        KSTDValueType(12, "B", "bool", 1, kIntegerFlag),
        KSTDValueType(13, "v", "void", 1, 0),
        KSTDValueType(14, "*", "char*", kPointerSize, 0),
        KSTDValueType(kObjectCode, "@", "id", kPointerSize, 0),
        KSTDValueType(16, "#", "Class", kPointerSize, 0),
    };
    return types;
}

KSTDValueType KSTDValueType::typeForEncoding(std::string_view encoding, platform::SystemLog& log) {
    if (std::optional<std::string> className = quotedClassName(encoding)) {
        return {kObjectCode, encoding, "id", kPointerSize, 0, std::move(className)};
    }
    const char first = encoding.empty() ? '\0' : encoding.front();
    switch (first) {
    case '[':
        return {18, encoding, "array", 0, 0};
    case '{':
        return {19, encoding, "structure", 0, 0};
    case '(':
        return {20, encoding, "union", 0, 0};
    case 'b':
        return {21, encoding, "bitfield", 0, 0};
    case '^':
        return {22, encoding, "pointer", kPointerSize, 0};
    default:
        break;
    }
    const std::size_t index = kScalarEncodings.find(first);
    if (index == std::string_view::npos) {
        return {23, encoding, "unknown", 0, 0};
    }
    // Only the last of the encodings, ':', comes here. That it has no row, and asking for it stops
    // the process as any index out of range would, is meant so.
    if (index >= kScalarTypeCount) {
        stop(log, formatText("KSTDValueType: index %lu is out of range, there are %lu types",
                             {index, kScalarTypeCount}));
    }
    return scalarTypes()[index];
}

const KSTDValueType& KSTDValueType::typeForValue(const platform::Value& value) {
    const char encoding = std::visit(EncodingNamer(), value.content());
    return scalarTypes()[kScalarEncodings.find(encoding)];
}

platform::Value KSTDValueType::objectWithBytes(std::span<const std::uint8_t> bytes,
                                               platform::SystemLog& log) const {
    const Boxer boxer = boxerFor(code_);
    if (boxer == nullptr) {
        stop(log, formatText("For class KSTDValueType, Unsupported boxing type: %@", {name_}));
    }
    if (bytes.size() < size_) {
        stop(log, formatText("KSTDValueType: %lu bytes are too few for %@", {bytes.size(), name_}));
    }
    return boxer(bytes);
}

void KSTDValueType::getBytes(platform::Bytes& bytes, const platform::Value& forObject,
                             platform::SystemLog& log) const {
    if (!std::visit(ByteCopier{bytes}, forObject.content())) {
        stop(log, formatText("Unsupported unboxing type: %@", {name_}));
    }
}

} // namespace kstd
