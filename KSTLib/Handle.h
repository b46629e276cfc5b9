#ifndef KST_KSTLIB_HANDLE_H
#define KST_KSTLIB_HANDLE_H

#include <stdint.h>

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

#endif
