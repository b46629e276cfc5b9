#include "KSTLib/ContextCredentials.h"

#include "KSTLib/Channel.h"
#include "KSTLib/Command.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/LibrarySender.h"
#include "common/CommandSender.h"
#include "common/Failure.h"
#include "common/PayloadMemory.h"

#include <algorithm>

namespace {

KSTStatus sendCredential(const kst::CredentialCommand& command, KSTContextRef context,
                         const KSTCredential* credential, KSTScope scope) {
    KSTStatus err = kst::checkCredential(kst::libraryContext(), context, credential, scope);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::openChannel();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return kst::sendCredential(kst::librarySender(), command, context, credential, scope);
}

KSTStatus removeByNumber(std::uint32_t code, KSTContextRef context, std::uint32_t number,
                         KSTScope scope) {
    KSTStatus err = kst::checkScope(kst::libraryContext(), context, scope);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::openChannel();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return kst::sendNumbers(kst::librarySender(), code, context, number, scope, nullptr, nullptr);
}

/// The kernel service's no is a status too. The size of the reply is not looked at.
KSTStatus isContained(std::uint32_t code, KSTContextRef context, std::uint32_t number,
                      std::uint32_t argument) {
    KSTStatus err =
        kst::requireArguments(kst::libraryContext(), {kst::Argument(context, "context")});
    if (err == kKSTErrorSuccess) {
        err = kst::openChannel();
    }
    kst::WipedBytes<sizeof(std::uint32_t)> reply;
    std::size_t outSize = reply.size();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::sendNumbers(kst::librarySender(), code, context, number, argument, reply.data(),
                           &outSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const bool contained = std::any_of(reply.data(), reply.data() + reply.size(),
                                       [](std::uint8_t byte) { return byte != 0; });
    return contained ? kKSTErrorSuccess : kKSTErrorNotContained;
}

/// KSTContextAddCredentialWithScope, in the time of the call that it is part of.
KSTStatus addCredential(KSTContextRef context, const KSTCredential* credential, KSTScope scope) {
    constexpr const char* kFunction = "KSTContextAddCredentialWithScope";
    kst::logCalled(kFunction);
    return kst::logReturning(kFunction,
                             sendCredential(kst::kAddCredential, context, credential, scope));
}

/// KSTContextRemoveCredentialsByTypeAndScope, likewise.
KSTStatus removeCredentials(KSTContextRef context, std::uint32_t type, KSTScope scope) {
    constexpr const char* kFunction = "KSTContextRemoveCredentialsByTypeAndScope";
    kst::logCalled(kFunction);
    return kst::logReturning(
        kFunction, removeByNumber(kKSTCommandRemoveCredentialsByType, context, type, scope));
}

KSTStatus addGlobally(const KSTCredential* credential) {
    KSTStatus err =
        kst::requireArguments(kst::libraryContext(), {kst::Argument(credential, "credential")});
    kst::TemporaryContext context;
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = context.create();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return addCredential(context.get(), credential, kKSTScopeGlobal);
}

KSTStatus removeGlobally(std::uint32_t type) {
    kst::TemporaryContext context;
    KSTStatus err = context.create();
    if (err == kKSTErrorSuccess) {
        err = removeCredentials(context.get(), type, kKSTScopeGlobal);
    }
    return err;
}

} // namespace

KSTStatus KSTContextAddCredential(KSTContextRef context, const KSTCredential* credential) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return KSTContextAddCredentialWithScope(context, credential, kKSTScopeContext);
}

KSTStatus KSTContextAddCredentialWithScope(KSTContextRef context, const KSTCredential* credential,
                                           KSTScope scope) noexcept {
    const kst::CallScope call;
    return addCredential(context, credential, scope);
}

KSTStatus KSTContextRemoveCredentialsByType(KSTContextRef context, std::uint32_t type) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return KSTContextRemoveCredentialsByTypeAndScope(context, type, kKSTScopeContext);
}

KSTStatus KSTContextRemoveCredentialsByTypeAndScope(KSTContextRef context, std::uint32_t type,
                                                    KSTScope scope) noexcept {
    const kst::CallScope call;
    return removeCredentials(context, type, scope);
}

KSTStatus KSTContextRemoveCredentialsByValue(KSTContextRef context,
                                             const KSTCredential* credential) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return KSTContextRemoveCredentialsByValueAndScope(context, credential, kKSTScopeContext);
}

KSTStatus KSTContextRemoveCredentialsByValueAndScope(KSTContextRef context,
                                                     const KSTCredential* credential,
                                                     KSTScope scope) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__,
                             sendCredential(kst::kRemoveCredential, context, credential, scope));
}

KSTStatus KSTContextContainsCredentialType(KSTContextRef context, std::uint32_t type) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return KSTContextContainsCredentialTypeEx(context, type, 0);
}

KSTStatus KSTContextContainsCredentialTypeEx(KSTContextRef context, std::uint32_t type,
                                             std::uint32_t argument) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(
        __func__, isContained(kKSTCommandContainsCredentialType, context, type, argument));
}

KSTStatus KSTContextRemovePassphraseCredentialsByPurposeAndScope(KSTContextRef context,
                                                                 KSTPassphrasePurpose purpose,
                                                                 KSTScope scope) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(
        __func__, removeByNumber(kKSTCommandRemovePassphraseCredentials, context, purpose, scope));
}

KSTStatus KSTContextReplacePassphraseCredentialsWithScope(KSTContextRef context,
                                                          const KSTCredential* credential,
                                                          KSTScope scope) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__,
                             sendCredential(kst::kReplacePassphrase, context, credential, scope));
}

KSTStatus KSTContextContainsPassphraseCredentialWithPurpose(KSTContextRef context,
                                                            KSTPassphrasePurpose purpose,
                                                            std::uint32_t argument) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(
        __func__, isContained(kKSTCommandContainsPassphraseCredential, context, purpose, argument));
}

KSTStatus KSTGlobalContextAddCredential(const KSTCredential* credential) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__, addGlobally(credential));
}

KSTStatus KSTGlobalContextRemoveCredentialsByType(std::uint32_t type) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__, removeGlobally(type));
}
