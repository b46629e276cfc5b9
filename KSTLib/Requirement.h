#ifndef KST_KSTLIB_REQUIREMENT_H
#define KST_KSTLIB_REQUIREMENT_H

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

#endif
