#pragma once

#include "base/Digits.h"

#include <algorithm>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

/// Texts of lines that are words with one blank between each two. Any bytes can be a word: as
/// hexadecimal digits.
namespace base {

/// Stands for an empty word.
inline constexpr std::string_view kEmptyWord = "-";

/// Takes the words of one line in their order. What is missing or not as it should be spoils the
/// line: who reads takes all that there is to take, and asks once, in the end, whether it was good.
class LineWords {
  public:
    explicit LineWords(std::string_view line) : rest_(line) {}

    /// Empty, and a spoilt line, when there is none.
    std::string_view word() {
        const std::size_t end = std::min(rest_.find(' '), rest_.size());
        const std::string_view word = rest_.substr(0, end);
        const bool isLast = end == rest_.size();
        rest_.remove_prefix(isLast ? end : end + 1);
        require(!word.empty() && (isLast || !rest_.empty()));
        return word;
    }

    /// A word that may stand for an empty one.
    std::string_view wordOrNothing() {
        const std::string_view taken = word();
        return taken == kEmptyWord ? std::string_view() : taken;
    }

    /// 0 for a word that is none.
    template <std::integral Number>
    Number number() {
        const auto value = parseNumber<Number>(word());
        require(value.has_value());
        return value.value_or(0);
    }

    /// What `hexWord` made a word of.
    std::string bytes() {
        const std::string_view digits = wordOrNothing();
        std::string bytes;
        for (std::size_t at = 0; at < digits.size(); at += 2) {
            const auto high = hexDigitValue(digits[at]);
            const auto low = at + 1 < digits.size() ? hexDigitValue(digits[at + 1]) : std::nullopt;
            require(high && low);
            bytes.push_back(static_cast<char>((high.value_or(0) << 4U) | low.value_or(0)));
        }
        return bytes;
    }

    /// A check of the reader's own.
    void require(bool holds) { isGood_ = isGood_ && holds; }

    /// Whether the line was good, and nothing of it is left.
    [[nodiscard]] bool isDone() const { return isGood_ && rest_.empty(); }

  private:
    std::string_view rest_;
    bool isGood_ = true;
};

[[nodiscard]] inline std::string hexWord(std::string_view bytes) {
    const auto* const data = reinterpret_cast<const std::uint8_t*>(bytes.data());
    return bytes.empty() ? std::string(kEmptyWord) : hexDigits({data, bytes.size()});
}

/// The lines of a text that ends with one; none for any other text.
[[nodiscard]] inline std::optional<std::vector<std::string_view>> linesOf(std::string_view text) {
    std::vector<std::string_view> lines;
    while (!text.empty()) {
        const std::size_t end = text.find('\n');
        if (end == std::string_view::npos) {
            return std::nullopt;
        }
        lines.push_back(text.substr(0, end));
        text.remove_prefix(end + 1);
    }
    return lines;
}

} // namespace base
