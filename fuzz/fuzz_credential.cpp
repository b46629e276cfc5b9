// Credentials from outside: what can be read comes back the same, can be copied, compared and
// looked at, and nothing stays allocated.

#include "KSTLib/AllocatedBytes.h"
#include "KSTLib/CredentialSerialization.h"
#include "KSTLib/LibCall.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

namespace {

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

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

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    // An empty input may come without an address, which is another failure than one without bytes.
    static const std::uint8_t kNothing = 0;
    const std::uint8_t* bytes = size > 0 ? data : &kNothing;
    const std::int64_t allocatedBefore = gAllocatedBytes;
    KSTCredential* credential = nullptr;
    std::size_t consumed = 0;
    if (DeserializeCredential(bytes, size, &credential, &consumed) == 0) {
        require(consumed <= size);
        checkBytes(credential, bytes, consumed);
        checkCopy(credential);
        checkProperties(credential);
        checkComparison(credential, bytes + consumed, size - consumed);
        DeallocCredential(credential);
    } else {
        require(credential == nullptr && consumed == 0);
    }
    require(gAllocatedBytes == allocatedBefore);
    return 0;
}
