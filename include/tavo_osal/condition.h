/**
 * @file
 * Condition variables: the platform's, with default attributes, behind a handle.
 *
 * A handle is the address of the platform's object, allocated by the library; null means none. The caller owns
 * it from create until destroy. Waits go with a mutex of tavo_osal/mutex.h that the caller holds, return with
 * that mutex held, and may return without a signal. Every function may be called from any thread. Messages carry
 * the tag "OSAL_THREAD" and level 1.
 *
 * A thread cancelled in a wait ends at once and, where the platform takes the mutex again before it runs cleanup
 * handlers (glibc does, Android does not), leaves that mutex locked unless a handler of the thread's unlocks it.
 * A mutex somebody else holds holds up the end until it is released.
 */
#ifndef TAVO_OSAL_CONDITION_H
#define TAVO_OSAL_CONDITION_H

#include <stdint.h>

#include "tavo_osal/export.h"
#include "tavo_osal/mutex.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** A condition variable. Callers hold its address only. */
typedef struct TAVO_Condition TAVO_Condition;

/**
 * Creates a condition variable.
 * @param ppCondition receives the handle; null when the allocation failed. When only the platform's
 *                    initialisation failed, it receives the uninitialised object all the same
 * @retval TAVO_SUCCESS       created
 * @retval TAVO_INVALID_PARAM ppCondition is null
 * @retval TAVO_NO_MEMORY     the object could not be allocated
 * @retval TAVO_FAILURE       the platform could not initialise it
 */
TAVO_API TAVO_Status tavo_osal_thread_condition_create(TAVO_Condition** ppCondition);

/**
 * Waits for a signal, without limit.
 * @param pCondition the condition
 * @param pMutex     a mutex the caller holds; released during the wait
 * @retval TAVO_SUCCESS       woken
 * @retval TAVO_INVALID_PARAM pCondition or pMutex is null
 * @retval TAVO_FAILURE       the platform reports an error
 */
TAVO_API TAVO_Status tavo_osal_thread_condition_wait(TAVO_Condition* pCondition, TAVO_Mutex* pMutex);

/**
 * Waits for a signal until a time-out passes, measured against the realtime clock.
 *
 * The deadline's nanoseconds are the current microseconds and the milliseconds of the time-out added up without
 * a carry into the seconds. A time-out whose milliseconds reach into the next second is therefore not waited for:
 * the platform rejects the deadline and the result is #TAVO_FAILURE. Pass whole seconds to be safe from this.
 *
 * @param pCondition    the condition
 * @param pMutex        a mutex the caller holds; released during the wait
 * @param uiTimeoutMs   milliseconds; 0 times out at once unless signalled
 * @retval TAVO_SUCCESS           woken
 * @retval TAVO_CONDITION_TIMEOUT the time-out passed; not logged
 * @retval TAVO_INVALID_PARAM     pCondition or pMutex is null
 * @retval TAVO_FAILURE           the time of day could not be read, or the platform reports an error, which
 *                                includes the deadlines described above
 */
TAVO_API TAVO_Status tavo_osal_thread_condition_timedwait(TAVO_Condition* pCondition, TAVO_Mutex* pMutex,
                                                          uint64_t uiTimeoutMs);

/**
 * Wakes one waiter, if there is any.
 * @retval TAVO_SUCCESS       signalled
 * @retval TAVO_INVALID_PARAM pCondition is null
 * @retval TAVO_FAILURE       the platform reports an error
 */
TAVO_API TAVO_Status tavo_osal_thread_condition_signal(TAVO_Condition* pCondition);

/**
 * Wakes every waiter.
 * @retval TAVO_SUCCESS       signalled
 * @retval TAVO_INVALID_PARAM pCondition is null
 * @retval TAVO_FAILURE       the platform reports an error
 */
TAVO_API TAVO_Status tavo_osal_thread_condition_broadcast(TAVO_Condition* pCondition);

/**
 * Destroys the condition variable, releases its memory and sets the caller's handle to null. Threads must not
 * be waiting; platforms differ in what happens then, and glibc waits for them to leave.
 * @retval TAVO_SUCCESS       destroyed
 * @retval TAVO_INVALID_PARAM ppCondition or the handle is null
 * @retval TAVO_FAILURE       the platform refused; memory and handle are kept
 */
TAVO_API TAVO_Status tavo_osal_thread_condition_destroy(TAVO_Condition** ppCondition);

TAVO_END_DECLS

#endif
