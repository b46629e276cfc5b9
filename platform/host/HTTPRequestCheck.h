#pragma once

#include "platform/HTTPSession.h"

#include <cstdint>
#include <optional>
#include <string>

namespace platform {

/// A reply that is only an error.
[[nodiscard]] HTTPReply failedReply(std::int64_t code, std::string description);

/// Why a request is not even tried: its link is none, or is not one of "http" or "https" (in any
/// letter case) that names a host, or its method is unknown. None when it is to be tried.
[[nodiscard]] std::optional<HTTPReply> refusalOf(const HTTPRequest& request);

/// Whether a supported link is one of "https".
[[nodiscard]] bool isSecure(const Link& link);

/// The description of kAnswerTooLarge.
[[nodiscard]] std::string describeTooLarge(std::size_t limit);

} // namespace platform
