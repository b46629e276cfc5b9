#ifndef KST_KSTLIB_CREDENTIAL_COMMAND_SERIALIZATION_H
#define KST_KSTLIB_CREDENTIAL_COMMAND_SERIALIZATION_H

#include "KSTLib/Credential.h"
#include "KSTLib/Handle.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>

/** The payload of the commands that add a credential to a context, remove one from it and replace
 *  its passphrases; the three differ in the command's code only. D is the credential's dataLength:
 *
 *  | offset | width  | field                           |
 *  |      0 |     16 | handle of the context, or zeros |
 *  |     16 | 32 + D | credential (KSTLib/Credential.h) |
 *  | 48 + D |      4 | scope                           |
 *
 *  The functions keep no state and run on the calling thread. A failed check writes one line to the
 *  library's log, and each function that passes a failure up one more; the Remove and Replace
 *  functions pass up what the Add functions say. On failure no output is changed, unless it is
 *  said, and nothing stays allocated. */

#ifdef __cplusplus
extern "C" {
#endif

/** Stores the size of the payload, D + 52, in `*outSize`.
 *
 *  kKSTErrorBadParameter: `handle` is null and `scope` is not kKSTScopeGlobal; `credential` or
 *  `outSize` is null; or GetSerializedCredentialSize refuses the credential. */
KSTStatus GetSerializedAddCredentialSize(const KSTHandle* handle, const KSTCredential* credential,
                                         KSTScope scope, size_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  the bytes written.
 *
 *  kKSTErrorBadParameter, with nothing written: what GetSerializedAddCredentialSize refuses;
 *  `outBuffer` is null; or there is not enough room. */
KSTStatus SerializeAddCredential(const KSTHandle* handle, const KSTCredential* credential,
                                 KSTScope scope, void* outBuffer, size_t* outSize) KST_PUBLIC;

/** Reads the payload at the start of the `size` bytes at `buffer`; what follows it is not looked
 *  at, nor is whether the scope needs a handle. `*outCredential` becomes a new credential, which
 *  the caller gives to DeallocCredential.
 *
 *  kKSTErrorBadParameter: an argument is null; fewer than 52 bytes; the payload is cut short; or
 *  DeserializeCredential refuses the credential. kKSTErrorOutOfMemory. After a failure `*outHandle`
 *  may have been written all the same. */
KSTStatus DeserializeAddCredential(const void* buffer, size_t size, KSTHandle* outHandle,
                                   KSTCredential** outCredential, KSTScope* outScope) KST_PUBLIC;

KSTStatus GetSerializedRemoveCredentialSize(const KSTHandle* handle,
                                            const KSTCredential* credential, KSTScope scope,
                                            size_t* outSize) KST_PUBLIC;

KSTStatus SerializeRemoveCredential(const KSTHandle* handle, const KSTCredential* credential,
                                    KSTScope scope, void* outBuffer, size_t* outSize) KST_PUBLIC;

KSTStatus DeserializeRemoveCredential(const void* buffer, size_t size, KSTHandle* outHandle,
                                      KSTCredential** outCredential, KSTScope* outScope) KST_PUBLIC;

KSTStatus GetSerializedReplacePassphraseCredentialSize(const KSTHandle* handle,
                                                       const KSTCredential* credential,
                                                       KSTScope scope, size_t* outSize) KST_PUBLIC;

KSTStatus SerializeReplacePassphraseCredential(const KSTHandle* handle,
                                               const KSTCredential* credential, KSTScope scope,
                                               void* outBuffer, size_t* outSize) KST_PUBLIC;

KSTStatus DeserializeReplacePassphraseCredential(const void* buffer, size_t size,
                                                 KSTHandle* outHandle,
                                                 KSTCredential** outCredential,
                                                 KSTScope* outScope) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
