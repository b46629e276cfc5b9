#include "platform/host/HTTPRequestCheck.h"

#include "base/Concat.h"

#include <algorithm>
#include <string_view>
#include <utility>

namespace platform {

namespace {

bool equalsInAnyCase(std::string_view text, std::string_view lowerCase) {
    return std::equal(
        text.begin(), text.end(), lowerCase.begin(), lowerCase.end(), [](char c, char lower) {
            return c == lower ||
                   (c >= 'A' && c <= 'Z' && static_cast<char>(c - 'A' + 'a') == lower);
        });
}

bool namesHost(std::string_view afterScheme) {
    constexpr std::string_view kBeforeHost = "://";
    return afterScheme.substr(0, kBeforeHost.size()) == kBeforeHost &&
           afterScheme.size() > kBeforeHost.size() &&
           std::string_view("/?#:@").find(afterScheme[kBeforeHost.size()]) ==
               std::string_view::npos;
}

bool isSupported(const Link& link) {
    const std::string_view scheme = link.scheme();
    return (equalsInAnyCase(scheme, "http") || equalsInAnyCase(scheme, "https")) &&
           namesHost(std::string_view(link.text).substr(scheme.size()));
}

} // namespace

HTTPReply failedReply(std::int64_t code, std::string description) {
    return {Error{kTransportErrorDomain, code, std::move(description)}, std::nullopt, {}};
}

std::optional<HTTPReply> refusalOf(const HTTPRequest& request) {
    if (!request.link || !isSupported(*request.link)) {
        return failedReply(kUnsupportedLink, "unsupported URL");
    }
    if (request.method != "GET" && request.method != "POST") {
        return failedReply(kTransferFailed, base::concat("unsupported method ", request.method));
    }
    return std::nullopt;
}

bool isSecure(const Link& link) {
    return equalsInAnyCase(link.scheme(), "https");
}

std::string describeTooLarge(std::size_t limit) {
    return base::concat("answer longer than ", limit, " bytes");
}

} // namespace platform
