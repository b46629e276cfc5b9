#include "KSTLib/Blocks.h"
#include "KSTLib/Credential.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/Requirement.h"
#include "common/Failure.h"
#include "wire/RequirementLayout.h"

namespace {

/// Hands over what `getPropertyData` finds; a null pointer for no bytes.
template <typename Object>
KSTStatus handOverProperty(const Object* object, const char* objectName, std::uint32_t propertyId,
                           KSTStatus (*getPropertyData)(const Object*, std::uint32_t, const void**,
                                                        std::size_t*),
                           const KSTDataBlock& processProperty) {
    KSTStatus err = kst::requireArguments(kst::libraryContext(),
                                          {
                                              kst::Argument(object, objectName),
                                              kst::Argument(processProperty, "processProperty"),
                                          });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const void* data = nullptr;
    std::size_t length = 0;
    err = getPropertyData(object, propertyId, &data, &length);
    if (err != kKSTErrorSuccess) {
        return kst::failCall(kst::libraryContext(), err);
    }
    processProperty.invoke(processProperty.captured, length > 0 ? data : nullptr, length);
    return kKSTErrorSuccess;
}

KSTStatus getProperties(const KSTRequirement* requirement,
                        const KSTPropertyBlock& processProperty) {
    const KSTStatus err = kst::requireArguments(
        kst::libraryContext(), {
                                   kst::Argument(requirement, "requirement"),
                                   kst::Argument(processProperty, "processProperty"),
                               });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    for (const wire::RequirementProperty& property : wire::requirementProperties()) {
        if (property.isEnumeratedFor(requirement)) {
            processProperty.invoke(processProperty.captured, property.id, property.in(requirement),
                                   property.enumeratedLength);
        }
    }
    return kKSTErrorSuccess;
}

void getSubrequirements(const KSTRequirement* requirement,
                        const KSTRequirementBlock& processSubrequirement) {
    const KSTStatus err = kst::requireArguments(
        kst::libraryContext(), {
                                   kst::Argument(requirement, "requirement"),
                                   kst::Argument(processSubrequirement, "processSubrequirement"),
                               });
    if (err != kKSTErrorSuccess) {
        return;
    }
    const std::uint32_t count =
        wire::isWireType(requirement->type) ? wire::childCount(requirement) : 0;
    for (std::uint32_t i = 0; i < count; ++i) {
        processSubrequirement.invoke(processSubrequirement.captured, wire::childAt(requirement, i));
    }
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
    return kst::logReturning(__func__,
                             handOverProperty(credential, "credential", propertyId,
                                              KSTCredentialGetPropertyData, processProperty));
}

std::uint32_t KSTRequirementGetType(const KSTRequirement* requirement) noexcept {
    kst::logCalled(__func__);
    const std::uint32_t type = LibCall_KSTRequirementGetType(requirement);
    kst::logReturning(__func__);
    return type;
}

std::uint32_t KSTRequirementGetState(const KSTRequirement* requirement) noexcept {
    kst::logCalled(__func__);
    const std::uint32_t state = LibCall_KSTRequirementGetState(requirement);
    kst::logReturning(__func__);
    return state;
}

std::uint32_t KSTRequirementGetPriority(const KSTRequirement* requirement) noexcept {
    kst::logCalled(__func__);
    const std::uint32_t priority = LibCall_KSTRequirementGetPriority(requirement);
    kst::logReturning(__func__);
    return priority;
}

KSTStatus KSTRequirementGetPropertyData(const KSTRequirement* requirement, std::uint32_t propertyId,
                                        const void** data, std::size_t* dataLength) noexcept {
    kst::logCalled(__func__);
    return kst::logReturning(
        __func__, LibCall_KSTRequirementGetPropertyData(requirement, propertyId, data, dataLength));
}

KSTStatus KSTRequirementGetProperty(const KSTRequirement* requirement, std::uint32_t propertyId,
                                    KSTDataBlock processProperty) noexcept {
    kst::logCalled(__func__);
    return kst::logReturning(__func__,
                             handOverProperty(requirement, "requirement", propertyId,
                                              KSTRequirementGetPropertyData, processProperty));
}

KSTStatus KSTRequirementGetProperties(const KSTRequirement* requirement,
                                      KSTPropertyBlock processProperty) noexcept {
    kst::logCalled(__func__);
    return kst::logReturning(__func__, getProperties(requirement, processProperty));
}

void KSTRequirementGetSubrequirements(const KSTRequirement* requirement,
                                      KSTRequirementBlock processSubrequirement) noexcept {
    kst::logCalled(__func__);
    getSubrequirements(requirement, processSubrequirement);
    kst::logReturning(__func__);
}
