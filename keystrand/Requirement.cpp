#include "keystrand/Requirement.h"

#include "KSTLib/Credential.h"
#include "KSTLib/Requirement.h"
#include "base/Concat.h"
#include "common/RequirementLayout.h"

#include <algorithm>
#include <array>
#include <utility>

namespace keystrand {

namespace {

constexpr std::uint32_t kAgeLimitSize = 4;
constexpr std::uint32_t kPurposeSize = 4;
constexpr std::uint32_t kBiometrySize = 4 + 16 + 16 + 32;
constexpr std::uint32_t kUserOutputSize = 32;

/// The numbers 4, 5 and 7 are composite requirements: what credentials of these types meet has
/// numbers above 12.
constexpr std::array kLeafTypes = {
    LeafType{"passcode", kKSTRequirementTypePasscodeValidated, kKSTCredentialTypePasscodeValidated,
             kAgeLimitSize},
    LeafType{"passphrase", kKSTRequirementTypePassphraseEntered,
             kKSTCredentialTypePassphraseEntered, kPurposeSize},
    LeafType{"biometry", kKSTRequirementTypeBiometryMatched, kKSTCredentialTypeBiometryMatched,
             kBiometrySize},
    LeafType{"marker-6", 6, kKSTCredentialTypeMarker6, 0},
    LeafType{"marker-8", 8, kKSTCredentialTypeMarker8, 0},
    LeafType{"continuity-unlock", 9, kKSTCredentialTypeContinuityUnlock, 0},
    LeafType{"passcode2", 10, kKSTCredentialTypePasscodeValidated2, 0},
    LeafType{"marker-11", 11, kKSTCredentialTypeMarker11, 0},
    LeafType{"kext-deny-list", 12, kKSTCredentialTypeKextDenyList, 0},
    LeafType{"user-output", kKSTRequirementTypeUserOutputDisplayed,
             kKSTCredentialTypeUserOutputDisplayed, kUserOutputSize},
    LeafType{"marker-4", 14, kKSTCredentialTypeMarker4, 0},
    LeafType{"marker-5", 15, kKSTCredentialTypeMarker5, 0},
    LeafType{"never", 16, LeafType::kNoCredential, 0},
};

} // namespace

std::span<const LeafType> leafTypes() {
    return kLeafTypes;
}

const LeafType* findLeafType(std::string_view name) {
    const auto* found = std::find_if(kLeafTypes.begin(), kLeafTypes.end(),
                                     [name](const LeafType& type) { return type.name == name; });
    return found == kLeafTypes.end() ? nullptr : found;
}

namespace {

std::string optionsText(const Requirement& leaf) {
    std::string text;
    const auto add = [&text](const std::string& option) {
        text += text.empty() ? "(" : ", ";
        text += option;
    };
    const std::pair<const char*, std::optional<std::uint32_t>> numbers[] = {
        {"user=", leaf.user}, {"age=", leaf.maxAge}, {"purpose=", leaf.purpose}};
    for (const auto& [name, value] : numbers) {
        if (value) {
            add(base::concat(name, *value));
        }
    }
    if (leaf.priority != 0) {
        add(base::concat("priority=", leaf.priority));
    }
    if (leaf.once) {
        add("once");
    }
    return text.empty() ? text : base::concat(text, ')');
}

std::string headText(const Requirement& composite) {
    switch (composite.kind) {
    case Requirement::Kind::allOf:
        return "all-of";
    case Requirement::Kind::anyOf:
        return "any-of";
    default:
        return base::concat(composite.needed, "-of");
    }
}

} // namespace

std::size_t wireSize(const Requirement& requirement) {
    if (requirement.kind == Requirement::Kind::always) {
        // It is met, so it is missing in no answer.
        return 0;
    }
    if (requirement.kind == Requirement::Kind::leaf) {
        return sizeof(KSTRequirement) + requirement.type->dataSize;
    }
    std::size_t size = requirement.kind == Requirement::Kind::someOf
                           ? kst::kKofNLayout.childrenOffset
                           : kst::kListLayout.childrenOffset;
    for (const Requirement& child : requirement.children) {
        size += wireSize(child);
    }
    return size;
}

std::string toText(const Requirement& requirement) {
    if (requirement.kind == Requirement::Kind::always) {
        return std::string(kAlways);
    }
    if (requirement.kind == Requirement::Kind::leaf) {
        return base::concat(requirement.type->name, optionsText(requirement));
    }
    std::string text = headText(requirement);
    for (const Requirement& child : requirement.children) {
        text += &child == &requirement.children.front() ? "(" : ", ";
        text += toText(child);
    }
    return base::concat(text, ')');
}

} // namespace keystrand
