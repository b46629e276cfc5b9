#include "platform/ValueSink.h"

#include <concepts>
#include <utility>

namespace platform {

namespace {

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

} // namespace

void describe(const Value& value, ValueSink& sink) {
    std::visit(Describer{sink}, value.content());
}

} // namespace platform
