#ifndef KST_KSTLIB_PROCESS_ACL_SERIALIZATION_H
#define KST_KSTLIB_PROCESS_ACL_SERIALIZATION_H

#include "KSTLib/Handle.h"
#include "KSTLib/Parameter.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stdint.h>

/** The payload that hands over a whole access-control list for an operation. A, O and P are the
 *  lengths of the list, of the operation and of the parameters on the wire
 *  (KSTLib/ParameterSerialization.h):
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
 *  All sizes are 32-bit. The functions keep no state and run on the calling thread. A failed check
 *  writes one line to the library's log, and each function that passes a failure up one more. On
 *  failure no output is changed, unless it is said, and nothing stays allocated. */

#ifdef __cplusplus
extern "C" {
#endif

/** Stores A + O + P + 36, in 32-bit arithmetic, in `*outSize`: 4 bytes more than will be written.
 *  `handle` and `operation` are not looked at.
 *
 *  kKSTErrorBadParameter: `acl` is null or A is 0; `outSize` is null; only one of `parameters` and
 *  `parametersCount` is given; more than kKSTMaxParameters; or GetSerializedParametersLength
 *  refuses them. */
KSTStatus GetSerializedProcessAclSize(const KSTHandle* handle, const void* acl, uint32_t aclLength,
                                      const void* operation, uint32_t operationLength,
                                      uint32_t maxGlobalCredentialAge,
                                      const KSTParameter* parameters, uint32_t parametersCount,
                                      uint32_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  the bytes written, A + O + P + 32. `handle` may be null, and `operation` when O is 0.
 *
 *  kKSTErrorBadParameter, with nothing written: what GetSerializedProcessAclSize refuses; a
 *  parameter or the operation has a length and no bytes; `outBuffer` is null; or there is no room
 *  for A + O + P + 36 bytes. */
KSTStatus SerializeProcessAcl(const KSTHandle* handle, const void* acl, uint32_t aclLength,
                              const void* operation, uint32_t operationLength,
                              uint32_t maxGlobalCredentialAge, const KSTParameter* parameters,
                              uint32_t parametersCount, void* outBuffer,
                              uint32_t* outSize) KST_PUBLIC;

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
KSTStatus DeserializeProcessAcl(const void* buffer, uint32_t size, KSTHandle* outHandle,
                                void** outAcl, uint32_t* outAclLength, void** outOperation,
                                uint32_t* outOperationLength, uint32_t* outMaxGlobalCredentialAge,
                                KSTParameter** outParameters,
                                uint32_t* outParametersCount) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
