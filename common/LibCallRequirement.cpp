#include "KSTLib/LibCall.h"
#include "KSTLib/RequirementSerialization.h"
#include "common/AssertLine.h"
#include "common/LibCallReport.h"
#include "common/RequiredFunction.h"
#include "common/RequirementProperties.h"

namespace {

kst::AssertionContext assertionContext() {
    return kst::libCallContext("common/LibCall");
}

/// A member of the header; 0 when there is none.
std::uint32_t headerWord(const KSTRequirement* requirement,
                         const std::uint32_t KSTRequirement::*word) {
    const KSTStatus err =
        assertionContext().requireArguments({kst::Argument(requirement, "requirement")});
    return err == kKSTErrorSuccess ? requirement->*word : 0;
}

/// Finds the property of that number which the type of `requirement` has.
KSTStatus findProperty(const KSTRequirement* requirement, std::uint32_t propertyId,
                       const kst::RequirementProperty*& found) {
    const char* check = "0";
    for (const kst::RequirementProperty& property : kst::requirementProperties()) {
        if (property.id != propertyId) {
            continue;
        }
        if (property.belongsTo(requirement)) {
            found = &property;
            return kKSTErrorSuccess;
        }
        check = property.typeCheck;
    }
    return kst::fail(assertionContext(), check, 0, kKSTErrorBadParameter);
}

KSTStatus getPropertyData(const KSTRequirement* requirement, std::uint32_t propertyId,
                          const void** data, std::size_t* dataLength) {
    const kst::AssertionContext context = assertionContext();
    // The pointer and the length are one output to the check.
    KSTStatus err = context.requireArguments({
        kst::Argument(requirement, "requirement"),
        kst::Argument(data, "data"),
        kst::Argument(dataLength, "data"),
    });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const kst::RequirementProperty* property = nullptr;
    err = findProperty(requirement, propertyId, property);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    // What is not found has a status. NOLINTNEXTLINE(clang-analyzer-core.*)
    if (!property->fitsIn(requirement)) {
        return kst::fail(context, "offset + length <= requirement->dataLength", 0,
                         kKSTErrorBadParameter);
    }
    *data = property->in(requirement);
    *dataLength = property->length;
    return kKSTErrorSuccess;
}

KSTStatus deleteRequirement(KSTTransport transport, KSTRequirement* requirement) {
    KSTStatus err = kst::requireFunction(assertionContext(), transport, "transport");
    if (err == kKSTErrorSuccess) {
        err = assertionContext().requireArguments({kst::Argument(requirement, "requirement")});
    }
    if (err == kKSTErrorSuccess) {
        DeallocRequirement(requirement);
    }
    return err;
}

} // namespace

std::uint32_t LibCall_KSTRequirementGetType(const KSTRequirement* requirement) noexcept {
    return headerWord(requirement, &KSTRequirement::type);
}

std::uint32_t LibCall_KSTRequirementGetState(const KSTRequirement* requirement) noexcept {
    return headerWord(requirement, &KSTRequirement::state);
}

std::uint32_t LibCall_KSTRequirementGetPriority(const KSTRequirement* requirement) noexcept {
    return headerWord(requirement, &KSTRequirement::priority);
}

KSTStatus LibCall_KSTRequirementGetPropertyData(const KSTRequirement* requirement,
                                                std::uint32_t propertyId, const void** data,
                                                std::size_t* dataLength) noexcept {
    return kst::printReturn(__func__, getPropertyData(requirement, propertyId, data, dataLength));
}

KSTStatus LibCall_KSTRequirementDelete(KSTTransport transport,
                                       KSTRequirement* requirement) noexcept {
    return kst::printReturn(__func__, deleteRequirement(transport, requirement));
}
