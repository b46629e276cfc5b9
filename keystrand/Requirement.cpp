#include "keystrand/Requirement.h"

#include "base/Concat.h"
#include "common/RequirementLayout.h"

#include <utility>

namespace keystrand {

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
