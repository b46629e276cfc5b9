#ifndef KST_KSTLIB_CONTEXTS_H
#define KST_KSTLIB_CONTEXTS_H

#include "KSTLib/Blocks.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

/** Contexts of the kernel service: where a client puts credentials and has policies verified.
 *
 *  A context has two ends. The kernel service keeps the credentials; the client holds an object
 *  with the context's handle, 16 bytes, in it. The handle is also the external form: another
 *  process that gets it can open the same context.
 *
 *  How the functions send, on which threads they may be called and what every one of them may
 *  return is told in KSTLib/KSTLib.h. After a failure, a wrong argument included, the library asks
 *  the kernel service for its log level, in what is left of the call's time. It does not when it
 *  has no connection, or when the failure ended the connection. "No command" below means that
 *  nothing but that question is sent. */

/** The kernel's name for a context: 16 opaque bytes, which are also the context's external form. On
 *  the wire an absent handle is 16 zero bytes. */
typedef struct KSTHandle {
    uint8_t bytes[16];
} KSTHandle;

enum { kKSTHandleSize = 16 };

/** Where a credential belongs. */
typedef uint32_t KSTScope;

enum {
    /** One context. */
    kKSTScopeContext = 1,
    /** The global context that all clients share; the only scope that needs no context. */
    kKSTScopeGlobal = 2
};

/** A context of the kernel service as a client holds it: an object with the context's handle
 *  in it, from a create function until a delete function. It is not locked: it is not deleted while
 *  another thread uses it. */
typedef struct KSTContext* KSTContextRef;

#ifdef __cplusplus
extern "C" {
#endif

/** Creates a context with command 1 and stores it in `*context`. The caller gives it to
 *  KSTContextDelete. The library's log level becomes the one in the reply. On failure `*context` is
 *  as it was.
 *
 *  The object takes 17 bytes, of which KSTContextDelete gives 16 back: gAllocatedBytes stands 1
 *  higher afterwards.
 *
 *  kKSTErrorBadParameter: `context` is null; no command. kKSTErrorOutOfMemory: no memory for the
 *  context. kKSTErrorUnexpected: the reply has not 17 bytes. */
KST_CHECKED KSTStatus KSTContextCreate(KSTContextRef* context) KST_PUBLIC;

/** Opens the context whose external form is the `dataLength` bytes at `externalForm`, which stay
 *  the caller's, with command 18. Returns it, and the caller gives it to KSTContextDelete; or null
 *  when the kernel service knows no such context, and after a failure, which only the log tells
 *  from that. The library's log level becomes the one in the reply.
 *
 *  Failures: `externalForm` is null or `dataLength` is not 16, and no command; no memory; the reply
 *  has not 5 bytes; or the command fails. */
KST_CHECKED KSTContextRef KSTContextCreateWithExternalForm(const void* externalForm,
                                                           size_t dataLength) KST_PUBLIC;

/** Deletes `context`. With `destroy` the kernel service's end goes too, by command 2; without it
 *  there is no command, and who has the external form can go on using the context. The object is
 *  wiped and freed. After a failure it still is the caller's.
 *
 *  kKSTErrorBadParameter: `context` is null. */
KSTStatus KSTContextDelete(KSTContextRef context, bool destroy) KST_PUBLIC;

/** Announces with command 19 that the external form of `context` is wanted, and then calls
 *  `processExternalForm` with its 16 bytes. After a failure, which only the log tells, the block is
 *  not called: `context` is null or `processExternalForm` a null block, and no command; or the
 * command fails. */
void KSTContextGetExternalForm(KSTContextRef context, KSTDataBlock processExternalForm) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
