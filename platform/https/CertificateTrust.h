#pragma once

#include "platform/HTTPSession.h"

#include <mutex>
#include <openssl/x509_vfy.h>
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

} // namespace platform
