#ifndef KST_KSTLIB_CONTEXT_H
#define KST_KSTLIB_CONTEXT_H

/** A context of the kernel service as a client holds it: an object with the context's handle
 *  (KSTLib/Handle.h) in it, from a create function until a delete function. It is not locked: it is
 *  not deleted while another thread uses it. */
typedef struct KSTContext* KSTContextRef;

#endif
