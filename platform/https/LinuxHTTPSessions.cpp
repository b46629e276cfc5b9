#include "platform/https/LinuxHTTPSessions.h"

#include "platform/https/LinuxHTTPSession.h"

#include <utility>

namespace platform {

LinuxHTTPSessions::LinuxHTTPSessions(LinuxHTTPOptions options) : options_(std::move(options)) {}

std::unique_ptr<HTTPSession>
LinuxHTTPSessions::makeEphemeral(const std::map<std::string, std::string>& headers,
                                 std::weak_ptr<HTTPSessionDelegate> delegate) {
    return std::make_unique<LinuxHTTPSession>(headers, std::move(delegate), options_);
}

} // namespace platform
