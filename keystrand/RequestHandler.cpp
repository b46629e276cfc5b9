#include "keystrand/RequestHandler.h"

#include "KSTLib/Command.h"
#include "base/ByteWriter.h"
#include "keystrand/DispatchTable.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <cassert>
#include <utility>

namespace keystrand {

using wire::KernelOperation;

namespace {

constexpr std::uint32_t kConnectionType = 0;

} // namespace

std::optional<wire::KernelRequestHeader> RequestHandler::headerOf(Bytes packet) {
    return packet.size() > wire::kKernelMessageMaxSize ? std::nullopt
                                                       : wire::decodeKernelRequestHeader(packet);
}

RequestOutcome RequestHandler::handle(std::span<const std::uint8_t> packet,
                                      ConnectionState& connection) {
    const auto header = headerOf(packet);
    if (!header) {
        // Without a header there is no sequence number that an answer could bear.
        return {.kind = RequestOutcome::Kind::hangUp, .packet = {}};
    }
    Reply reply =
        perform(header->operation, packet.subspan(wire::kKernelRequestHeaderSize), connection);
    RequestOutcome outcome = answerWith({.operation = header->operation,
                                         .sequence = header->sequence,
                                         .status = reply.status,
                                         .reported = reply.reported},
                                        reply.body);
    outcome.afterwards = std::move(reply.afterwards);
    return outcome;
}

RequestOutcome RequestHandler::answerWith(const wire::KernelReplyHeader& header, Bytes body) {
    const auto bytes = wire::encodeKernelReplyHeader(header);
    RequestOutcome outcome;
    outcome.packet.resize(bytes.size() + body.size());
    std::copy(body.begin(), body.end(),
              std::copy(bytes.begin(), bytes.end(), outcome.packet.begin()));
    return outcome;
}

RequestHandler::Reply RequestHandler::perform(KernelOperation operation, Bytes body,
                                              ConnectionState& connection) {
    switch (operation) {
    case KernelOperation::findByPath:
        return findByPath(body);
    case KernelOperation::findByClassName:
        return findByClassName(body);
    case KernelOperation::copyProperty:
        return copyProperty(body);
    case KernelOperation::open:
        return open(body, connection);
    case KernelOperation::structCall:
        return structCall(body, connection);
    case KernelOperation::scalarCall:
        break;
    }
    return scalarCall(body, connection);
}

RequestHandler::Reply RequestHandler::findByPath(Bytes body) const {
    const auto path = wire::decodeKernelFindByPath(body);
    return path ? foundEntry(isEntry(*path)) : failed(kKernelMalformedRequest);
}

RequestHandler::Reply RequestHandler::findByClassName(Bytes body) const {
    const auto name = wire::decodeKernelFindByClassName(body);
    if (!name) {
        return failed(kKernelMalformedRequest);
    }
    return foundEntry(*name == wire::rm::kKernelServiceClass && hasEntry());
}

RequestHandler::Reply RequestHandler::copyProperty(Bytes body) {
    const auto request = wire::decodeKernelProperty(body);
    if (!request) {
        return failed(kKernelMalformedRequest);
    }
    if (!isEntry(request->path)) {
        return failed(kKernelNoSuchEntry);
    }
    if (hidesProperty(request->name)) {
        return {};
    }
    auto value = parts_.registry.copy(request->name);
    if (!value) {
        return {};
    }
    return {.status = kKernelSuccess, .reported = 1, .body = std::move(*value)};
}

RequestHandler::Reply RequestHandler::open(Bytes body, ConnectionState& connection) const {
    const auto request = wire::decodeKernelOpen(body);
    if (!request) {
        return failed(kKernelMalformedRequest);
    }
    if (!isEntry(request->path)) {
        return failed(kKernelNoSuchEntry);
    }
    if (request->connectionType != kConnectionType) {
        return failed(kKernelUnknownSelector);
    }
    connection.open = true;
    return {};
}

RequestHandler::Reply RequestHandler::structCall(Bytes body,
                                                 const ConnectionState& connection) const {
    const auto request = wire::decodeKernelStruct(body);
    if (!request) {
        return failed(kKernelMalformedRequest);
    }
    if (!connection.open) {
        return failed(kKernelNotOpen);
    }
    if (request->selector != kKSTSelectorCommand) {
        return failed(kKernelUnknownSelector);
    }
    const auto frame = decodeCommandFrame(request->input);
    if (!frame) {
        return failed(kKernelMalformedFrame);
    }
    CommandResult result = parts_.commands.run(frame->code, frame->payload, request->offeredSize);
    if (result.status != kKernelSuccess) {
        return failed(result.status);
    }
    // Of an output of a fixed size the command has made sure before it did anything.
    if (result.output.size() > request->offeredSize) {
        return failed(kKernelReplyDoesNotFit);
    }
    return {.status = kKernelSuccess,
            .reported = static_cast<std::uint32_t>(result.output.size()),
            .body = std::move(result.output),
            .afterwards = std::move(result.afterwards)};
}

RequestHandler::Reply RequestHandler::scalarCall(Bytes body,
                                                 const ConnectionState& connection) const {
    const auto request = wire::decodeKernelScalar(body);
    if (!request) {
        return failed(kKernelMalformedRequest);
    }
    if (!connection.open) {
        return failed(kKernelNotOpen);
    }
    if (request->selector != kKSTSelectorLogLevel) {
        return failed(kKernelUnknownSelector);
    }
    if (!request->inputs.empty()) {
        return failed(kKernelBadPayload);
    }
    if (request->offeredCount == 0) {
        return failed(kKernelReplyDoesNotFit);
    }
    Reply reply{.status = kKernelSuccess, .reported = 1, .body = {}};
    reply.body.resize(sizeof(std::uint64_t));
    [[maybe_unused]] const bool fits =
        base::ByteWriter(reply.body).writeU64(std::uint64_t{parts_.logLevel});
    assert(fits);
    return reply;
}

bool RequestHandler::isEntry(std::string_view path) const {
    return path == wire::rm::kKernelServicePath && hasEntry();
}

RequestHandler::Reply RequestHandler::failed(KernelStatus status) {
    return {.status = status, .reported = 0, .body = {}};
}

RequestHandler::Reply RequestHandler::foundEntry(bool found) {
    if (!found) {
        return {};
    }
    const std::string_view path = wire::rm::kKernelServicePath;
    return {.status = kKernelSuccess, .reported = 1, .body = {path.begin(), path.end()}};
}

} // namespace keystrand
