#include "platform/https/HTTPAnswer.h"

#include "base/Concat.h"
#include "platform/shared/HTTPRequestCheck.h"

namespace platform {

bool HTTPAnswer::takeBody(const char* bytes, std::size_t size) {
    if (size > maximumBody_ - body_.size()) {
        excess_ = describeTooLarge(maximumBody_);
        return false;
    }
    body_.append(bytes, size);
    return true;
}

bool HTTPAnswer::countHeaders(std::size_t size) {
    if (size > maximumHeaders_ - headerSize_) {
        excess_ = base::concat("headers longer than ", maximumHeaders_, " bytes");
        return false;
    }
    headerSize_ += size;
    return true;
}

} // namespace platform
