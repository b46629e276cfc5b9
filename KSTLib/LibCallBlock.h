#ifndef KST_KSTLIB_LIB_CALL_BLOCK_H
#define KST_KSTLIB_LIB_CALL_BLOCK_H

#include "KSTLib/Blocks.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** The LibCall functions (KSTLib/LibCall.h) that hand their result to a block. */

#ifdef __cplusplus
extern "C" {
#endif

/** Reads the kernel service's environment variable number `variable` with command 25 and calls
 *  `processVariable` with its 0 to 64 bytes; no bytes are a null pointer and 0.
 *
 *  kKSTErrorBadParameter: `transport` is null, or `processVariable` is a null block; nothing is
 *  sent then. kKSTErrorUnexpected: the transport reported more than the 64 bytes that it was
 *  offered. Any other status is the transport's. On any status but 0 the block is not called. */
KSTStatus LibCall_KSTGetEnvironmentVariable_Block(KSTTransport transport, void* transportContext,
                                                  uint32_t variable,
                                                  KSTDataBlock processVariable) KST_PUBLIC;

/** Sends the control code `code` with `dataLength` bytes at `data` (1 to 256), or without data when
 *  `data` is null and `dataLength` is 0, as command 26. The bytes stay the caller's.
 *
 *  Once the command was handed to the transport, `resultBlock`, unless it is a null block, is
 * called whatever the status is, so it sees failed replies too: with the 256-byte reply buffer and
 * the reply's size as the transport left it, or with a null pointer and 0 when that is 0. A
 * transport that fails without setting the size thus gives the block all 256 bytes, zeros where
 * nothing was written. A size above 256 is no reply and gives a null pointer and 0. Only the status
 * that the function returns says whether the bytes mean anything.
 *
 *  kKSTErrorBadParameter: `transport` is null; or the data are not 1 to 256 bytes and not null with
 *  length 0. Nothing is sent and the block is not called then. kKSTErrorUnexpected: the transport
 *  succeeded and reported more than 256 bytes. Any other status is the transport's. */
KSTStatus LibCall_KSTKernelControl_Block(KSTTransport transport, void* transportContext,
                                         uint32_t code, const void* data, size_t dataLength,
                                         KSTDataBlock resultBlock) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
