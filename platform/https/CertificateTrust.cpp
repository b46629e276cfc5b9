#include "platform/https/CertificateTrust.h"

#include <openssl/err.h>

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

} // namespace platform
