#ifndef KST_KSTLIB_ALLOCATED_BYTES_H
#define KST_KSTLIB_ALLOCATED_BYTES_H

#include "KSTLib/Public.h"

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/** Bytes that the library holds allocated: every allocation adds its size, every release subtracts
 *  it. Initially 0. Not synchronised: read it while no call is under way. */
extern KST_VISIBLE int64_t gAllocatedBytes;

/** Room for a caller that wants to keep a former value of gAllocatedBytes. The library never writes
 *  it. Initially 0. */
extern KST_VISIBLE int64_t gLastAllocatedBytes;

#ifdef __cplusplus
}
#endif

#endif
