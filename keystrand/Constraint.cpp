#include "keystrand/Constraint.h"

#include "base/Concat.h"
#include "keystrand/RequirementParser.h"

#include <algorithm>
#include <utility>

namespace keystrand {

namespace {

std::optional<AccessRule> parseRule(TextParser& parser, const std::vector<AccessRule>& before) {
    if (!parser.keyword("allow")) {
        return std::nullopt;
    }
    const auto operation = parser.word("operation");
    if (!operation) {
        return std::nullopt;
    }
    if (std::any_of(before.begin(), before.end(),
                    [&](const AccessRule& rule) { return rule.operation == *operation; })) {
        parser.fail(base::concat("there is a rule for ", *operation, " already"));
        return std::nullopt;
    }
    if (!parser.mark('=')) {
        return std::nullopt;
    }
    auto constraint = parseConstraint(parser);
    if (!constraint) {
        return std::nullopt;
    }
    return AccessRule{std::string(*operation), std::move(*constraint)};
}

} // namespace

std::optional<Constraint> parseConstraint(TextParser& parser) {
    if (parser.takeWord("policy")) {
        const auto name = parser.word("name");
        return name ? std::optional<Constraint>(std::string(*name)) : std::nullopt;
    }
    auto requirement = parseRequirement(parser);
    return requirement ? std::optional<Constraint>(std::move(*requirement)) : std::nullopt;
}

const Requirement* resolve(const Constraint& constraint, const PolicyTable& policies) {
    if (const auto* name = std::get_if<std::string>(&constraint)) {
        return policies.find(*name);
    }
    return std::get_if<Requirement>(&constraint);
}

std::optional<std::vector<AccessRule>> parseAccessList(TextParser& parser) {
    std::vector<AccessRule> rules;
    do {
        if (rules.size() == kMaxAccessRules) {
            parser.fail("too many rules");
            return std::nullopt;
        }
        auto rule = parseRule(parser, rules);
        if (!rule) {
            return std::nullopt;
        }
        rules.push_back(std::move(*rule));
    } while (!parser.atEnd());
    return rules;
}

} // namespace keystrand
