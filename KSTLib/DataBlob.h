#ifndef KST_KSTLIB_DATA_BLOB_H
#define KST_KSTLIB_DATA_BLOB_H

#include "KSTLib/Public.h"

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

/** Releases bytes that a function of this library handed out: overwrites `length` bytes at `data`
 *  with zeros, frees them and subtracts `length` from gAllocatedBytes.
 *
 *  `length` is the length that came with them: of a blob as it was reported, of a text one more
 *  than its characters, of a command frame its size. Null is ignored. */
void DeallocDataBlob(void* data, size_t length) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
