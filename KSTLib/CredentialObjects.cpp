#include "KSTLib/CredentialObjects.h"

#include "KSTLib/LibraryLogging.h"
#include "common/LibCallCredential.h"

namespace {

KSTStatus getProperty(const KSTCredential* credential, std::uint32_t propertyId,
                      const KSTDataBlock& processProperty) {
    const kst::AssertionContext context = kst::libraryContext();
    if (credential == nullptr) {
        return kst::fail(context, "credential", 0, kKSTErrorBadParameter);
    }
    if (processProperty.invoke == nullptr) {
        return kst::fail(context, "processProperty", 0, kKSTErrorBadParameter);
    }
    const void* data = nullptr;
    std::size_t length = 0;
    const KSTStatus err = KSTCredentialGetPropertyData(credential, propertyId, &data, &length);
    if (err != kKSTErrorSuccess) {
        return kst::failCall(context, err);
    }
    processProperty.invoke(processProperty.captured, length > 0 ? data : nullptr, length);
    return kKSTErrorSuccess;
}

} // namespace

KSTStatus KSTCredentialCreate(std::uint32_t type, KSTCredential** credential) noexcept {
    kst::logCalled(__func__);
    return kst::logReturning(__func__, LibCall_KSTCredentialCreate(type, credential));
}

void KSTCredentialDelete(KSTCredential* credential) noexcept {
    kst::logCalled(__func__);
    LibCall_KSTCredentialDelete(credential);
    kst::logReturning(__func__);
}

std::uint32_t KSTCredentialGetType(const KSTCredential* credential) noexcept {
    kst::logCalled(__func__);
    const std::uint32_t type = LibCall_KSTCredentialGetType(credential);
    kst::logReturning(__func__);
    return type;
}

KSTStatus KSTCredentialSetProperty(KSTCredential* credential, std::uint32_t propertyId,
                                   const void* data, std::size_t dataLength) noexcept {
    kst::logCalled(__func__);
    return kst::logReturning(
        __func__, LibCall_KSTCredentialSetProperty(credential, propertyId, data, dataLength));
}

KSTStatus KSTCredentialGetPropertyData(const KSTCredential* credential, std::uint32_t propertyId,
                                       const void** data, std::size_t* dataLength) noexcept {
    kst::logCalled(__func__);
    return kst::logReturning(
        __func__, LibCall_KSTCredentialGetPropertyData(credential, propertyId, data, dataLength));
}

KSTStatus KSTCredentialGetProperty(const KSTCredential* credential, std::uint32_t propertyId,
                                   KSTDataBlock processProperty) noexcept {
    kst::logCalled(__func__);
    return kst::logReturning(__func__, getProperty(credential, propertyId, processProperty));
}
