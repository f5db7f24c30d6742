/**
 * @file
 * Memory: the C library's allocator and memory functions, with allocation failures logged.
 *
 * No function here checks its arguments; null where the C library forbids it is undefined. Memory from
 * the three allocating functions belongs to the caller and is released with tavo_osal_mem_free(), which
 * is plain free(). Every function may be called from any thread.
 */
#ifndef TAVO_OSAL_MEMORY_H
#define TAVO_OSAL_MEMORY_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/**
 * malloc().
 * @param uiSize bytes
 * @return the block, or null; a null result is logged, "Memory not allocated. Size Requested: %d.\n"
 */
TAVO_CHECK_RESULT TAVO_API void* tavo_osal_mem_malloc(unsigned int uiSize);

/**
 * realloc().
 * @param pvMem  a block from this family, or null
 * @param uiSize its new size in bytes
 * @return the block, possibly moved, or null; a null result is logged, "Memory not allocated\n", also where the
 *         C library answers null to size 0. When the allocation failed, pvMem is left as it was
 */
TAVO_CHECK_RESULT TAVO_API void* tavo_osal_mem_realloc(void* pvMem, unsigned int uiSize);

/**
 * calloc(): zeroed memory for an array.
 * @param uiCount number of elements
 * @param uiSize  bytes of one element
 * @return the block, or null; a null result is logged, "Memory not allocated\n"
 */
TAVO_CHECK_RESULT TAVO_API void* tavo_osal_mem_calloc(unsigned int uiCount, unsigned int uiSize);

/** free(); null is allowed. */
TAVO_API void tavo_osal_mem_free(void* pvMem);

/** memset(): fills uiLen bytes with the low 8 bits of iValue. @return pvDst */
TAVO_API void* tavo_osal_memset(void* pvDst, int iValue, unsigned int uiLen);

/** memcpy(): copies uiLen bytes between blocks that do not overlap. @return pvDst */
TAVO_API void* tavo_osal_memcpy(void* pvDst, const void* pvSrc, unsigned int uiLen);

/** memcmp(). @return negative, 0 or positive as the first differing byte, taken unsigned, is smaller or larger */
TAVO_API int tavo_osal_memcmp(const void* pvA, const void* pvB, unsigned int uiLen);

/** memmove(): copies uiLen bytes; the blocks may overlap. @return pvDst */
TAVO_API void* tavo_osal_memmove(void* pvDst, const void* pvSrc, unsigned int uiLen);

TAVO_END_DECLS

#endif
