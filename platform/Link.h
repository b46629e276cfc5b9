#pragma once

#include <algorithm>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// An absolute link (URI), as it was written. linkFromText makes one from a text of unknown worth.
struct Link {
    std::string text;

    /// What stands before the first colon, as it was written.
    [[nodiscard]] std::string_view scheme() const {
        const std::string_view all(text);
        return {all.begin(), std::find(all.begin(), all.end(), ':')};
    }

    /// What stands between the "//" behind the scheme and the path: the host, with what surrounds
    /// it. Empty when there is none.
    [[nodiscard]] std::string_view authority() const { return authorityIn(text); }

    /// The same of a text of unknown worth.
    [[nodiscard]] static std::string_view authorityIn(std::string_view text) {
        constexpr std::string_view kBefore = "://";
        const std::size_t begin = text.find(kBefore);
        if (begin == std::string_view::npos) {
            return {};
        }
        const std::string_view rest = text.substr(begin + kBefore.size());
        return rest.substr(0, rest.find_first_of("/?#"));
    }

    friend bool operator==(const Link&, const Link&) = default;
};

namespace link_text {

[[nodiscard]] constexpr bool isLetter(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}

[[nodiscard]] constexpr bool isDigit(char c) {
    return c >= '0' && c <= '9';
}

[[nodiscard]] constexpr bool isHexDigit(char c) {
    return isDigit(c) || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F');
}

[[nodiscard]] constexpr bool isScheme(std::string_view text) {
    return !text.empty() && isLetter(text.front()) &&
           std::all_of(text.begin(), text.end(), [](char c) {
               return isLetter(c) || isDigit(c) || c == '+' || c == '-' || c == '.';
           });
}

/// A character that may stand in a link as itself; a percent sign only begins an escape.
[[nodiscard]] constexpr bool isAllowed(char c) {
    constexpr std::string_view kMarks = "-._~:/?#[]@!$&'()*+,;=";
    return isLetter(c) || isDigit(c) || kMarks.find(c) != std::string_view::npos;
}

[[nodiscard]] constexpr bool isBody(std::string_view text) {
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (text[i] == '%') {
            if (text.size() - i < 3 || !isHexDigit(text[i + 1]) || !isHexDigit(text[i + 2])) {
                return false;
            }
            i += 2;
        } else if (!isAllowed(text[i])) {
            return false;
        }
    }
    return !text.empty();
}

} // namespace link_text

/// Whether a user or a password stands in the text of a link. They are nobody else's business, and
/// never sent.
[[nodiscard]] inline bool namesUser(std::string_view link) {
    return Link::authorityIn(link).find('@') != std::string_view::npos;
}

/// The absolute link that `text` is in full (RFC 3986: a scheme, a colon, and only characters that
/// a link may hold), or none. Whether anything can be reached there is not looked at.
[[nodiscard]] inline std::optional<Link> linkFromText(std::string_view text) {
    const std::size_t colon = text.find(':');
    if (colon == std::string_view::npos || !link_text::isScheme(text.substr(0, colon)) ||
        !link_text::isBody(text.substr(colon + 1))) {
        return std::nullopt;
    }
    return Link{std::string(text)};
}

} // namespace platform
