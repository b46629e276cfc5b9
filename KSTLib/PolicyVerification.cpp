#include "KSTLib/PolicyVerification.h"

#include "KSTLib/Channel.h"
#include "KSTLib/Command.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/LibrarySender.h"
#include "KSTLib/RequestSerialization.h"
#include "KSTLib/RequirementSerialization.h"
#include "common/Allocation.h"
#include "common/CommandSender.h"
#include "common/Failure.h"
#include "common/PayloadMemory.h"

#include <cstring>
#include <limits>
#include <optional>

namespace {

constexpr std::uint32_t kAnyAge = std::numeric_limits<std::uint32_t>::max();

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
    const KSTStatus err =
        kst::requireArguments(kst::libraryContext(), {
                                                         kst::Argument(question.context, "context"),
                                                         kst::Argument(policyId, "policyId"),
                                                         kst::Argument(block, "processRequirement"),
                                                     });
    return err == kKSTErrorSuccess ? verifyPolicyInternal(question, policyId, answer) : err;
}

KSTStatus verifyAclConstraint(const kst::PolicyQuestion& question, const void* aclConstraint,
                              std::size_t length, const KSTPolicyStatusBlock& block,
                              kst::PolicyAnswer& answer) {
    KSTStatus err =
        kst::requireArguments(kst::libraryContext(), {kst::Argument(question.context, "context")});
    if (err == kKSTErrorSuccess && (aclConstraint == nullptr || length == 0)) {
        err = kst::fail(kst::libraryContext(), "aclConstraint && aclConstraintLength", 0,
                        kKSTErrorBadParameter);
    }
    if (err == kKSTErrorSuccess) {
        err = kst::requireArguments(kst::libraryContext(),
                                    {kst::Argument(block, "processRequirement")});
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

namespace {

constexpr std::size_t kMaxCharacteristicsSize = 4096;

/// The reply, as the block is to see it: its size stays the one that was offered until there is
/// one.
struct Characteristics {
    std::optional<kst::AllocatedMemory> output;
    std::size_t outputSize = kMaxCharacteristicsSize;
};

KSTStatus checkArguments(const void* acl, std::size_t aclLength, const KSTStatusDataBlock& block) {
    const kst::AssertionContext context = kst::libraryContext();
    if (acl == nullptr || aclLength == 0) {
        return kst::fail(context, "acl && aclLength", 0, kKSTErrorBadParameter);
    }
    const KSTStatus err =
        kst::requireArguments(context, {kst::Argument(block, "processConstraintCharacteristics")});
    if (err == kKSTErrorSuccess && aclLength > std::numeric_limits<std::uint32_t>::max()) {
        return kst::fail(context, "aclLength <= UINT32_MAX", 0, kKSTErrorBadParameter);
    }
    return err;
}

/// Sends the payload and keeps a copy of the reply of exactly its size.
KSTStatus sendAcl(const kst::BuiltPayload& payload, Characteristics& result) {
    const kst::AllocatedMemory outputBuffer(kMaxCharacteristicsSize);
    if (outputBuffer.bytes() == nullptr) {
        return kst::fail(kst::libraryContext(), "outputBuffer", 0, kKSTErrorOutOfMemory);
    }
    const KSTStatus err =
        kst::librarySender().send(kKSTCommandParseAcl, payload.bytes(), payload.size(),
                                  outputBuffer.bytes(), &result.outputSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    result.output.emplace(result.outputSize);
    if (result.output->bytes() == nullptr) {
        return kst::fail(kst::libraryContext(), "output", 0, kKSTErrorOutOfMemory);
    }
    std::memcpy(result.output->bytes(), outputBuffer.bytes(), result.outputSize);
    return kKSTErrorSuccess;
}

KSTStatus parseAcl(const void* acl, std::uint32_t aclLength, Characteristics& result) {
    KSTStatus err = kst::openChannel();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    kst::BuiltPayload payload;
    err = payload.build<std::uint32_t>(
        kst::libraryContext(),
        [&](std::uint32_t* size) {
            return GetSerializedProcessAclSize(nullptr, acl, aclLength, nullptr, 0, 0, nullptr, 0,
                                               size);
        },
        [&](void* buffer, std::uint32_t* size) {
            return SerializeProcessAcl(nullptr, acl, aclLength, nullptr, 0, 0, nullptr, 0, buffer,
                                       size);
        });
    return err != kKSTErrorSuccess ? err : sendAcl(payload, result);
}

} // namespace

KSTStatus KSTParseAclAndCopyConstraintCharacteristics(
    const void* acl, std::size_t aclLength,
    KSTStatusDataBlock processConstraintCharacteristics) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    const KSTStatusDataBlock& block = processConstraintCharacteristics;
    Characteristics result;
    KSTStatus err = checkArguments(acl, aclLength, block);
    if (err == kKSTErrorSuccess) {
        err = parseAcl(acl, static_cast<std::uint32_t>(aclLength), result);
    }
    if (block.invoke != nullptr) {
        const bool isThere = err == kKSTErrorSuccess && result.outputSize > 0;
        block.invoke(block.captured, err, isThere ? result.output->bytes() : nullptr,
                     result.outputSize);
    }
    return kst::logReturning(__func__, err);
}
