#include "KSTLib/RequestSerialization.h"
#include "common/ContextObject.h"
#include "common/Failure.h"
#include "common/ParameterPayload.h"
#include "common/PayloadMemory.h"

#include <algorithm>
#include <string.h>

namespace {

using kst::serializationContext;

static_assert(kKSTPolicyIdMaxLength == 128, "the texts below name it");

/// Handle, zero byte, preflight, age and count.
constexpr std::uint64_t kFixedSize =
    kKSTHandleSize + 1 + sizeof(std::uint8_t) + sizeof(std::uint32_t) + sizeof(std::uint32_t);

/// The length of a policy's name, looking at one byte more than it may have.
std::size_t policyIdLength(const void* policyId, std::size_t size) {
    return ::strnlen(static_cast<const char*>(policyId),
                     std::min<std::size_t>(size, kKSTPolicyIdMaxLength + 1));
}

struct Measured {
    std::size_t policyLength = 0;
    std::uint64_t size = 0;
};

/// The sizes of a payload whose policy is there.
KSTStatus measure(const char* policyId, const KSTParameter* parameters,
                  std::uint32_t parametersCount, Measured& measured) {
    measured.policyLength = policyIdLength(policyId, SIZE_MAX);
    if (measured.policyLength > kKSTPolicyIdMaxLength) {
        return kst::fail(serializationContext(), "policyLength <= 128", 0, kKSTErrorBadParameter);
    }
    std::uint32_t parametersLength = 0;
    const KSTStatus err = kst::measureParameters(parameters, parametersCount, parametersLength);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    measured.size = measured.policyLength + kFixedSize + parametersLength;
    // Never so in 64 bits; it says that the sum cannot have wrapped.
    if (measured.size <= parametersLength) {
        return kst::fail(serializationContext(),
                         "sizeof(KSTHandle) + policyLength + 1 + sizeof(uint8_t) + "
                         "sizeof(uint32_t) + sizeof(uint32_t) + parametersLength > "
                         "parametersLength",
                         0, kKSTErrorBadParameter);
    }
    return kKSTErrorSuccess;
}

KSTStatus readPolicyId(base::ByteReader& reader, kst::ReceivedBlob& policyId) {
    const std::size_t length = policyIdLength(reader.rest().data(), reader.left());
    if (length > kKSTPolicyIdMaxLength) {
        return kst::fail(serializationContext(), "(policyLength <= 128)", 0, kKSTErrorBadParameter);
    }
    constexpr const char* kSizeCheck = "(size - offset) >= (policyLength + 1)";
    if (reader.left() < length + 1) {
        return kst::fail(serializationContext(), kSizeCheck, 0, kKSTErrorBadParameter);
    }
    return policyId.read(reader, length + 1, "policy", kSizeCheck);
}

} // namespace

KSTStatus GetSerializedVerifyPolicySize(const KSTHandle* handle, const char* policyId,
                                        std::uint8_t /*preflight*/,
                                        std::uint32_t /*maxGlobalCredentialAge*/,
                                        const KSTParameter* parameters,
                                        std::uint32_t parametersCount,
                                        std::size_t* outSize) noexcept {
    KSTStatus err =
        kst::requireArguments(serializationContext(), {
                                                          kst::Argument(handle, "handle"),
                                                          kst::Argument(policyId, "policyId"),
                                                          kst::Argument(outSize, "outSize"),
                                                      });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    Measured measured;
    err = measure(policyId, parameters, parametersCount, measured);
    if (err == kKSTErrorSuccess) {
        *outSize = measured.size;
    }
    return err;
}

KSTStatus SerializeVerifyPolicy(const KSTHandle* handle, const char* policyId,
                                std::uint8_t preflight, std::uint32_t maxGlobalCredentialAge,
                                const KSTParameter* parameters, std::uint32_t parametersCount,
                                void* outBuffer, std::size_t* outSize) noexcept {
    const kst::AssertionContext context = serializationContext();
    KSTStatus err = kst::requireArguments(context, {
                                                       kst::Argument(handle, "handle"),
                                                       kst::Argument(policyId, "policyId"),
                                                   });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::checkWriter(parameters, parametersCount, outBuffer, outSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    Measured measured;
    err = measure(policyId, parameters, parametersCount, measured);
    err = kst::checkRoom(err, measured.size, *outSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::checkParameters(parameters, parametersCount);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteWriter writer(outBuffer, *outSize);
    if (!kst::writeHandle(writer, handle) || !writer.writeBytes(policyId, measured.policyLength) ||
        !writer.writeU8(0) || !writer.writeU8(preflight) ||
        !writer.writeU32(maxGlobalCredentialAge) ||
        !kst::writeParameters(writer, parameters, parametersCount)) {
        return kst::failForRoom();
    }
    *outSize = writer.written();
    return kKSTErrorSuccess;
}

KSTStatus DeserializeVerifyPolicy(const void* buffer, std::size_t size, KSTHandle* outHandle,
                                  char** outPolicyId, std::uint8_t* outPreflight,
                                  std::uint32_t* outMaxGlobalCredentialAge,
                                  KSTParameter** outParameters,
                                  std::uint32_t* outParametersCount) noexcept {
    kst::ReceivedBlob policyId;
    std::uint8_t preflight = 0;
    kst::PayloadReader payload(
        buffer, size, {outHandle, outMaxGlobalCredentialAge, outParameters, outParametersCount});
    KSTStatus err = payload.begin({
        kst::Argument(outPolicyId, "policyId"),
        kst::Argument(outPreflight, "preflight"),
    });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = readPolicyId(payload.rest(), policyId);
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
    *outPolicyId = reinterpret_cast<char*>(policyId.handOut());
    *outPreflight = preflight;
    return kKSTErrorSuccess;
}
