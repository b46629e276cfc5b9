#ifndef KST_KSTLIB_LIB_CALL_CONTEXT_H
#define KST_KSTLIB_LIB_CALL_CONTEXT_H

#include "KSTLib/Context.h"
#include "KSTLib/Credential.h"
#include "KSTLib/Handle.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Parameter.h"
#include "KSTLib/Public.h"
#include "KSTLib/Requirement.h"
#include "KSTLib/Status.h"

#include <stdbool.h>
#include <stdint.h>

/** The LibCall functions (KSTLib/LibCall.h) for contexts. They hand a null context to the
 *  transport. What they do is told with their namesakes in KSTLib/Contexts.h,
 *  KSTLib/ContextCredentials.h and KSTLib/PolicyVerification.h; what differs is told here.
 *
 *  Any status that is not named is the transport's or a serialiser's. */

#ifdef __cplusplus
extern "C" {
#endif

/** Creates a context with command 1 and stores it in `*context`. The level byte of the reply is
 *  stored in `*logLevel` unless that is null; it changes nothing in the library.
 *
 *  kKSTErrorBadParameter: `transport` or `context` is null; nothing is sent then.
 *  kKSTErrorUnexpected: the reply has not 17 bytes. kKSTErrorOutOfMemory: `*context` becomes null.
 *  After any other failure both are as they were. */
KSTStatus LibCall_KSTContextCreate(KSTTransport transport, KSTContextRef* context,
                                   uint8_t* logLevel) KST_PUBLIC;

/** Deletes `context`, with command 2 when `destroy`. After a failure `context` still is the
 *  caller's. kKSTErrorBadParameter: `transport` or `context` is null. */
KSTStatus LibCall_KSTContextDelete(KSTTransport transport, KSTContextRef context,
                                   bool destroy) KST_PUBLIC;

/** As KSTContextAddCredentialWithScope. kKSTErrorBadParameter also when `transport` is null. (The
 *  name is as it is.) */
KSTStatus LibCall_KSTContexAddCredentialWithScope(KSTTransport transport, KSTContextRef context,
                                                  const KSTCredential* credential,
                                                  KSTScope scope) KST_PUBLIC;

/** As KSTContextRemoveCredentialsByTypeAndScope. kKSTErrorBadParameter also when `transport` is
 *  null. (The name is as it is.) */
KSTStatus LibCall_KSTContexRemoveCredentialsByTypeAndScope(KSTTransport transport,
                                                           KSTContextRef context, uint32_t type,
                                                           KSTScope scope) KST_PUBLIC;

/** Asks as KSTContextVerifyPolicyEx does and stores the answer: `*policySatisfied` and, unless
 *  `requirement` is null, the requirement tree or null in `*requirement`. The tree is the caller's,
 *  who gives it to LibCall_KSTRequirementDelete. Without `requirement` what follows the flag in the
 *  reply is not looked at.
 *
 *  kKSTErrorBadParameter: `transport`, `context`, `policyId` or `policySatisfied` is null; only one
 *  of `parameters` and `parametersCount` is given; or the request cannot carry them; nothing is
 *  sent then. kKSTErrorUnexpected: the reply is shorter than 4 bytes or longer than was offered.
 *  After a failure both outputs are as they were. */
KSTStatus LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
    KSTTransport transport, KSTContextRef context, const char* policyId, bool preflight,
    const KSTParameter* parameters, uint32_t parametersCount, uint32_t maxGlobalCredentialAge,
    bool* policySatisfied, KSTRequirement** requirement) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
