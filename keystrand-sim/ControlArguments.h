#pragma once

#include "base/Digits.h"

#include <concepts>
#include <cstdint>
#include <limits>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand::sim {

/// The words of a control line, taken one by one. A word with '=' in it is a named value, any other
/// stands for itself. The line outlives the arguments.
///
/// What cannot be taken as wanted is remembered: a handler takes all it needs, asks `problem` once
/// and acts only when there is none.
class ControlArguments {
  public:
    explicit ControlArguments(std::string_view line);

    /// The next plain word; missing ones are a problem.
    std::string_view word(std::string_view what);
    [[nodiscard]] bool hasWord() const { return !words_.empty(); }
    /// Takes the plain word when it is there, wherever it stands.
    bool flag(std::string_view name);
    /// `on` is true, `off` is false.
    bool onOrOff();
    /// Bytes in hexadecimal, or the word `empty`.
    std::vector<std::uint8_t> bytes(std::string_view what);

    /// The value of a named word, if it is there.
    std::optional<std::string_view> named(std::string_view name);

    /// A number in decimal between `min` and `max`.
    template <std::integral Number>
    Number numberWord(std::string_view what, Number min = std::numeric_limits<Number>::min(),
                      Number max = std::numeric_limits<Number>::max()) {
        return inRange<Number>(what, word(what), min, max);
    }
    template <std::integral Number>
    std::optional<Number> namedNumber(std::string_view name,
                                      Number min = std::numeric_limits<Number>::min(),
                                      Number max = std::numeric_limits<Number>::max()) {
        const auto text = named(name);
        return text ? std::optional(inRange<Number>(name, *text, min, max)) : std::nullopt;
    }

    /// Remembers a problem of the caller's own.
    void fail(std::string_view what, std::string_view problem);

    /// The first thing that was wrong, a word that nobody took included.
    [[nodiscard]] std::optional<std::string> problem() const;

  private:
    template <std::integral Number>
    Number inRange(std::string_view what, std::string_view text, Number min, Number max) {
        const auto value = base::parseNumber<Number>(text);
        if (!value || *value < min || *value > max) {
            fail(what, "bad number");
            return min;
        }
        return *value;
    }

    std::vector<std::string_view> words_;
    std::map<std::string_view, std::string_view> named_;
    std::string problem_;
};

/// Two lower-case digits for each byte; the word `empty` for no bytes.
[[nodiscard]] std::string toHexWord(std::span<const std::uint8_t> bytes);

/// The bytes of a word that `toHexWord` made, or of upper-case digits. None when it is anything
/// else.
[[nodiscard]] std::optional<std::vector<std::uint8_t>> fromHexWord(std::string_view word);

} // namespace keystrand::sim
