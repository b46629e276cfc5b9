#include "KSTLib/Credential.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/ObjectArguments.h"

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
    return kst::logReturning(__func__,
                             kst::handOverProperty(credential, "credential", propertyId,
                                                   KSTCredentialGetPropertyData, processProperty));
}
