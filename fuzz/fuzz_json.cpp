// JSON from outside: what can be read comes back the same after it was written.

#include "platform/formats/JSONCodec.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>

namespace {

base::TextBuffer written(const platform::Value& value) {
    platform::JSONWriter writer;
    platform::describe(value, writer);
    auto text = writer.finish();
    if (!text) {
        std::abort();
    }
    return std::move(text).value();
}

void check(const platform::Value& value) {
    const base::TextBuffer text = written(value);
    // Reals may get longer: 1e5 becomes 100000.0.
    if (text.size() > platform::kMaxJSONSize) {
        return;
    }
    const auto again = platform::readJSON(text.view());
    if (!again || again.value() != value || written(again.value()).view() != text.view()) {
        std::abort();
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (const auto value = platform::readJSON({reinterpret_cast<const char*>(data), size})) {
        check(value.value());
    }
    return 0;
}
