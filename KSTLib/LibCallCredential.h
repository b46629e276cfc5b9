#ifndef KST_KSTLIB_LIB_CALL_CREDENTIAL_H
#define KST_KSTLIB_LIB_CALL_CREDENTIAL_H

#include "KSTLib/Credential.h"
#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** The LibCall functions (KSTLib/LibCall.h) that make and edit credentials in the caller's memory.
 *  They send nothing and so take no transport. What they do is told with their namesakes in
 *  KSTLib/CredentialObjects.h. */

#ifdef __cplusplus
extern "C" {
#endif

KSTStatus LibCall_KSTCredentialCreate(uint32_t type, KSTCredential** credential) KST_PUBLIC;

void LibCall_KSTCredentialDelete(KSTCredential* credential) KST_PUBLIC;

uint32_t LibCall_KSTCredentialGetType(const KSTCredential* credential) KST_PUBLIC;

KSTStatus LibCall_KSTCredentialSetProperty(KSTCredential* credential, uint32_t propertyId,
                                           const void* data, size_t dataLength) KST_PUBLIC;

KSTStatus LibCall_KSTCredentialGetPropertyData(const KSTCredential* credential, uint32_t propertyId,
                                               const void** data, size_t* dataLength) KST_PUBLIC;

#ifdef __cplusplus
}
#endif

#endif
