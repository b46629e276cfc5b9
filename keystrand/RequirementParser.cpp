#include "keystrand/RequirementParser.h"

#include "KSTLib/Requirement.h"
#include "base/Concat.h"
#include "base/Digits.h"

#include <limits>
#include <set>
#include <utility>

namespace keystrand {

namespace {

using Kind = Requirement::Kind;

constexpr std::string_view kSomeOfSuffix = "-of";

std::optional<Requirement> parseNode(TextParser& parser, std::size_t depth);

/// The composite that the word begins, without children; none for a word that begins none.
std::optional<Requirement> compositeOf(std::string_view word) {
    Requirement composite;
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

bool parseChildren(TextParser& parser, Requirement& composite, std::size_t depth) {
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

bool settleNeeded(TextParser& parser, Requirement& composite) {
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
std::optional<std::uint32_t>* optionOf(Requirement& leaf, std::optional<std::uint32_t>& priority,
                                       std::string_view name) {
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

bool parseNumberOption(TextParser& parser, Requirement& leaf,
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

bool parseOptions(TextParser& parser, Requirement& leaf) {
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

std::optional<Requirement> parseNode(TextParser& parser, std::size_t depth) {
    const auto word = parser.word("requirement");
    if (!word) {
        return std::nullopt;
    }
    if (auto composite = compositeOf(*word)) {
        const bool isWhole =
            parseChildren(parser, *composite, depth) && settleNeeded(parser, *composite);
        return isWhole ? std::move(composite) : std::nullopt;
    }
    Requirement leaf;
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

std::optional<Requirement> parseRequirement(TextParser& parser) {
    auto requirement = parseNode(parser, 1);
    if (requirement && wireSize(*requirement) > kMaxRequirementWireSize) {
        parser.fail("the requirement is too large");
        return std::nullopt;
    }
    return requirement;
}

} // namespace keystrand
