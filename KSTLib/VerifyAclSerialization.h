#ifndef KST_KSTLIB_VERIFY_ACL_SERIALIZATION_H
#define KST_KSTLIB_VERIFY_ACL_SERIALIZATION_H

#include "KSTLib/Handle.h"
#include "KSTLib/Parameter.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stdint.h>

/** The payload that asks whether a context satisfies one constraint of an access-control list. N is
 *  the length of the constraint, P that of the parameters on the wire
 *  (KSTLib/ParameterSerialization.h):
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
 *  All sizes are 32-bit. The functions keep no state and run on the calling thread. A failed check
 *  writes one line to the library's log, and each function that passes a failure up one more. On
 *  failure no output is changed, unless it is said, and nothing stays allocated. */

#ifdef __cplusplus
extern "C" {
#endif

/** Stores N + P + 33, in 32-bit arithmetic, in `*outSize`: 4 bytes more than will be written.
 *  `handle` is not looked at; N may be 0.
 *
 *  kKSTErrorBadParameter: `aclConstraint` or `outSize` is null; only one of `parameters` and
 *  `parametersCount` is given; more than kKSTMaxParameters; or GetSerializedParametersLength
 *  refuses them. */
KSTStatus GetSerializedVerifyAclConstraintSize(const KSTHandle* handle, const void* aclConstraint,
                                               uint32_t aclConstraintLength, uint8_t preflight,
                                               uint32_t maxGlobalCredentialAge,
                                               const KSTParameter* parameters,
                                               uint32_t parametersCount,
                                               uint32_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  the bytes written, N + P + 29. `handle` may be null.
 *
 *  kKSTErrorBadParameter, with nothing written: what GetSerializedVerifyAclConstraintSize refuses;
 *  a parameter has a length and no value; `outBuffer` is null; or there is no room for N + P + 33
 *  bytes. */
KSTStatus SerializeVerifyAclConstraint(const KSTHandle* handle, const void* aclConstraint,
                                       uint32_t aclConstraintLength, uint8_t preflight,
                                       uint32_t maxGlobalCredentialAge,
                                       const KSTParameter* parameters, uint32_t parametersCount,
                                       void* outBuffer, uint32_t* outSize) KST_PUBLIC;

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
KSTStatus DeserializeVerifyAclConstraint(const void* buffer, uint32_t size, KSTHandle* outHandle,
                                         void** outAclConstraint, uint32_t* outAclConstraintLength,
                                         uint8_t* outPreflight, uint32_t* outMaxGlobalCredentialAge,
                                         KSTParameter** outParameters,
                                         uint32_t* outParametersCount) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
