#pragma once

#include "platform/Error.h"

#include <utility>
#include <variant>

namespace platform {

/// What an operation made, or why it made nothing.
template <typename Made>
class [[nodiscard]] Result {
  public:
    // NOLINTNEXTLINE(google-explicit-constructor): a function returns either of the two.
    Result(Made made) : content_(std::in_place_index<0>, std::move(made)) {}
    // NOLINTNEXTLINE(google-explicit-constructor)
    Result(Error error) : content_(std::in_place_index<1>, std::move(error)) {}

    [[nodiscard]] explicit operator bool() const { return content_.index() == 0; }

    /// Only when there is one.
    [[nodiscard]] const Made& value() const& { return std::get<0>(content_); }
    [[nodiscard]] Made&& value() && { return std::get<0>(std::move(content_)); }

    /// Only when there is no value.
    [[nodiscard]] const Error& error() const { return std::get<1>(content_); }

  private:
    std::variant<Made, Error> content_;
};

} // namespace platform
