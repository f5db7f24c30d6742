/**
 * @file
 * How the library's declarations are marked: C linkage, exported, checked by the compiler where it can.
 */
#ifndef TAVO_OSAL_EXPORT_H
#define TAVO_OSAL_EXPORT_H

#ifdef __cplusplus
/** Begins the declarations of a header, with C linkage. */
#define TAVO_BEGIN_DECLS extern "C" {
/** Ends them. */
#define TAVO_END_DECLS }
#else
#define TAVO_BEGIN_DECLS
#define TAVO_END_DECLS
#endif

/** Part of the library's binary interface. */
#define TAVO_API __attribute__((visibility("default")))

/** Not part of it, although a member of something that is. */
#define TAVO_LOCAL __attribute__((visibility("hidden")))

/** Argument number @p fmt is a printf format whose values start at argument number @p first. */
#define TAVO_PRINTF(fmt, first) __attribute__((format(printf, fmt, first)))

/** Argument number @p fmt is a scanf format whose targets start at argument number @p first. */
#define TAVO_SCANF(fmt, first) __attribute__((format(scanf, fmt, first)))

/** The arguments end with a null pointer. */
#define TAVO_SENTINEL __attribute__((sentinel))

/** The result carries the only news of a failure or the only reference to a resource. */
#define TAVO_CHECK_RESULT __attribute__((warn_unused_result))

#endif
