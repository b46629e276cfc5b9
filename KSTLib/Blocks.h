#ifndef KST_KSTLIB_BLOCKS_H
#define KST_KSTLIB_BLOCKS_H

#include "KSTLib/Requirement.h"
#include "KSTLib/Status.h"

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
#include "KSTLib/BlockOf.h"
#endif

/** Result blocks: what a library function calls to hand over what it found.
 *
 *  A block is called synchronously, on the caller's thread, before the function returns. What it is
 *  handed is valid only during the call: copy what is to be kept. `data` is null when `length`
 *  is 0.
 *
 *  Each is a struct of two words, the same in C and in C++, and is passed by value:
 *
 *      void (*invoke)(void* captured, <what the block is handed>);
 *      void* captured;
 *
 *  A block whose `invoke` is null is a null block.
 *
 *  C fills in both members. C++ may instead pass nullptr or anything that can be called with what
 *  the block is handed. The callable is held by its address and must live until the library
 *  function has returned, which an argument written in the call does; an exception that leaves it
 *  ends the program. A null function pointer and an empty std::function give a null block. */

#ifdef __cplusplus
#define KST_BLOCK(name, ...)                                                                       \
    struct name : kst::BlockOf<void(__VA_ARGS__)> {                                                \
        using kst::BlockOf<void(__VA_ARGS__)>::BlockOf;                                            \
    };                                                                                             \
    static_assert(kst::kIsTwoWords<name>)
#else
#define KST_BLOCK(name, ...)                                                                       \
    typedef struct name {                                                                          \
        void (*invoke)(void* captured, __VA_ARGS__);                                               \
        void* captured;                                                                            \
    } name
#endif

/** Gets `length` bytes at `data`. The library wipes them after the call unless they belong to an
 *  object of the caller. */
KST_BLOCK(KSTDataBlock, const void* data, size_t length);

/** Gets one property: its number and its `length` bytes at `data`. */
KST_BLOCK(KSTPropertyBlock, uint32_t propertyId, const void* data, size_t length);

/** Gets one requirement, which is not the block's to free; null for an empty place in a tree that
 *  the caller put together. */
KST_BLOCK(KSTRequirementBlock, const KSTRequirement* requirement);

/** Gets how the call ended, and `length` bytes at `data`, which are wiped after it. */
KST_BLOCK(KSTStatusDataBlock, KSTStatus status, const void* data, size_t length);

/** Gets whether a policy is satisfied, and the requirement tree that came with the answer, or null.
 *  The tree is not the block's to free. */
KST_BLOCK(KSTPolicyBlock, bool policySatisfied, const KSTRequirement* requirement);

/** Gets how the call ended and then what KSTPolicyBlock gets: false and null unless the status
 *  is 0. */
KST_BLOCK(KSTPolicyStatusBlock, KSTStatus status, bool policySatisfied,
          const KSTRequirement* requirement);

#endif
