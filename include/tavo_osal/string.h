/**
 * @file
 * Strings: the C library's string and formatting functions, with null texts refused instead of read.
 *
 * The copying, searching, duplicating and measuring functions log "Invalid parameter\n" and return null (or 0)
 * when a text is null, and otherwise return what the C library returns. The comparisons take a null text as an
 * empty one. Texts made by tavo_osal_string_duplicate_string() and tavo_osal_convert_string_to_upper() belong to
 * the caller and are released with tavo_osal_mem_free(). Every function may be called from any thread; the
 * caller serialises access to the texts.
 */
#ifndef TAVO_OSAL_STRING_H
#define TAVO_OSAL_STRING_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** @name Copying and joining
 *  The target's size is not known here: the caller makes room for the result and its terminator.
 *  @{ */

/** strcpy(). @return pcDst, or null when a pointer is null */
TAVO_API char* tavo_osal_string_copy(char* pcDst, const char* pcSrc);

/** strncpy(): writes exactly uiCount characters, padded with zeros; not terminated when pcSrc has as many or more.
 *  @return pcDst, or null when a pointer is null */
TAVO_API char* tavo_osal_string_num_copy(char* pcDst, const char* pcSrc, unsigned int uiCount);

/** strcat(). @return pcDst, or null when a pointer is null */
TAVO_API char* tavo_osal_string_concatenate(char* pcDst, const char* pcSrc);

/** strncat(): appends at most uiCount characters, and a terminator.
 *  @return pcDst, or null when a pointer is null */
TAVO_API char* tavo_osal_string_num_concatenate(char* pcDst, const char* pcSrc, unsigned int uiCount);

/** strdup(). @return the copy, which the caller frees; null when pcStr is null or memory is short */
TAVO_CHECK_RESULT TAVO_API char* tavo_osal_string_duplicate_string(char* pcStr);
/** @} */

/** @name Measuring and searching
 *  @{ */

/** strlen(). @return characters before the terminator; 0 when pcStr is null */
TAVO_API unsigned int tavo_osal_string_get_length(const char* pcStr);

/** strstr(). @return the first occurrence of pcNeedle in pcHaystack; null when there is none or a pointer is null */
TAVO_API char* tavo_osal_string_search_string(char* pcHaystack, const char* pcNeedle);

/** strchr(). @return the first occurrence of iChar in pcStr; null when there is none or pcStr is null */
TAVO_API char* tavo_osal_string_search_character(char* pcStr, int iChar);

/** strrchr(). @return the last occurrence of iChar in pcStr; null when there is none or pcStr is null */
TAVO_API char* tavo_osal_string_search_last_character(char* pcStr, int iChar);

/** The same as tavo_osal_string_search_character(), under its other name. */
TAVO_API char* tavo_osal_string_scan_string(char* pcStr, int iChar);

/** The same as tavo_osal_string_search_last_character(), under its other name. */
TAVO_API char* tavo_osal_string_scan_string_rev(char* pcStr, int iChar);
/** @} */

/**
 * @name Comparing
 * A null text compares like an empty one: the result is the first byte of pcA, or minus the first byte of pcB,
 * taken unsigned and without case folding, whatever uiCount is; 0 when both are null. One null is logged as
 * "Invalid parameter\n", two as "Invalid parameters\n".
 * @{ */

/** strcmp(). @return negative, 0 or positive as pcA is before, equal to or behind pcB */
TAVO_API int tavo_osal_string_compare(const char* pcA, const char* pcB);

/** strncmp(), over at most uiCount characters. @return as tavo_osal_string_compare() */
TAVO_API int tavo_osal_string_num_compare(const char* pcA, const char* pcB, unsigned int uiCount);

/** strcasecmp(). @return as tavo_osal_string_compare() */
TAVO_API int tavo_osal_case_ignore_string_compare(const char* pcA, const char* pcB);

/** strncasecmp(), over at most uiCount characters. @return as tavo_osal_string_compare() */
TAVO_API int tavo_osal_case_ignore_string_num_compare(const char* pcA, const char* pcB, unsigned int uiCount);
/** @} */

/** @name Converting
 *  @{ */

/**
 * Makes an upper-case copy, byte by byte as toupper() has it.
 * @param pcStr the text; not checked for null
 * @return the copy, which the caller frees; null when memory is short, logged as "String duplication failed\n"
 */
TAVO_CHECK_RESULT TAVO_API char* tavo_osal_convert_string_to_upper(const char* pcStr);

/**
 * Converts the whole text to a number of 32 bits, signed.
 *
 * strtol() on every platform as where long has 32 bits: leading white space and a sign are taken, base 0 selects the
 * base from a "0x" or "0" prefix, and a number beyond 32 bits is cut to the nearest limit with errno set to ERANGE.
 * An empty text is 0. A base that strtol() refuses converts nothing.
 *
 * errno is not cleared beforehand: an ERANGE left by an earlier call makes the two exact limits, 2147483647 and
 * -2147483648, come out as out of range.
 *
 * @param pcStr the text
 * @param iBase 0, or 2 to 36
 * @param plNum receives the number; 0 when the text is not a number or out of range; left alone when a pointer is null
 * @retval TAVO_SUCCESS       converted
 * @retval TAVO_INVALID_PARAM a pointer is null, or something that is no number follows (trailing blanks too)
 * @retval TAVO_OUT_OF_RANGE  the number does not fit in 32 bits
 */
TAVO_API TAVO_Status tavo_osal_convert_string_to_num(const char* pcStr, int iBase, long long* plNum);
/** @} */

/** @name Formatting and scanning
 *  Nothing is checked here; null where the C library forbids it is undefined.
 *  @{ */

/** vsprintf(), without a bound: prefer tavo_osal_snprintf(). @return characters written, or a negative number */
TAVO_API int tavo_osal_sprintf(char* pcDst, const char* pcFormat, ...) TAVO_PRINTF(2, 3);

/** vsnprintf(): at most uiSize bytes, terminator included. @return the length of the whole text even when it was
 *  cut, or a negative number */
TAVO_API int tavo_osal_snprintf(char* pcDst, unsigned int uiSize, const char* pcFormat, ...) TAVO_PRINTF(3, 4);

/** vsscanf(). @return the number of targets stored, or EOF when the text ends before the first */
TAVO_API int tavo_osal_sscanf(const char* pcSrc, const char* pcFormat, ...) TAVO_SCANF(2, 3);
/** @} */

TAVO_END_DECLS

#endif
