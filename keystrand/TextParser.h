#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace keystrand {

/// What is wrong with a text, and on which of its lines, counted from 1.
struct TextError {
    std::size_t line = 0;
    std::string reason;
};

/// Takes a text apart into words (letters, digits, '.', '_' and '-') and single marks. Blanks, ends
/// of lines and comments, from '#' to the end of the line, separate. The text outlives the parser
/// and the words that it hands out.
///
/// What cannot be taken as wanted is remembered, the first time only.
class TextParser {
  public:
    explicit TextParser(std::string_view text);

    /// Takes the next word; anything else is an error: `what` was expected.
    [[nodiscard]] std::optional<std::string_view> word(std::string_view what);
    /// Takes the next word as a decimal number.
    [[nodiscard]] std::optional<std::uint32_t> number(std::string_view what);
    /// Takes that word, or that mark; anything else is an error.
    [[nodiscard]] bool keyword(std::string_view wanted);
    [[nodiscard]] bool mark(char wanted);

    /// Takes what is wanted if it is next.
    [[nodiscard]] bool takeWord(std::string_view wanted);
    [[nodiscard]] bool takeMark(char wanted);

    [[nodiscard]] bool atEnd() const { return token_.empty(); }

    /// Remembers a problem of the caller's own, with what was taken last.
    void fail(std::string reason);
    [[nodiscard]] const std::optional<TextError>& error() const { return error_; }

  private:
    void skipBlanks();
    void advance();
    void failExpecting(std::string_view what);
    void failAt(std::size_t line, std::string reason);
    [[nodiscard]] bool isWord() const;

    std::string_view rest_;
    std::size_t line_ = 1;
    /// What comes next, empty at the end.
    std::string_view token_;
    /// Where what was taken last stands.
    std::size_t lineOfLast_ = 1;
    std::optional<TextError> error_;
};

} // namespace keystrand
