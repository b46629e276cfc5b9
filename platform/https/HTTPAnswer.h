#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// Collects what a server sends, up to the limits, and remembers which one was passed.
class HTTPAnswer {
  public:
    /// With no maximum nothing of the body is kept.
    HTTPAnswer(std::optional<std::size_t> maximumBody, std::size_t maximumHeaders)
        : maximumBody_(maximumBody), maximumHeaders_(maximumHeaders) {}

    /// Takes the next part of the body. False, with nothing taken, when that would be too much.
    [[nodiscard]] bool takeBody(const char* bytes, std::size_t size);

    /// Counts the next line of the headers, which are not kept. False when there are too many.
    [[nodiscard]] bool countHeader(std::string_view line);

    /// Whether the last line was the end of a header, of an interim answer or the final one.
    [[nodiscard]] bool isHeaderWhole() const { return isHeaderWhole_; }

    /// Which limit was passed, for messages; none while all is well.
    [[nodiscard]] const std::optional<std::string>& excess() const { return excess_; }

    /// Gives the body away.
    [[nodiscard]] std::string takeWhole() { return std::move(body_); }

  private:
    std::optional<std::size_t> maximumBody_;
    std::size_t maximumHeaders_;
    std::size_t headerSize_ = 0;
    bool isHeaderWhole_ = false;
    std::string body_;
    std::optional<std::string> excess_;
};

} // namespace platform
