#include "keystrand/PolicyRequirement.h"

#include "KSTLib/Credential.h"
#include "KSTLib/Requirement.h"
#include "base/Concat.h"
#include "base/Digits.h"
#include "wire/RequirementLayout.h"

#include <algorithm>
#include <array>
#include <limits>
#include <set>
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

std::string optionsText(const PolicyRequirement& leaf) {
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

std::string headText(const PolicyRequirement& composite) {
    switch (composite.kind) {
    case PolicyRequirement::Kind::allOf:
        return "all-of";
    case PolicyRequirement::Kind::anyOf:
        return "any-of";
    default:
        return base::concat(composite.needed, "-of");
    }
}

} // namespace

std::size_t wireSize(const PolicyRequirement& requirement) {
    if (requirement.kind == PolicyRequirement::Kind::always) {
        // It is met, so it is missing in no answer.
        return 0;
    }
    if (requirement.kind == PolicyRequirement::Kind::leaf) {
        return sizeof(KSTRequirement) + requirement.type->dataSize;
    }
    std::size_t size = requirement.kind == PolicyRequirement::Kind::someOf
                           ? wire::kKofNLayout.childrenOffset
                           : wire::kListLayout.childrenOffset;
    for (const PolicyRequirement& child : requirement.children) {
        size += wireSize(child);
    }
    return size;
}

std::string toText(const PolicyRequirement& requirement) {
    if (requirement.kind == PolicyRequirement::Kind::always) {
        return std::string(kAlways);
    }
    if (requirement.kind == PolicyRequirement::Kind::leaf) {
        return base::concat(requirement.type->name, optionsText(requirement));
    }
    std::string text = headText(requirement);
    for (const PolicyRequirement& child : requirement.children) {
        text += &child == &requirement.children.front() ? "(" : ", ";
        text += toText(child);
    }
    return base::concat(text, ')');
}

namespace {

using Kind = PolicyRequirement::Kind;

constexpr std::string_view kSomeOfSuffix = "-of";

std::optional<PolicyRequirement> parseNode(TextParser& parser, std::size_t depth);

/// The composite that the word begins, without children; none for a word that begins none.
std::optional<PolicyRequirement> compositeOf(std::string_view word) {
    PolicyRequirement composite;
    if (word == "all-of") {
        composite.kind = Kind::allOf;
        return composite;
    }
    if (word == "any-of") {
        composite.kind = Kind::anyOf;
        composite.needed = 1;
        return composite;
    }
    if (!word.ends_with(kSomeOfSuffix)) {
        return std::nullopt;
    }
    word.remove_suffix(kSomeOfSuffix.size());
    const auto needed = base::parseNumber<std::uint32_t>(word);
    if (!needed) {
        return std::nullopt;
    }
    composite.kind = Kind::someOf;
    composite.needed = *needed;
    return composite;
}

bool parseChildren(TextParser& parser, PolicyRequirement& composite, std::size_t depth) {
    if (depth == kMaxRequirementDepth) {
        parser.fail("nested too deeply");
        return false;
    }
    if (!parser.mark('(')) {
        return false;
    }
    do {
        auto child = parseNode(parser, depth + 1);
        if (!child) {
            return false;
        }
        composite.children.push_back(std::move(*child));
    } while (parser.takeMark(','));
    return parser.mark(')');
}

bool settleNeeded(TextParser& parser, PolicyRequirement& composite) {
    const std::size_t count = composite.children.size();
    if (composite.kind == Kind::allOf) {
        composite.needed = static_cast<std::uint32_t>(count);
    }
    if (composite.needed >= 1 && composite.needed <= count) {
        return true;
    }
    parser.fail(base::concat(composite.needed, " of ", count, " cannot be asked for"));
    return false;
}

/// Where the number of an option goes; null when the leaf has no such option.
std::optional<std::uint32_t>*
optionOf(PolicyRequirement& leaf, std::optional<std::uint32_t>& priority, std::string_view name) {
    if (name == "user") {
        return &leaf.user;
    }
    if (name == "age") {
        return &leaf.maxAge;
    }
    if (name == "priority") {
        return &priority;
    }
    const bool isPassphrase = leaf.type->requirement == kKSTRequirementTypePassphraseEntered;
    return name == "purpose" && isPassphrase ? &leaf.purpose : nullptr;
}

bool parseNumberOption(TextParser& parser, PolicyRequirement& leaf,
                       std::optional<std::uint32_t>& priority, std::string_view name) {
    std::optional<std::uint32_t>* option = optionOf(leaf, priority, name);
    if (option == nullptr) {
        parser.fail(base::concat(leaf.type->name, " has no option ", name));
        return false;
    }
    if (!parser.mark('=')) {
        return false;
    }
    *option = parser.number(name);
    return option->has_value();
}

bool parseOptions(TextParser& parser, PolicyRequirement& leaf) {
    std::set<std::string_view> seen;
    std::optional<std::uint32_t> priority;
    do {
        const auto name = parser.word("option");
        if (!name) {
            return false;
        }
        if (!seen.insert(*name).second) {
            parser.fail(base::concat(*name, " given twice"));
            return false;
        }
        if (*name == "once") {
            leaf.once = true;
        } else if (!parseNumberOption(parser, leaf, priority, *name)) {
            return false;
        }
    } while (parser.takeMark(','));
    leaf.priority = priority.value_or(0);
    return parser.mark(')');
}

std::optional<PolicyRequirement> parseNode(TextParser& parser, std::size_t depth) {
    const auto word = parser.word("requirement");
    if (!word) {
        return std::nullopt;
    }
    if (auto composite = compositeOf(*word)) {
        const bool isWhole =
            parseChildren(parser, *composite, depth) && settleNeeded(parser, *composite);
        return isWhole ? std::move(composite) : std::nullopt;
    }
    PolicyRequirement leaf;
    if (*word == kAlways) {
        leaf.kind = Kind::always;
        return leaf;
    }
    leaf.type = findLeafType(*word);
    if (leaf.type == nullptr) {
        parser.fail(base::concat("unknown requirement ", *word));
        return std::nullopt;
    }
    if (parser.takeMark('(') && !parseOptions(parser, leaf)) {
        return std::nullopt;
    }
    return leaf;
}

} // namespace

std::optional<PolicyRequirement> parseRequirement(TextParser& parser) {
    auto requirement = parseNode(parser, 1);
    if (requirement && wireSize(*requirement) > kMaxRequirementWireSize) {
        parser.fail("the requirement is too large");
        return std::nullopt;
    }
    return requirement;
}

} // namespace keystrand
