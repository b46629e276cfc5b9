#include "common/VerifyAclSerialization.h"

#include "common/HandleWire.h"
#include "common/ParameterSerialization.h"
#include "common/ParameterWire.h"
#include "common/ReceivedBlob.h"
#include "common/RequiredArguments.h"
#include "common/SerializationContext.h"

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
    const KSTStatus err =
        GetSerializedParametersLength(parameters, parametersCount, &parametersLength);
    if (err != kKSTErrorSuccess) {
        return kst::fail(serializationContext(), "err == kKSTErrorSuccess", 0, err);
    }
    size = std::uint64_t{aclConstraintLength} + parametersLength + kFixedSize;
    return kKSTErrorSuccess;
}

struct ReceivedPayload {
    kst::ReceivedBlob constraint;
    std::uint8_t preflight = 0;
    kst::ReceivedParameters parameters;
};

KSTStatus readPayload(base::ByteReader& reader, KSTHandle& handle, ReceivedPayload& payload) {
    const kst::AssertionContext context = serializationContext();
    if (!kst::readHandle(reader, handle)) {
        return kst::fail(context, "(size - offset) >= sizeof(KSTHandle)", 0, kKSTErrorBadParameter);
    }
    std::uint32_t constraintLength = 0;
    if (!reader.readU32(constraintLength)) {
        return kst::fail(context, "(size - offset) >= sizeof(uint32_t)", 0, kKSTErrorBadParameter);
    }
    const KSTStatus err = payload.constraint.read(reader, constraintLength, "constraint",
                                                  "(size - offset) >= constraintLength");
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (!reader.readU8(payload.preflight)) {
        return kst::fail(context, "(size - offset) >= sizeof(uint8_t)", 0, kKSTErrorBadParameter);
    }
    return payload.parameters.read(reader);
}

} // namespace

KSTStatus
GetSerializedVerifyAclConstraintSize(const KSTHandle* /*handle*/, const void* aclConstraint,
                                     std::uint32_t aclConstraintLength, std::uint8_t /*preflight*/,
                                     std::uint32_t /*maxGlobalCredentialAge*/,
                                     const KSTParameter* parameters, std::uint32_t parametersCount,
                                     std::uint32_t* outSize) noexcept {
    KSTStatus err = kst::requireArguments(serializationContext(),
                                          {{aclConstraint, "aclConstraint"}, {outSize, "outSize"}});
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
    KSTStatus err = kst::requireArguments(context, {{aclConstraint, "aclConstraint"}});
    if (err == kKSTErrorSuccess) {
        err = kst::checkParameterList(parameters, parametersCount);
    }
    if (err == kKSTErrorSuccess) {
        err = kst::requireArguments(context, {{outBuffer, "outBuffer"}, {outSize, "outSize"}});
    }
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::uint64_t requiredSize = 0;
    err = measure(aclConstraintLength, parameters, parametersCount, requiredSize);
    if (err != kKSTErrorSuccess) {
        return kst::failCall(context, err);
    }
    constexpr const char* kRoomCheck = "*outSize >= requiredSize";
    if (*outSize < requiredSize) {
        return kst::fail(context, kRoomCheck, 0, kKSTErrorBadParameter);
    }
    err = kst::checkParameters(parameters, parametersCount);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteWriter writer(outBuffer, *outSize);
    if (!kst::writeHandle(writer, handle) || !writer.writeU32(aclConstraintLength) ||
        !writer.writeBytes(aclConstraint, aclConstraintLength) || !writer.writeU8(preflight) ||
        !writer.writeU32(maxGlobalCredentialAge) ||
        !kst::writeParameters(writer, parameters, parametersCount)) {
        return kst::fail(context, kRoomCheck, 0, kKSTErrorBadParameter);
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
    KSTStatus err = kst::requireArguments(serializationContext(),
                                          {{buffer, "buffer"},
                                           {outHandle, "handle"},
                                           {outAclConstraint, "aclConstraint"},
                                           {outAclConstraintLength, "aclConstraintLength"},
                                           {outPreflight, "preflight"},
                                           {outMaxGlobalCredentialAge, "maxGlobalCredentialAge"},
                                           {outParameters, "parameters"},
                                           {outParametersCount, "parametersCount"}});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteReader reader(buffer, size);
    ReceivedPayload payload;
    err = readPayload(reader, *outHandle, payload);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    *outAclConstraintLength = static_cast<std::uint32_t>(payload.constraint.length());
    *outAclConstraint = payload.constraint.handOut();
    *outPreflight = payload.preflight != 0 ? 1 : 0;
    payload.parameters.handOut(*outMaxGlobalCredentialAge, *outParameters, *outParametersCount);
    return kKSTErrorSuccess;
}
