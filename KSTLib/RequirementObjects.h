#ifndef KST_KSTLIB_REQUIREMENT_OBJECTS_H
#define KST_KSTLIB_REQUIREMENT_OBJECTS_H

#include "KSTLib/Blocks.h"
#include "KSTLib/Public.h"
#include "KSTLib/Requirement.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** Reads one node of a tree of requirements (KSTLib/Requirement.h). Nothing is copied, changed or
 *  sent. The functions run on the calling thread.
 *
 *  Properties, with the lengths of their data in bytes:
 *
 *  |  id | types | where          | length | length in KSTRequirementGetProperties |
 *  |   1 | all   | type           |      4 | 4                                     |
 *  |   2 | all   | state          |      4 | 4                                     |
 *  |   3 | all   | priority       |      4 | 4                                     |
 *  | 100 | 1, 3  | data, byte 0   |      4 | 4                                     |
 *  | 200 | 2     | data, byte 0   |      4 | 4                                     |
 *  | 300 | 3     | data, byte 4   |     16 | 8                                     |
 *  | 301 | 3     | data, byte 36  |     32 | 8                                     |
 *  | 302 | 3     | data, byte 20  |     16 | 8                                     |
 *  | 400 | 13    | data, byte 0   |     32 | left out                              |
 *  | 700 | 7     | data, byte 0   |      4 | 4 (K)                                 |
 */

#ifdef __cplusplus
extern "C" {
#endif

/** The type, the state and the priority of `requirement`; 0, with a line in the log, when it is
 *  null. */
uint32_t KSTRequirementGetType(const KSTRequirement* requirement) KST_PUBLIC;
uint32_t KSTRequirementGetState(const KSTRequirement* requirement) KST_PUBLIC;
uint32_t KSTRequirementGetPriority(const KSTRequirement* requirement) KST_PUBLIC;

/** Stores where the property `propertyId` of `requirement` is in `*data` and its length in
 *  `*dataLength`. The pointer points into the node and is good for as long as the node is. On
 *  failure the outputs are as they were.
 *
 *  kKSTErrorBadParameter: a null argument; the property is unknown or not one of the requirement's
 *  type; or the requirement's data are too short for it. */
KSTStatus KSTRequirementGetPropertyData(const KSTRequirement* requirement, uint32_t propertyId,
                                        const void** data, size_t* dataLength) KST_PUBLIC;

/** Calls `processProperty` with what KSTRequirementGetPropertyData gives. On any status but 0 the
 *  block is not called.
 *
 *  kKSTErrorBadParameter: `processProperty` is a null block, or as there. */
KSTStatus KSTRequirementGetProperty(const KSTRequirement* requirement, uint32_t propertyId,
                                    KSTDataBlock processProperty) KST_PUBLIC;

/** Calls `processProperty` with every property of `requirement`, in the order 1, 2, 3, 100, 200,
 *  300, 302, 301, 700, and with the table's own lengths: who wants the whole of a property asks for
 *  it alone. A property is there when the requirement's data have the bytes that it is given with,
 *  and left out otherwise; for the whole of it the data may still be too short.
 *
 *  kKSTErrorBadParameter: `requirement` is null or `processProperty` is a null block. */
KSTStatus KSTRequirementGetProperties(const KSTRequirement* requirement,
                                      KSTPropertyBlock processProperty) KST_PUBLIC;

/** Calls `processSubrequirement` with each child of `requirement`, in order; a leaf has none. The
 *  children belong to the tree. A tree that this library has read has no null child; where a tree
 *  that the caller put together has one, the block is called with null. A null requirement and a
 *  null block are logged and ignored. */
void KSTRequirementGetSubrequirements(const KSTRequirement* requirement,
                                      KSTRequirementBlock processSubrequirement) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
