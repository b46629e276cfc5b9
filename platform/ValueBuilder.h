#pragma once

#include "platform/ValueSink.h"

#include <string>
#include <utility>
#include <vector>

namespace platform {

/// Makes a whole value of the pieces. Integers become signed 64-bit, those above its range unsigned
/// 64-bit, reals double.
class ValueBuilder final : public ValueSink {
  public:
    void beginMap() override { open_.push_back({ValueMap(), {}}); }
    void key(std::string_view key) override { open_.back().key = key; }
    void endMap() override { closeInnermost(); }
    void beginList() override { open_.push_back({ValueList(), {}}); }
    void endList() override { closeInnermost(); }

    void null() override { add(Null()); }
    void boolean(bool value) override { add(value); }
    void integer(std::int64_t value) override { add(value); }
    void largeInteger(std::uint64_t value) override { add(value); }
    void real(double value) override { add(value); }
    void text(std::string_view utf8) override { add(utf8); }
    void bytes(std::span<const std::uint8_t> value) override {
        add(Bytes(value.begin(), value.end()));
    }
    void date(Timestamp value) override { add(value); }
    /// No text form carries these kinds, so none comes back.
    void other(std::string_view /*kind*/) override { add(Null()); }

    /// The value, once every map and list is ended.
    [[nodiscard]] Value take() { return std::move(value_); }

  private:
    struct Open {
        std::variant<ValueMap, ValueList> content;
        std::string key;
    };

    void closeInnermost();
    void add(Value value);

    std::vector<Open> open_;
    Value value_;
};

} // namespace platform
