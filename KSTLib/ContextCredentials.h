#ifndef KST_KSTLIB_CONTEXT_CREDENTIALS_H
#define KST_KSTLIB_CONTEXT_CREDENTIALS_H

#include "KSTLib/Contexts.h"
#include "KSTLib/Credential.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stdint.h>

/** Credentials in contexts: put in, taken out, asked for.
 *
 *  A credential is in one context, or in the global context that the kernel service shares among
 *  all clients. A function that takes a scope needs a context for every scope but kKSTScopeGlobal;
 *  one that takes none means kKSTScopeContext. Credentials stay the caller's; the copies that are
 *  sent are wiped.
 *
 *  How the functions send, on which threads they may be called and what every one of them may
 *  return is told in KSTLib/KSTLib.h. kKSTErrorBadParameter stands for a null credential and for a
 *  context that is null without need, and nothing is sent; kKSTErrorOutOfMemory also for the
 *  payload. A credential that cannot be written (KSTLib/CredentialSerialization.h) is not sent. */

#ifdef __cplusplus
extern "C" {
#endif

/** Adds `credential` to `context`. */
KST_CHECKED KSTStatus KSTContextAddCredential(KSTContextRef context,
                                              const KSTCredential* credential) KST_PUBLIC;

/** Adds `credential` with command 5. */
KST_CHECKED KSTStatus KSTContextAddCredentialWithScope(KSTContextRef context,
                                                       const KSTCredential* credential,
                                                       KSTScope scope) KST_PUBLIC;

/** Takes the credentials of `type` out of `context`. */
KST_CHECKED KSTStatus KSTContextRemoveCredentialsByType(KSTContextRef context,
                                                        uint32_t type) KST_PUBLIC;

/** Takes the credentials of `type` out with command 9. */
KST_CHECKED KSTStatus KSTContextRemoveCredentialsByTypeAndScope(KSTContextRef context,
                                                                uint32_t type,
                                                                KSTScope scope) KST_PUBLIC;

/** Takes the credentials that equal `credential` out of `context`. */
KST_CHECKED KSTStatus KSTContextRemoveCredentialsByValue(
    KSTContextRef context, const KSTCredential* credential) KST_PUBLIC;

/** Takes the credentials that equal `credential` out with command 6. */
KST_CHECKED KSTStatus KSTContextRemoveCredentialsByValueAndScope(KSTContextRef context,
                                                                 const KSTCredential* credential,
                                                                 KSTScope scope) KST_PUBLIC;

/** Whether `context` has a credential of `type`: 0 when it has, kKSTErrorNotContained when it has
 *  not. `context` must not be null. */
KST_CHECKED KSTStatus KSTContextContainsCredentialType(KSTContextRef context,
                                                       uint32_t type) KST_PUBLIC;

/** As KSTContextContainsCredentialType, which passes 0 for `argument`, with command 4. What the
 *  argument means is the kernel service's. */
KST_CHECKED KSTStatus KSTContextContainsCredentialTypeEx(KSTContextRef context, uint32_t type,
                                                         uint32_t argument) KST_PUBLIC;

/** Takes the passphrases of `purpose` out with command 16. */
KST_CHECKED KSTStatus KSTContextRemovePassphraseCredentialsByPurposeAndScope(
    KSTContextRef context, KSTPassphrasePurpose purpose, KSTScope scope) KST_PUBLIC;

/** Puts `credential` in the place of the passphrases with command 15. */
KST_CHECKED KSTStatus KSTContextReplacePassphraseCredentialsWithScope(
    KSTContextRef context, const KSTCredential* credential, KSTScope scope) KST_PUBLIC;

/** Whether `context` has a passphrase of `purpose`, with command 13: as
 *  KSTContextContainsCredentialTypeEx. */
KST_CHECKED KSTStatus KSTContextContainsPassphraseCredentialWithPurpose(
    KSTContextRef context, KSTPassphrasePurpose purpose, uint32_t argument) KST_PUBLIC;

/** Adds `credential` to the global context. A context is created for the call and destroyed after
 *  it, whether the call succeeds or not; what creating it fails with is returned too. */
KST_CHECKED KSTStatus KSTGlobalContextAddCredential(const KSTCredential* credential) KST_PUBLIC;

/** Takes the credentials of `type` out of the global context. As KSTGlobalContextAddCredential. */
KST_CHECKED KSTStatus KSTGlobalContextRemoveCredentialsByType(uint32_t type) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
