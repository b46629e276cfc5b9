// Credentials from outside: what can be read comes back the same, can be copied, compared and
// looked at, and nothing stays allocated.

#include "KSTLib/CredentialSerialization.h"
#include "KSTLib/LibCall.h"
#include "fuzz/Payloads.h"

namespace {

using fuzz::require;

void checkBytes(const KSTCredential* credential, const std::uint8_t* bytes, std::size_t consumed) {
    std::size_t size = 0;
    require(GetSerializedCredentialSize(credential, &size) == 0 && size == consumed);
    std::vector<std::uint8_t> written(size);
    require(SerializeCredential(credential, written.data(), &size) == 0 && size == consumed);
    require(std::memcmp(written.data(), bytes, consumed) == 0);
    --size;
    require(SerializeCredential(credential, written.data(), &size) == kKSTErrorBadParameter);
}

void checkCopy(const KSTCredential* credential) {
    KSTCredential* copy = nullptr;
    std::uint8_t equal = 0;
    require(CopyCredential(credential, &copy) == 0);
    require(CompareCredentials(credential, copy, &equal) == 0 && equal == 1);
    DeallocCredential(copy);
}

/// Of all properties those that the type has.
void checkProperties(const KSTCredential* credential) {
    std::vector<std::uint32_t> ids = {1, 2, 3, 4, 5};
    if (credential->type == kKSTCredentialTypePassphraseEntered) {
        ids.insert(ids.end(), {200, 201});
    }
    const auto* begin = reinterpret_cast<const std::uint8_t*>(credential);
    for (const std::uint32_t id : ids) {
        const void* data = nullptr;
        std::size_t length = 0;
        require(LibCall_KSTCredentialGetPropertyData(credential, id, &data, &length) == 0);
        const auto offset =
            static_cast<std::size_t>(static_cast<const std::uint8_t*>(data) - begin);
        require(offset + length <= sizeof(KSTCredential) + credential->dataLength);
    }
}

/// With the credential that follows in the same bytes, if one does.
void checkComparison(const KSTCredential* credential, const std::uint8_t* rest, std::size_t size) {
    KSTCredential* other = nullptr;
    std::size_t consumed = 0;
    if (DeserializeCredential(rest, size, &other, &consumed) != 0) {
        return;
    }
    std::uint8_t equal = 0;
    std::uint8_t reversed = 0;
    require(CompareCredentials(credential, other, &equal) == 0);
    require(CompareCredentials(other, credential, &reversed) == 0);
    require(equal == reversed);
    DeallocCredential(other);
}

void check(std::span<const std::uint8_t> input) {
    KSTCredential* credential = nullptr;
    std::size_t consumed = 0;
    if (DeserializeCredential(input.data(), input.size(), &credential, &consumed) == 0) {
        require(consumed <= input.size());
        checkBytes(credential, input.data(), consumed);
        checkCopy(credential);
        checkProperties(credential);
        checkComparison(credential, input.data() + consumed, input.size() - consumed);
        DeallocCredential(credential);
    } else {
        require(credential == nullptr && consumed == 0);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    return fuzz::checkInput(data, size, check);
}
