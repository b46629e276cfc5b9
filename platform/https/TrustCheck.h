#pragma once

#include "base/NotCopied.h"
#include "platform/HTTPSession.h"

#include <memory>
#include <mutex>
#include <openssl/ssl.h>
#include <openssl/x509_vfy.h>
#include <optional>
#include <string>

namespace platform {

/// The certificates that a server has shown, with all that `chain` knows about the host and the
/// trust anchors. Evaluated at most once, from whichever thread asks first.
class CertificateTrust final : public ServerTrust {
  public:
    explicit CertificateTrust(X509_STORE_CTX* chain) : chain_(chain) {}

    [[nodiscard]] TrustResult evaluate() override;

    /// What the evaluation found, in words. Only after it.
    [[nodiscard]] const std::string& finding() const { return finding_; }

  private:
    X509_STORE_CTX* chain_;
    std::once_flag evaluated_;
    TrustResult result_ = TrustResult::recoverableFailure;
    std::string finding_;
};

/// Decides for a connection whether its server is trusted: evaluates, asks the delegate, and lets
/// the handshake go on or fail.
class TrustCheck : private base::NotCopied {
  public:
    /// `host` is a name or an address; `anchors` a file or a directory as in HTTPOptions.
    TrustCheck(std::string host, std::string anchors, std::weak_ptr<HTTPSessionDelegate> delegate);

    /// Makes this the only check of the connections of `context`, with no other trust anchors. This
    /// must outlast them. False when `context` cannot be made to; it must then not be used.
    [[nodiscard]] bool install(SSL_CTX* context);

    /// Why the server was refused; none while it was not.
    [[nodiscard]] const std::optional<std::string>& refusal() const { return refusal_; }

  private:
    static int verify(X509_STORE_CTX* chain, void* check) noexcept;

    [[nodiscard]] bool requireHost(X509_VERIFY_PARAM* parameters) const;
    [[nodiscard]] bool loadAnchors(SSL_CTX* context);
    [[nodiscard]] bool isAccepted(X509_STORE_CTX* chain);

    std::string host_;
    std::string anchors_;
    std::weak_ptr<HTTPSessionDelegate> delegate_;
    bool hasAnchors_ = false;
    std::optional<std::string> refusal_;
};

} // namespace platform
