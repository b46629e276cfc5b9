#include "common/PolicyCommands.h"

#include "base/ByteReader.h"
#include "common/Allocation.h"
#include "common/Command.h"
#include "common/ContextObject.h"
#include "common/RequirementSerialization.h"
#include "common/VerifyAclSerialization.h"
#include "common/VerifyPolicySerialization.h"

namespace kst {

namespace {

KSTStatus readAnswer(const AssertionContext& context, const AllocatedMemory& reqBuffer,
                     std::size_t reqBufferSize, bool wanted, PolicyAnswer& answer) {
    if (reqBufferSize > reqBuffer.size()) {
        static_assert(kPolicyReplySize == 4096, "the text below names it");
        return fail(context, "reqBufferSize <= 4096", 0, kKSTErrorUnexpected);
    }
    base::ByteReader reader(reqBuffer.bytes(), reqBufferSize);
    std::uint32_t satisfied = 0;
    if (!reader.readU32(satisfied)) {
        return fail(context, "reqBufferSize >= sizeof(uint32_t)", 0, kKSTErrorUnexpected);
    }
    KSTRequirement* requirement = nullptr;
    if (wanted && !(satisfied != 0 && reader.left() == 0)) {
        std::size_t consumed = 0;
        const KSTStatus err =
            DeserializeRequirement(reader.rest().data(), reader.left(), &requirement, &consumed);
        if (err != kKSTErrorSuccess) {
            return failCall(context, err);
        }
    }
    answer = {satisfied != 0, requirement};
    return kKSTErrorSuccess;
}

} // namespace

KSTStatus sendQuestion(const CommandSender& sender, std::uint32_t code, const void* payload,
                       std::size_t payloadSize, bool wanted, PolicyAnswer& answer) noexcept {
    const AllocatedMemory reqBuffer(kPolicyReplySize);
    if (reqBuffer.bytes() == nullptr) {
        return fail(sender.context, "reqBuffer", 0, kKSTErrorOutOfMemory);
    }
    std::size_t reqBufferSize = reqBuffer.size();
    const KSTStatus err =
        sender.send(code, payload, payloadSize, reqBuffer.bytes(), &reqBufferSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return readAnswer(sender.context, reqBuffer, reqBufferSize, wanted, answer);
}

KSTStatus askAboutPolicy(const CommandSender& sender, const char* policyId,
                         const PolicyQuestion& question, bool wanted,
                         PolicyAnswer& answer) noexcept {
    // Before the size is asked for, which would look at every parameter.
    if (question.parametersCount > kKSTMaxParameters) {
        return fail(sender.context, "parametersCount <= 10", 0, kKSTErrorBadParameter);
    }
    const KSTHandle* handle = handleOf(question.context);
    const std::uint8_t preflight = question.preflight ? 1 : 0;
    std::size_t size = 0;
    KSTStatus err =
        GetSerializedVerifyPolicySize(handle, policyId, preflight, question.maxGlobalCredentialAge,
                                      question.parameters, question.parametersCount, &size);
    if (err != kKSTErrorSuccess) {
        return failCall(sender.context, err);
    }
    const AllocatedMemory inputBuffer(size);
    if (inputBuffer.bytes() == nullptr) {
        return fail(sender.context, "inputBuffer", 0, kKSTErrorOutOfMemory);
    }
    err = SerializeVerifyPolicy(handle, policyId, preflight, question.maxGlobalCredentialAge,
                                question.parameters, question.parametersCount, inputBuffer.bytes(),
                                &size);
    if (err != kKSTErrorSuccess) {
        return failCall(sender.context, err);
    }
    return sendQuestion(sender, kKSTCommandVerifyPolicy, inputBuffer.bytes(), size, wanted, answer);
}

KSTStatus askAboutAclConstraint(const CommandSender& sender, const void* aclConstraint,
                                std::uint32_t length, const PolicyQuestion& question, bool wanted,
                                PolicyAnswer& answer) noexcept {
    const KSTHandle* handle = handleOf(question.context);
    const std::uint8_t preflight = question.preflight ? 1 : 0;
    std::uint32_t size = 0;
    KSTStatus err = GetSerializedVerifyAclConstraintSize(
        handle, aclConstraint, length, preflight, question.maxGlobalCredentialAge,
        question.parameters, question.parametersCount, &size);
    if (err != kKSTErrorSuccess) {
        return failCall(sender.context, err);
    }
    const AllocatedMemory inputBuffer(size);
    if (inputBuffer.bytes() == nullptr) {
        return fail(sender.context, "inputBuffer", 0, kKSTErrorOutOfMemory);
    }
    err = SerializeVerifyAclConstraint(handle, aclConstraint, length, preflight,
                                       question.maxGlobalCredentialAge, question.parameters,
                                       question.parametersCount, inputBuffer.bytes(), &size);
    if (err != kKSTErrorSuccess) {
        return failCall(sender.context, err);
    }
    // What was written, which is less than what was announced.
    return sendQuestion(sender, kKSTCommandVerifyAclConstraint, inputBuffer.bytes(), size, wanted,
                        answer);
}

} // namespace kst
