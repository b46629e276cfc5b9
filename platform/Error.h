#pragma once

#include <cstdint>
#include <string>

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

} // namespace platform
