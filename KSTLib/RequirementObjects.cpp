#include "KSTLib/LibCall.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/ObjectArguments.h"
#include "KSTLib/Requirement.h"
#include "common/RequirementLayout.h"
#include "common/RequirementProperties.h"

namespace {

KSTStatus getProperties(const KSTRequirement* requirement,
                        const KSTPropertyBlock& processProperty) {
    const KSTStatus err = kst::requireObjectAndBlock(kst::Argument(requirement, "requirement"),
                                                     processProperty, "processProperty");
    if (err != kKSTErrorSuccess) {
        return err;
    }
    for (const kst::RequirementProperty& property : kst::requirementProperties()) {
        if (property.isEnumeratedFor(requirement)) {
            processProperty.invoke(processProperty.captured, property.id, property.in(requirement),
                                   property.enumeratedLength);
        }
    }
    return kKSTErrorSuccess;
}

void getSubrequirements(const KSTRequirement* requirement,
                        const KSTRequirementBlock& processSubrequirement) {
    if (kst::requireObjectAndBlock(kst::Argument(requirement, "requirement"), processSubrequirement,
                                   "processSubrequirement") != kKSTErrorSuccess) {
        return;
    }
    const std::uint32_t count =
        kst::isWireType(requirement->type) ? kst::childCount(requirement) : 0;
    for (std::uint32_t i = 0; i < count; ++i) {
        processSubrequirement.invoke(processSubrequirement.captured, kst::childAt(requirement, i));
    }
}

} // namespace

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
                             kst::handOverProperty(requirement, "requirement", propertyId,
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
