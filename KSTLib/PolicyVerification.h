#ifndef KST_KSTLIB_POLICY_VERIFICATION_H
#define KST_KSTLIB_POLICY_VERIFICATION_H

#include "KSTLib/Blocks.h"
#include "KSTLib/Contexts.h"
#include "KSTLib/Public.h"
#include "KSTLib/Requirement.h"
#include "KSTLib/Status.h"

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

/** Asks the kernel service whether the credentials of a context satisfy a policy or a constraint
 *  from an access-control list. When they do not, the answer brings the requirement that is still
 *  unmet (KSTLib/Requirement.h).
 *
 *  `policyId` is a text of at most 128 bytes. `preflight` asks without using anything up.
 *  `maxGlobalCredentialAge` bounds the age of credentials of the global context in a unit that is
 *  the kernel service's. `parameters` are at most 10, or null with the count 0. All of them stay
 *  the caller's.
 *
 *  A block is handed the answer and, while it runs, the requirement tree, which is freed after it;
 *  an answer that the policy is satisfied may come without one, and then it is null.
 *
 *  How the functions send, on which threads they may be called and what every one of them may
 *  return is told in KSTLib/KSTLib.h. Beside that:
 *    kKSTErrorBadParameter  a null context, policy or block; or something above its limit, or of
 *                           the wrong length; nothing is sent. Or the requirement cannot be read;
 *    kKSTErrorOutOfMemory   also for the payload, the reply and the requirement;
 *    kKSTErrorUnexpected    the reply is shorter than 4 bytes, or longer than the 4096 that were
 *                           offered. */

/** The type of a parameter, 0 to 7. It settles how long the value must be:
 *
 *  | type    | bytes     | value           |
 *  | 0       | 0         | none            |
 *  | 1, 5    | 4         | a signed number |
 *  | 2, 6, 7 | 16        | opaque          |
 *  | 3       | 1 to 1000 | opaque          |
 *  | 4       | 4         | a user id       |
 */
typedef uint32_t KSTParameterType;

/** How many parameters go with one request at most. */
#define kKSTMaxParameters 10

/** The longest value, which only type 3 may have. */
#define kKSTParameterMaxDataLength 1000

typedef struct KSTParameter {
    KSTParameterType type;
    /** The value; null when its length is 0. */
    const void* parameterData;
    uint32_t parameterDataLength;
} KSTParameter;

#ifdef __cplusplus
static_assert(sizeof(KSTParameter) == 24, "natural alignment");
#endif

#ifdef __cplusplus
extern "C" {
#endif

/** Asks with command 3, without preflight, parameters or global credentials of any age but 0. The
 *  block is called on success only. */
KST_CHECKED KSTStatus KSTContextVerifyPolicy(KSTContextRef context, const char* policyId,
                                             KSTPolicyBlock processRequirement) KST_PUBLIC;

/** As KSTContextVerifyPolicy, with preflight or without. */
KST_CHECKED KSTStatus
KSTContextVerifyPolicyWithPreflight(KSTContextRef context, const char* policyId, bool preflight,
                                    KSTPolicyBlock processRequirement) KST_PUBLIC;

/** Asks with command 3. The block, unless it is a null block, is called exactly once, after a
 *  failure too, and is the only one to learn the status. */
void KSTContextVerifyPolicyEx(KSTContextRef context, const char* policyId, bool preflight,
                              const KSTParameter* parameters, uint32_t parametersCount,
                              uint32_t maxGlobalCredentialAge,
                              KSTPolicyStatusBlock processRequirement) KST_PUBLIC;

/** As KSTContextVerifyPolicyEx, for global credentials of any age (0xffffffff) and a context that
 *  is created for the call and destroyed after it. When it cannot be created, the block learns that
 *  status. */
void KSTGlobalContextVerifyPolicy(const char* policyId, bool preflight,
                                  const KSTParameter* parameters, uint32_t parametersCount,
                                  KSTPolicyStatusBlock processRequirement) KST_PUBLIC;

/** As KSTContextVerifyPolicyEx, about the constraint of `aclConstraintLength` bytes at
 *  `aclConstraint`, with command 11. kKSTErrorBadParameter also for a constraint that is null,
 *  empty, or too long for 32-bit sizes. */
void KSTContextVerifyAclConstraint(KSTContextRef context, const void* aclConstraint,
                                   size_t aclConstraintLength, bool preflight,
                                   const KSTParameter* parameters, uint32_t parametersCount,
                                   uint32_t maxGlobalCredentialAge,
                                   KSTPolicyStatusBlock processRequirement) KST_PUBLIC;

/** Has the access-control list of `aclLength` bytes at `acl` read with command 20, and hands the
 *  characteristics of its constraints, at most 4096 bytes, to the block.
 *
 *  The block, unless it is a null block, is called exactly once, with the status that is also
 *  returned. After a failure `data` is null whatever `length` is: the size of the reply, or 4096
 *  when there was none.
 *
 *  kKSTErrorBadParameter also for a list that is null, empty, or too long for 32-bit sizes. */
KSTStatus KSTParseAclAndCopyConstraintCharacteristics(
    const void* acl, size_t aclLength,
    KSTStatusDataBlock processConstraintCharacteristics) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
