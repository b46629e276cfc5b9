#ifndef KST_KSTLIB_CREDENTIAL_H
#define KST_KSTLIB_CREDENTIAL_H

#include "KSTLib/Blocks.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** Credentials: the proof of one authentication event, a flat record that is the same in memory and
 *  on the wire. Integers are in host byte order; there are no gaps. What the kernel service means
 *  by a number is its own affair: the library stores it and hands it on. */

/** The header of a credential. The `dataLength` bytes of the type's data area follow it at once, so
 *  a whole credential takes dataLength + 32 bytes. */
typedef struct KSTCredential {
    /** kKSTCredentialType..., 1 to 12. */
    uint32_t type;
    /** Property 4. 1 in a new credential. */
    uint32_t word4;
    /** 0 in a new credential. */
    uint32_t word8;
    /** Property 5. kKSTCredentialNoUser in a new credential. */
    uint32_t userId;
    /** Property 1. 0 in a new credential. */
    uint64_t word16;
    /** Property 2. 0 in a new credential. */
    uint32_t word24;
    /** Bytes of the data area; in a valid credential the size of the type's KSTCredentialData...,
     *  or 0 for a type that has none. */
    uint32_t dataLength;
} KSTCredential;

#define kKSTCredentialNoUser 0xffffffffU

/** Types of credentials. A marker carries no data: that it is there says everything. */
enum {
    kKSTCredentialTypePasscodeValidated = 1,
    kKSTCredentialTypePassphraseEntered = 2,
    kKSTCredentialTypeBiometryMatched = 3,
    kKSTCredentialTypeMarker4 = 4,
    kKSTCredentialTypeMarker5 = 5,
    kKSTCredentialTypeMarker6 = 6,
    kKSTCredentialTypeUserOutputDisplayed = 7,
    kKSTCredentialTypeMarker8 = 8,
    kKSTCredentialTypeContinuityUnlock = 9,
    kKSTCredentialTypePasscodeValidated2 = 10,
    kKSTCredentialTypeMarker11 = 11,
    kKSTCredentialTypeKextDenyList = 12,
    kKSTCredentialTypeMax = kKSTCredentialTypeKextDenyList
};

typedef uint32_t KSTPassphrasePurpose;
typedef uint32_t KSTKextDenyListFormat;
typedef uint32_t KSTKextDenyListRevision;

/** The longest passphrase, in bytes. */
#define kKSTPassphraseMaxLength 128

/** The data areas. The comments give the property that a member is read and set by; a member
 *  without one is carried along. */

typedef struct KSTCredentialDataPasscodeValidated {
    uint32_t property101;
    int32_t property102;
    uint8_t word8[4];
    uint8_t property100[16];
} KSTCredentialDataPasscodeValidated;

typedef struct KSTCredentialDataPassphraseEntered {
    /** Property 201. */
    KSTPassphrasePurpose purpose;
    /** How many bytes of `passphrase`, property 200, are in use. */
    uint32_t passphraseLength;
    uint8_t passphrase[kKSTPassphraseMaxLength];
} KSTCredentialDataPassphraseEntered;

typedef struct KSTCredentialDataBiometryMatched {
    uint32_t property101;
    uint8_t property300[16];
    uint8_t property302[16];
    uint8_t property301[32];
    uint8_t word68[4];
    uint8_t property100[16];
} KSTCredentialDataBiometryMatched;

typedef struct KSTCredentialDataUserOutputDisplayed {
    uint8_t property400[32];
    uint8_t property401[24];
} KSTCredentialDataUserOutputDisplayed;

typedef struct KSTCredentialDataContinuityUnlock {
    uint32_t property101;
    uint8_t word4[4];
    uint8_t property100[16];
} KSTCredentialDataContinuityUnlock;

typedef struct KSTCredentialDataPasscodeValidated2 {
    uint32_t property101;
    uint8_t property501[16];
    uint8_t property502[16];
} KSTCredentialDataPasscodeValidated2;

typedef struct KSTCredentialDataKextDenyList {
    /** Property 601. */
    KSTKextDenyListFormat format;
    /** Property 602. */
    KSTKextDenyListRevision revision;
} KSTCredentialDataKextDenyList;

/** The most credentials that a list is read with. */
#define kKSTCredentialListMaxCount 1000

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
KST_CHECKED KSTStatus KSTCredentialCreate(uint32_t type, KSTCredential** credential) KST_PUBLIC;

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
KST_CHECKED KSTStatus KSTCredentialSetProperty(KSTCredential* credential, uint32_t propertyId,
                                               const void* data, size_t dataLength) KST_PUBLIC;

/** Stores where the property `propertyId` of `credential` is in `*data` and its length in
 *  `*dataLength`. The pointer points into the credential: nothing is copied, and it is good for as
 *  long as the credential is. A stored passphrase length above 128 counts as 128. On failure the
 *  outputs are as they were.
 *
 *  kKSTErrorBadParameter: a null argument; the property is unknown or not one of the credential's
 *  type; or the credential's data area is too short for it. */
KST_CHECKED KSTStatus KSTCredentialGetPropertyData(const KSTCredential* credential,
                                                   uint32_t propertyId, const void** data,
                                                   size_t* dataLength) KST_PUBLIC;

/** Calls `processProperty` with what KSTCredentialGetPropertyData gives; no bytes are a null
 *  pointer and 0. On any status but 0 the block is not called.
 *
 *  kKSTErrorBadParameter: `processProperty` is a null block, or as there. */
KST_CHECKED KSTStatus KSTCredentialGetProperty(const KSTCredential* credential, uint32_t propertyId,
                                               KSTDataBlock processProperty) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
