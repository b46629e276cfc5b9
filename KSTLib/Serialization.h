#ifndef KST_KSTLIB_SERIALIZATION_H
#define KST_KSTLIB_SERIALIZATION_H

#include "KSTLib/CredentialSerialization.h"
#include "KSTLib/Public.h"
#include "KSTLib/RequestSerialization.h"
#include "KSTLib/RequirementSerialization.h"

#include <stddef.h>

/** Credentials, requirements and the payloads of all requests as bytes, for who carries them
 *  himself: a kernel side, a transport (KSTLib/LibCall.h), a tool. Who asks the kernel service
 *  needs KSTLib/KSTLib.h alone. */

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
