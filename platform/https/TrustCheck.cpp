#include "platform/https/TrustCheck.h"

#include "base/Concat.h"
#include "platform/host/HTTPRequests.h"

#include <filesystem>
#include <openssl/err.h>
#include <openssl/x509_vfy.h>
#include <openssl/x509v3.h>
#include <utility>

namespace platform {

TrustResult CertificateTrust::evaluate() {
    std::call_once(evaluated_, [this] {
        const bool verified = X509_verify_cert(chain_) == 1;
        const int error = X509_STORE_CTX_get_error(chain_);
        ERR_clear_error();
        if (verified && error == X509_V_OK) {
            result_ = TrustResult::unspecified;
        }
        finding_ = X509_verify_cert_error_string(error);
    });
    return result_;
}

TrustCheck::TrustCheck(std::string host, std::string anchors,
                       std::weak_ptr<HTTPSessionDelegate> delegate)
    : host_(std::move(host)), anchors_(std::move(anchors)), delegate_(std::move(delegate)) {
    // "localhost." is the same host as "localhost", which is how certificates write it.
    if (host_.ends_with('.')) {
        host_.pop_back();
    }
}

bool TrustCheck::install(SSL_CTX* context) {
    // A file that the environment names for the keys of all connections gets nothing.
    SSL_CTX_set_keylog_callback(context, nullptr);
    if (!requireHost(SSL_CTX_get0_param(context)) || !loadAnchors(context)) {
        return false;
    }
    SSL_CTX_set_cert_verify_callback(context, &TrustCheck::verify, this);
    return true;
}

bool TrustCheck::requireHost(X509_VERIFY_PARAM* parameters) const {
    // No name at all would be one that every certificate has.
    if (host_.empty()) {
        return false;
    }
    if (X509_VERIFY_PARAM_set1_ip_asc(parameters, host_.c_str()) == 1) {
        return true;
    }
    // No address but a name. The error would stay with the thread and be taken for a later one's.
    ERR_clear_error();
    X509_VERIFY_PARAM_set_hostflags(parameters, X509_CHECK_FLAG_NEVER_CHECK_SUBJECT |
                                                    X509_CHECK_FLAG_NO_PARTIAL_WILDCARDS);
    return X509_VERIFY_PARAM_set1_host(parameters, host_.data(), host_.size()) == 1;
}

bool TrustCheck::loadAnchors(SSL_CTX* context) {
    X509_STORE* store = X509_STORE_new();
    if (store == nullptr) {
        return false;
    }
    // The store is the context's from here on.
    SSL_CTX_set_cert_store(context, store);
    std::error_code ignored;
    hasAnchors_ = (std::filesystem::is_directory(anchors_, ignored)
                       ? X509_STORE_load_path(store, anchors_.c_str())
                       : X509_STORE_load_file(store, anchors_.c_str())) == 1;
    ERR_clear_error();
    // Any certificate among the anchors ends a chain, also one that is no root.
    return X509_STORE_set_flags(store, X509_V_FLAG_TRUSTED_FIRST | X509_V_FLAG_PARTIAL_CHAIN) == 1;
}

int TrustCheck::verify(X509_STORE_CTX* chain, void* check) noexcept {
    const bool accepted = static_cast<TrustCheck*>(check)->isAccepted(chain);
    // The error is looked at once more when the handshake is over.
    X509_STORE_CTX_set_error(chain, accepted ? X509_V_OK : X509_V_ERR_APPLICATION_VERIFICATION);
    return accepted ? 1 : 0;
}

bool TrustCheck::isAccepted(X509_STORE_CTX* chain) {
    CertificateTrust trust(chain);
    const ChallengeOutcome outcome = askDelegate(delegate_, {kServerTrustMethod, 0, &trust, host_});
    if (outcome == ChallengeOutcome::accepted ||
        (outcome == ChallengeOutcome::leftToEvaluation && isTrusted(trust.evaluate()))) {
        return true;
    }
    refusal_ = isTrusted(trust.evaluate()) ? "refused by the delegate" : trust.finding();
    if (!hasAnchors_) {
        refusal_ = base::concat(*refusal_, " (no trust anchors in ", anchors_, ')');
    }
    return false;
}

} // namespace platform
