#include "keystrand-sim/RequestHandler.h"

#include "KSTLib/Command.h"
#include "base/ByteWriter.h"
#include "keystrand-sim/CommandFrame.h"
#include "keystrand-sim/Withholding.h"
#include "wire/RestrictedMode.h"

#include <cassert>
#include <utility>

namespace sim {

using wire::KernelOperation;

namespace {

constexpr std::uint32_t kConnectionType = 0;
constexpr std::uint8_t kGarbageByte = 0xa5;

/// A struct call as the log and the faults see it.
struct CallDescription {
    RequestKind kind;
    std::span<const std::uint8_t> payload;
    std::optional<Withholding> withholding;
};

CallDescription describe(KernelOperation operation, std::span<const std::uint8_t> body) {
    CallDescription call{.kind = {.operation = operation, .command = {}, .control = {}},
                         .payload = body,
                         .withholding = {}};
    if (operation != KernelOperation::structCall) {
        return call;
    }
    const auto request = wire::decodeKernelStruct(body);
    if (!request) {
        return call;
    }
    call.payload = request->input;
    const auto frame = decodeCommandFrame(request->input);
    if (!frame) {
        return call;
    }
    call.withholding = withholdingFrom(frame->code, frame->payload);
    if (request->selector != kKSTSelectorCommand) {
        if (call.withholding) {
            call.withholding->kept += kKSTCommandHeaderSize;
        }
        return call;
    }
    call.kind.command = frame->code;
    call.kind.control = controlCodeOf(*frame);
    call.payload = frame->payload;
    return call;
}

LoggedRequest logEntry(const CallDescription& call, std::optional<KernelStatus> sent,
                       std::optional<KernelStatus> performed) {
    const auto kept = call.withholding ? call.payload.first(call.withholding->kept) : call.payload;
    return {.index = 0,
            .command = call.kind.command,
            .control = call.kind.control,
            .payload = {kept.begin(), kept.end()},
            .withheld = call.payload.size() - kept.size(),
            .credentialType = call.withholding ? call.withholding->credentialType : std::nullopt,
            .status = sent,
            .acknowledged = call.kind.control == wire::rm::kKSTKernelControlRMNotificationAck &&
                            performed == kKernelSuccess};
}

/// Counts up from 1, so that a reader can see where bytes went missing.
std::vector<std::uint8_t> pattern(std::uint32_t size) {
    std::vector<std::uint8_t> bytes(size);
    std::uint8_t next = 0;
    for (std::uint8_t& byte : bytes) {
        byte = ++next;
    }
    return bytes;
}

} // namespace

RequestOutcome RequestHandler::handle(std::span<const std::uint8_t> packet,
                                      ConnectionState& connection) {
    const auto header = wire::decodeKernelRequestHeader(packet);
    if (!header || packet.size() > wire::kKernelMessageMaxSize) {
        return {.kind = RequestOutcome::Kind::hangUp, .packet = {}};
    }
    const Bytes body = packet.subspan(wire::kKernelRequestHeaderSize);
    const CallDescription call = describe(header->operation, body);
    const FaultEffect effect = parts_.faults.take(call.kind).value_or(FaultEffect{});

    Reply reply;
    std::optional<KernelStatus> performed;
    if (!effect.replacesHandling() || effect.perform) {
        reply = perform(header->operation, body, connection);
        performed = reply.status;
    }
    replace(reply, effect);
    const bool sendsStatus = !effect.silence && !effect.hangUp && !effect.garbageSize;
    if (header->operation == KernelOperation::structCall) {
        parts_.log.record(
            logEntry(call, sendsStatus ? std::optional(reply.status) : std::nullopt, performed));
    }
    return answer(*header, reply, effect);
}

void RequestHandler::replace(Reply& reply, const FaultEffect& effect) {
    if (effect.status) {
        reply = failed(*effect.status);
    } else if (effect.replySize) {
        reply = {.status = kKernelSuccess,
                 .reported = *effect.replySize,
                 .body = pattern(*effect.replySize)};
    }
    reply.reported = effect.reported.value_or(reply.reported);
}

RequestOutcome RequestHandler::answer(const wire::KernelRequestHeader& request, const Reply& reply,
                                      const FaultEffect& effect) {
    if (effect.hangUp) {
        return {.kind = RequestOutcome::Kind::hangUp, .packet = {}};
    }
    if (effect.silence) {
        return {.kind = RequestOutcome::Kind::silence, .packet = {}};
    }
    RequestOutcome outcome{.kind = RequestOutcome::Kind::reply,
                           .packet = {},
                           .delay = std::chrono::milliseconds(effect.delayMilliseconds)};
    if (effect.garbageSize) {
        outcome.packet.assign(*effect.garbageSize, kGarbageByte);
        return outcome;
    }
    const auto header = wire::encodeKernelReplyHeader(
        {.operation = request.operation,
         .sequence = request.sequence + (effect.wrongSequence ? 1 : 0),
         .status = reply.status,
         .reported = reply.reported});
    outcome.packet.assign(header.begin(), header.end());
    outcome.packet.insert(outcome.packet.end(), reply.body.begin(), reply.body.end());
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
    return foundEntry(*name == wire::rm::kKernelServiceClass && parts_.faults.entryPresent());
}

RequestHandler::Reply RequestHandler::copyProperty(Bytes body) {
    const auto request = wire::decodeKernelProperty(body);
    if (!request) {
        return failed(kKernelMalformedRequest);
    }
    if (!isEntry(request->path)) {
        return failed(kKernelNoSuchEntry);
    }
    if (parts_.faults.takeHiddenProperty(request->name)) {
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
    if (result.output.size() > request->offeredSize) {
        return failed(kKernelReplyDoesNotFit);
    }
    return {.status = kKernelSuccess,
            .reported = static_cast<std::uint32_t>(result.output.size()),
            .body = std::move(result.output)};
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
    return path == wire::rm::kKernelServicePath && parts_.faults.entryPresent();
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

} // namespace sim
