#ifndef KST_KSTLIB_PARAMETER_H
#define KST_KSTLIB_PARAMETER_H

#include <stdint.h>

/** The typed parameters of a verify request. */

/** 0 to 7. The type settles how long the value must be:
 *
 *  | type    | bytes     | value           |
 *  | 0       | 0         | none            |
 *  | 1, 5    | 4         | a signed number |
 *  | 2, 6, 7 | 16        | opaque          |
 *  | 3       | 1 to 1000 | opaque          |
 *  | 4       | 4         | a user id       |
 */
typedef uint32_t KSTParameterType;

/** How many parameters go with one request at most. */
#define kKSTMaxParameters 10

/** The longest value, which only type 3 may have. */
#define kKSTParameterMaxDataLength 1000

typedef struct KSTParameter {
    KSTParameterType type;
    /** The value; null when its length is 0. */
    const void* parameterData;
    uint32_t parameterDataLength;
} KSTParameter;

#ifdef __cplusplus
static_assert(sizeof(KSTParameter) == 24, "natural alignment");
#endif

#endif
