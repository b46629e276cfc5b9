#include "keystrand-sim/FaultyRequestHandler.h"

#include "KSTLib/Command.h"
#include "keystrand-sim/RequestLog.h"
#include "keystrand/DispatchTable.h"
#include "wire/RestrictedMode.h"

#include <utility>

namespace keystrand::sim {

using wire::KernelOperation;

namespace {

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
        // A secret is one whatever selector it came with.
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

RequestOutcome FaultyRequestHandler::handle(std::span<const std::uint8_t> packet,
                                            ConnectionState& connection) {
    const auto header = headerOf(packet);
    if (!header) {
        return {.kind = RequestOutcome::Kind::hangUp, .packet = {}};
    }
    const Bytes body = packet.subspan(wire::kKernelRequestHeaderSize);
    const CallDescription call = describe(header->operation, body);
    const FaultEffect effect = faults_.take(call.kind).value_or(FaultEffect{});

    Reply reply;
    std::optional<KernelStatus> performed;
    if (!effect.replacesHandling() || effect.perform) {
        reply = perform(header->operation, body, connection);
        performed = reply.status;
    }
    auto afterwards = std::exchange(reply.afterwards, nullptr);
    replace(reply, effect);
    const bool sendsStatus = !effect.silence && !effect.hangUp && !effect.garbageSize;
    if (header->operation == KernelOperation::structCall) {
        log_.record(
            logEntry(call, sendsStatus ? std::optional(reply.status) : std::nullopt, performed));
    }
    RequestOutcome outcome = answer(*header, reply, effect);
    outcome.afterwards = std::move(afterwards);
    return outcome;
}

void FaultyRequestHandler::replace(Reply& reply, const FaultEffect& effect) {
    if (effect.status) {
        reply = failed(*effect.status);
    } else if (effect.replySize) {
        reply = {.status = kKernelSuccess,
                 .reported = *effect.replySize,
                 .body = pattern(*effect.replySize)};
    }
    reply.reported = effect.reported.value_or(reply.reported);
}

RequestOutcome FaultyRequestHandler::answer(const wire::KernelRequestHeader& request,
                                            const Reply& reply, const FaultEffect& effect) {
    if (effect.hangUp) {
        return {.kind = RequestOutcome::Kind::hangUp, .packet = {}};
    }
    if (effect.silence) {
        return {.kind = RequestOutcome::Kind::silence, .packet = {}};
    }
    RequestOutcome outcome =
        answerWith({.operation = request.operation,
                    .sequence = request.sequence + (effect.wrongSequence ? 1 : 0),
                    .status = reply.status,
                    .reported = reply.reported},
                   reply.body);
    outcome.delay = std::chrono::milliseconds(effect.delayMilliseconds);
    if (effect.garbageSize) {
        outcome.packet.assign(*effect.garbageSize, kGarbageByte);
    }
    return outcome;
}

} // namespace keystrand::sim
