#include "KSTLib/Command.h"
#include "KSTLib/LibCall.h"
#include "common/CommandSender.h"
#include "common/ContextObject.h"
#include "common/Failure.h"
#include "common/PayloadMemory.h"

namespace {

kst::CommandSender senderOver(KSTTransport transport) {
    return {kst::libCallContext("common/LibCall"), transport};
}

KSTStatus checkTransport(const kst::CommandSender& sender) {
    return kst::requireArguments(sender.context, {kst::Argument(sender.transport, "transport")});
}

KSTStatus create(const kst::CommandSender& sender, KSTContextRef* context, std::uint8_t* logLevel) {
    KSTStatus err = checkTransport(sender);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::requireArguments(sender.context, {kst::Argument(context, "context")});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    kst::WipedBytes<kKSTHandleSize + sizeof(std::uint8_t)> outputBuffer;
    std::size_t outputBufferSize = outputBuffer.size();
    err = sender.send(kKSTCommandContextCreate, nullptr, 0, outputBuffer.data(), &outputBufferSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (outputBufferSize != outputBuffer.size()) {
        return kst::fail(sender.context, "outputBufferSize == sizeof(outputBuffer)", 0,
                         kKSTErrorUnexpected);
    }
    *context = kst::makeContext(outputBuffer.data());
    if (*context == nullptr) {
        return kst::fail(sender.context, "*context", 0, kKSTErrorOutOfMemory);
    }
    if (logLevel != nullptr) {
        *logLevel = outputBuffer.data()[kKSTHandleSize];
    }
    return kKSTErrorSuccess;
}

KSTStatus deleteContext(const kst::CommandSender& sender, KSTContextRef context, bool destroy) {
    KSTStatus err = checkTransport(sender);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::requireArguments(sender.context, {kst::Argument(context, "context")});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (destroy) {
        err = sender.send(kKSTCommandContextDelete, context->handle.bytes, kKSTHandleSize, nullptr,
                          nullptr);
    }
    if (err != kKSTErrorSuccess) {
        return err;
    }
    kst::disposeOfContext(context);
    return kKSTErrorSuccess;
}

KSTStatus addCredential(const kst::CommandSender& sender, KSTContextRef context,
                        const KSTCredential* credential, KSTScope scope) {
    KSTStatus err = checkTransport(sender);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::checkCredential(sender.context, context, credential, scope);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return kst::sendCredential(sender, kst::kAddCredential, context, credential, scope);
}

KSTStatus removeCredentialsByType(const kst::CommandSender& sender, KSTContextRef context,
                                  std::uint32_t type, KSTScope scope) {
    KSTStatus err = checkTransport(sender);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::checkScope(sender.context, context, scope);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return kst::sendNumbers(sender, kKSTCommandRemoveCredentialsByType, context, type, scope,
                            nullptr, nullptr);
}

KSTStatus checkPolicyArguments(const kst::CommandSender& sender,
                               const kst::PolicyQuestion& question, const char* policyId,
                               const bool* policySatisfied) {
    KSTStatus err = checkTransport(sender);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::requireArguments(sender.context, {kst::Argument(question.context, "context")});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    // The null pointer stands in the text as its macro expands.
    if ((question.parametersCount > 0) != (question.parameters != nullptr)) {
        return kst::fail(sender.context,
                         "( (parametersCount > 0 && parameters != ((void*)0)) || "
                         "((parametersCount == 0) && parameters == ((void*)0)) )",
                         0, kKSTErrorBadParameter);
    }
    return kst::requireArguments(sender.context,
                                 {
                                     kst::Argument(policyId, "policyId"),
                                     kst::Argument(policySatisfied, "policySatisfied"),
                                 });
}

KSTStatus verifyPolicy(const kst::CommandSender& sender, const kst::PolicyQuestion& question,
                       const char* policyId, bool* policySatisfied, KSTRequirement** requirement) {
    KSTStatus err = checkPolicyArguments(sender, question, policyId, policySatisfied);
    kst::PolicyAnswer answer;
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::askAboutPolicy(sender, policyId, question, requirement != nullptr, answer);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    *policySatisfied = answer.satisfied;
    if (requirement != nullptr) {
        *requirement = answer.requirement;
    }
    return kKSTErrorSuccess;
}

} // namespace

KSTStatus LibCall_KSTContextCreate(KSTTransport transport, KSTContextRef* context,
                                   std::uint8_t* logLevel) noexcept {
    return kst::printReturn(__func__, create(senderOver(transport), context, logLevel));
}

KSTStatus LibCall_KSTContextDelete(KSTTransport transport, KSTContextRef context,
                                   bool destroy) noexcept {
    return kst::printReturn(__func__, deleteContext(senderOver(transport), context, destroy));
}

// Without the t: this is what clients link.
KSTStatus LibCall_KSTContexAddCredentialWithScope(KSTTransport transport, KSTContextRef context,
                                                  const KSTCredential* credential,
                                                  KSTScope scope) noexcept {
    return kst::printReturn(__func__,
                            addCredential(senderOver(transport), context, credential, scope));
}

KSTStatus LibCall_KSTContexRemoveCredentialsByTypeAndScope(KSTTransport transport,
                                                           KSTContextRef context,
                                                           std::uint32_t type,
                                                           KSTScope scope) noexcept {
    return kst::printReturn(__func__,
                            removeCredentialsByType(senderOver(transport), context, type, scope));
}

KSTStatus LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
    KSTTransport transport, KSTContextRef context, const char* policyId, bool preflight,
    const KSTParameter* parameters, std::uint32_t parametersCount,
    std::uint32_t maxGlobalCredentialAge, bool* policySatisfied,
    KSTRequirement** requirement) noexcept {
    return kst::printReturn(__func__, verifyPolicy(senderOver(transport),
                                                   {context, preflight, maxGlobalCredentialAge,
                                                    parameters, parametersCount},
                                                   policyId, policySatisfied, requirement));
}
