#include "KSTLib/RequestSerialization.h"
#include "common/ContextObject.h"
#include "common/Failure.h"
#include "common/ParameterPayload.h"
#include "common/PayloadMemory.h"

namespace {

using kst::serializationContext;

/// Handle, length, preflight, age, count, and 4 bytes that are never written.
constexpr std::uint32_t kConstraintFixedSize = kKSTHandleSize + sizeof(std::uint32_t) +
                                               sizeof(std::uint8_t) + sizeof(std::uint32_t) +
                                               sizeof(std::uint32_t) + sizeof(std::uint32_t);

/// Stores what the payload needs, as a sum that does not wrap. `parameters` were checked as a list.
KSTStatus measureConstraint(std::uint32_t aclConstraintLength, const KSTParameter* parameters,
                            std::uint32_t parametersCount, std::uint64_t& size) {
    std::uint32_t parametersLength = 0;
    const KSTStatus err = kst::measureParameters(parameters, parametersCount, parametersLength);
    size = std::uint64_t{aclConstraintLength} + parametersLength + kConstraintFixedSize;
    return err;
}

} // namespace

KSTStatus
GetSerializedVerifyAclConstraintSize(const KSTHandle* /*handle*/, const void* aclConstraint,
                                     std::uint32_t aclConstraintLength, std::uint8_t /*preflight*/,
                                     std::uint32_t /*maxGlobalCredentialAge*/,
                                     const KSTParameter* parameters, std::uint32_t parametersCount,
                                     std::uint32_t* outSize) noexcept {
    KSTStatus err = kst::requireArguments(serializationContext(),
                                          {
                                              kst::Argument(aclConstraint, "aclConstraint"),
                                              kst::Argument(outSize, "outSize"),
                                          });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::checkParameterList(parameters, parametersCount);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::uint64_t size = 0;
    err = measureConstraint(aclConstraintLength, parameters, parametersCount, size);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    // Cut to 32 bits where it does not fit. Who writes looks at the whole of it.
    *outSize = static_cast<std::uint32_t>(size);
    return kKSTErrorSuccess;
}

