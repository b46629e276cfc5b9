// Process-ACL payloads from outside: what can be read comes back the same, and nothing stays
// allocated.

#include "KSTLib/RequestSerialization.h"
#include "KSTLib/Serialization.h"
#include "fuzz/Payloads.h"

namespace {

using fuzz::require;

struct Payload {
    KSTHandle handle{};
    void* acl = nullptr;
    std::uint32_t aclLength = 0;
    void* operation = nullptr;
    std::uint32_t operationLength = 0;
    std::uint32_t age = 0;
    KSTParameter* parameters = nullptr;
    std::uint32_t count = 0;
};

void checkBytes(const Payload& payload, std::span<const std::uint8_t> input) {
    std::uint32_t size = 0;
    const KSTStatus err = GetSerializedProcessAclSize(
        &payload.handle, payload.acl, payload.aclLength, payload.operation, payload.operationLength,
        payload.age, payload.parameters, payload.count, &size);
    if (payload.aclLength == 0 || !fuzz::canBeWritten(payload.parameters, payload.count)) {
        require(err == kKSTErrorBadParameter);
        return;
    }
    require(err == 0);
    std::vector<std::uint8_t> written(size);
    require(SerializeProcessAcl(&payload.handle, payload.acl, payload.aclLength, payload.operation,
                                payload.operationLength, payload.age, payload.parameters,
                                payload.count, written.data(), &size) == 0);
    require(size + 4 == written.size() && size <= input.size());
    require(std::memcmp(written.data(), input.data(), size) == 0);
}

void check(std::span<const std::uint8_t> input) {
    Payload payload;
    if (DeserializeProcessAcl(input.data(), static_cast<std::uint32_t>(input.size()),
                              &payload.handle, &payload.acl, &payload.aclLength, &payload.operation,
                              &payload.operationLength, &payload.age, &payload.parameters,
                              &payload.count) == 0) {
        checkBytes(payload, input);
        DeallocDataBlob(payload.acl, payload.aclLength);
        DeallocDataBlob(payload.operation, payload.operationLength);
        DeallocParameters(payload.parameters, payload.count);
    } else {
        require(payload.acl == nullptr && payload.operation == nullptr &&
                payload.parameters == nullptr);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    return fuzz::checkInput(data, size, check);
}
