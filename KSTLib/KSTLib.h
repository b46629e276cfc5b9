#ifndef KST_KSTLIB_KSTLIB_H
#define KST_KSTLIB_KSTLIB_H

#include "KSTLib/AllocatedBytes.h"
#include "KSTLib/Blocks.h"
#include "KSTLib/ContextCredentials.h"
#include "KSTLib/Contexts.h"
#include "KSTLib/Credential.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Public.h"
#include "KSTLib/Requirement.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** The client library of the kernel service: the functions whose names begin with KST. Those that
 *  turn records into bytes are in KSTLib/Serialization.h, those over a transport of the caller's
 *  own in KSTLib/LibCall.h; a program that needs neither has none of their names.
 *
 *  The functions in this file and in KSTLib/Contexts.h, KSTLib/ContextCredentials.h and
 *  KSTLib/PolicyVerification.h send commands over the library's own connection, which the first of
 *  them opens and which stays open for the life of the process; when it cannot be opened, the next
 *  call tries again. They are synchronous and run on the calling thread. Nothing is locked: a
 *  program with several threads makes one call at a time.
 *
 *  Each of them waits for the kernel service for 5 seconds at the most, however much it sends. A
 *  context that one makes for itself (on the global scope) is deleted at its end; when the time is
 *  up that is sent without waiting for an answer.
 *
 *  A process may fork at any time, also while another thread is inside a call, for which fork does
 *  not wait. The child has no connection: it closes what it inherited without a byte on it, and its
 *  first call that sends opens one of its own. The parent goes on undisturbed. In the child
 * contexts keep their handles, the log level is as it was, and what the library held for the calls
 * of other threads is wiped.
 *
 *  Every function may return, beside what it names itself:
 *    kKSTErrorUnexpected   the kernel service could not be found;
 *    kKSTErrorOutOfMemory  memory for the command or the connection could not be had; nothing was
 *                          sent;
 *    a status of the platform (-1001 to -5095) or of the kernel side, unchanged.
 *
 *  A failed check writes its line to the system log whatever the log level is, and each place that
 *  a failure passes on its way to the caller writes one more. The line of the return is written too
 *  unless the log level is above 70; kKSTErrorNotContained has that line alone. What goes through a
 *  LibCall function also prints that function's line to standard output. */

#ifdef __cplusplus
extern "C" {
#endif

/** Sets the kernel service's environment variable number `variable` to `dataLength` bytes at
 *  `data` (1 to 64), or to nothing when `data` is null and `dataLength` is 0. The bytes stay the
 *  caller's.
 *
 *  kKSTErrorBadParameter: `data` is null with a length, or not null with a length of 0 or above 64;
 *  nothing is sent then. */
KST_CHECKED KSTStatus KSTSetEnvironmentVariable(uint32_t variable, const void* data,
                                                size_t dataLength) KST_PUBLIC;

/** Reads the kernel service's environment variable number `variable` and calls `processVariable`
 *  with its 0 to 64 bytes; no bytes are a null pointer and 0. On any status but 0 the block is not
 *  called.
 *
 *  kKSTErrorBadParameter: `processVariable` is a null block; nothing is sent then. */
KST_CHECKED KSTStatus KSTGetEnvironmentVariable(uint32_t variable,
                                                KSTDataBlock processVariable) KST_PUBLIC;

/** Sends the control code `code` with `dataLength` bytes at `data` (1 to 256), or without data when
 *  `data` is null and `dataLength` is 0, to the kernel service. The bytes stay the caller's.
 *
 *  `resultBlock`, unless it is a null block, is called whatever the status is, with up to 256 bytes
 *  of reply; no bytes are a null pointer and 0. Once the command was
 *  to be sent, every failure gives it 256 zero bytes, also one that the kernel service answered.
 *  Only the status that the function returns says whether the bytes mean anything.
 *
 *  kKSTErrorBadParameter: `data` is null with a length, or not null with a length of 0 or above
 *  256; nothing is sent and the block is not called then. */
KST_CHECKED KSTStatus KSTKernelControl(uint32_t code, const void* data, size_t dataLength,
                                       KSTDataBlock resultBlock) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
