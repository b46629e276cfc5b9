// Lists of credentials from outside: what can be read comes back the same, and nothing stays
// allocated.

#include "KSTLib/CredentialSerialization.h"
#include "fuzz/Payloads.h"

namespace {

using fuzz::require;

void checkBytes(KSTCredential* const* list, std::uint32_t count, const std::uint8_t* bytes,
                std::size_t size) {
    std::size_t expected = sizeof count;
    for (std::uint32_t i = 0; i < count; ++i) {
        std::size_t one = 0;
        require(GetSerializedCredentialSize(list[i], &one) == 0);
        expected += one;
    }
    require(expected <= size);
    std::vector<std::uint8_t> written(expected);
    std::size_t writtenSize = expected;
    require(SerializeCredentialList(list, count, written.data(), &writtenSize) == 0);
    require(writtenSize == expected);
    require(std::memcmp(written.data(), bytes, expected) == 0);
}

void check(std::span<const std::uint8_t> input) {
    KSTCredential** list = nullptr;
    std::uint32_t count = 0;
    if (DeserializeCredentialList(input.data(), input.size(), &list, &count) == 0) {
        require((list == nullptr) == (count == 0) && count <= kKSTCredentialListMaxCount);
        checkBytes(list, count, input.data(), input.size());
        if (list != nullptr) {
            DeallocCredentialList(list, count);
        }
    } else {
        require(list == nullptr && count == 0);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    return fuzz::checkInput(data, size, check);
}
