#include "platform/https/HTTPAnswer.h"

#include "base/Concat.h"
#include "platform/host/HTTPRequests.h"

namespace platform {

bool HTTPAnswer::takeBody(const char* bytes, std::size_t size) {
    if (!maximumBody_) {
        return true;
    }
    if (size > *maximumBody_ - body_.size()) {
        excess_ = describeTooLarge(*maximumBody_);
        return false;
    }
    body_.append(bytes, size);
    return true;
}

bool HTTPAnswer::countHeader(std::string_view line) {
    if (line.size() > maximumHeaders_ - headerSize_) {
        excess_ = base::concat("headers longer than ", maximumHeaders_, " bytes");
        return false;
    }
    headerSize_ += line.size();
    isHeaderWhole_ = line == "\r\n" || line == "\n";
    return true;
}

} // namespace platform
