#ifndef KST_KSTLIB_REQUEST_SERIALIZATION_H
#define KST_KSTLIB_REQUEST_SERIALIZATION_H

#include "KSTLib/Contexts.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** The payloads of the requests about policies and access-control lists.
 *
 *  The functions keep no state and run on the calling thread. A failed check writes one line to the
 *  library's log, and each function that passes a failure up one more. On failure no output is
 *  changed, unless it is said, and nothing stays allocated.
 *
 *  All of them end in parameters (KSTLib/PolicyVerification.h), which on the wire are one behind
 *  the other without padding:
 *
 *  | offset | width | field               |
 *  |      0 |     4 | type                |
 *  |      4 |     4 | parameterDataLength |
 *  |      8 |     n | the value           |
 */

#ifdef __cplusplus
extern "C" {
#endif

/** Whether the length of `parameter` is one that its type may have. The value is not looked at.
 *
 *  kKSTErrorBadParameter: `parameter` is null, its type is above 7, or its length is another. */
KST_CHECKED KSTStatus ValidateParameter(const KSTParameter* parameter) KST_PUBLIC;

/** Stores in `*outLength` how many bytes `parametersCount` parameters take on the wire: 8 and the
 *  value for each. The count is not compared with kKSTMaxParameters.
 *
 *  kKSTErrorBadParameter, with `*outLength` 0: `parameters` is null and the count is not 0; a
 *  parameter is not valid; or a value does not make the 32-bit sum grow. The last holds for every
 *  value of length 0, so that a list with a parameter of type 0 cannot be sent, though it can be
 *  read. kKSTErrorBadParameter also when `outLength` is null. */
KST_CHECKED KSTStatus GetSerializedParametersLength(const KSTParameter* parameters,
                                                    uint32_t parametersCount,
                                                    uint32_t* outLength) KST_PUBLIC;

/** Releases an array that a deserialiser handed out, and the value of each parameter in it: all is
 *  overwritten with zeros twice, freed and subtracted from gAllocatedBytes. Null is ignored. */
void DeallocParameters(KSTParameter* parameters, uint32_t parametersCount) KST_PUBLIC;

/** The payload that asks whether a context satisfies a policy. L is the length of the policy's
 *  name, P that of the parameters:
 *
 *  | offset | width | field                                     |
 *  |      0 |    16 | handle of the context                     |
 *  |     16 | L + 1 | name of the policy and a zero byte        |
 *  | 17 + L |     1 | preflight, not 0: evaluate, use up nothing |
 *  | 18 + L |     4 | maxGlobalCredentialAge                    |
 *  | 22 + L |     4 | number of parameters, 0 to 10             |
 *  | 26 + L |     P | parameters                                |
 *
 *  The unit of the age is the kernel service's. */

/** The longest name of a policy, in bytes and without its zero byte. */
#define kKSTPolicyIdMaxLength 128

/** Stores L + P + 26 in `*outSize`.
 *
 *  kKSTErrorBadParameter: `handle`, `policyId` or `outSize` is null; the name is longer than
 *  kKSTPolicyIdMaxLength; or GetSerializedParametersLength refuses the parameters. Their number is
 *  not looked at. */
KST_CHECKED KSTStatus GetSerializedVerifyPolicySize(const KSTHandle* handle, const char* policyId,
                                                    uint8_t preflight,
                                                    uint32_t maxGlobalCredentialAge,
                                                    const KSTParameter* parameters,
                                                    uint32_t parametersCount,
                                                    size_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  the bytes written.
 *
 *  kKSTErrorBadParameter, with nothing written: what GetSerializedVerifyPolicySize refuses; only
 *  one of `parameters` and `parametersCount` is given; more than kKSTMaxParameters; a parameter has
 *  a length and no value; `outBuffer` is null; or there is not enough room. */
KST_CHECKED KSTStatus SerializeVerifyPolicy(const KSTHandle* handle, const char* policyId,
                                            uint8_t preflight, uint32_t maxGlobalCredentialAge,
                                            const KSTParameter* parameters,
                                            uint32_t parametersCount, void* outBuffer,
                                            size_t* outSize) KST_PUBLIC;

/** Reads the payload at the start of the `size` bytes at `buffer`; what follows it is not looked
 *  at. `*outPreflight` becomes 0 or 1.
 *
 *  `*outPolicyId` becomes a new text, which the caller gives to DeallocDataBlob with its length and
 *  1 more; `*outParameters` a new array, which the caller gives to DeallocParameters, or null when
 *  there are none.
 *
 *  kKSTErrorBadParameter: an argument is null; the payload is cut short; the name is longer than
 *  kKSTPolicyIdMaxLength; there are more than kKSTMaxParameters parameters, or one is not valid.
 *  kKSTErrorOutOfMemory. After a failure `*outHandle` may have been written all the same. */
KST_CHECKED KSTStatus DeserializeVerifyPolicy(const void* buffer, size_t size, KSTHandle* outHandle,
                                              char** outPolicyId, uint8_t* outPreflight,
                                              uint32_t* outMaxGlobalCredentialAge,
                                              KSTParameter** outParameters,
                                              uint32_t* outParametersCount) KST_PUBLIC;

/** The payload that asks whether a context satisfies one constraint of an access-control list. N is
 *  the length of the constraint, P that of the parameters:
 *
 *  | offset | width | field                                     |
 *  |      0 |    16 | handle of the context, or zeros           |
 *  |     16 |     4 | N                                         |
 *  |     20 |     N | constraint, opaque                        |
 *  | 20 + N |     1 | preflight, not 0: evaluate, use up nothing |
 *  | 21 + N |     4 | maxGlobalCredentialAge                    |
 *  | 25 + N |     4 | number of parameters, 0 to 10             |
 *  | 29 + N |     P | parameters                                |
 *
 *  All sizes are 32-bit. */

/** Stores N + P + 33, in 32-bit arithmetic, in `*outSize`: 4 bytes more than will be written.
 *  `handle` is not looked at; N may be 0.
 *
 *  kKSTErrorBadParameter: `aclConstraint` or `outSize` is null; only one of `parameters` and
 *  `parametersCount` is given; more than kKSTMaxParameters; or GetSerializedParametersLength
 *  refuses them. */
KST_CHECKED KSTStatus GetSerializedVerifyAclConstraintSize(
    const KSTHandle* handle, const void* aclConstraint, uint32_t aclConstraintLength,
    uint8_t preflight, uint32_t maxGlobalCredentialAge, const KSTParameter* parameters,
    uint32_t parametersCount, uint32_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  the bytes written, N + P + 29. `handle` may be null.
 *
 *  kKSTErrorBadParameter, with nothing written: what GetSerializedVerifyAclConstraintSize refuses;
 *  a parameter has a length and no value; `outBuffer` is null; or there is no room for N + P + 33
 *  bytes. */
KST_CHECKED KSTStatus SerializeVerifyAclConstraint(
    const KSTHandle* handle, const void* aclConstraint, uint32_t aclConstraintLength,
    uint8_t preflight, uint32_t maxGlobalCredentialAge, const KSTParameter* parameters,
    uint32_t parametersCount, void* outBuffer, uint32_t* outSize) KST_PUBLIC;

/** Reads the payload at the start of the `size` bytes at `buffer`; what follows it is not looked
 *  at. `*outPreflight` becomes 0 or 1.
 *
 *  `*outAclConstraint` becomes a new copy, which the caller gives to DeallocDataBlob with its
 *  length, or null when it is empty; `*outParameters` a new array, which the caller gives to
 *  DeallocParameters, or null when there are none.
 *
 *  kKSTErrorBadParameter: an argument is null; the payload is cut short; there are more than
 *  kKSTMaxParameters parameters, or one is not valid. kKSTErrorOutOfMemory, which is found out
 *  before a constraint that is cut short is. After a failure `*outHandle` may have been written all
 *  the same. */
KST_CHECKED KSTStatus DeserializeVerifyAclConstraint(
    const void* buffer, uint32_t size, KSTHandle* outHandle, void** outAclConstraint,
    uint32_t* outAclConstraintLength, uint8_t* outPreflight, uint32_t* outMaxGlobalCredentialAge,
    KSTParameter** outParameters, uint32_t* outParametersCount) KST_PUBLIC;

/** The payload that hands over a whole access-control list for an operation. A, O and P are the
 *  lengths of the list, of the operation and of the parameters:
 *
 *  | offset     | width | field                            |
 *  |          0 |    16 | handle of the context, or zeros  |
 *  |         16 |     4 | A                                |
 *  |         20 |     A | list, opaque                     |
 *  | 20 + A     |     4 | O                                |
 *  | 24 + A     |     O | operation, opaque                |
 *  | 24 + A + O |     4 | maxGlobalCredentialAge           |
 *  | 28 + A + O |     4 | number of parameters, 0 to 10    |
 *  | 32 + A + O |     P | parameters                       |
 *
 *  All sizes are 32-bit. */

/** Stores A + O + P + 36, in 32-bit arithmetic, in `*outSize`: 4 bytes more than will be written.
 *  `handle` and `operation` are not looked at.
 *
 *  kKSTErrorBadParameter: `acl` is null or A is 0; `outSize` is null; only one of `parameters` and
 *  `parametersCount` is given; more than kKSTMaxParameters; or GetSerializedParametersLength
 *  refuses them. */
KST_CHECKED KSTStatus GetSerializedProcessAclSize(
    const KSTHandle* handle, const void* acl, uint32_t aclLength, const void* operation,
    uint32_t operationLength, uint32_t maxGlobalCredentialAge, const KSTParameter* parameters,
    uint32_t parametersCount, uint32_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  the bytes written, A + O + P + 32. `handle` may be null, and `operation` when O is 0.
 *
 *  kKSTErrorBadParameter, with nothing written: what GetSerializedProcessAclSize refuses; a
 *  parameter or the operation has a length and no bytes; `outBuffer` is null; or there is no room
 *  for A + O + P + 36 bytes. */
KST_CHECKED KSTStatus SerializeProcessAcl(const KSTHandle* handle, const void* acl,
                                          uint32_t aclLength, const void* operation,
                                          uint32_t operationLength, uint32_t maxGlobalCredentialAge,
                                          const KSTParameter* parameters, uint32_t parametersCount,
                                          void* outBuffer, uint32_t* outSize) KST_PUBLIC;

/** Reads the payload at the start of the `size` bytes at `buffer`; what follows it is not looked
 *  at. An empty list is read, although none can be written.
 *
 *  `*outAcl` and `*outOperation` become new copies, which the caller gives to DeallocDataBlob with
 *  their lengths, or null when they are empty; `*outParameters` a new array, which the caller gives
 *  to DeallocParameters, or null when there are none.
 *
 *  kKSTErrorBadParameter: an argument is null; the payload is cut short; there are more than
 *  kKSTMaxParameters parameters, or one is not valid. kKSTErrorOutOfMemory, which is found out
 *  before a list or an operation that is cut short is. After a failure `*outHandle` may have been
 *  written all the same. */
KST_CHECKED KSTStatus DeserializeProcessAcl(const void* buffer, uint32_t size, KSTHandle* outHandle,
                                            void** outAcl, uint32_t* outAclLength,
                                            void** outOperation, uint32_t* outOperationLength,
                                            uint32_t* outMaxGlobalCredentialAge,
                                            KSTParameter** outParameters,
                                            uint32_t* outParametersCount) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
