#ifndef KST_KSTLIB_PUBLIC_H
#define KST_KSTLIB_PUBLIC_H

/** What every public header of the library stands on. */

#ifdef __cplusplus
#if __cplusplus < 201703L
#error "KSTLib needs C++17 or later (-std=c++17)"
#endif
#elif !defined(__STDC_VERSION__) || __STDC_VERSION__ < 201112L
#error "KSTLib needs C11 or later (-std=c11)"
#endif

/** The version of the library that these headers belong to. */
#define KST_VERSION_MAJOR 0
#define KST_VERSION_MINOR 1
#define KST_VERSION_PATCH 0

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

/** Marks a function that is in its header alone, made of those of the library. */
#ifdef __cplusplus
#define KST_INLINE inline
#else
#define KST_INLINE static inline
#endif

/** Marks a function whose result must be looked at: a failure would be lost otherwise, or memory.
 *  The compiler warns. C++ ignores such a result on purpose by a cast to void, C by storing it.
 *
 *  Functions that return a status have the mark, but for two kinds: those that end something
 *  (KSTContextDelete, LibCall_KSTContextDelete, LibCall_KSTRequirementDelete), after whose failure
 *  there often is nothing to be done, and KSTParseAclAndCopyConstraintCharacteristics, whose block
 *  learns the same status. */
#ifdef __cplusplus
#define KST_CHECKED [[nodiscard]]
#elif defined(__GNUC__)
#define KST_CHECKED __attribute__((warn_unused_result))
#else
#define KST_CHECKED
#endif

/** Marks what a result keeps pointing to: a compiler that knows the mark warns when the result is
 *  stored and what it points to is gone. */
#if defined(__cplusplus) && defined(__has_cpp_attribute)
#if __has_cpp_attribute(clang::lifetimebound)
#define KST_LIFETIMEBOUND [[clang::lifetimebound]]
#endif
#endif
#ifndef KST_LIFETIMEBOUND
#define KST_LIFETIMEBOUND
#endif

#endif
