#ifndef KST_COMMON_NO_THROW_H
#define KST_COMMON_NO_THROW_H

/** Marks a function of the library: nothing is thrown out of it. An exception that a caller's block
 *  or transport lets escape ends the program. */
#ifdef __cplusplus
#define KST_NOTHROW noexcept
#else
#define KST_NOTHROW
#endif

#endif
