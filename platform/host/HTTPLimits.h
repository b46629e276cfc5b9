#pragma once

#include <chrono>
#include <cstdint>
#include <string_view>

namespace platform {

/// How long the parts of a request may take; what takes longer ends it with kTimedOut. Who talks to
/// the server keeps them, and who waits for its answer makes sure.
struct HTTPLimits {
    using Time = std::chrono::milliseconds;

    /// Each full so many bytes of a document are given as long again as the first.
    static constexpr std::uint64_t kSendingStep = 4UL * 1024 * 1024;

    /// From the start of a request to the end of the TLS handshake, a delegate's time to answer
    /// included.
    Time connecting = std::chrono::seconds(30);
    /// The whole of a "GET".
    Time fetching = std::chrono::seconds(60);
    /// From there on to the last byte of a "POST", with each full step of its body.
    Time sending = std::chrono::seconds(60);
    /// From there on to the end of the header of its answer.
    Time answering = std::chrono::seconds(60);

    [[nodiscard]] Time toSend(std::uint64_t bodySize) const {
        return sending * static_cast<Time::rep>(1 + bodySize / kSendingStep);
    }

    /// The whole of a request.
    [[nodiscard]] Time whole(std::string_view method, std::uint64_t bodySize) const {
        return method == "POST" ? connecting + toSend(bodySize) + answering : fetching;
    }
};

} // namespace platform
