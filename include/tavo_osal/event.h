/**
 * @file
 * Events: counting signals between threads. A setter raises the count and wakes one waiter; a waiter takes one count,
 * or all of them, and sleeps while there is none.
 *
 * The caller owns the handle from create until destroy. Any number of threads may wait and set; sets that come before
 * a wait are not lost. A waiter sleeps once and does not check the count before it reports success: it may be woken
 * for nothing, and two waiters woken for one set both succeed while one count is taken. Messages carry the tag
 * "OSAL_THREAD" and level 1 unless said otherwise.
 *
 * Time-outs are milliseconds: #TAVO_EVENT_FOREVER waits without limit; from 1000 up, the whole seconds are waited and
 * the rest is dropped, so that 1999 waits one second; below 1000 the wait is refused, 0 included, whatever the
 * count. Deadlines are measured against the realtime clock.
 *
 * A thread cancelled in a wait ends at once and leaves the event as it was.
 */
#ifndef TAVO_OSAL_EVENT_H
#define TAVO_OSAL_EVENT_H

#include <stdint.h>

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** An event. Callers hold its address only. */
typedef struct TAVO_Event TAVO_Event;

/** The time-out of a wait without limit. */
#define TAVO_EVENT_FOREVER 0xFFFFFFFFU

/**
 * Creates an event with count 0.
 * @param ppEvent receives the handle, or null on any failure after the argument check
 * @retval TAVO_SUCCESS       created
 * @retval TAVO_INVALID_PARAM ppEvent is null
 * @retval TAVO_NO_MEMORY     the object could not be allocated
 * @retval TAVO_FAILURE       the platform could not initialise its parts
 */
TAVO_API TAVO_Status tavo_osal_event_create(TAVO_Event** ppEvent);

/**
 * Takes one count, or waits once for a set and takes one count then if there still is one.
 * @param pEvent      the event; must not be null, which is not checked
 * @param uiTimeoutMs see above
 * @retval TAVO_SUCCESS a count was taken, or the caller was woken
 * @retval TAVO_TIMEOUT the time-out passed; logged at level 3. A set that came at the last moment is taken all the same
 * @retval TAVO_FAILURE time-out below 1000, or the platform reports an error; an error of the final unlock counts
 *                      even after a count was taken
 */
TAVO_API TAVO_Status tavo_osal_event_waitset(TAVO_Event* pEvent, uint32_t uiTimeoutMs);

/**
 * Raises the count by one and wakes one waiter.
 * @param pEvent the event; must not be null, which is not checked
 * @retval TAVO_SUCCESS set
 * @retval TAVO_FAILURE the platform reports an error; when it is not the lock's, the count is raised all the same
 */
TAVO_API TAVO_Status tavo_osal_event_set(TAVO_Event* pEvent);

/**
 * tavo_osal_event_waitset() with a choice of what is taken. The time of day is trusted to be readable.
 * @param pEvent      the event
 * @param uiTimeoutMs see above
 * @param iClearAll   non-zero takes all counts instead of one
 * @retval TAVO_SUCCESS       taken, or the caller was woken
 * @retval TAVO_TIMEOUT       the time-out passed; logged at level 3
 * @retval TAVO_INVALID_PARAM pEvent is null
 * @retval TAVO_FAILURE       as tavo_osal_event_waitset()
 */
TAVO_API TAVO_Status tavo_osal_event_waitset_with_flag(TAVO_Event* pEvent, uint32_t uiTimeoutMs, int iClearAll);

/**
 * tavo_osal_event_set() with a choice of how the count is raised.
 * @param pEvent the event
 * @param iReset non-zero sets the count to exactly 1 instead of raising it
 * @retval TAVO_SUCCESS       set
 * @retval TAVO_INVALID_PARAM pEvent is null
 * @retval TAVO_FAILURE       the platform reports an error; the messages print the calling thread's errno
 */
TAVO_API TAVO_Status tavo_osal_event_set_with_flag(TAVO_Event* pEvent, int iReset);

/**
 * Sets the count to 0.
 * @retval TAVO_SUCCESS       cleared
 * @retval TAVO_INVALID_PARAM pEvent is null
 * @retval TAVO_FAILURE       the platform reports an error; when it is the unlock's, the count is cleared all the same
 */
TAVO_API TAVO_Status tavo_osal_event_clear(TAVO_Event* pEvent);

/**
 * Destroys the event, releases its memory and sets the caller's handle to null, also when the platform refuses.
 * Threads still waiting are woken first and their waits succeed; no thread may begin to use the event meanwhile.
 * @param ppEvent address of the handle
 * @retval TAVO_SUCCESS        destroyed
 * @retval TAVO_INVALID_PARAM  ppEvent or the handle is null
 * @retval TAVO_DESTROY_FAILED the platform refused to destroy a part of the event
 */
TAVO_API TAVO_Status tavo_osal_event_destroy(TAVO_Event** ppEvent);

TAVO_END_DECLS

#endif
