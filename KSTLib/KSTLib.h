#ifndef KST_KSTLIB_KSTLIB_H
#define KST_KSTLIB_KSTLIB_H

#include "KSTLib/AllocatedBytes.h"
#include "KSTLib/Blocks.h"
#include "KSTLib/Command.h"
#include "KSTLib/Context.h"
#include "KSTLib/ContextCredentials.h"
#include "KSTLib/ContextPropertySerialization.h"
#include "KSTLib/Contexts.h"
#include "KSTLib/Credential.h"
#include "KSTLib/CredentialCommandSerialization.h"
#include "KSTLib/CredentialObjects.h"
#include "KSTLib/CredentialSerialization.h"
#include "KSTLib/DataBlob.h"
#include "KSTLib/Handle.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/LibCallBlock.h"
#include "KSTLib/LibCallContext.h"
#include "KSTLib/LibCallCredential.h"
#include "KSTLib/LibCallRequirement.h"
#include "KSTLib/Parameter.h"
#include "KSTLib/ParameterSerialization.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/ProcessAclSerialization.h"
#include "KSTLib/Public.h"
#include "KSTLib/Requirement.h"
#include "KSTLib/RequirementObjects.h"
#include "KSTLib/RequirementSerialization.h"
#include "KSTLib/Status.h"
#include "KSTLib/VerifyAclSerialization.h"
#include "KSTLib/VerifyPolicySerialization.h"

#include <stddef.h>
#include <stdint.h>

/** The client library of the kernel service, whole.
 *
 *  The functions in this file and in KSTLib/Contexts.h, KSTLib/ContextCredentials.h and
 *  KSTLib/PolicyVerification.h send commands over the library's own connection, which the first of
 *  them opens and which stays open for the life of the process; when it cannot be opened, the next
 *  call tries again. They are synchronous and run on the calling thread. Nothing is locked: a
 *  program with several threads makes one call at a time.
 *
 *  Every function may return, beside what it names itself:
 *    kKSTErrorUnexpected   the kernel service could not be found;
 *    kKSTErrorOutOfMemory  memory for the command could not be had; nothing was sent;
 *    a status of the platform (-1001 to -5095) or of the kernel side, unchanged.
 *
 *  All failures are written to the system log, and what goes through a LibCall function also prints
 *  that function's line to standard output. */

#ifdef __cplusplus
extern "C" {
#endif

/** Sets the kernel service's environment variable number `variable` to `dataLength` bytes at
 *  `data` (1 to 64), or to nothing when `data` is null and `dataLength` is 0. The bytes stay the
 *  caller's.
 *
 *  kKSTErrorBadParameter: `data` is null with a length, or not null with a length of 0 or above 64;
 *  nothing is sent then. */
KSTStatus KSTSetEnvironmentVariable(uint32_t variable, const void* data,
                                    size_t dataLength) KST_PUBLIC;

/** Reads the kernel service's environment variable number `variable` and calls `processVariable`
 *  with its 0 to 64 bytes; no bytes are a null pointer and 0. On any status but 0 the block is not
 *  called.
 *
 *  kKSTErrorBadParameter: `processVariable` is a null block; nothing is sent then. */
KSTStatus KSTGetEnvironmentVariable(uint32_t variable, KSTDataBlock processVariable) KST_PUBLIC;

/** Sends the control code `code` with `dataLength` bytes at `data` (1 to 256), or without data when
 *  `data` is null and `dataLength` is 0, to the kernel service. The bytes stay the caller's.
 *
 *  `resultBlock`, unless it is a null block, is called whatever the status is, with up to 256 bytes
 *  of reply; no bytes are a null pointer and 0. When no reply arrived it gets 256 zero bytes. Only
 *  the status that the function returns says whether the bytes mean anything.
 *
 *  kKSTErrorBadParameter: `data` is null with a length, or not null with a length of 0 or above
 *  256; nothing is sent and the block is not called then. */
KSTStatus KSTKernelControl(uint32_t code, const void* data, size_t dataLength,
                           KSTDataBlock resultBlock) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
