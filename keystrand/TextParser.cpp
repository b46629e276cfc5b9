#include "keystrand/TextParser.h"

#include "base/Concat.h"
#include "base/Digits.h"

#include <algorithm>
#include <utility>

namespace keystrand {

namespace {

constexpr std::string_view kBlanksOrNewline = " \t\r\n";
constexpr std::string_view kWordMarks = "._-";

bool isWordCharacter(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
           kWordMarks.find(c) != std::string_view::npos;
}

bool isPrintable(std::string_view token) {
    return token.front() > ' ' && token.front() <= '~';
}

} // namespace

TextParser::TextParser(std::string_view text) : rest_(text) {
    advance();
    lineOfLast_ = line_;
}

void TextParser::skipBlanks() {
    while (!rest_.empty()) {
        std::size_t length = 1;
        if (rest_.front() == '#') {
            length = std::min(rest_.find('\n'), rest_.size());
        } else if (kBlanksOrNewline.find(rest_.front()) == std::string_view::npos) {
            return;
        } else if (rest_.front() == '\n') {
            ++line_;
        }
        rest_.remove_prefix(length);
    }
}

void TextParser::advance() {
    lineOfLast_ = line_;
    skipBlanks();
    const auto* end = std::find_if_not(rest_.begin(), rest_.end(), isWordCharacter);
    const auto length = static_cast<std::size_t>(end - rest_.begin());
    // A character that no word has is a token of its own.
    token_ = rest_.substr(0, std::max<std::size_t>(length, 1));
    rest_.remove_prefix(token_.size());
}

bool TextParser::isWord() const {
    return !token_.empty() && isWordCharacter(token_.front());
}

std::optional<std::string_view> TextParser::word(std::string_view what) {
    if (!isWord()) {
        failExpecting(what);
        return std::nullopt;
    }
    const std::string_view word = token_;
    advance();
    return word;
}

std::optional<std::uint32_t> TextParser::number(std::string_view what) {
    const auto text = word(what);
    if (!text) {
        return std::nullopt;
    }
    const auto value = base::parseNumber<std::uint32_t>(*text);
    if (!value) {
        fail(base::concat(what, " is not a number: ", *text));
    }
    return value;
}

bool TextParser::keyword(std::string_view wanted) {
    if (takeWord(wanted)) {
        return true;
    }
    failExpecting(wanted);
    return false;
}

bool TextParser::mark(char wanted) {
    return keyword({&wanted, 1});
}

bool TextParser::takeWord(std::string_view wanted) {
    if (token_ != wanted) {
        return false;
    }
    advance();
    return true;
}

bool TextParser::takeMark(char wanted) {
    return takeWord({&wanted, 1});
}

void TextParser::fail(std::string reason) {
    // What is wrong with a word is found once it has been taken.
    failAt(lineOfLast_, std::move(reason));
}

void TextParser::failExpecting(std::string_view what) {
    if (atEnd()) {
        failAt(line_, base::concat(what, " expected at the end"));
    } else if (isPrintable(token_)) {
        failAt(line_, base::concat(what, " expected before ", token_));
    } else {
        failAt(line_, base::concat(what, " expected before a byte that is no text"));
    }
}

void TextParser::failAt(std::size_t line, std::string reason) {
    // Those that come later only follow from the first.
    if (!error_) {
        error_ = {.line = line, .reason = std::move(reason)};
    }
}

} // namespace keystrand
