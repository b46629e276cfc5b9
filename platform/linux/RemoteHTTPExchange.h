#pragma once

#include "base/NotCopied.h"
#include "platform/HTTPSession.h"
#include "platform/linux/RemoteHTTPSessions.h"
#include "wire/HTTPConnection.h"

#include <cstddef>
#include <map>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace platform {

/// What all requests of a session share.
struct RemoteHTTPSettings {
    std::map<std::string, std::string> headers;
    std::weak_ptr<HTTPSessionDelegate> delegate;
    RemoteHTTPOptions options;
};

/// A client asks about no more than so many challenges of one request.
inline constexpr int kMaximumChallenges = 4;

/// Of kTransferFailed, for a request that the end of this process has ended.
inline constexpr char kStoppedDescription[] = "transfer failed: the daemon is asked to end";

/// One request over a connection to the HTTPS client: gives it the request, and whatever it asks
/// for, until it has answered. The request must have passed refusalOf. All three must outlast this.
class RemoteHTTPExchange : private base::NotCopied {
  public:
    RemoteHTTPExchange(wire::HTTPConnection& connection, const HTTPRequest& request,
                       const RemoteHTTPSettings& settings);

    /// Makes the request and waits for its end, up to the limits. Once.
    [[nodiscard]] HTTPReply perform();

  private:
    using State = wire::HTTPConnectionState;

    [[nodiscard]] bool isPost() const { return request_.method == "POST"; }
    [[nodiscard]] std::optional<wire::HTTPMessageBytes> requestMessage() const;
    /// The reply is there when it is over, unless the connection failed.
    [[nodiscard]] State handle(const wire::HTTPMessage& message);
    [[nodiscard]] State judge(std::span<const std::uint8_t> fields);
    [[nodiscard]] State giveBody(std::span<const std::uint8_t> fields);
    [[nodiscard]] std::string_view nextPiece(std::size_t most);
    [[nodiscard]] State takeFailure(std::span<const std::uint8_t> fields);
    [[nodiscard]] State takeResponse(std::span<const std::uint8_t> fields);
    [[nodiscard]] State receiveBody(std::size_t size, std::string& body);
    [[nodiscard]] HTTPReply replyFor(State state) const;

    wire::HTTPConnection& connection_;
    const HTTPRequest& request_;
    const RemoteHTTPSettings& settings_;
    HTTPLimits::Time limit_;
    wire::HTTPConnection::Clock::time_point end_;
    bool hasDelegate_;
    int challenges_ = 0;
    /// How much of the body the client has not got yet.
    std::uint64_t bodyLeft_;
    std::optional<HTTPReply> reply_;
};

} // namespace platform
