#ifndef KST_KSTLIB_LIB_CALL_REQUIREMENT_H
#define KST_KSTLIB_LIB_CALL_REQUIREMENT_H

#include "KSTLib/LibCall.h"
#include "KSTLib/Public.h"
#include "KSTLib/Requirement.h"
#include "KSTLib/Status.h"

#include <stddef.h>
#include <stdint.h>

/** The LibCall functions (KSTLib/LibCall.h) over one requirement in the caller's memory. What the
 *  getters do is told with their namesakes in KSTLib/RequirementObjects.h. */

#ifdef __cplusplus
extern "C" {
#endif

uint32_t LibCall_KSTRequirementGetType(const KSTRequirement* requirement) KST_PUBLIC;

uint32_t LibCall_KSTRequirementGetState(const KSTRequirement* requirement) KST_PUBLIC;

uint32_t LibCall_KSTRequirementGetPriority(const KSTRequirement* requirement) KST_PUBLIC;

KSTStatus LibCall_KSTRequirementGetPropertyData(const KSTRequirement* requirement,
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
