#ifndef KST_KSTLIB_PUBLIC_H
#define KST_KSTLIB_PUBLIC_H

/** Marks what the shared library shows; all else in it is hidden. */
#ifdef __GNUC__
#define KST_VISIBLE __attribute__((visibility("default")))
#else
#define KST_VISIBLE
#endif

/** Marks a function of the library: it is part of the interface, and nothing is thrown out of it.
 *  An exception that a caller's block or transport lets escape ends the program. */
#ifdef __cplusplus
#define KST_PUBLIC noexcept KST_VISIBLE
#else
#define KST_PUBLIC KST_VISIBLE
#endif

#endif
