#include "platform/linux/RemoteHTTPSessions.h"

#include "platform/linux/RemoteHTTPSession.h"

#include <utility>

namespace platform {

std::unique_ptr<HTTPSession>
RemoteHTTPSessions::makeEphemeral(const std::map<std::string, std::string>& headers,
                                  std::weak_ptr<HTTPSessionDelegate> delegate) {
    return std::make_unique<RemoteHTTPSession>(
        RemoteHTTPSettings{headers, std::move(delegate), options_});
}

} // namespace platform
