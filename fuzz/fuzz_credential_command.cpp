// Payloads of the credential commands and of the context property from outside: what can be read
// comes back the same, and nothing stays allocated.

#include "KSTLib/CredentialSerialization.h"
#include "fuzz/Payloads.h"

namespace {

using fuzz::require;

/// The payload without what follows it.
void requireBeginning(std::span<const std::uint8_t> input, const std::vector<std::uint8_t>& bytes,
                      std::size_t size) {
    require(size == bytes.size() && size <= input.size());
    require(std::memcmp(bytes.data(), input.data(), size) == 0);
}

template <typename Size, typename Write, typename Read>
void checkCommand(std::span<const std::uint8_t> input, Size announce, Write write, Read read) {
    KSTHandle handle{};
    KSTCredential* credential = nullptr;
    KSTScope scope = 0;
    if (read(input.data(), input.size(), &handle, &credential, &scope) != 0) {
        require(credential == nullptr && scope == 0);
        return;
    }
    std::size_t size = 0;
    require(announce(&handle, credential, scope, &size) == 0);
    std::vector<std::uint8_t> written(size);
    require(write(&handle, credential, scope, written.data(), &size) == 0);
    requireBeginning(input, written, size);
    --size;
    require(write(&handle, credential, scope, written.data(), &size) == kKSTErrorBadParameter);
    DeallocCredential(credential);
}

void checkProperty(std::span<const std::uint8_t> input) {
    KSTHandle handle{};
    KSTContextProperty property = 0;
    const KSTStatus err =
        DeserializeGetContextProperty(input.data(), input.size(), &handle, &property);
    require((err == 0) == (input.size() >= 20));
    if (err != 0) {
        return;
    }
    std::size_t size = 0;
    require(GetSerializedGetContextPropertySize(&handle, property, &size) == 0);
    std::vector<std::uint8_t> written(size);
    require(SerializeGetContextProperty(&handle, property, written.data(), &size) == 0);
    requireBeginning(input, written, size);
}

void check(std::span<const std::uint8_t> input) {
    checkCommand(input, GetSerializedAddCredentialSize, SerializeAddCredential,
                 DeserializeAddCredential);
    checkCommand(input, GetSerializedRemoveCredentialSize, SerializeRemoveCredential,
                 DeserializeRemoveCredential);
    checkCommand(input, GetSerializedReplacePassphraseCredentialSize,
                 SerializeReplacePassphraseCredential, DeserializeReplacePassphraseCredential);
    checkProperty(input);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    return fuzz::checkInput(data, size, check);
}
