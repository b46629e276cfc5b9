#include "common/CommandSender.h"

#include "KSTLib/Command.h"
#include "KSTLib/CredentialSerialization.h"
#include "KSTLib/RequestSerialization.h"
#include "KSTLib/RequirementSerialization.h"
#include "base/ByteReader.h"
#include "common/Allocation.h"
#include "common/ContextObject.h"
#include "common/PayloadMemory.h"

namespace kst {

const CredentialCommand kAddCredential = {kKSTCommandAddCredential, GetSerializedAddCredentialSize,
                                          SerializeAddCredential};

const CredentialCommand kRemoveCredential = {kKSTCommandRemoveCredentialsByValue,
                                             GetSerializedRemoveCredentialSize,
                                             SerializeRemoveCredential};

const CredentialCommand kReplacePassphrase = {kKSTCommandReplacePassphraseCredentials,
                                              GetSerializedReplacePassphraseCredentialSize,
                                              SerializeReplacePassphraseCredential};

KSTStatus checkScope(const AssertionContext& report, KSTContextRef context,
                     KSTScope scope) noexcept {
    return context != nullptr || scope == kKSTScopeGlobal
               ? kKSTErrorSuccess
               : fail(report, "context || scope == kKSTScopeGlobal", 0, kKSTErrorBadParameter);
}

KSTStatus checkCredential(const AssertionContext& report, KSTContextRef context,
                          const KSTCredential* credential, KSTScope scope) noexcept {
    const KSTStatus err = checkScope(report, context, scope);
    if (err == kKSTErrorSuccess && credential == nullptr) {
        return fail(report, "credential", 0, kKSTErrorBadParameter);
    }
    return err;
}

KSTStatus sendCredential(const CommandSender& sender, const CredentialCommand& command,
                         KSTContextRef context, const KSTCredential* credential,
                         KSTScope scope) noexcept {
    const KSTHandle* handle = handleOf(context);
    BuiltPayload payload;
    const KSTStatus err = payload.build<std::size_t>(
        sender.context,
        [&](std::size_t* size) { return command.getSize(handle, credential, scope, size); },
        [&](void* buffer, std::size_t* size) {
            return command.serialize(handle, credential, scope, buffer, size);
        });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return sender.send(command.code, payload.bytes(), payload.size(), nullptr, nullptr);
}

KSTStatus sendNumbers(const CommandSender& sender, std::uint32_t code, KSTContextRef context,
                      std::uint32_t first, std::uint32_t second, void* outData,
                      std::size_t* outSize) noexcept {
    const AllocatedMemory inputBuffer(kKSTHandleSize + sizeof first + sizeof second);
    if (inputBuffer.bytes() == nullptr) {
        return fail(sender.context, "inputBuffer", 0, kKSTErrorOutOfMemory);
    }
    base::ByteWriter writer(inputBuffer.bytes(), inputBuffer.size());
    static_cast<void>(writeHandle(writer, handleOf(context)));
    static_cast<void>(writer.writeU32(first));
    static_cast<void>(writer.writeU32(second));
    return sender.send(code, inputBuffer.bytes(), inputBuffer.size(), outData, outSize);
}

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
    if (wanted && (satisfied == 0 || reader.left() > 0)) {
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

/// Sends a payload and reads the reply.
KSTStatus sendQuestion(const CommandSender& sender, std::uint32_t code, const BuiltPayload& payload,
                       bool wanted, PolicyAnswer& answer) {
    const AllocatedMemory reqBuffer(kPolicyReplySize);
    if (reqBuffer.bytes() == nullptr) {
        return fail(sender.context, "reqBuffer", 0, kKSTErrorOutOfMemory);
    }
    std::size_t reqBufferSize = reqBuffer.size();
    const KSTStatus err =
        sender.send(code, payload.bytes(), payload.size(), reqBuffer.bytes(), &reqBufferSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return readAnswer(sender.context, reqBuffer, reqBufferSize, wanted, answer);
}

} // namespace

KSTStatus askAboutPolicy(const CommandSender& sender, const char* policyId,
                         const PolicyQuestion& question, bool wanted,
                         PolicyAnswer& answer) noexcept {
    // Before the size is asked for, which would look at every parameter.
    if (question.parametersCount > kKSTMaxParameters) {
        return fail(sender.context, "parametersCount <= 10", 0, kKSTErrorBadParameter);
    }
    const KSTHandle* handle = handleOf(question.context);
    const std::uint8_t preflight = question.preflight ? 1 : 0;
    BuiltPayload payload;
    const KSTStatus err = payload.build<std::size_t>(
        sender.context,
        [&](std::size_t* size) {
            return GetSerializedVerifyPolicySize(
                handle, policyId, preflight, question.maxGlobalCredentialAge, question.parameters,
                question.parametersCount, size);
        },
        [&](void* buffer, std::size_t* size) {
            return SerializeVerifyPolicy(handle, policyId, preflight,
                                         question.maxGlobalCredentialAge, question.parameters,
                                         question.parametersCount, buffer, size);
        });
    return err != kKSTErrorSuccess
               ? err
               : sendQuestion(sender, kKSTCommandVerifyPolicy, payload, wanted, answer);
}

KSTStatus askAboutAclConstraint(const CommandSender& sender, const void* aclConstraint,
                                std::uint32_t length, const PolicyQuestion& question, bool wanted,
                                PolicyAnswer& answer) noexcept {
    const KSTHandle* handle = handleOf(question.context);
    const std::uint8_t preflight = question.preflight ? 1 : 0;
    BuiltPayload payload;
    const KSTStatus err = payload.build<std::uint32_t>(
        sender.context,
        [&](std::uint32_t* size) {
            return GetSerializedVerifyAclConstraintSize(
                handle, aclConstraint, length, preflight, question.maxGlobalCredentialAge,
                question.parameters, question.parametersCount, size);
        },
        [&](void* buffer, std::uint32_t* size) {
            return SerializeVerifyAclConstraint(
                handle, aclConstraint, length, preflight, question.maxGlobalCredentialAge,
                question.parameters, question.parametersCount, buffer, size);
        });
    return err != kKSTErrorSuccess
               ? err
               : sendQuestion(sender, kKSTCommandVerifyAclConstraint, payload, wanted, answer);
}

} // namespace kst
