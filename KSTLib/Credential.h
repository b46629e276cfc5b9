#ifndef KST_KSTLIB_CREDENTIAL_H
#define KST_KSTLIB_CREDENTIAL_H

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

#endif
