#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <variant>

namespace platform {

/// Why an operation failed, for people and for programs.
struct Error {
    /// Who gives the code its meaning, for example kGenericErrorDomain.
    std::string domain;
    std::int64_t code = 0;
    std::string description;

    friend bool operator==(const Error&, const Error&) = default;
};

/// Errors whose code says nothing: the description is all there is.
inline constexpr char kGenericErrorDomain[] = "generic";
/// The code is an errno value.
inline constexpr char kSystemErrorDomain[] = "system";
/// The code is one of HTTPSession.h.
inline constexpr char kTransportErrorDomain[] = "transport";

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
