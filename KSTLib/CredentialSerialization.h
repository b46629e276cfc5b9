#ifndef KST_KSTLIB_CREDENTIAL_SERIALIZATION_H
#define KST_KSTLIB_CREDENTIAL_SERIALIZATION_H

#include "KSTLib/Contexts.h"
#include "KSTLib/Credential.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** Sizes, writes, reads, copies, compares and frees credentials (KSTLib/Credential.h) and counted
 *  lists of them, and the payloads of the requests about them. All sizes are bytes. A list on the
 *  wire is its 32-bit count and then its credentials, back to back.
 *
 *  The functions keep no state and run on the calling thread. A failed check writes one line to the
 *  library's log, and each function that passes a failure up one more. On failure no output is
 *  changed, unless it is said, and nothing stays allocated.
 *
 *  kKSTErrorBadParameter stands for a null argument, a type outside 1 to 12 and whatever a function
 *  names itself.
 *
 *  A record is trusted as far as its `dataLength`: that many bytes must be readable behind its
 *  header. */

#ifdef __cplusplus
extern "C" {
#endif

/** Stores the size of `credential` on the wire, dataLength + 32, in `*outSize`. Whether the length
 *  suits the type is not looked at. */
KST_CHECKED KSTStatus GetSerializedCredentialSize(const KSTCredential* credential,
                                                  size_t* outSize) KST_PUBLIC;

/** Writes `credential` to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  the bytes written.
 *
 *  kKSTErrorBadParameter, with nothing written: there is not enough room. */
KST_CHECKED KSTStatus SerializeCredential(const KSTCredential* credential, void* outBuffer,
                                          size_t* outSize) KST_PUBLIC;

/** Reads the credential at the start of the `size` bytes at `buffer`. Stores a new credential in
 *  `*outCredential`, which the caller gives to DeallocCredential, and the bytes that were read in
 *  `*consumedBytes`. What follows them is not looked at, and of the data area only the length is.
 *
 *  kKSTErrorBadParameter: the length of the data is not the type's, or `size` is too small.
 *  kKSTErrorOutOfMemory. */
KST_CHECKED KSTStatus DeserializeCredential(const void* buffer, size_t size,
                                            KSTCredential** outCredential,
                                            size_t* consumedBytes) KST_PUBLIC;

/** Stores a new copy of `credential` in `*outCopy`, which the caller gives to DeallocCredential.
 *  Neither the type nor the length is looked at. kKSTErrorOutOfMemory. */
KST_CHECKED KSTStatus CopyCredential(const KSTCredential* credential,
                                     KSTCredential** outCopy) KST_PUBLIC;

/** Wipes and frees `credential`, which comes from this library and has the `dataLength` that it was
 *  made with. Null is logged and ignored. */
void DeallocCredential(KSTCredential* credential) KST_PUBLIC;

/** Stores in `*outEqual` 1 when the two prove the same, otherwise 0. The status says only whether
 *  they could be compared.
 *
 *  They are equal when type and dataLength are the same and so are, byte by byte,
 *
 *  | type              | the headers and of the data areas the bytes                         |
 *  | 1                 | 12 to 27                                                            |
 *  | 2                 | 0 to 3 and the passphrases; not the headers                         |
 *  | 3                 | 72 to 87                                                            |
 *  | 4, 5, 6, 8, 11, 12 | all                                                                |
 *  | 7                 | 0 to 55                                                             |
 *  | 9                 | 8 to 23                                                             |
 *  | 10                | 4 to 35                                                             |
 *
 *  as far as the data areas reach. Two passphrases are the same when their lengths are, as stored,
 *  and the bytes that these count, of which at most 128 are looked at. When type or dataLength
 *  differ, a type outside 1 to 12 is no error: they are not equal. */
KST_CHECKED KSTStatus CompareCredentials(const KSTCredential* credential1,
                                         const KSTCredential* credential2,
                                         uint8_t* outEqual) KST_PUBLIC;

/** 1 when both pointers are null or both point to the same `length1` == `length2` bytes, otherwise
 *  0. */
uint8_t CompareDataBlobs(const void* data1, size_t length1, const void* data2,
                         size_t length2) KST_PUBLIC;

/** Writes the `count` credentials that `credentialList` points to as a list to `outBuffer`, which
 *  has room for `*outSize` bytes, and sets `*outSize` to the bytes written. `credentialList` may be
 *  null when `count` is 0. At least 4 bytes of room must be there in any case: the count is written
 *  without a look at `*outSize`.
 *
 *  kKSTErrorBadParameter: an element is null or cannot be written, or there is not enough room.
 *  What was written until then stays in `outBuffer`.
 *
 *  More than the kKSTCredentialListMaxCount credentials that can be read are written all the same.
 */
KST_CHECKED KSTStatus SerializeCredentialList(KSTCredential* const* credentialList, uint32_t count,
                                              void* outBuffer, size_t* outSize) KST_PUBLIC;

/** Reads the list at the start of the `size` bytes at `buffer`. Stores a new array of new
 *  credentials in `*outCredentialList` and their number in `*outCount`; the caller gives both to
 *  DeallocCredentialList. An empty list is a null array and 0. What follows the list is not looked
 *  at.
 *
 *  kKSTErrorBadParameter: fewer than 4 bytes, more than kKSTCredentialListMaxCount credentials, or
 *  one that DeserializeCredential refuses. kKSTErrorOutOfMemory. */
KST_CHECKED KSTStatus DeserializeCredentialList(const void* buffer, size_t size,
                                                KSTCredential*** outCredentialList,
                                                uint32_t* outCount) KST_PUBLIC;

/** Gives each credential of an array from DeserializeCredentialList, except null ones, to
 *  DeallocCredential, then wipes and frees the array, which has `count` elements. Null is logged
 *  and ignored. */
void DeallocCredentialList(KSTCredential** credentialList, uint32_t count) KST_PUBLIC;

/** The payload of the commands that add a credential to a context, remove one from it and replace
 *  its passphrases; the three differ in the command's code only. D is the credential's dataLength:
 *
 *  | offset | width  | field                           |
 *  |      0 |     16 | handle of the context, or zeros |
 *  |     16 | 32 + D | credential (KSTLib/Credential.h) |
 *  | 48 + D |      4 | scope                           |
 *
 *  The Remove and Replace functions pass up what the Add functions say. */

/** Stores the size of the payload, D + 52, in `*outSize`.
 *
 *  kKSTErrorBadParameter: `handle` is null and `scope` is not kKSTScopeGlobal; `credential` or
 *  `outSize` is null; or GetSerializedCredentialSize refuses the credential. */
KST_CHECKED KSTStatus GetSerializedAddCredentialSize(const KSTHandle* handle,
                                                     const KSTCredential* credential,
                                                     KSTScope scope, size_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  the bytes written.
 *
 *  kKSTErrorBadParameter, with nothing written: what GetSerializedAddCredentialSize refuses;
 *  `outBuffer` is null; or there is not enough room. */
KST_CHECKED KSTStatus SerializeAddCredential(const KSTHandle* handle,
                                             const KSTCredential* credential, KSTScope scope,
                                             void* outBuffer, size_t* outSize) KST_PUBLIC;

/** Reads the payload at the start of the `size` bytes at `buffer`; what follows it is not looked
 *  at, nor is whether the scope needs a handle. `*outCredential` becomes a new credential, which
 *  the caller gives to DeallocCredential.
 *
 *  kKSTErrorBadParameter: an argument is null; fewer than 52 bytes; the payload is cut short; or
 *  DeserializeCredential refuses the credential. kKSTErrorOutOfMemory. After a failure `*outHandle`
 *  may have been written all the same. */
KST_CHECKED KSTStatus DeserializeAddCredential(const void* buffer, size_t size,
                                               KSTHandle* outHandle, KSTCredential** outCredential,
                                               KSTScope* outScope) KST_PUBLIC;

KST_CHECKED KSTStatus GetSerializedRemoveCredentialSize(const KSTHandle* handle,
                                                        const KSTCredential* credential,
                                                        KSTScope scope, size_t* outSize) KST_PUBLIC;

KST_CHECKED KSTStatus SerializeRemoveCredential(const KSTHandle* handle,
                                                const KSTCredential* credential, KSTScope scope,
                                                void* outBuffer, size_t* outSize) KST_PUBLIC;

KST_CHECKED KSTStatus DeserializeRemoveCredential(const void* buffer, size_t size,
                                                  KSTHandle* outHandle,
                                                  KSTCredential** outCredential,
                                                  KSTScope* outScope) KST_PUBLIC;

KST_CHECKED KSTStatus GetSerializedReplacePassphraseCredentialSize(const KSTHandle* handle,
                                                                   const KSTCredential* credential,
                                                                   KSTScope scope,
                                                                   size_t* outSize) KST_PUBLIC;

KST_CHECKED KSTStatus SerializeReplacePassphraseCredential(const KSTHandle* handle,
                                                           const KSTCredential* credential,
                                                           KSTScope scope, void* outBuffer,
                                                           size_t* outSize) KST_PUBLIC;

KST_CHECKED KSTStatus DeserializeReplacePassphraseCredential(const void* buffer, size_t size,
                                                             KSTHandle* outHandle,
                                                             KSTCredential** outCredential,
                                                             KSTScope* outScope) KST_PUBLIC;

/** The payload that asks for one property of a context, 20 bytes:
 *
 *  | offset | width | field                 |
 *  |      0 |    16 | handle of the context |
 *  |     16 |     4 | number of the property |
 */

/** The number of a property; what it means is the kernel service's. */
typedef uint32_t KSTContextProperty;

/** Stores 20 in `*outSize`. `handle` and `property` are not looked at. kKSTErrorBadParameter:
 *  `outSize` is null. */
KST_CHECKED KSTStatus GetSerializedGetContextPropertySize(const KSTHandle* handle,
                                                          KSTContextProperty property,
                                                          size_t* outSize) KST_PUBLIC;

/** Writes the payload to `outBuffer`, which has room for `*outSize` bytes, and sets `*outSize` to
 *  20. kKSTErrorBadParameter, with nothing written: an argument is null, or there is not enough
 *  room. */
KST_CHECKED KSTStatus SerializeGetContextProperty(const KSTHandle* handle,
                                                  KSTContextProperty property, void* outBuffer,
                                                  size_t* outSize) KST_PUBLIC;

/** Reads the payload at the start of the `size` bytes at `buffer`; what follows it is not looked
 *  at. kKSTErrorBadParameter: an argument is null, or the payload is cut short; with 16 to 19 bytes
 *  `*outHandle` has been written all the same. */
KST_CHECKED KSTStatus DeserializeGetContextProperty(const void* buffer, size_t size,
                                                    KSTHandle* outHandle,
                                                    KSTContextProperty* outProperty) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
