#pragma once

#include "platform/HTTPSession.h"

namespace kstd {

/// Starts the request and waits for its end, however long that takes. A completion that comes
/// again, or after the session's end, does no harm.
[[nodiscard]] platform::HTTPReply waitForReply(platform::HTTPSession& session,
                                               const platform::HTTPRequest& request);

} // namespace kstd
