#include "platform/Value.h"

#include <utility>

namespace platform {

namespace {

struct Namer {
    std::string_view operator()(const Null& /*null*/) const { return "null"; }
    std::string_view operator()(bool /*value*/) const { return "boolean"; }
    std::string_view operator()(std::integral auto /*value*/) const { return "integer"; }
    std::string_view operator()(std::floating_point auto /*value*/) const { return "real"; }
    std::string_view operator()(const std::string& /*value*/) const { return "text"; }
    std::string_view operator()(const Bytes& /*value*/) const { return "bytes"; }
    std::string_view operator()(const Timestamp& /*value*/) const { return "date"; }
    std::string_view operator()(const UniqueIdentifier& /*value*/) const { return "identifier"; }
    std::string_view operator()(const Link& /*value*/) const { return "link"; }
    std::string_view operator()(const Error& /*value*/) const { return "error"; }
    std::string_view operator()(const ValueList& /*value*/) const { return "list"; }
    std::string_view operator()(const ValueMap& /*value*/) const { return "map"; }
};

} // namespace

Value::Value() = default;
Value::Value(const Value& other) = default;
Value::Value(Value&& other) noexcept = default;
Value& Value::operator=(const Value& other) = default;
Value& Value::operator=(Value&& other) noexcept = default;
Value::~Value() = default;

template <typename Kind>
requires value_kinds::isKind<Kind, Value::Content> Value::Value(Kind content)
    : content_(std::in_place_type<Kind>, std::move(content)) {}

template Value::Value(Null);
template Value::Value(bool);
template Value::Value(std::int8_t);
template Value::Value(std::int16_t);
template Value::Value(std::int32_t);
template Value::Value(std::int64_t);
template Value::Value(std::uint8_t);
template Value::Value(std::uint16_t);
template Value::Value(std::uint32_t);
template Value::Value(std::uint64_t);
template Value::Value(float);
template Value::Value(double);
template Value::Value(std::string);
template Value::Value(Bytes);
template Value::Value(Timestamp);
template Value::Value(UniqueIdentifier);
template Value::Value(Link);
template Value::Value(Error);
template Value::Value(ValueList);
template Value::Value(ValueMap);

Value::Value(const char* text) : content_(std::in_place_type<std::string>, text) {}
Value::Value(std::string_view text) : content_(std::in_place_type<std::string>, text) {}

bool operator==(const Value& left, const Value& right) {
    return left.content_ == right.content_;
}

std::string_view kindName(const Value& value) {
    return std::visit(Namer(), value.content());
}

} // namespace platform
