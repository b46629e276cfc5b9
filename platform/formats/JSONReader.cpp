#include "base/Concat.h"
#include "platform/JSON.h"
#include "platform/ValueBuilder.h"
#include "platform/formats/JSONCodec.h"

#include <charconv>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <system_error>

namespace platform {

namespace {

using Encoding = rapidjson::UTF8<>;
using Length = rapidjson::SizeType;

/// Nesting must not use up the stack. Numbers come as they were written: in the library's own
/// conversion an exponent of many digits overflows.
constexpr unsigned kFlags = rapidjson::kParseIterativeFlag | rapidjson::kParseValidateEncodingFlag |
                            rapidjson::kParseNumbersAsStringsFlag;

/// The library takes the second half of a surrogate pair for a character when it stands alone. That
/// is the only way for a surrogate to get through; in UTF-8 it begins with ED and a byte from A0
/// up.
[[nodiscard]] bool holdsSurrogate(std::string_view text) {
    std::size_t at = text.find('\xED');
    while (at != std::string_view::npos && static_cast<std::uint8_t>(text[at + 1]) < 0xA0) {
        at = text.find('\xED', at + 1);
    }
    return at != std::string_view::npos;
}

/// The number that the text is in full, if it is one of this type.
template <typename Number>
[[nodiscard]] std::optional<Number> numberIn(std::string_view text) {
    Number number{};
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, number);
    if (result.ec != std::errc() || result.ptr != end) {
        return std::nullopt;
    }
    return number;
}

/// Passes what the library finds on to a builder. An operation that returns false stops the
/// library.
class Handler : public rapidjson::BaseReaderHandler<Encoding, Handler> {
  public:
    bool Null() {
        builder_.null();
        return true;
    }

    bool Bool(bool value) {
        builder_.boolean(value);
        return true;
    }

    bool RawNumber(const char* characters, Length length, bool /*copy*/) {
        return number({characters, length});
    }

    bool String(const char* characters, Length length, bool /*copy*/) {
        builder_.text({characters, length});
        return isText({characters, length});
    }

    bool Key(const char* characters, Length length, bool /*copy*/) {
        builder_.key({characters, length});
        return isText({characters, length});
    }

    bool StartObject() {
        builder_.beginMap();
        return isDepthLeft();
    }

    bool EndObject(Length /*count*/) {
        builder_.endMap();
        --depth_;
        return true;
    }

    bool StartArray() {
        builder_.beginList();
        return isDepthLeft();
    }

    bool EndArray(Length /*count*/) {
        builder_.endList();
        --depth_;
        return true;
    }

    [[nodiscard]] Value take() { return builder_.take(); }

    /// Why an operation returned false.
    [[nodiscard]] std::string_view objection() const { return objection_; }

  private:
    bool number(std::string_view digits) {
        if (const auto small = numberIn<std::int64_t>(digits)) {
            builder_.integer(*small);
        } else if (const auto large = numberIn<std::uint64_t>(digits)) {
            builder_.largeInteger(*large);
        } else if (const auto real = numberIn<double>(digits)) {
            builder_.real(*real);
        } else {
            return objectTo("Number out of the range of a double.");
        }
        return true;
    }

    bool isText(std::string_view text) {
        if (holdsSurrogate(text)) {
            return objectTo("Half of a surrogate pair in string.");
        }
        return true;
    }

    bool isDepthLeft() {
        if (++depth_ > kMaxJSONDepth) {
            return objectTo("Nested too deep.");
        }
        return true;
    }

    bool objectTo(std::string_view what) {
        objection_ = what;
        return false;
    }

    ValueBuilder builder_;
    std::size_t depth_ = 0;
    std::string_view objection_;
};

[[nodiscard]] Error failure(std::size_t offset, std::string_view what) {
    return {kGenericErrorDomain, 0, base::concat("no JSON from byte ", offset, " on: ", what)};
}

[[nodiscard]] std::string_view reason(rapidjson::ParseErrorCode code, const Handler& handler) {
    return code == rapidjson::kParseErrorTermination ? handler.objection()
                                                     : rapidjson::GetParseError_En(code);
}

} // namespace

Result<Value> readJSON(std::string_view text) {
    if (text.size() > kMaxJSONSize) {
        return failure(kMaxJSONSize, "The text is too long.");
    }
    rapidjson::MemoryStream stream(text.data(), text.size());
    rapidjson::GenericReader<Encoding, Encoding> reader;
    Handler handler;
    const rapidjson::ParseResult result = reader.Parse<kFlags>(stream, handler);
    if (result.IsError()) {
        return failure(result.Offset(), reason(result.Code(), handler));
    }
    // For the library the text ends at a zero byte.
    if (stream.Tell() < text.size()) {
        return failure(stream.Tell(),
                       reason(rapidjson::kParseErrorDocumentRootNotSingular, handler));
    }
    return handler.take();
}

} // namespace platform
