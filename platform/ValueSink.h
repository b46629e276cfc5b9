#pragma once

#include "platform/Value.h"

#include <cstdint>
#include <span>
#include <string_view>
#include <utility>

namespace platform {

/// Takes one value piece by piece, so that a large one need never be held whole. What is handed
/// over lasts only for the call.
///
/// A map is beginMap, then key and value for each entry, sorted by the keys' bytes with no key
/// twice, then endMap. A list is beginList, the values, endList. Sources keep to this.
class ValueSink {
  public:
    ValueSink() = default;
    ValueSink(const ValueSink&) = delete;
    ValueSink& operator=(const ValueSink&) = delete;
    virtual ~ValueSink() = default;

    virtual void beginMap() = 0;
    virtual void key(std::string_view key) = 0;
    virtual void endMap() = 0;
    virtual void beginList() = 0;
    virtual void endList() = 0;

    virtual void null() = 0;
    virtual void boolean(bool value) = 0;
    virtual void integer(std::int64_t value) = 0;
    /// Only above the range of `integer`.
    virtual void largeInteger(std::uint64_t value) = 0;
    virtual void real(double value) = 0;
    virtual void text(std::string_view utf8) = 0;
    virtual void bytes(std::span<const std::uint8_t> value) = 0;
    virtual void date(Timestamp value) = 0;
    /// An identifier, a link or an error, by the name of its kind.
    virtual void other(std::string_view kind) = 0;
};

/// Hands a value that is held whole to a sink.
void describe(const Value& value, ValueSink& sink);

namespace value_sink {

struct Describer {
    ValueSink& sink;

    void operator()(const Null& /*null*/) const { sink.null(); }
    void operator()(bool value) const { sink.boolean(value); }
    void operator()(std::signed_integral auto value) const { sink.integer(value); }
    void operator()(std::unsigned_integral auto value) const {
        if (std::in_range<std::int64_t>(value)) {
            sink.integer(static_cast<std::int64_t>(value));
        } else {
            sink.largeInteger(value);
        }
    }
    void operator()(std::floating_point auto value) const { sink.real(value); }
    void operator()(const std::string& value) const { sink.text(value); }
    void operator()(const Bytes& value) const { sink.bytes(value); }
    void operator()(const Timestamp& value) const { sink.date(value); }
    void operator()(const UniqueIdentifier& /*value*/) const { sink.other("identifier"); }
    void operator()(const Link& /*value*/) const { sink.other("link"); }
    void operator()(const Error& /*value*/) const { sink.other("error"); }
    void operator()(const ValueList& list) const {
        sink.beginList();
        for (const Value& value : list) {
            describe(value, sink);
        }
        sink.endList();
    }
    void operator()(const ValueMap& map) const {
        sink.beginMap();
        for (const auto& [key, value] : map) {
            sink.key(key);
            describe(value, sink);
        }
        sink.endMap();
    }
};

} // namespace value_sink

inline void describe(const Value& value, ValueSink& sink) {
    std::visit(value_sink::Describer{sink}, value.content());
}

} // namespace platform
