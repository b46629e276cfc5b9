#ifndef KST_KSTLIB_REQUIREMENT_SERIALIZATION_H
#define KST_KSTLIB_REQUIREMENT_SERIALIZATION_H

#include "KSTLib/Public.h"
#include "KSTLib/Requirement.h"
#include "KSTLib/Status.h"

#include <stddef.h>

/** Sizes, writes, reads and frees trees of requirements (KSTLib/Requirement.h). All sizes are
 *  bytes.
 *
 *  The functions keep no state and run on the calling thread; a tree may be as deep as memory
 *  allows, and all of them take time in proportion to its nodes. A failed check writes one line to
 *  the library's log; a failure below the root is followed by one line "err == 0 " for each
 *  enclosing level, the innermost first. On failure no output argument is changed, and nothing
 *  stays allocated.
 *
 *  kKSTErrorBadParameter stands for a null argument, a type outside 1 to 16 and whatever a function
 *  names itself. Beside what they return, the functions may need memory for the levels of the tree:
 *  kKSTErrorOutOfMemory. */

#ifdef __cplusplus
extern "C" {
#endif

/** Stores the size of the tree `requirement` on the wire in `*outSize`.
 *
 *  kKSTErrorBadParameter: a child is null, or a composite's `dataLength` is too short for the
 *  children that it counts. */
KST_CHECKED KSTStatus GetSerializedRequirementSize(const KSTRequirement* requirement,
                                                   size_t* outSize) KST_PUBLIC;

/** Writes the tree `requirement` to `buffer`, which has room for `*bufferSize` bytes, and sets
 *  `*bufferSize` to the bytes written.
 *
 *  kKSTErrorBadParameter, with nothing written: there is not enough room, or the tree has no
 *  size. */
KST_CHECKED KSTStatus SerializeRequirement(const KSTRequirement* requirement, void* buffer,
                                           size_t* bufferSize) KST_PUBLIC;

/** Reads the tree at the start of the `size` bytes at `buffer`. Stores a new tree in
 *  `*outRequirement`, which the caller gives to DeallocRequirement, and the bytes that were read in
 *  `*consumedBytes`. What follows them is not looked at, nor is the `dataLength` of a composite.
 *
 *  kKSTErrorBadParameter: `size` is too small; for a composite also when it is smaller than the
 *  composite is in memory. kKSTErrorOutOfMemory. */
KST_CHECKED KSTStatus DeserializeRequirement(const void* buffer, size_t size,
                                             KSTRequirement** outRequirement,
                                             size_t* consumedBytes) KST_PUBLIC;

/** Wipes and frees the tree `requirement`, children first. Its nodes come from this library and
 *  have the `dataLength` that they were made with. Null is ignored, as a child too. */
void DeallocRequirement(KSTRequirement* requirement) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
