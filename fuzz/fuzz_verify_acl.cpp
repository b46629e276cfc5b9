// Verify-ACL-constraint payloads from outside: what can be read comes back the same, and nothing
// stays allocated.

#include "KSTLib/RequestSerialization.h"
#include "KSTLib/Serialization.h"
#include "fuzz/Payloads.h"

namespace {

using fuzz::require;

struct Payload {
    KSTHandle handle{};
    void* constraint = nullptr;
    std::uint32_t length = 0;
    std::uint8_t preflight = 0;
    std::uint32_t age = 0;
    KSTParameter* parameters = nullptr;
    std::uint32_t count = 0;
};

void checkBytes(const Payload& payload, std::span<const std::uint8_t> input) {
    // An empty constraint is read as null and written from any address.
    const void* constraint = payload.constraint != nullptr ? payload.constraint : &payload;
    std::uint32_t size = 0;
    const KSTStatus err = GetSerializedVerifyAclConstraintSize(
        &payload.handle, constraint, payload.length, payload.preflight, payload.age,
        payload.parameters, payload.count, &size);
    if (!fuzz::canBeWritten(payload.parameters, payload.count)) {
        require(err == kKSTErrorBadParameter);
        return;
    }
    require(err == 0);
    std::vector<std::uint8_t> written(size);
    require(SerializeVerifyAclConstraint(&payload.handle, constraint, payload.length,
                                         payload.preflight, payload.age, payload.parameters,
                                         payload.count, written.data(), &size) == 0);
    require(size + 4 == written.size());
    written.resize(size);
    require(fuzz::isBeginningOf(written, input, kKSTHandleSize + 4 + payload.length));
}

void check(std::span<const std::uint8_t> input) {
    Payload payload;
    if (DeserializeVerifyAclConstraint(input.data(), static_cast<std::uint32_t>(input.size()),
                                       &payload.handle, &payload.constraint, &payload.length,
                                       &payload.preflight, &payload.age, &payload.parameters,
                                       &payload.count) == 0) {
        checkBytes(payload, input);
        DeallocDataBlob(payload.constraint, payload.length);
        DeallocParameters(payload.parameters, payload.count);
    } else {
        require(payload.constraint == nullptr && payload.parameters == nullptr);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    return fuzz::checkInput(data, size, check);
}
