#ifndef KST_KSTLIB_CONTEXT_PROPERTY_SERIALIZATION_H
#define KST_KSTLIB_CONTEXT_PROPERTY_SERIALIZATION_H

#include "KSTLib/Handle.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** The payload that asks for one property of a context, 20 bytes:
 *
 *  | offset | width | field                 |
 *  |      0 |    16 | handle of the context |
 *  |     16 |     4 | number of the property |
 *
 *  The functions keep no state and run on the calling thread. A failed check writes one line to the
 *  library's log. On failure no output is changed, unless it is said. */

#ifdef __cplusplus
extern "C" {
#endif

/** The number of a property; what it means is the kernel service's. */
typedef uint32_t KSTContextProperty;

/** Stores 20 in `*outSize`. `handle` and `property` are not looked at. kKSTErrorBadParameter:
 *  `outSize` is null. */
KSTStatus GetSerializedGetContextPropertySize(const KSTHandle* handle, KSTContextProperty property,
                                              size_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  20. kKSTErrorBadParameter, with nothing written: an argument is null, or there is not enough
 *  room. */
KSTStatus SerializeGetContextProperty(const KSTHandle* handle, KSTContextProperty property,
                                      void* outBuffer, size_t* outSize) KST_PUBLIC;

/** Reads the payload at the start of the `size` bytes at `buffer`; what follows it is not looked
 *  at. kKSTErrorBadParameter: an argument is null, or the payload is cut short; with 16 to 19 bytes
 *  `*outHandle` has been written all the same. */
KSTStatus DeserializeGetContextProperty(const void* buffer, size_t size, KSTHandle* outHandle,
                                        KSTContextProperty* outProperty) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
