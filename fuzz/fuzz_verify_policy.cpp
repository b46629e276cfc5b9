// Verify-policy payloads from outside: what can be read comes back the same, and nothing stays
// allocated.

#include "KSTLib/RequestSerialization.h"
#include "KSTLib/Serialization.h"
#include "fuzz/Payloads.h"

namespace {

using fuzz::require;

struct Payload {
    KSTHandle handle{};
    char* policyId = nullptr;
    std::uint8_t preflight = 0;
    std::uint32_t age = 0;
    KSTParameter* parameters = nullptr;
    std::uint32_t count = 0;
};

void checkBytes(const Payload& payload, std::span<const std::uint8_t> input) {
    std::size_t size = 0;
    const KSTStatus err =
        GetSerializedVerifyPolicySize(&payload.handle, payload.policyId, payload.preflight,
                                      payload.age, payload.parameters, payload.count, &size);
    if (!fuzz::canBeWritten(payload.parameters, payload.count)) {
        require(err == kKSTErrorBadParameter);
        return;
    }
    require(err == 0);
    std::vector<std::uint8_t> written(size);
    require(SerializeVerifyPolicy(&payload.handle, payload.policyId, payload.preflight, payload.age,
                                  payload.parameters, payload.count, written.data(), &size) == 0);
    require(size == written.size());
    const std::size_t preflight = kKSTHandleSize + std::strlen(payload.policyId) + 1;
    require(fuzz::isBeginningOf(written, input, preflight));
}

void check(std::span<const std::uint8_t> input) {
    Payload payload;
    if (DeserializeVerifyPolicy(input.data(), input.size(), &payload.handle, &payload.policyId,
                                &payload.preflight, &payload.age, &payload.parameters,
                                &payload.count) == 0) {
        checkBytes(payload, input);
        DeallocDataBlob(payload.policyId, std::strlen(payload.policyId) + 1);
        DeallocParameters(payload.parameters, payload.count);
    } else {
        require(payload.policyId == nullptr && payload.parameters == nullptr);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    return fuzz::checkInput(data, size, check);
}
