#ifndef KST_KSTLIB_LIB_CALL_H
#define KST_KSTLIB_LIB_CALL_H

#include "KSTLib/Blocks.h"
#include "KSTLib/Command.h"
#include "KSTLib/Contexts.h"
#include "KSTLib/Credential.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Public.h"
#include "KSTLib/Requirement.h"
#include "KSTLib/Status.h"

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

/** The LibCall functions build the payload of a command and hand it to a transport that the caller
 *  supplies. They keep no state, run on the calling thread and return only after the transport did.
 *
 *  A failure is printed to standard output as one line, "KST: <function>: returning, err = <n>.",
 *  and flushed. A failed check also writes its line to the library's log, a transport that fails
 *  the line "err == 0 " with its status, and so does each function that passes a failure up. A
 *  success prints and writes nothing. */

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
 *  caller's, who gives it to DeallocDataBlob (KSTLib/Serialization.h) with its size.
 *
 *  Returns null, stores nothing and counts nothing when memory could not be had, when
 *  payloadSize + 8 cannot be expressed, when `payload` is null and `payloadSize` is not 0, or when
 *  `outFrameSize` is null. */
KST_CHECKED uint8_t* LibCall_BuildCommand(uint8_t code, uint8_t secondByte, uint8_t thirdByte,
                                          const void* payload, size_t payloadSize,
                                          size_t* outFrameSize) KST_PUBLIC;

/** Sets the kernel service's environment variable number `variable` to `dataLength` bytes at
 *  `data` (1 to 64), or to nothing when `data` is null and `dataLength` is 0. The bytes stay the
 *  caller's. Sends command 24 and takes no reply.
 *
 *  kKSTErrorBadParameter: `transport` is null; or the data are not 1 to 64 bytes and not null with
 *  length 0. Nothing is sent then. Any other status is the transport's. */
KST_CHECKED KSTStatus LibCall_KSTSetEnvironmentVariable(KSTTransport transport,
                                                        void* transportContext, uint32_t variable,
                                                        const void* data,
                                                        size_t dataLength) KST_PUBLIC;

/** Reads the kernel service's environment variable number `variable` with command 25 and calls
 *  `processVariable` with its 0 to 64 bytes; no bytes are a null pointer and 0.
 *
 *  kKSTErrorBadParameter: `transport` is null, or `processVariable` is a null block; nothing is
 *  sent then. kKSTErrorUnexpected: the transport reported more than the 64 bytes that it was
 *  offered. Any other status is the transport's. On any status but 0 the block is not called. */
KST_CHECKED KSTStatus
LibCall_KSTGetEnvironmentVariable_Block(KSTTransport transport, void* transportContext,
                                        uint32_t variable, KSTDataBlock processVariable) KST_PUBLIC;

/** Sends the control code `code` with `dataLength` bytes at `data` (1 to 256), or without data when
 *  `data` is null and `dataLength` is 0, as command 26. The bytes stay the caller's.
 *
 *  Once the command was handed to the transport, `resultBlock`, unless it is a null block, is
 *  called whatever the status is, so it sees failed replies too: with the 256-byte reply buffer and
 *  the reply's size as the transport left it, or with a null pointer and 0 when that is 0. A
 *  transport that fails without setting the size thus gives the block all 256 bytes, zeros where
 *  nothing was written. A size above 256 is no reply and gives a null pointer and 0. Only the
 *  status that the function returns says whether the bytes mean anything.
 *
 *  kKSTErrorBadParameter: `transport` is null; or the data are not 1 to 256 bytes and not null with
 *  length 0. Nothing is sent and the block is not called then. kKSTErrorUnexpected: the transport
 *  succeeded and reported more than 256 bytes. Any other status is the transport's. */
KST_CHECKED KSTStatus LibCall_KSTKernelControl_Block(KSTTransport transport, void* transportContext,
                                                     uint32_t code, const void* data,
                                                     size_t dataLength,
                                                     KSTDataBlock resultBlock) KST_PUBLIC;

/** The functions for contexts hand a null context to the
 *  transport. What they do is told with their namesakes in KSTLib/Contexts.h,
 *  KSTLib/ContextCredentials.h and KSTLib/PolicyVerification.h; what differs is told here.
 *
 *  Any status that is not named is the transport's or a serialiser's. */

/** Creates a context with command 1 and stores it in `*context`. The level byte of the reply is
 *  stored in `*logLevel` unless that is null; it changes nothing in the library.
 *
 *  kKSTErrorBadParameter: `transport` or `context` is null; nothing is sent then.
 *  kKSTErrorUnexpected: the reply has not 17 bytes. kKSTErrorOutOfMemory: `*context` becomes null.
 *  After any other failure both are as they were. */
