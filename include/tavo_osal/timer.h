/**
 * @file
 * Timers: a framework of five one-shot or periodic timers and one worker thread that counts them down, a tick at a
 * time, and calls their callbacks.
 *
 * The worker sleeps one tick, looks at the five timers in order, and starts over; its period is the tick plus the time
 * that takes, callbacks included, and the drift is not made up for. A timer started with N ticks' worth of
 * milliseconds fires at the (N+1)-th tick, a periodic one every N+1 ticks from then on. A count that is not a multiple
 * of the tick never comes to an end: its remainder is never subtracted and the timer stays running without firing.
 *
 * Callbacks run one at a time on the worker, without any lock held, and may create, start, stop, restart and free
 * timers of their framework. When a callback returns, a one-shot timer is stopped (a restart from its own callback is
 * lost) and a periodic one's count is reloaded (one stopped in its own callback stays stopped). A callback may be
 * cancelled like any code of the caller's (see tavo_osal/thread.h), or end its thread; the framework's timers then
 * never fire again, and every other function goes on working.
 *
 * Every function but tavo_osal_timer_framework_init() and tavo_osal_timer_framework_uninit() may be called from any
 * thread between these two; framework and timers are invalid after the latter. Messages carry the tag "OSAL_TIMER"
 * and level 1 unless said otherwise. Where the framework's mutex cannot be locked or unlocked, that is logged and
 * the mutex's own status is the result; a change made before a failing unlock stays.
 */
#ifndef TAVO_OSAL_TIMER_H
#define TAVO_OSAL_TIMER_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** Five timers and their worker thread. Callers hold its address only. */
typedef struct TAVO_TimerFramework TAVO_TimerFramework;

/** One of a framework's timers. Callers hold its address only. */
typedef struct TAVO_Timer TAVO_Timer;

/** What a timer calls; the result is ignored. */
typedef void* (*TAVO_TimerCallback)(void* pvArg);

/** Kinds of timers. */
enum {
    TAVO_TIMER_ONE_SHOT = 0, /**< fires once */
    TAVO_TIMER_PERIODIC = 1  /**< fires again and again */
};

/** How many timers a framework holds. Creating more is not reported, see tavo_osal_timer_create(). */
enum { TAVO_TIMERS_PER_FRAMEWORK = 5 /**< five */ };

/**
 * Creates a framework and starts its worker thread. Success is logged at level 3.
 * @param uiTickMs    the tick, in milliseconds
 * @param ppFramework receives the framework; null on every failure
 * @retval TAVO_SUCCESS       the worker runs
 * @retval TAVO_INVALID_PARAM uiTickMs is 0 or ppFramework is null
 * @retval TAVO_NO_MEMORY     the framework or its mutex could not be allocated
 * @retval TAVO_FAILURE       the mutex or the thread could not be made
 */
TAVO_API TAVO_Status tavo_osal_timer_framework_init(unsigned int uiTickMs, TAVO_TimerFramework** ppFramework);

/**
 * Ends the worker, after the round it is in, and frees the framework. Timers still running are discarded.
 *
 * From a callback of the same framework it fails, since a thread cannot join itself; the worker ends all the same, and
 * a second call from another thread then frees the framework.
 *
 * @param pFramework the framework
 * @retval TAVO_SUCCESS       freed
 * @retval TAVO_INVALID_PARAM pFramework is null
 * @retval TAVO_FAILURE       the worker could not be joined, or the mutex not destroyed with errno set: the framework
 *                            is not freed. Or the mutex could not be destroyed with errno 0: the framework is freed
 */
TAVO_API TAVO_Status tavo_osal_timer_framework_uninit(TAVO_TimerFramework* pFramework);

/**
 * Takes the framework's first free timer. It is stopped, and counts nothing until it is started.
 *
 * A framework that has no free timer is not reported: the result is #TAVO_SUCCESS and *ppTimer the address one past
 * the last timer. Functions given that address do nothing and succeed. Keep to #TAVO_TIMERS_PER_FRAMEWORK.
 *
 * @param pFramework  the framework
 * @param pcName      not used; may be null
 * @param uiType      #TAVO_TIMER_ONE_SHOT or #TAVO_TIMER_PERIODIC
 * @param iDurationMs at least one tick; otherwise without effect, since starting takes a count of its own
 * @param iReloadMs   what a periodic timer counts after it fired, at least one tick; also what a restart counts, of
 *                    both kinds. A one-shot timer's is not checked
 * @param pfCallback  what to call
 * @param pvArg       its argument
 * @param ppTimer     receives the timer
 * @retval TAVO_SUCCESS       see above
 * @retval TAVO_INVALID_PARAM pFramework, pfCallback or ppTimer is null, uiType is neither kind, a periodic timer's
 *                            iReloadMs is 0, or iDurationMs or a periodic timer's iReloadMs is below one tick
 */
TAVO_API TAVO_Status tavo_osal_timer_create(TAVO_TimerFramework* pFramework, const TAVO_CHAR* pcName,
                                            unsigned int uiType, int iDurationMs, int iReloadMs,
                                            TAVO_TimerCallback pfCallback, void* pvArg, TAVO_Timer** ppTimer);

/**
 * Gives a timer back, running or not. A timer that is free already is left alone.
 * @retval TAVO_SUCCESS       free
 * @retval TAVO_INVALID_PARAM pFramework or pTimer is null
 */
TAVO_API TAVO_Status tavo_osal_timer_free(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer);

/**
 * Starts a stopped timer. One that runs, or is free, is left alone.
 * @param pFramework the framework
 * @param pTimer     the timer
 * @param uiCountMs  milliseconds to count, at least one tick
 * @retval TAVO_SUCCESS       see above
 * @retval TAVO_INVALID_PARAM pFramework or pTimer is null, or uiCountMs is 0 or below one tick
 */
TAVO_API TAVO_Status tavo_osal_timer_start(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer, unsigned int uiCountMs);

/**
 * Starts a timer, running or not, with the reload given at its creation. With a reload of 0 it fires at the next tick.
 * A free timer is left alone.
 * @retval TAVO_SUCCESS       see above
 * @retval TAVO_INVALID_PARAM pFramework or pTimer is null
 */
TAVO_API TAVO_Status tavo_osal_timer_restart(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer);

/**
 * Stops a running timer. One that does not run, or is free, is left alone.
 * @retval TAVO_SUCCESS       see above
 * @retval TAVO_INVALID_PARAM pFramework or pTimer is null
 */
TAVO_API TAVO_Status tavo_osal_timer_stop(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer);

/**
 * Tells whether a timer runs. Takes no lock, so the answer may be old when it arrives.
 * @param pFramework not used, but for the message when both are null
 * @param pTimer     the timer
 * @return 1 while it runs, else 0; 0 for a null pTimer, with a message only when pFramework is null too
 */
TAVO_API int tavo_osal_is_timer_running(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer);

TAVO_END_DECLS

#endif
