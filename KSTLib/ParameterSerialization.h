#ifndef KST_KSTLIB_PARAMETER_SERIALIZATION_H
#define KST_KSTLIB_PARAMETER_SERIALIZATION_H

#include "KSTLib/Parameter.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stdint.h>

/** Parameters (KSTLib/Parameter.h) on the wire, one behind the other without padding:
 *
 *  | offset | width | field               |
 *  |      0 |     4 | type                |
 *  |      4 |     4 | parameterDataLength |
 *  |      8 |     n | the value           |
 *
 *  The functions keep no state and run on the calling thread. A failed check writes one line to the
 *  library's log. */

#ifdef __cplusplus
extern "C" {
#endif

/** Whether the length of `parameter` is one that its type may have. The value is not looked at.
 *
 *  kKSTErrorBadParameter: `parameter` is null, its type is above 7, or its length is another. */
KSTStatus ValidateParameter(const KSTParameter* parameter) KST_PUBLIC;

/** Stores in `*outLength` how many bytes `parametersCount` parameters take on the wire: 8 and the
 *  value for each. The count is not compared with kKSTMaxParameters.
 *
 *  kKSTErrorBadParameter, with `*outLength` 0: `parameters` is null and the count is not 0; a
 *  parameter is not valid; or a value does not make the 32-bit sum grow. The last holds for every
 *  value of length 0, so that a list with a parameter of type 0 cannot be sent, though it can be
 *  read. kKSTErrorBadParameter also when `outLength` is null. */
KSTStatus GetSerializedParametersLength(const KSTParameter* parameters, uint32_t parametersCount,
                                        uint32_t* outLength) KST_PUBLIC;

/** Releases an array that a deserialiser handed out, and the value of each parameter in it: all is
 *  overwritten with zeros twice, freed and subtracted from gAllocatedBytes. Null is ignored. */
void DeallocParameters(KSTParameter* parameters, uint32_t parametersCount) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