KSTStatus SerializeVerifyAclConstraint(const KSTHandle* handle, const void* aclConstraint,
                                       std::uint32_t aclConstraintLength, std::uint8_t preflight,
                                       std::uint32_t maxGlobalCredentialAge,
                                       const KSTParameter* parameters,
                                       std::uint32_t parametersCount, void* outBuffer,
                                       std::uint32_t* outSize) noexcept {
    const kst::AssertionContext context = serializationContext();
    KSTStatus err = kst::requireArguments(context, {kst::Argument(aclConstraint, "aclConstraint")});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::checkWriter(parameters, parametersCount, outBuffer, outSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::uint64_t requiredSize = 0;
    err = measureConstraint(aclConstraintLength, parameters, parametersCount, requiredSize);
    err = kst::checkRoom(err, requiredSize, *outSize);
    if (err != kKSTErrorSuccess) {
        return err;
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
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = constraint.readWithLength(payload.rest(), "constraint",
                                    "(size - offset) >= constraintLength");
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = payload.readFlag(preflight);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = payload.finish();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    *outAclConstraintLength = static_cast<std::uint32_t>(constraint.length());
    *outAclConstraint = constraint.handOut();
    *outPreflight = preflight;
    return kKSTErrorSuccess;
}

namespace {

KSTStatus checkAcl(const void* acl, std::uint32_t aclLength) {
    return acl != nullptr && aclLength != 0
               ? kKSTErrorSuccess
               : kst::fail(serializationContext(), "acl && aclLength", 0, kKSTErrorBadParameter);
}

/// Stores what the payload needs, as a sum that does not wrap: 8 bytes of it count a field that is
/// 4 bytes when it is written. `parameters` were checked as a list.
KSTStatus measureAcl(std::uint64_t aclLength, std::uint64_t operationLength,
                     const KSTParameter* parameters, std::uint32_t parametersCount,
                     std::uint64_t& size) {
    std::uint32_t parametersLength = 0;
    const KSTStatus err = kst::measureParameters(parameters, parametersCount, parametersLength);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    constexpr std::uint64_t kFixedSize =
        kKSTHandleSize + sizeof(std::uint64_t) + 3 * sizeof(std::uint32_t);
    const std::uint64_t withOperation = kFixedSize + operationLength;
    const std::uint64_t withAcl = withOperation + aclLength;
    const std::uint64_t withParameters = withAcl + parametersLength;
    // Never so in 64 bits; it says that no sum can have wrapped.
    if (withOperation <= operationLength || withAcl <= aclLength ||
        withParameters <= parametersLength) {
        return kst::fail(
            serializationContext(),
            "sizeof(KSTHandle) + sizeof(uint64_t) + sizeof(uint32_t) + operationLength + "
            "sizeof(uint32_t) + sizeof(uint32_t) > operationLength && sizeof(KSTHandle) + "
            "sizeof(uint64_t) + aclLength + sizeof(uint32_t) + operationLength + sizeof(uint32_t) "
            "+ sizeof(uint32_t) > aclLength && sizeof(KSTHandle) + sizeof(uint64_t) + aclLength + "
            "sizeof(uint32_t) + operationLength + sizeof(uint32_t) + sizeof(uint32_t) + "
            "parametersLength > parametersLength",
            0, kKSTErrorBadParameter);
    }
    size = withParameters;
    return kKSTErrorSuccess;
}

} // namespace

KSTStatus GetSerializedProcessAclSize(const KSTHandle* /*handle*/, const void* acl,
                                      std::uint32_t aclLength, const void* /*operation*/,
                                      std::uint32_t operationLength,
                                      std::uint32_t /*maxGlobalCredentialAge*/,
                                      const KSTParameter* parameters, std::uint32_t parametersCount,
                                      std::uint32_t* outSize) noexcept {
    KSTStatus err = checkAcl(acl, aclLength);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::requireArguments(serializationContext(), {kst::Argument(outSize, "outSize")});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::checkParameterList(parameters, parametersCount);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::uint64_t size = 0;
    err = measureAcl(aclLength, operationLength, parameters, parametersCount, size);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    *outSize = static_cast<std::uint32_t>(size);
    return kKSTErrorSuccess;
}

KSTStatus SerializeProcessAcl(const KSTHandle* handle, const void* acl, std::uint32_t aclLength,
                              const void* operation, std::uint32_t operationLength,
                              std::uint32_t maxGlobalCredentialAge, const KSTParameter* parameters,
                              std::uint32_t parametersCount, void* outBuffer,
                              std::uint32_t* outSize) noexcept {
    const kst::AssertionContext context = serializationContext();
    KSTStatus err = checkAcl(acl, aclLength);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::checkWriter(parameters, parametersCount, outBuffer, outSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::uint64_t requiredSize = 0;
    err = measureAcl(aclLength, operationLength, parameters, parametersCount, requiredSize);
    err = kst::checkRoom(err, requiredSize, *outSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (operation == nullptr && operationLength != 0) {
        return kst::fail(context, "operation || !operationLength", 0, kKSTErrorBadParameter);
    }
    err = kst::checkParameters(parameters, parametersCount);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteWriter writer(outBuffer, *outSize);
    if (!kst::writeHandle(writer, handle) || !writer.writeU32(aclLength) ||
        !writer.writeBytes(acl, aclLength) || !writer.writeU32(operationLength) ||
        !writer.writeBytes(operation, operationLength) ||
        !writer.writeU32(maxGlobalCredentialAge) ||
        !kst::writeParameters(writer, parameters, parametersCount)) {
        return kst::failForRoom();
    }
    *outSize = static_cast<std::uint32_t>(writer.written());
    return kKSTErrorSuccess;
}

KSTStatus DeserializeProcessAcl(const void* buffer, std::uint32_t size, KSTHandle* outHandle,
                                void** outAcl, std::uint32_t* outAclLength, void** outOperation,
                                std::uint32_t* outOperationLength,
                                std::uint32_t* outMaxGlobalCredentialAge,
                                KSTParameter** outParameters,
                                std::uint32_t* outParametersCount) noexcept {
    kst::ReceivedBlob acl;
    kst::ReceivedBlob operation;
    kst::PayloadReader payload(
        buffer, size, {outHandle, outMaxGlobalCredentialAge, outParameters, outParametersCount});
    KSTStatus err = payload.begin({
        kst::Argument(outAcl, "acl"),
        kst::Argument(outAclLength, "aclLength"),
        kst::Argument(outOperation, "operation"),
        kst::Argument(outOperationLength, "operationLength"),
    });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = acl.readWithLength(payload.rest(), "tmpAcl", "(size - offset) >= tmpAclLength");
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = operation.readWithLength(payload.rest(), "op", "(size - offset) >= opLen");
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = payload.finish();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    *outAclLength = static_cast<std::uint32_t>(acl.length());
    *outAcl = acl.handOut();
    *outOperationLength = static_cast<std::uint32_t>(operation.length());
    *outOperation = operation.handOut();
    return kKSTErrorSuccess;
}
