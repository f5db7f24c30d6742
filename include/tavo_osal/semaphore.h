/**
 * @file
 * Counting semaphores: the platform's, in the caller's storage. The library neither allocates nor frees anything.
 *
 * The semaphores follow the platform's rules; one created with the shared flag in shared memory works across
 * processes. create, wait, timedwait and post do not check their address, the others do. Messages carry the tag
 * "TAVO_OSAL" and level 1; the last three functions also trace their entry and every exit at level 6.
 *
 * Not to be confused with the tavo_semaphore_* functions of tavo_osal/ipc_semaphore.h: those are binary semaphores that
 * processes share by a key.
 */
#ifndef TAVO_OSAL_SEMAPHORE_H
#define TAVO_OSAL_SEMAPHORE_H

#include <semaphore.h>
#include <stdint.h>

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/**
 * Initialises a semaphore.
 * @param pSemaphore storage for it; must not be null, which is not checked
 * @param iShared    non-zero to use it across processes
 * @param uiValue    initial value
 * @retval TAVO_SUCCESS initialised; destroy it when it is no longer used
 * @retval TAVO_FAILURE the platform refuses, for instance a value too large
 */
TAVO_API TAVO_Status tavo_osal_semaphore_create(sem_t* pSemaphore, int iShared, uint32_t uiValue);

/**
 * Takes one count, waiting for it without limit.
 * @param pSemaphore the semaphore; must not be null, which is not checked
 * @retval TAVO_SUCCESS taken
 * @retval TAVO_FAILURE the platform reports an error; a signal that interrupted the wait is one, and is not waited over
 */
TAVO_API TAVO_Status tavo_osal_semaphore_wait(sem_t* pSemaphore);

/**
 * Takes one count, waiting for it until a point in time.
 * @param pSemaphore   the semaphore; must not be null, which is not checked
 * @param uiDeadlineMs the point in time, in milliseconds since the epoch on the realtime clock, and not a duration:
 *                     500 is long past, so the count is taken at once or not at all
 * @retval TAVO_SUCCESS           taken
 * @retval TAVO_SEMAPHORE_TIMEOUT the point has passed; logged
 * @retval TAVO_FAILURE           the platform reports another error, an interrupting signal included
 */
TAVO_API TAVO_Status tavo_osal_semaphore_timedwait(sem_t* pSemaphore, uint64_t uiDeadlineMs);

/**
 * Gives one count back.
 * @param pSemaphore the semaphore; must not be null, which is not checked
 * @retval TAVO_SUCCESS given
 * @retval TAVO_FAILURE the platform reports an error, for instance a count too large
 */
TAVO_API TAVO_Status tavo_osal_semaphore_post(sem_t* pSemaphore);

/**
 * Reads the count. Logs both addresses at level 5.
 * @param pSemaphore the semaphore
 * @param piValue    receives the count
 * @retval TAVO_SUCCESS       read
 * @retval TAVO_INVALID_PARAM pSemaphore or piValue is null
 * @retval TAVO_FAILURE       the platform reports an error
 */
TAVO_API TAVO_Status tavo_osal_semaphore_get_value(sem_t* pSemaphore, int* piValue);

/**
 * Takes one count if there is one.
 * @param pSemaphore the semaphore
 * @retval TAVO_SUCCESS       taken
 * @retval TAVO_INVALID_PARAM pSemaphore is null
 * @retval TAVO_FAILURE       there is none, or the platform reports another error; both are logged
 */
TAVO_API TAVO_Status tavo_osal_semaphore_trywait(sem_t* pSemaphore);

/**
 * Destroys the semaphore; the storage stays the caller's. Nobody must be waiting.
 * @param pSemaphore the semaphore
 * @retval TAVO_SUCCESS       destroyed
 * @retval TAVO_INVALID_PARAM pSemaphore is null
 * @retval TAVO_FAILURE       the platform reports an error
 */
TAVO_API TAVO_Status tavo_osal_semaphore_destroy(sem_t* pSemaphore);

TAVO_END_DECLS

#endif
