#include "kstd-https/Service.h"

#include "kstd-https/Daemon.h"
#include "platform/host/HTTPRequestCheck.h"
#include "platform/https/HTTPTransfer.h"

#include <algorithm>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace https {

namespace {

using State = wire::HTTPConnectionState;

std::optional<wire::HTTPRequestFields> receiveRequest(wire::HTTPConnection& connection) {
    wire::HTTPMessage message;
    if (connection.receive(message) != State::open ||
        message.type != wire::HTTPMessageType::request) {
        return std::nullopt;
    }
    auto fields = wire::decodeHTTPRequest(message.fields);
    return fields && (fields->bodySize == 0 || fields->method == "POST") ? fields : std::nullopt;
}

platform::HTTPReply replyTo(wire::HTTPConnection& connection, const wire::HTTPRequestFields& fields,
                            const platform::HTTPOptions& options) {
    const platform::HTTPRequest request{.method = std::string(fields.method),
                                        .link = platform::Link{std::string(fields.link)},
                                        .maximumAnswerSize = fields.maximumAnswerSize};
    if (auto refusal = platform::refusalOf(request)) {
        return *std::move(refusal);
    }
    const auto daemon = std::make_shared<Daemon>(connection, fields.bodySize);
    platform::HTTPTransferSettings settings{.options = options};
    settings.headers.insert(fields.headers.begin(), fields.headers.end());
    if (fields.hasDelegate) {
        settings.delegate = daemon;
    }
    return platform::HTTPTransfer(request, settings, *daemon).perform();
}

/// As much of the text as a message takes, in one line.
std::string lineOf(std::string_view text) {
    std::string line(text.substr(0, wire::kHTTPMaxDescriptionLength));
    std::replace_if(
        line.begin(), line.end(),
        [](char c) {
            const auto byte = static_cast<unsigned char>(c);
            return byte < 0x20 || byte == 0x7f;
        },
        '?');
    return line;
}

std::optional<wire::HTTPMessageBytes> messageFor(const platform::HTTPReply& reply) {
    if (reply.error) {
        return wire::encodeHTTPFailure(
            {reply.error->code, reply.error->domain, lineOf(reply.error->description)});
    }
    return wire::encodeHTTPResponse(
        {reply.response->status, reply.body.size(), reply.response->className});
}

void answer(wire::HTTPConnection& connection, const platform::HTTPReply& reply) {
    const auto message = messageFor(reply);
    State state = message ? connection.send(*message) : State::malformed;
    std::span<const std::uint8_t> left(reinterpret_cast<const std::uint8_t*>(reply.body.data()),
                                       reply.body.size());
    while (state == State::open && !left.empty()) {
        const auto piece = left.first(std::min(left.size(), wire::kHTTPMaxPieceSize));
        state = connection.sendPiece(piece);
        left = left.subspan(piece.size());
    }
}

} // namespace

bool serve(wire::HTTPConnection& connection, const platform::HTTPOptions& options) {
    const auto request = receiveRequest(connection);
    if (!request) {
        return false;
    }
    answer(connection, replyTo(connection, *request, options));
    return true;
}

} // namespace https
