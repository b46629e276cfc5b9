#include "KSTLib/RequestSerialization.h"
#include "common/AssertLine.h"
#include "common/HandleWire.h"
#include "common/ParameterWire.h"
#include "common/PayloadReader.h"
#include "common/ReceivedBlob.h"
#include "common/SerializationContext.h"
#include "common/WriterRoom.h"

namespace {

using kst::serializationContext;

/// Handle, length, preflight, age, count, and 4 bytes that are never written.
constexpr std::uint32_t kFixedSize = kKSTHandleSize + sizeof(std::uint32_t) + sizeof(std::uint8_t) +
                                     sizeof(std::uint32_t) + sizeof(std::uint32_t) +
                                     sizeof(std::uint32_t);

/// Stores what the payload needs, as a sum that does not wrap. `parameters` were checked as a list.
KSTStatus measure(std::uint32_t aclConstraintLength, const KSTParameter* parameters,
                  std::uint32_t parametersCount, std::uint64_t& size) {
    std::uint32_t parametersLength = 0;
    const KSTStatus err = kst::measureParameters(parameters, parametersCount, parametersLength);
    size = std::uint64_t{aclConstraintLength} + parametersLength + kFixedSize;
    return err;
}

} // namespace

KSTStatus
GetSerializedVerifyAclConstraintSize(const KSTHandle* /*handle*/, const void* aclConstraint,
                                     std::uint32_t aclConstraintLength, std::uint8_t /*preflight*/,
                                     std::uint32_t /*maxGlobalCredentialAge*/,
                                     const KSTParameter* parameters, std::uint32_t parametersCount,
                                     std::uint32_t* outSize) noexcept {
    KSTStatus err = serializationContext().requireArguments({
        kst::Argument(aclConstraint, "aclConstraint"),
        kst::Argument(outSize, "outSize"),
    });
    if (err == kKSTErrorSuccess) {
        err = kst::checkParameterList(parameters, parametersCount);
    }
    std::uint64_t size = 0;
    if (err == kKSTErrorSuccess) {
        err = measure(aclConstraintLength, parameters, parametersCount, size);
    }
    if (err == kKSTErrorSuccess) {
        *outSize = static_cast<std::uint32_t>(size);
    }
    return err;
}

KSTStatus SerializeVerifyAclConstraint(const KSTHandle* handle, const void* aclConstraint,
                                       std::uint32_t aclConstraintLength, std::uint8_t preflight,
                                       std::uint32_t maxGlobalCredentialAge,
                                       const KSTParameter* parameters,
                                       std::uint32_t parametersCount, void* outBuffer,
                                       std::uint32_t* outSize) noexcept {
    const kst::AssertionContext context = serializationContext();
    KSTStatus err = context.requireArguments({kst::Argument(aclConstraint, "aclConstraint")});
    if (err == kKSTErrorSuccess) {
        err = kst::checkWriter(parameters, parametersCount, outBuffer, outSize);
    }
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::uint64_t requiredSize = 0;
    err = measure(aclConstraintLength, parameters, parametersCount, requiredSize);
    err = kst::checkRoom(err, requiredSize, *outSize);
    if (err == kKSTErrorSuccess) {
        err = kst::checkParameters(parameters, parametersCount);
    }
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteWriter writer(outBuffer, *outSize);
    if (!kst::writeHandle(writer, handle) || !writer.writeU32(aclConstraintLength) ||
        !writer.writeBytes(aclConstraint, aclConstraintLength) || !writer.writeU8(preflight) ||
        !writer.writeU32(maxGlobalCredentialAge) ||
        !kst::writeParameters(writer, parameters, parametersCount)) {
        return kst::failForRoom();
    }
    *outSize = static_cast<std::uint32_t>(writer.written());
    return kKSTErrorSuccess;
}

KSTStatus DeserializeVerifyAclConstraint(const void* buffer, std::uint32_t size,
                                         KSTHandle* outHandle, void** outAclConstraint,
                                         std::uint32_t* outAclConstraintLength,
                                         std::uint8_t* outPreflight,
                                         std::uint32_t* outMaxGlobalCredentialAge,
                                         KSTParameter** outParameters,
                                         std::uint32_t* outParametersCount) noexcept {
    kst::ReceivedBlob constraint;
    std::uint8_t preflight = 0;
    kst::PayloadReader payload(
        buffer, size, {outHandle, outMaxGlobalCredentialAge, outParameters, outParametersCount});
    KSTStatus err = payload.begin({
        kst::Argument(outAclConstraint, "aclConstraint"),
        kst::Argument(outAclConstraintLength, "aclConstraintLength"),
        kst::Argument(outPreflight, "preflight"),
    });
    if (err == kKSTErrorSuccess) {
        err = constraint.readWithLength(payload.rest(), "constraint",
                                        "(size - offset) >= constraintLength");
    }
    if (err == kKSTErrorSuccess) {
        err = payload.readFlag(preflight);
    }
    if (err == kKSTErrorSuccess) {
        err = payload.finish();
    }
    if (err == kKSTErrorSuccess) {
        *outAclConstraintLength = static_cast<std::uint32_t>(constraint.length());
        *outAclConstraint = constraint.handOut();
        *outPreflight = preflight;
    }
    return err;
}
