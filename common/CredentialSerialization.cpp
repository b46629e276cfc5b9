#include "KSTLib/CredentialSerialization.h"

#include "base/ByteReader.h"
#include "common/Allocation.h"
#include "common/CredentialTypes.h"
#include "common/Failure.h"

#include <cstring>
#include <string.h>

namespace {

/// A new credential whose data area has `dataLength` bytes, all zero but its `dataLength`, so that
/// it can be given to DeallocCredential. Null when there is no memory.
KSTCredential* newCredential(std::uint32_t dataLength) {
    auto* credential = static_cast<KSTCredential*>(kst::allocate(kst::credentialSize(dataLength)));
    if (credential != nullptr) {
        credential->dataLength = dataLength;
    }
    return credential;
}

/// Stores what `credential` takes on the wire in `size`.
KSTStatus measure(const KSTCredential* credential, std::size_t& size) {
    if (!kst::isCredentialType(credential->type)) {
        return kst::fail(kst::serializationContext(), "0", 0, kKSTErrorBadParameter);
    }
    size = kst::credentialSize(credential->dataLength);
    return kKSTErrorSuccess;
}

/// Checks the header at the start of `buffer`, of which no copy is made, and stores its
/// `dataLength`.
KSTStatus checkHeader(const void* buffer, std::size_t size, std::uint32_t& dataLength) {
    const kst::AssertionContext context = kst::serializationContext();
    base::ByteReader reader(buffer, size);
    std::uint32_t number = 0;
    // The length is the header's last field: whoever has that has the whole header.
    static_assert(offsetof(KSTCredential, dataLength) + sizeof dataLength == sizeof(KSTCredential));
    if (!reader.readU32(number) ||
        !reader.skip(offsetof(KSTCredential, dataLength) - sizeof number) ||
        !reader.readU32(dataLength)) {
        return kst::fail(context, "size >= sizeof(KSTCredential)", 0, kKSTErrorBadParameter);
    }
    const kst::CredentialType* type = kst::findCredentialType(number);
    if (type == nullptr) {
        return kst::fail(context, "0", 0, kKSTErrorBadParameter);
    }
    if (dataLength != type->dataSize) {
        return kst::fail(context, type->sizeCheck, 0, kKSTErrorBadParameter);
    }
    return kKSTErrorSuccess;
}

} // namespace

KSTStatus GetSerializedCredentialSize(const KSTCredential* credential,
                                      std::size_t* outSize) noexcept {
    const KSTStatus err = kst::requireArguments(kst::serializationContext(),
                                                {
                                                    kst::Argument(credential, "credential"),
                                                    kst::Argument(outSize, "outSize"),
                                                });
    return err == kKSTErrorSuccess ? measure(credential, *outSize) : err;
}

KSTStatus SerializeCredential(const KSTCredential* credential, void* outBuffer,
                              std::size_t* outSize) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    KSTStatus err = kst::requireArguments(context, {
                                                       kst::Argument(credential, "credential"),
                                                       kst::Argument(outBuffer, "outBuffer"),
                                                       kst::Argument(outSize, "outSize"),
                                                   });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::size_t size = 0;
    err = measure(credential, size);
    if (err != kKSTErrorSuccess) {
        return kst::failCall(context, err);
    }
    if (size > *outSize) {
        return kst::fail(context, "credLen <= *outSize", 0, kKSTErrorBadParameter);
    }
    std::memcpy(outBuffer, credential, size);
    *outSize = size;
    return kKSTErrorSuccess;
}

KSTStatus DeserializeCredential(const void* buffer, std::size_t size, KSTCredential** outCredential,
                                std::size_t* consumedBytes) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    KSTStatus err =
        kst::requireArguments(context, {
                                           kst::Argument(buffer, "buffer"),
                                           kst::Argument(outCredential, "credential"),
                                           kst::Argument(consumedBytes, "consumedBytes"),
                                       });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::uint32_t dataLength = 0;
    err = checkHeader(buffer, size, dataLength);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    KSTCredential* credential = newCredential(dataLength);
    if (credential == nullptr) {
        return kst::fail(context, "cred", 0, kKSTErrorOutOfMemory);
    }
    const std::size_t wholeSize = kst::credentialSize(dataLength);
    if (wholeSize > size) {
        DeallocCredential(credential);
        return kst::fail(context, "size >= credSize", 0, kKSTErrorBadParameter);
    }
    std::memcpy(credential, buffer, wholeSize);
    *outCredential = credential;
    *consumedBytes = wholeSize;
    return kKSTErrorSuccess;
}

KSTStatus CopyCredential(const KSTCredential* credential, KSTCredential** outCopy) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    const KSTStatus err =
        kst::requireArguments(context, {
                                           kst::Argument(credential, "credential"),
                                           kst::Argument(outCopy, "copy"),
                                       });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    KSTCredential* copy = newCredential(credential->dataLength);
    if (copy == nullptr) {
        return kst::fail(context, "cred", 0, kKSTErrorOutOfMemory);
    }
    std::memcpy(copy, credential, kst::credentialSize(credential->dataLength));
    *outCopy = copy;
    return kKSTErrorSuccess;
}

