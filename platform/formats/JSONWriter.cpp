#include "base/Concat.h"
#include "platform/formats/JSONCodec.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <concepts>
#include <cstring>
#include <limits>
#include <rapidjson/internal/dtoa.h>
#include <rapidjson/writer.h>
#include <string>
#include <utility>

namespace platform {

namespace {

using Encoding = rapidjson::UTF8<>;

template <typename Output>
using Writer = rapidjson::Writer<Output, Encoding, Encoding, rapidjson::CrtAllocator,
                                 rapidjson::kWriteValidateEncodingFlag>;

template <std::integral Integer>
void appendInteger(base::TextBuffer& buffer, Integer number) {
    constexpr std::size_t kMostDigits = std::numeric_limits<Integer>::digits10 + 2;
    buffer.appendWritten(kMostDigits, [number](char* place) {
        return std::to_chars(place, place + kMostDigits, number).ptr;
    });
}

class BufferOutput {
  public:
    using Ch = char;

    explicit BufferOutput(base::TextBuffer& buffer) : buffer_(buffer) {}

    void Put(char character) { buffer_.append(character); }
    void Flush() {}

  private:
    base::TextBuffer& buffer_;
};

/// The number is finite.
void appendReal(base::TextBuffer& buffer, double number) {
    // Takes the longest one: sign, 17 digits, point, exponent.
    std::array<char, 32> characters;
    const std::string_view text(characters.data(),
                                rapidjson::internal::dtoa(number, characters.data()));
    if (text.find('.') != std::string_view::npos) {
        buffer.append(text);
        return;
    }
    // A single digit with an exponent, such as 1e25, comes from the library without a fraction.
    const std::size_t digits = std::min(text.find('e'), text.size());
    buffer.append(text.substr(0, digits));
    buffer.append(".0");
    buffer.append(text.substr(digits));
}

[[nodiscard]] std::size_t lengthOfCharacter(char firstByte) {
    const auto byte = static_cast<std::uint8_t>(firstByte);
    return byte >= 0xF0 ? 4 : byte >= 0xE0 ? 3 : byte >= 0xC0 ? 2 : 1;
}

/// The library checks a character only when it has read all its bytes, also those behind the end of
/// the text.
[[nodiscard]] bool endsWithinCharacter(std::string_view text) {
    const std::size_t most = std::min<std::size_t>(text.size(), 3);
    for (std::size_t left = 1; left <= most; ++left) {
        if (lengthOfCharacter(text[text.size() - left]) > left) {
            return true;
        }
    }
    return false;
}

[[nodiscard]] bool isPlainByte(char character) {
    const auto byte = static_cast<std::uint8_t>(character);
    return byte >= 0x20 && byte < 0x80 && byte != '"' && byte != '\\';
}

/// The same for each of the 8 bytes at `text`.
[[nodiscard]] bool isPlainWord(const char* text) {
    constexpr std::uint64_t kEveryByte = 0x0101010101010101;
    std::uint64_t word = 0;
    std::memcpy(&word, text, sizeof word);
    // Among bytes without their high bit only one that is less than what is taken away gets it.
    const std::uint64_t lessThanBlank = word - kEveryByte * 0x20;
    const std::uint64_t isQuote = (word ^ (kEveryByte * '"')) - kEveryByte;
    const std::uint64_t isBackslash = (word ^ (kEveryByte * '\\')) - kEveryByte;
    return ((word | lessThanBlank | isQuote | isBackslash) & (kEveryByte * 0x80)) == 0;
}

/// Most keys and texts: printable ASCII that stands for itself.
[[nodiscard]] bool isPlain(std::string_view text) {
    constexpr std::size_t kWord = sizeof(std::uint64_t);
    if (text.size() < kWord) {
        return std::all_of(text.begin(), text.end(), isPlainByte);
    }
    for (std::size_t i = 0; i < text.size() - kWord; i += kWord) {
        if (!isPlainWord(text.data() + i)) {
            return false;
        }
    }
    return isPlainWord(text.data() + text.size() - kWord);
}

/// False when the text is not UTF-8; what was appended until then stays.
[[nodiscard]] bool appendEscaped(base::TextBuffer& buffer, std::string_view text) {
    using Length = rapidjson::SizeType;
    if (text.size() > std::numeric_limits<Length>::max() || endsWithinCharacter(text)) {
        return false;
    }
    BufferOutput output(buffer);
    return Writer<BufferOutput>(output).String(text.data(), static_cast<Length>(text.size()));
}

/// Appends the text between quotation marks; false as above.
[[nodiscard]] bool appendQuoted(base::TextBuffer& buffer, std::string_view text) {
    if (!isPlain(text)) {
        return appendEscaped(buffer, text);
    }
    buffer.append(text, '"');
    return true;
}

} // namespace

void JSONWriter::key(std::string_view key) {
    if (depthLeftOut_ > 0) {
        return;
    }
    beginEntry();
    if (appendQuoted(text_, key)) {
        text_.append(':');
        if (isPretty_) {
            text_.append(' ');
        }
        hasKey_ = true;
    } else {
        text_.truncate(entryStart_);
        isKeyLeftOut_ = true;
    }
}

void JSONWriter::repeatedKey(std::string_view key, std::string& form) {
    constexpr std::string_view kComma = ",";
    if (form.empty()) {
        JSONWriter alone;
        alone.key(key);
        form = base::concat(kComma, alone.text_.view());
    }
    const bool isExpressed = form != kComma;
    if (!isExpressed || isPretty_ || depthLeftOut_ > 0) {
        this->key(key);
        return;
    }
    entryStart_ = text_.size();
    text_.append(std::string_view(form).substr(isFirst_ ? kComma.size() : 0));
    hasKey_ = true;
}

void JSONWriter::integer(std::int64_t value) {
    if (openValue()) {
        appendInteger(text_, value);
        closeValue(true);
    }
}

void JSONWriter::largeInteger(std::uint64_t value) {
    if (openValue()) {
        appendInteger(text_, value);
        closeValue(true);
    }
}

void JSONWriter::real(double value) {
    if (openValue()) {
        const bool isExpressed = std::isfinite(value);
        if (isExpressed) {
            appendReal(text_, value);
        }
        closeValue(isExpressed);
    }
}

void JSONWriter::text(std::string_view utf8) {
    if (openValue()) {
        closeValue(appendQuoted(text_, utf8));
    }
}

JSONText::Mark JSONWriter::mark() const {
    return {text_.size(), depth_ + depthLeftOut_, isFirst_};
}

void JSONWriter::rewind(const Mark& mark) {
    text_.truncate(mark.size);
    depth_ = std::min(depth_, mark.depth);
    depthLeftOut_ = mark.depth - depth_;
    isFirst_ = mark.isFirst;
    hasKey_ = false;
    isKeyLeftOut_ = false;
}

void JSONWriter::moveTo(base::TextBuffer& taken) {
    taken.append(text_.view());
    text_.truncate(0);
    entryStart_ = 0;
}

Result<base::TextBuffer> JSONWriter::finish() {
    if (depth_ + depthLeftOut_ > 0) {
        return Error{kGenericErrorDomain, 0, "a map or list of the JSON text is still open"};
    }
    if (text_.size() == 0) {
        return Error{kGenericErrorDomain, 0, "there is no value that JSON can express"};
    }
    return std::move(text_);
}

void JSONWriter::begin(char bracket) {
    if (depthLeftOut_ > 0 || std::exchange(isKeyLeftOut_, false)) {
        ++depthLeftOut_;
    } else if (openValue()) {
        text_.append(bracket);
        ++depth_;
        isFirst_ = true;
    }
}

void JSONWriter::end(char bracket) {
    if (depthLeftOut_ > 0) {
        --depthLeftOut_;
    } else {
        --depth_;
        if (!isFirst_) {
            breakLine(depth_);
        }
        text_.append(bracket);
        isFirst_ = false;
    }
}

void JSONWriter::constant(std::string_view text) {
    if (openValue()) {
        text_.append(text);
        closeValue(true);
    }
}

void JSONWriter::leaveOut() {
    if (openValue()) {
        closeValue(false);
    }
}

bool JSONWriter::openValue() {
    if (depthLeftOut_ > 0 || std::exchange(isKeyLeftOut_, false)) {
        return false;
    }
    if (!std::exchange(hasKey_, false)) {
        beginEntry();
    }
    return true;
}

void JSONWriter::closeValue(bool isExpressed) {
    if (isExpressed) {
        isFirst_ = false;
    } else {
        text_.truncate(entryStart_);
    }
}

void JSONWriter::beginEntry() {
    entryStart_ = text_.size();
    if (!isFirst_) {
        text_.append(',');
    }
    if (depth_ > 0) {
        breakLine(depth_);
    }
}

void JSONWriter::breakLine(std::size_t depth) {
    if (isPretty_) {
        text_.append('\n');
        for (std::size_t i = 0; i < depth; ++i) {
            text_.append("  ");
        }
    }
}

} // namespace platform
