#include "KSTLib/PolicyVerification.h"

#include "KSTLib/Channel.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/LibrarySender.h"
#include "KSTLib/RequirementSerialization.h"
#include "KSTLib/TemporaryContext.h"
#include "common/AssertLine.h"
#include "common/PolicyCommands.h"
#include "common/RequiredFunction.h"

#include <limits>

namespace {

constexpr std::uint32_t kAnyAge = std::numeric_limits<std::uint32_t>::max();

template <typename Block>
KSTStatus requireBlock(const Block& block, kst::CheckPlace place = kst::CheckPlace::here()) {
    return kst::requireBlock(kst::libraryContext(), block, "processRequirement", place);
}

/// Context and policy are there.
KSTStatus verifyPolicyInternal(const kst::PolicyQuestion& question, const char* policyId,
                               kst::PolicyAnswer& answer) {
    const KSTStatus err = kst::openChannel();
    return err == kKSTErrorSuccess
               ? kst::askAboutPolicy(kst::librarySender(), policyId, question, true, answer)
               : err;
}

/// Context and constraint are there.
KSTStatus verifyAclConstraintInternal(const kst::PolicyQuestion& question,
                                      const void* aclConstraint, std::uint32_t length,
                                      kst::PolicyAnswer& answer) {
    const KSTStatus err = kst::openChannel();
    return err == kKSTErrorSuccess ? kst::askAboutAclConstraint(kst::librarySender(), aclConstraint,
                                                                length, question, true, answer)
                                   : err;
}

/// Context, policy and block are checked in this order, then the question is sent.
template <typename Block>
KSTStatus verifyPolicy(const kst::PolicyQuestion& question, const char* policyId,
                       const Block& block, kst::PolicyAnswer& answer) {
    KSTStatus err = kst::libraryContext().requireArguments({
        kst::Argument(question.context, "context"),
        kst::Argument(policyId, "policyId"),
    });
    if (err == kKSTErrorSuccess) {
        err = requireBlock(block);
    }
    return err == kKSTErrorSuccess ? verifyPolicyInternal(question, policyId, answer) : err;
}

KSTStatus verifyAclConstraint(const kst::PolicyQuestion& question, const void* aclConstraint,
                              std::size_t length, const KSTPolicyStatusBlock& block,
                              kst::PolicyAnswer& answer) {
    KSTStatus err =
        kst::libraryContext().requireArguments({kst::Argument(question.context, "context")});
    if (err == kKSTErrorSuccess && (aclConstraint == nullptr || length == 0)) {
        err = kst::fail(kst::libraryContext(), "aclConstraint && aclConstraintLength", 0,
                        kKSTErrorBadParameter);
    }
    if (err == kKSTErrorSuccess) {
        err = requireBlock(block);
    }
    if (err == kKSTErrorSuccess && length > std::numeric_limits<std::uint32_t>::max()) {
        err = kst::fail(kst::libraryContext(), "aclConstraintLength <= UINT32_MAX", 0,
                        kKSTErrorBadParameter);
    }
    return err == kKSTErrorSuccess
               ? verifyAclConstraintInternal(question, aclConstraint,
                                             static_cast<std::uint32_t>(length), answer)
               : err;
}

/// Hands over an answer on success only.
KSTStatus handOver(KSTStatus err, const kst::PolicyAnswer& answer, const KSTPolicyBlock& block) {
    if (err == kKSTErrorSuccess) {
        block.invoke(block.captured, answer.satisfied, answer.requirement);
        DeallocRequirement(answer.requirement);
    }
    return err;
}

/// Hands over an answer whatever the status is.
KSTStatus handOver(KSTStatus err, const kst::PolicyAnswer& answer,
                   const KSTPolicyStatusBlock& block) {
    if (block.invoke != nullptr) {
        block.invoke(block.captured, err, answer.satisfied, answer.requirement);
    }
    DeallocRequirement(answer.requirement);
    return err;
}

template <typename Block>
KSTStatus verifyPolicyAndHandOver(const kst::PolicyQuestion& question, const char* policyId,
                                  const Block& block) {
    kst::PolicyAnswer answer;
    const KSTStatus err = verifyPolicy(question, policyId, block, answer);
    return handOver(err, answer, block);
}

/// KSTContextVerifyPolicyEx with a result.
KSTStatus verifyPolicyEx(const kst::PolicyQuestion& question, const char* policyId,
                         const KSTPolicyStatusBlock& block) {
    constexpr const char* kFunction = "KSTContextVerifyPolicyEx";
    kst::logCalled(kFunction);
    return kst::logReturning(kFunction, verifyPolicyAndHandOver(question, policyId, block));
}

KSTStatus verifyPolicyGlobally(kst::PolicyQuestion question, const char* policyId,
                               const KSTPolicyStatusBlock& block) {
    kst::TemporaryContext context;
    const KSTStatus err = context.create();
    if (err != kKSTErrorSuccess) {
        return handOver(err, {}, block);
    }
    question.context = context.get();
    return verifyPolicyEx(question, policyId, block);
}

} // namespace

KSTStatus KSTContextVerifyPolicy(KSTContextRef context, const char* policyId,
                                 KSTPolicyBlock processRequirement) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__, verifyPolicyAndHandOver({context, false, 0, nullptr, 0},
                                                               policyId, processRequirement));
}

KSTStatus KSTContextVerifyPolicyWithPreflight(KSTContextRef context, const char* policyId,
                                              bool preflight,
                                              KSTPolicyBlock processRequirement) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__, verifyPolicyAndHandOver({context, preflight, 0, nullptr, 0},
                                                               policyId, processRequirement));
}

void KSTContextVerifyPolicyEx(KSTContextRef context, const char* policyId, bool preflight,
                              const KSTParameter* parameters, std::uint32_t parametersCount,
                              std::uint32_t maxGlobalCredentialAge,
                              KSTPolicyStatusBlock processRequirement) noexcept {
    const kst::CallScope call;
    static_cast<void>(
        verifyPolicyEx({context, preflight, maxGlobalCredentialAge, parameters, parametersCount},
                       policyId, processRequirement));
}

void KSTGlobalContextVerifyPolicy(const char* policyId, bool preflight,
                                  const KSTParameter* parameters, std::uint32_t parametersCount,
                                  KSTPolicyStatusBlock processRequirement) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    kst::logReturning(
        __func__, verifyPolicyGlobally({nullptr, preflight, kAnyAge, parameters, parametersCount},
                                       policyId, processRequirement));
}

void KSTContextVerifyAclConstraint(KSTContextRef context, const void* aclConstraint,
                                   std::size_t aclConstraintLength, bool preflight,
                                   const KSTParameter* parameters, std::uint32_t parametersCount,
                                   std::uint32_t maxGlobalCredentialAge,
                                   KSTPolicyStatusBlock processRequirement) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    kst::PolicyAnswer answer;
    const KSTStatus err = verifyAclConstraint(
        {context, preflight, maxGlobalCredentialAge, parameters, parametersCount}, aclConstraint,
        aclConstraintLength, processRequirement, answer);
    kst::logReturning(__func__, handOver(err, answer, processRequirement));
}
