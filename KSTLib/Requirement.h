#ifndef KST_KSTLIB_REQUIREMENT_H
#define KST_KSTLIB_REQUIREMENT_H

#include "KSTLib/Blocks.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** Requirements: what must be proven before the kernel service grants an operation. A requirement
 *  is a leaf, which one kind of credential meets, or a composite of other requirements. */

/** The header of one node. In memory `dataLength` bytes of data follow it at once; the node is one
 *  allocation of dataLength + 16 bytes.
 *
 *  The data of a leaf are opaque bytes. The data of a composite are a KSTRequirementDataAnd or a
 *  KSTRequirementDataKofN and behind it the pointers to the children, 8 bytes each, without padding
 *  and so not always aligned: walk them with KSTRequirementGetSubrequirements, or copy them out.
 *
 *  On the wire a leaf is the same bytes; of a composite the children themselves stand in the place
 *  of their pointers, one after the other, while `dataLength` stays what it is in memory. */
typedef struct KSTRequirement {
    /** kKSTRequirementType... */
    uint32_t type;
    /** The kernel service's. */
    uint32_t state;
    /** The kernel service's. */
    uint32_t priority;
    uint32_t dataLength;
} KSTRequirement;

/** Types of requirements. 1 to 16 without And, Or and KofN are leaves, whether they have a name
 *  here or not. */
enum {
    kKSTRequirementTypePasscodeValidated = 1,
    kKSTRequirementTypePassphraseEntered = 2,
    kKSTRequirementTypeBiometryMatched = 3,
    /** All of the children. */
    kKSTRequirementTypeAnd = 4,
    /** Any of the children. */
    kKSTRequirementTypeOr = 5,
    /** K of the children. */
    kKSTRequirementTypeKofN = 7,
    kKSTRequirementTypeUserOutputDisplayed = 13,
    /** The largest type that is read and written. */
    kKSTRequirementTypeMax = 16,
    /** A composite that exists in memory only: 17 opaque bytes, the 4-byte count of its children
     * and their pointers. DeallocRequirement alone knows it. */
    kKSTRequirementTypeInMemory = 1000
};

/** The data of And and Or; the pointers to the children follow. */
typedef struct KSTRequirementDataAnd {
    uint32_t subrequirementsCount;
} KSTRequirementDataAnd;

/** The data of KofN; the pointers to the children follow. */
typedef struct KSTRequirementDataKofN {
    uint32_t k;
    uint32_t subrequirementsCount;
} KSTRequirementDataKofN;

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
KST_CHECKED KSTStatus KSTRequirementGetPropertyData(const KSTRequirement* requirement,
                                                    uint32_t propertyId, const void** data,
                                                    size_t* dataLength) KST_PUBLIC;

/** Calls `processProperty` with what KSTRequirementGetPropertyData gives. On any status but 0 the
 *  block is not called.
 *
 *  kKSTErrorBadParameter: `processProperty` is a null block, or as there. */
KST_CHECKED KSTStatus KSTRequirementGetProperty(const KSTRequirement* requirement,
                                                uint32_t propertyId,
                                                KSTDataBlock processProperty) KST_PUBLIC;

/** Calls `processProperty` with every property of `requirement`, in the order 1, 2, 3, 100, 200,
 *  300, 302, 301, 700, and with the table's own lengths: who wants the whole of a property asks for
 *  it alone. A property is there when the requirement's data have the bytes that it is given with,
 *  and left out otherwise; for the whole of it the data may still be too short.
 *
 *  kKSTErrorBadParameter: `requirement` is null or `processProperty` is a null block. */
KST_CHECKED KSTStatus KSTRequirementGetProperties(const KSTRequirement* requirement,
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

#ifndef __cplusplus
static inline void kstCountOne(void* captured, const KSTRequirement* child) {
    (void)child;
    ++*(size_t*)captured;
}
#endif

/** How many children `requirement` has: as often KSTRequirementGetSubrequirements calls its block.
 */
KST_INLINE size_t KSTRequirementGetSubrequirementsCount(const KSTRequirement* requirement) {
    size_t count = 0;
#ifdef __cplusplus
    KSTRequirementGetSubrequirements(requirement, [&count](const KSTRequirement*) { ++count; });
#else
    KSTRequirementGetSubrequirements(requirement, (KSTRequirementBlock){kstCountOne, &count});
#endif
    return count;
}

#endif
