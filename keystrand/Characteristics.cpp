#include "keystrand/Characteristics.h"

#include "KSTLib/Credential.h"

#include <algorithm>

namespace keystrand {

namespace {

bool asksFor(const Requirement& requirement, std::uint32_t type) {
    if (requirement.kind == Requirement::Kind::leaf) {
        return requirement.type->credential == type;
    }
    return std::any_of(requirement.children.begin(), requirement.children.end(),
                       [type](const Requirement& child) { return asksFor(child, type); });
}

/// Whether the requirement could be met if there were every credential but those of that type.
bool canBeMetWithout(const Requirement& requirement, std::uint32_t type) {
    if (requirement.kind == Requirement::Kind::leaf) {
        const std::uint32_t wanted = requirement.type->credential;
        return wanted != type && wanted != LeafType::kNoCredential;
    }
    return std::count_if(requirement.children.begin(), requirement.children.end(),
                         [type](const Requirement& child) {
                             return canBeMetWithout(child, type);
                         }) >= static_cast<std::ptrdiff_t>(requirement.needed);
}

} // namespace

Characteristics characteristicsOf(const Requirement& requirement) {
    Characteristics result;
    for (std::uint32_t type = 1; type <= kKSTCredentialTypeMax; ++type) {
        if (asksFor(requirement, type)) {
            result.usable |= 1U << type;
        }
        if (!canBeMetWithout(requirement, type)) {
            result.indispensable |= 1U << type;
        }
    }
    return result;
}

} // namespace keystrand
