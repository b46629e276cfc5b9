#ifndef KST_KSTLIB_LIB_CALL_H
#define KST_KSTLIB_LIB_CALL_H

#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** The LibCall functions build the payload of a command and hand it to a transport that the caller
 *  supplies. They keep no state, run on the calling thread and return only after the transport did.
 *
 *  A failure is printed to standard output as one line, "KST: <function>: returning, err = <n>.",
 *  and flushed; a failed check also writes its line to the library's log. A success prints
 *  nothing. */

#ifdef __cplusplus
extern "C" {
#endif

/** Carries one command to the kernel service and its reply back.
 *
 *  `transportContext` is what the caller of the LibCall function gave. `inData` is the payload,
 *  without a frame header; it belongs to the LibCall function, is valid only during the call and is
 *  null only when `inSize` is 0. When `outSize` is not null, `*outSize` bytes are offered at
 *  `outData`, filled with zeros; on success the transport sets `*outSize` to the size of the reply,
 *  which must not be above what was offered. When `outSize` is null, no reply is expected.
 *
 *  Returns 0 or any status; the LibCall function returns it unchanged. It must not throw. */
typedef KSTStatus (*KSTTransport)(void* transportContext, uint32_t code, uint32_t thirdByte,
                                  const void* inData, size_t inSize, void* outData,
                                  size_t* outSize);

/** Allocates the frame of a command (KSTLib/Command.h) and copies `payloadSize` bytes at `payload`
 *  behind its header. Byte 7 of the frame is zero because the allocation is.
 *
 *  Returns the frame and stores its size, payloadSize + 8, in `*outFrameSize`. The frame is the
 *  caller's, who gives it to DeallocDataBlob (KSTLib/DataBlob.h) with its size.
 *
 *  Returns null, stores nothing and counts nothing when memory could not be had, when
 *  payloadSize + 8 cannot be expressed, when `payload` is null and `payloadSize` is not 0, or when
 *  `outFrameSize` is null. */
uint8_t* LibCall_BuildCommand(uint8_t code, uint8_t secondByte, uint8_t thirdByte,
                              const void* payload, size_t payloadSize,
                              size_t* outFrameSize) KST_PUBLIC;

/** Sets the kernel service's environment variable number `variable` to `dataLength` bytes at
 *  `data` (1 to 64), or to nothing when `data` is null and `dataLength` is 0. The bytes stay the
 *  caller's. Sends command 24 and takes no reply.
 *
 *  kKSTErrorBadParameter: `transport` is null; or the data are not 1 to 64 bytes and not null with
 *  length 0. Nothing is sent then. Any other status is the transport's. */
KSTStatus LibCall_KSTSetEnvironmentVariable(KSTTransport transport, void* transportContext,
                                            uint32_t variable, const void* data,
                                            size_t dataLength) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