KST_CHECKED KSTStatus LibCall_KSTContextCreate(KSTTransport transport, KSTContextRef* context,
                                               uint8_t* logLevel) KST_PUBLIC;

/** Deletes `context`, with command 2 when `destroy`. After a failure `context` still is the
 *  caller's. kKSTErrorBadParameter: `transport` or `context` is null. */
KSTStatus LibCall_KSTContextDelete(KSTTransport transport, KSTContextRef context,
                                   bool destroy) KST_PUBLIC;

/** As KSTContextAddCredentialWithScope. kKSTErrorBadParameter also when `transport` is null. (The
 *  name is as it is.) */
KST_CHECKED KSTStatus LibCall_KSTContexAddCredentialWithScope(KSTTransport transport,
                                                              KSTContextRef context,
                                                              const KSTCredential* credential,
                                                              KSTScope scope) KST_PUBLIC;

/** As KSTContextRemoveCredentialsByTypeAndScope. kKSTErrorBadParameter also when `transport` is
 *  null. (The name is as it is.) */
KST_CHECKED KSTStatus LibCall_KSTContexRemoveCredentialsByTypeAndScope(KSTTransport transport,
                                                                       KSTContextRef context,
                                                                       uint32_t type,
                                                                       KSTScope scope) KST_PUBLIC;

/** Asks as KSTContextVerifyPolicyEx does and stores the answer: `*policySatisfied` and, unless
 *  `requirement` is null, the requirement tree or null in `*requirement`. The tree is the caller's,
 *  who gives it to LibCall_KSTRequirementDelete. Without `requirement` what follows the flag in the
 *  reply is not looked at.
 *
 *  kKSTErrorBadParameter: `transport`, `context`, `policyId` or `policySatisfied` is null; only one
 *  of `parameters` and `parametersCount` is given; or the request cannot carry them; nothing is
 *  sent then. kKSTErrorUnexpected: the reply is shorter than 4 bytes or longer than was offered.
 *  After a failure both outputs are as they were. */
KST_CHECKED KSTStatus LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
    KSTTransport transport, KSTContextRef context, const char* policyId, bool preflight,
    const KSTParameter* parameters, uint32_t parametersCount, uint32_t maxGlobalCredentialAge,
    bool* policySatisfied, KSTRequirement** requirement) KST_PUBLIC;

/** The functions that make and edit credentials in the caller's memory send nothing and so take no
 *  transport. What they do is told with their namesakes in KSTLib/Credential.h. */

KST_CHECKED KSTStatus LibCall_KSTCredentialCreate(uint32_t type,
                                                  KSTCredential** credential) KST_PUBLIC;

void LibCall_KSTCredentialDelete(KSTCredential* credential) KST_PUBLIC;

uint32_t LibCall_KSTCredentialGetType(const KSTCredential* credential) KST_PUBLIC;

KST_CHECKED KSTStatus LibCall_KSTCredentialSetProperty(KSTCredential* credential,
                                                       uint32_t propertyId, const void* data,
                                                       size_t dataLength) KST_PUBLIC;

KST_CHECKED KSTStatus LibCall_KSTCredentialGetPropertyData(const KSTCredential* credential,
                                                           uint32_t propertyId, const void** data,
                                                           size_t* dataLength) KST_PUBLIC;

/** What the functions over one requirement in the caller's memory do is told with their namesakes
 *  in KSTLib/Requirement.h. */

uint32_t LibCall_KSTRequirementGetType(const KSTRequirement* requirement) KST_PUBLIC;

uint32_t LibCall_KSTRequirementGetState(const KSTRequirement* requirement) KST_PUBLIC;

uint32_t LibCall_KSTRequirementGetPriority(const KSTRequirement* requirement) KST_PUBLIC;

KST_CHECKED KSTStatus LibCall_KSTRequirementGetPropertyData(const KSTRequirement* requirement,
                                                            uint32_t propertyId, const void** data,
                                                            size_t* dataLength) KST_PUBLIC;

/** Frees the tree `requirement` that a LibCall function returned. Nothing is sent; the transport
 *  is asked for as everywhere.
 *
 *  kKSTErrorBadParameter, with nothing freed: `transport` or `requirement` is null. */
KSTStatus LibCall_KSTRequirementDelete(KSTTransport transport,
                                       KSTRequirement* requirement) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
