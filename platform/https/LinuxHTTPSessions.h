#pragma once

#include "platform/HTTPSession.h"
#include "platform/host/HTTPLimits.h"

#include <cstddef>
#include <map>
#include <memory>
#include <string>

namespace platform {

/// Longer headers of an answer, all of them together with those of interim answers, end a request
/// with kAnswerTooLarge. (One header of more than 100 KB fails in libcurl: kTransferFailed.)
inline constexpr std::size_t kMaximumAnswerHeaders = 64UL * 1024;

/// How a program wants its HTTPS client to be.
struct LinuxHTTPOptions {
    /// Certificates of the authorities that this machine trusts: a file of them (PEM), or a
    /// directory with one file for each under OpenSSL's hashed names. Read anew for every
    /// connection. When it cannot be read, no server is trusted by evaluation.
    std::string trustAnchors = "/etc/ssl/certs/ca-certificates.crt";
    HTTPLimits limits = {};
};

/// HTTP and HTTPS over libcurl and OpenSSL: HTTP/1.1, TLS 1.2 or newer, a connection for each
/// request. Nothing that the environment says about proxies or certificates is obeyed.
///
/// A server is trusted when its certificate leads to a trust anchor, is valid now, is for servers,
/// and names the link's host among its alternative names; its common name does not count. The
/// evaluation of any other is recoverableFailure. Challenges have no other method than
/// kServerTrustMethod, once for each connection with TLS.
///
/// A server that hangs up after an interim answer (a status below 200) has answered with it.
/// A user and a password in a link are not sent.
class LinuxHTTPSessions final : public HTTPSessions {
  public:
    explicit LinuxHTTPSessions(LinuxHTTPOptions options = {});

    [[nodiscard]] std::unique_ptr<HTTPSession>
    makeEphemeral(const std::map<std::string, std::string>& headers,
                  std::weak_ptr<HTTPSessionDelegate> delegate) override;

  private:
    LinuxHTTPOptions options_;
};

} // namespace platform
