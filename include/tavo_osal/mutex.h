/**
 * @file
 * Mutexes: the platform's default mutex, neither recursive nor error-checking, behind a handle.
 *
 * A handle is the address of the platform's mutex object, allocated by the library; null means no mutex. The
 * caller owns it from create until destroy. Every function may be called from any thread; destroying a mutex
 * that is held or waited for is the caller's mistake. Messages carry the tag "OSAL_THREAD", level 1 unless
 * said otherwise.
 */
#ifndef TAVO_OSAL_MUTEX_H
#define TAVO_OSAL_MUTEX_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** A mutex. Callers hold its address only. */
typedef struct TAVO_Mutex TAVO_Mutex;

/**
 * Creates a mutex. Success is logged at level 3.
 * @param ppMutex receives the handle, or null on any failure after the argument check
 * @retval TAVO_SUCCESS       created
 * @retval TAVO_INVALID_PARAM ppMutex is null
 * @retval TAVO_NO_MEMORY     the object could not be allocated
 * @retval TAVO_FAILURE       the platform could not initialise it
 */
TAVO_API TAVO_Status tavo_osal_mutex_create(TAVO_Mutex** ppMutex);

/**
 * Locks the mutex, waiting without limit.
 * @retval TAVO_SUCCESS       the caller holds the mutex
 * @retval TAVO_INVALID_PARAM pMutex is null
 * @retval TAVO_FAILURE       the platform reports an error
 */
TAVO_API TAVO_Status tavo_osal_mutex_lock(TAVO_Mutex* pMutex);

/**
 * Unlocks the mutex.
 * @retval TAVO_SUCCESS       released
 * @retval TAVO_INVALID_PARAM pMutex is null
 * @retval TAVO_FAILURE       the platform reports an error
 */
TAVO_API TAVO_Status tavo_osal_mutex_unlock(TAVO_Mutex* pMutex);

/**
 * Locks the mutex if nobody holds it, the caller included.
 * @retval TAVO_SUCCESS       the caller holds the mutex
 * @retval TAVO_BUSY          somebody holds it; logged
 * @retval TAVO_INVALID_PARAM pMutex is null
 * @retval TAVO_FAILURE       the platform reports another error
 */
TAVO_API TAVO_Status tavo_osal_mutex_try_lock(TAVO_Mutex* pMutex);

/**
 * Destroys the mutex and releases its memory, also when the platform refuses to destroy it. The caller's
 * handle variable is left as it was.
 * @param ppMutex address of the handle; a null handle succeeds and logs nothing
 * @retval TAVO_SUCCESS       destroyed, or there was none
 * @retval TAVO_INVALID_PARAM ppMutex itself is null
 * @retval TAVO_FAILURE       the platform refused; the memory is released all the same
 */
TAVO_API TAVO_Status tavo_osal_mutex_destroy(TAVO_Mutex** ppMutex);

TAVO_END_DECLS

#endif
