#ifndef KST_KSTLIB_CREDENTIAL_OBJECTS_H
#define KST_KSTLIB_CREDENTIAL_OBJECTS_H

#include "KSTLib/Blocks.h"
#include "KSTLib/Credential.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** Credentials (KSTLib/Credential.h) in the caller's memory: made empty, filled property by
 *  property, deleted when done. Nothing is sent; the kernel service need not be there. The
 *  functions run on the calling thread.
 *
 *  Properties, with the lengths of their data in bytes:
 *
 *  |  id | types       | length                    | what                                   |
 *  |   1 | all         | 8, cannot be set          | header field at offset 16              |
 *  |   2 | all         | 4, cannot be set          | header word at offset 24               |
 *  |   3 | all         | 4, cannot be set          | the type                               |
 *  |   4 | all         | 4, cannot be set          | header word at offset 4, 1 at first    |
 *  |   5 | all         | 4                         | user id (uid_t), 0xffffffff at first   |
 *  | 100 | 1, 3, 9     | 16                        | identifier; reads as null with length 0 |
 *  |     |             |                           | while it is all zeros                  |
 *  | 101 | 1, 3, 9, 10 | 4                         |                                        |
 *  | 102 | 1           | 4                         |                                        |
 *  | 200 | 2           | 0 to 128                  | passphrase                             |
 *  | 201 | 2           | 4                         | KSTPassphrasePurpose                   |
 *  | 300 | 3           | 16                        |                                        |
 *  | 301 | 3           | 32                        |                                        |
 *  | 302 | 3           | 16                        |                                        |
 *  | 400 | 7           | 32                        |                                        |
 *  | 401 | 7           | 24                        |                                        |
 *  | 501 | 10          | 16                        |                                        |
 *  | 502 | 10          | 16                        |                                        |
 *  | 601 | 12          | 4                         | KSTKextDenyListFormat                  |
 *  | 602 | 12          | 4                         | KSTKextDenyListRevision                |
 */

#ifdef __cplusplus
extern "C" {
#endif

/** Stores a new credential of type `type` in `*credential`: no user, all else zero but what the
 *  table says. The caller gives it to KSTCredentialDelete. On failure `*credential` is as it was.
 *
 *  kKSTErrorBadParameter: `credential` is null or `type` is not 1 to 12. kKSTErrorOutOfMemory. */
KSTStatus KSTCredentialCreate(uint32_t type, KSTCredential** credential) KST_PUBLIC;

/** Wipes and frees `credential`. Null is logged and ignored. */
void KSTCredentialDelete(KSTCredential* credential) KST_PUBLIC;

/** The type of `credential`; 0, with a line in the log, when it is null. */
uint32_t KSTCredentialGetType(const KSTCredential* credential) KST_PUBLIC;

/** Copies `dataLength` bytes at `data` into the property `propertyId` of `credential`. A passphrase
 *  that is shorter than the one before leaves nothing of it; null with length 0 clears it.
 *
 *  kKSTErrorBadParameter, with nothing changed: `credential` is null; only one of `data` and
 *  `dataLength` is there; the property is unknown, cannot be set or is not one of the credential's
 *  type; the length is not the property's; or the credential's data area is too short for it. */
KSTStatus KSTCredentialSetProperty(KSTCredential* credential, uint32_t propertyId, const void* data,
                                   size_t dataLength) KST_PUBLIC;

/** Stores where the property `propertyId` of `credential` is in `*data` and its length in
 *  `*dataLength`. The pointer points into the credential: nothing is copied, and it is good for as
 *  long as the credential is. A stored passphrase length above 128 counts as 128. On failure the
 *  outputs are as they were.
 *
 *  kKSTErrorBadParameter: a null argument; the property is unknown or not one of the credential's
 *  type; or the credential's data area is too short for it. */
KSTStatus KSTCredentialGetPropertyData(const KSTCredential* credential, uint32_t propertyId,
                                       const void** data, size_t* dataLength) KST_PUBLIC;

/** Calls `processProperty` with what KSTCredentialGetPropertyData gives; no bytes are a null
 *  pointer and 0. On any status but 0 the block is not called.
 *
 *  kKSTErrorBadParameter: `processProperty` is a null block, or as there. */
KSTStatus KSTCredentialGetProperty(const KSTCredential* credential, uint32_t propertyId,
                                   KSTDataBlock processProperty) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
