#include "KSTLib/Command.h"
#include "KSTLib/RequestSerialization.h"
#include "keystrand/AccessLists.h"
#include "keystrand/Commands.h"
#include "keystrand/Evaluation.h"
#include "keystrand/PolicyRequirement.h"

#include <cstring>

namespace keystrand {

namespace {

using Payload = std::span<const std::uint8_t>;

/// Without the name of the policy and without parameters.
constexpr std::size_t kMinPolicyPayload = kKSTHandleSize + 1 + 1 + 2 * sizeof(std::uint32_t);
/// Without the constraint and without parameters.
constexpr std::size_t kMinConstraintPayload = kKSTHandleSize + 1 + 3 * sizeof(std::uint32_t);
constexpr std::size_t kSatisfiedSize = sizeof(std::uint32_t);

/// What both commands ask beside the requirement.
struct Question {
    KSTHandle handle{};
    std::uint8_t preflight = 0;
    std::uint32_t maxGlobalAge = 0;
    ReceivedParameters parameters;
};

CommandResult verify(KernelState& kernel, Context& context, const PolicyRequirement& requirement,
                     const Question& question, CredentialSet::Seconds now) {
    const Situation situation{.own = context.credentials,
                              .global = kernel.globalCredentials,
                              .maxGlobalAge = question.maxGlobalAge,
                              .user = question.parameters.user(),
                              .now = now};
    if (const auto missing = whatIsMissing(requirement, situation)) {
        CommandResult result = answeredWith(false);
        const auto tree = encodeMissing(*missing);
        result.output.insert(result.output.end(), tree.begin(), tree.end());
        return result;
    }
    if (question.preflight == 0) {
        for (const KSTCredential* used : whatIsUsedUp(requirement, situation)) {
            context.credentials.remove(used);
            kernel.globalCredentials.remove(used);
        }
    }
    return answeredWith(true);
}

CommandResult verifyPolicy(KernelState& kernel, Payload payload, CredentialSet::Seconds now) {
    Question question;
    char* policyId = nullptr;
    if (DeserializeVerifyPolicy(payload.data(), payload.size(), &question.handle, &policyId,
                                &question.preflight, &question.maxGlobalAge,
                                &question.parameters.items,
                                &question.parameters.count) != kKSTErrorSuccess) {
        return endedWith(kKernelBadPayload);
    }
    ReceivedText name;
    name.data = policyId;
    name.length = static_cast<std::uint32_t>(std::strlen(policyId)) + 1;
    const std::size_t size = kMinPolicyPayload + name.length - 1 + question.parameters.wireSize();
    if (payload.size() != size || question.parameters.disagreeAboutUser()) {
        return endedWith(kKernelBadPayload);
    }
    Context* context = kernel.contexts.find(question.handle);
    if (context == nullptr) {
        return endedWith(kKernelNoSuchContext);
    }
    const PolicyRequirement* requirement = kernel.policies.find(policyId);
    if (requirement == nullptr) {
        return endedWith(kKernelNoSuchPolicy);
    }
    return verify(kernel, *context, *requirement, question, now);
}

CommandResult verifyConstraint(KernelState& kernel, Context& context, std::string_view text,
                               const Question& question, CredentialSet::Seconds now) {
    TextParser parser(text);
    const auto constraint = parseConstraint(parser);
    if (!constraint || !parser.atEnd()) {
        return endedWith(kKernelBadConstraint);
    }
    const PolicyRequirement* requirement = resolve(*constraint, kernel.policies);
    if (requirement == nullptr) {
        return endedWith(kKernelNoSuchPolicy);
    }
    return verify(kernel, context, *requirement, question, now);
}

CommandResult verifyAcl(KernelState& kernel, Payload payload, CredentialSet::Seconds now) {
    Question question;
    ReceivedText text;
    if (DeserializeVerifyAclConstraint(
            payload.data(), static_cast<std::uint32_t>(payload.size()), &question.handle,
            &text.data, &text.length, &question.preflight, &question.maxGlobalAge,
            &question.parameters.items, &question.parameters.count) != kKSTErrorSuccess) {
        return endedWith(kKernelBadPayload);
    }
    const std::size_t size = kMinConstraintPayload + text.length + question.parameters.wireSize();
    if (payload.size() != size || text.length > kMaxConstraintSize ||
        question.parameters.disagreeAboutUser()) {
        return endedWith(kKernelBadPayload);
    }
    Context* context = kernel.contexts.find(question.handle);
    if (context == nullptr) {
        return endedWith(kKernelNoSuchContext);
    }
    return verifyConstraint(kernel, *context, text.view(), question, now);
}

} // namespace

void addPolicyCommands(DispatchTable& table, KernelState& kernel, const Now& now) {
    table.add(kKSTCommandVerifyPolicy,
              {.min = kMinPolicyPayload,
               .max = kMinPolicyPayload + kKSTPolicyIdMaxLength + ReceivedParameters::kMaxWireSize,
               .output = kSatisfiedSize},
              [&kernel, now](Payload payload) { return verifyPolicy(kernel, payload, now()); });
    table.add(kKSTCommandVerifyAclConstraint,
              {.min = kMinConstraintPayload,
               .max = kMinConstraintPayload + kMaxConstraintSize + ReceivedParameters::kMaxWireSize,
               .output = kSatisfiedSize},
              [&kernel, now](Payload payload) { return verifyAcl(kernel, payload, now()); });
}

} // namespace keystrand
