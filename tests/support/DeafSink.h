#pragma once

#include "platform/ValueSink.h"

#include <cstdint>
#include <span>
#include <string_view>

namespace support {

/// Takes any value and keeps nothing, for sinks of tests that want to hear of one thing only.
struct DeafSink : platform::ValueSink {
    void beginMap() override {}
    void key(std::string_view /*key*/) override {}
    void endMap() override {}
    void beginList() override {}
    void endList() override {}
    void null() override {}
    void boolean(bool /*value*/) override {}
    void integer(std::int64_t /*value*/) override {}
    void largeInteger(std::uint64_t /*value*/) override {}
    void real(double /*value*/) override {}
    void text(std::string_view /*utf8*/) override {}
    void bytes(std::span<const std::uint8_t> /*value*/) override {}
    void date(platform::Timestamp /*value*/) override {}
    void other(std::string_view /*kind*/) override {}
};

} // namespace support
