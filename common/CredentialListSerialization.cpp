#include "KSTLib/CredentialSerialization.h"
#include "base/ByteReader.h"
#include "common/Allocation.h"
#include "common/AssertLine.h"
#include "common/SerializationContext.h"

#include <cstring>

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
    KSTStatus err = context.requireArguments({
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
    KSTStatus err = context.requireArguments({
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
