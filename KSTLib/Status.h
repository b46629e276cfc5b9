#ifndef KST_KSTLIB_STATUS_H
#define KST_KSTLIB_STATUS_H

#include <stdint.h>

/** The result of every library call: 0 is success. Statuses of the kernel side and of the platform
 *  pass through unchanged; the platform's own lie between -1001 and -5095 (-1000 - errno).
 *  KSTLib/Words.h has words for all of them. */
typedef int32_t KSTStatus;

enum {
    kKSTErrorSuccess = 0,
    /** A required pointer is null, a length is outside its limit, a transport is missing. */
    kKSTErrorBadParameter = -3,
    /** Memory for a command or a reply could not be had. */
    kKSTErrorOutOfMemory = -4,
    /** There is no kernel service, or its reply has not the size it must have. */
    kKSTErrorUnexpected = -5,
    /** A "contains" query was answered with no. */
    kKSTErrorNotContained = -7
};

#endif