void DeallocCredential(KSTCredential* credential) noexcept {
    if (credential == nullptr) {
        static_cast<void>(
            kst::fail(kst::serializationContext(), "credential", 0, kKSTErrorBadParameter));
        return;
    }
    const std::size_t size = kst::credentialSize(credential->dataLength);
    // `release` wipes once more.
    ::explicit_bzero(credential, size);
    kst::release(credential, size);
}

namespace {

constexpr std::size_t kCountSize = sizeof(std::uint32_t);
static_assert(kKSTCredentialListMaxCount == 1000);

/// Writes the elements behind the count and sets `end` to where they end.
KSTStatus writeElements(KSTCredential* const* credentialList, std::uint32_t count,
                        std::uint8_t* buffer, std::size_t capacity, std::size_t& end) {
    const kst::AssertionContext context = kst::serializationContext();
    std::size_t offset = kCountSize;
    for (std::uint32_t i = 0; i < count; ++i) {
        if (credentialList[i] == nullptr) {
            return kst::fail(context, "credentialList[i]", 0, kKSTErrorBadParameter);
        }
        std::size_t size = capacity > offset ? capacity - offset : 0;
        const KSTStatus err = SerializeCredential(credentialList[i], buffer + offset, &size);
        if (err != kKSTErrorSuccess) {
            return kst::failCall(context, err);
        }
        offset += size;
    }
    end = offset;
    return kKSTErrorSuccess;
}

KSTStatus readElements(std::span<const std::uint8_t> bytes, KSTCredential** list,
                       std::uint32_t count) {
    for (std::uint32_t i = 0; i < count; ++i) {
        std::size_t consumed = 0;
        const KSTStatus err =
            DeserializeCredential(bytes.data(), bytes.size(), &list[i], &consumed);
        if (err != kKSTErrorSuccess) {
            return kst::failCall(kst::serializationContext(), err);
        }
        bytes = bytes.subspan(consumed);
    }
    return kKSTErrorSuccess;
}

} // namespace

KSTStatus SerializeCredentialList(KSTCredential* const* credentialList, std::uint32_t count,
                                  void* outBuffer, std::size_t* outSize) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    if (credentialList == nullptr && count != 0) {
        return kst::fail(context, "credentialList || (count == 0)", 0, kKSTErrorBadParameter);
    }
    KSTStatus err = kst::requireArguments(context, {
                                                       kst::Argument(outBuffer, "outBuffer"),
                                                       kst::Argument(outSize, "outSize"),
                                                   });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::memcpy(outBuffer, &count, kCountSize);
    std::size_t end = kCountSize;
    err =
        writeElements(credentialList, count, static_cast<std::uint8_t*>(outBuffer), *outSize, end);
    if (err == kKSTErrorSuccess) {
        *outSize = end;
    }
    return err;
}

KSTStatus DeserializeCredentialList(const void* buffer, std::size_t size,
                                    KSTCredential*** outCredentialList,
                                    std::uint32_t* outCount) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    KSTStatus err =
        kst::requireArguments(context, {
                                           kst::Argument(buffer, "buffer"),
                                           kst::Argument(outCredentialList, "credentialList"),
                                           kst::Argument(outCount, "count"),
                                       });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteReader reader(buffer, size);
    std::uint32_t count = 0;
    if (!reader.readU32(count)) {
        return kst::fail(context, "size >= sizeof(uint32_t)", 0, kKSTErrorBadParameter);
    }
    if (count > kKSTCredentialListMaxCount) {
        return kst::fail(context, "credCount <= 1000", 0, kKSTErrorBadParameter);
    }
    KSTCredential** list = nullptr;
    if (count > 0) {
        list = static_cast<KSTCredential**>(kst::allocate(count * sizeof(KSTCredential*)));
        if (list == nullptr) {
            return kst::fail(context, "list", 0, kKSTErrorOutOfMemory);
        }
        err = readElements(reader.rest(), list, count);
        if (err != kKSTErrorSuccess) {
            DeallocCredentialList(list, count);
            return err;
        }
    }
    *outCredentialList = list;
    *outCount = count;
    return kKSTErrorSuccess;
}

void DeallocCredentialList(KSTCredential** credentialList, std::uint32_t count) noexcept {
    if (credentialList == nullptr) {
        static_cast<void>(
            kst::fail(kst::serializationContext(), "credentialList", 0, kKSTErrorBadParameter));
        return;
    }
    for (std::uint32_t i = 0; i < count; ++i) {
        if (credentialList[i] != nullptr) {
            DeallocCredential(credentialList[i]);
            credentialList[i] = nullptr;
        }
    }
    kst::release(credentialList, count * sizeof(KSTCredential*));
}
