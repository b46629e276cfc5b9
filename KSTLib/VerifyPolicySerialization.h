#ifndef KST_KSTLIB_VERIFY_POLICY_SERIALIZATION_H
#define KST_KSTLIB_VERIFY_POLICY_SERIALIZATION_H

#include "KSTLib/Handle.h"
#include "KSTLib/Parameter.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** The payload that asks whether a context satisfies a policy. L is the length of the policy's
 *  name, P that of the parameters on the wire (KSTLib/ParameterSerialization.h):
 *
 *  | offset | width | field                                     |
 *  |      0 |    16 | handle of the context                     |
 *  |     16 | L + 1 | name of the policy and a zero byte        |
 *  | 17 + L |     1 | preflight, not 0: evaluate, use up nothing |
 *  | 18 + L |     4 | maxGlobalCredentialAge                    |
 *  | 22 + L |     4 | number of parameters, 0 to 10             |
 *  | 26 + L |     P | parameters                                |
 *
 *  The unit of the age is the kernel service's. The functions keep no state and run on the calling
 *  thread. A failed check writes one line to the library's log, and each function that passes a
 *  failure up one more. On failure no output is changed, unless it is said, and nothing stays
 *  allocated. */

#ifdef __cplusplus
extern "C" {
#endif

/** The longest name of a policy, in bytes and without its zero byte. */
#define kKSTPolicyIdMaxLength 128

/** Stores L + P + 26 in `*outSize`.
 *
 *  kKSTErrorBadParameter: `handle`, `policyId` or `outSize` is null; the name is longer than
 *  kKSTPolicyIdMaxLength; or GetSerializedParametersLength refuses the parameters. Their number is
 *  not looked at. */
KSTStatus GetSerializedVerifyPolicySize(const KSTHandle* handle, const char* policyId,
                                        uint8_t preflight, uint32_t maxGlobalCredentialAge,
                                        const KSTParameter* parameters, uint32_t parametersCount,
                                        size_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  the bytes written.
 *
 *  kKSTErrorBadParameter, with nothing written: what GetSerializedVerifyPolicySize refuses; only
 *  one of `parameters` and `parametersCount` is given; more than kKSTMaxParameters; a parameter has
 *  a length and no value; `outBuffer` is null; or there is not enough room. */
KSTStatus SerializeVerifyPolicy(const KSTHandle* handle, const char* policyId, uint8_t preflight,
                                uint32_t maxGlobalCredentialAge, const KSTParameter* parameters,
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
KSTStatus DeserializeVerifyPolicy(const void* buffer, size_t size, KSTHandle* outHandle,
                                  char** outPolicyId, uint8_t* outPreflight,
                                  uint32_t* outMaxGlobalCredentialAge, KSTParameter** outParameters,
                                  uint32_t* outParametersCount) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
