#include "keystrand/AccessLists.h"

#include "KSTLib/Command.h"
#include "KSTLib/Credential.h"
#include "KSTLib/RequestSerialization.h"
#include "base/ByteWriter.h"
#include "base/Concat.h"
#include "keystrand/Commands.h"
#include "keystrand/PolicyRequirement.h"

#include <algorithm>
#include <cassert>
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

const PolicyRequirement* resolve(const Constraint& constraint, const PolicyTable& policies) {
    if (const auto* name = std::get_if<std::string>(&constraint)) {
        return policies.find(*name);
    }
    return std::get_if<PolicyRequirement>(&constraint);
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

namespace {

bool asksFor(const PolicyRequirement& requirement, std::uint32_t type) {
    if (requirement.kind == PolicyRequirement::Kind::leaf) {
        return requirement.type->credential == type;
    }
    return std::any_of(requirement.children.begin(), requirement.children.end(),
                       [type](const PolicyRequirement& child) { return asksFor(child, type); });
}

/// Whether the requirement could be met if there were every credential but those of that type.
bool canBeMetWithout(const PolicyRequirement& requirement, std::uint32_t type) {
    if (requirement.kind == PolicyRequirement::Kind::leaf) {
        const std::uint32_t wanted = requirement.type->credential;
        return wanted != type && wanted != LeafType::kNoCredential;
    }
    return std::count_if(requirement.children.begin(), requirement.children.end(),
                         [type](const PolicyRequirement& child) {
                             return canBeMetWithout(child, type);
                         }) >= static_cast<std::ptrdiff_t>(requirement.needed);
}

} // namespace

Characteristics characteristicsOf(const PolicyRequirement& requirement) {
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

namespace {

using Payload = std::span<const std::uint8_t>;

constexpr std::size_t kMaxOperationSize = 256;
/// Without the list, the operation and parameters.
constexpr std::size_t kMinPayload = kKSTHandleSize + 4 * sizeof(std::uint32_t);

struct Request {
    KSTHandle handle{};
    ReceivedText acl;
    ReceivedText operation;
    std::uint32_t maxGlobalAge = 0;
    ReceivedParameters parameters;

    [[nodiscard]] std::size_t wireSize() const {
        return kMinPayload + acl.length + operation.length + parameters.wireSize();
    }
};

/// False for a payload that is not exactly such a request.
bool read(Payload payload, Request& request) {
    const KSTStatus status = DeserializeProcessAcl(
        payload.data(), static_cast<std::uint32_t>(payload.size()), &request.handle,
        &request.acl.data, &request.acl.length, &request.operation.data, &request.operation.length,
        &request.maxGlobalAge, &request.parameters.items, &request.parameters.count);
    return status == kKSTErrorSuccess && payload.size() == request.wireSize() &&
           request.acl.length <= kMaxConstraintSize &&
           request.operation.length <= kMaxOperationSize && !request.parameters.disagreeAboutUser();
}

std::vector<std::uint8_t> encode(const std::vector<Characteristics>& all) {
    std::vector<std::uint8_t> bytes(sizeof(std::uint32_t) * (1 + 2 * all.size()));
    base::ByteWriter writer(bytes);
    [[maybe_unused]] bool fits = writer.writeU32(static_cast<std::uint32_t>(all.size()));
    for (const Characteristics& one : all) {
        fits = fits && writer.writeU32(one.usable) && writer.writeU32(one.indispensable);
    }
    assert(fits);
    return bytes;
}

/// Of the rules for `operation`, or of all of them when it is empty.
CommandResult describe(const std::vector<AccessRule>& rules, std::string_view operation,
                       const PolicyTable& policies) {
    std::vector<Characteristics> all;
    for (const AccessRule& rule : rules) {
        if (!operation.empty() && rule.operation != operation) {
            continue;
        }
        const PolicyRequirement* requirement = resolve(rule.constraint, policies);
        if (requirement == nullptr) {
            return endedWith(kKernelNoSuchPolicy);
        }
        all.push_back(characteristicsOf(*requirement));
    }
    return {.status = kKernelSuccess, .output = encode(all)};
}

CommandResult parseAcl(KernelState& kernel, Payload payload) {
    Request request;
    if (!read(payload, request)) {
        return endedWith(kKernelBadPayload);
    }
    if (!isNoHandle(request.handle) && kernel.contexts.find(request.handle) == nullptr) {
        return endedWith(kKernelNoSuchContext);
    }
    TextParser parser(request.acl.view());
    const auto rules = parseAccessList(parser);
    if (!rules) {
        return endedWith(kKernelBadConstraint);
    }
    return describe(*rules, request.operation.view(), kernel.policies);
}

} // namespace

void addAccessListCommand(DispatchTable& table, KernelState& kernel) {
    table.add(kKSTCommandParseAcl,
              {.min = kMinPayload,
               .max = kMinPayload + kMaxConstraintSize + kMaxOperationSize +
                      ReceivedParameters::kMaxWireSize},
              [&](Payload payload) { return parseAcl(kernel, payload); });
}

} // namespace keystrand
