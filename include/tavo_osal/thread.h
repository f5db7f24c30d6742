/**
 * @file
 * Threads: the platform's, with a cancellation that Android lacks.
 *
 * A handle is the platform's pthread_t. Every function may be called from any thread. Messages carry the tag
 * "OSAL_THREAD"; failures are logged at level 1.
 *
 * ## Cancellation
 *
 * The signal SIGUSR2 is reserved. Its handler, installed for the whole process by every successful
 * tavo_osal_thread_create(), ends the thread it runs on, whoever made that thread, with a null result. The thread
 * ends wherever it is: in its own code, asleep, in a blocking system call, in a wait for a lock, a condition, an
 * event, a semaphore or a thread. What it leaves behind is up to the program: a mutex it holds stays locked, and so
 * does any lock of a library it was in, the memory allocator's among them. Whether cleanup handlers and destructors
 * of C++ objects on its stack run is up to the platform (with glibc they do, and a C++ function with such objects that
 * is interrupted outside of a call ends the process; with Android's C library only cleanup handlers run). Cancel
 * threads that wait, rather than threads that work.
 *
 * This library never leaves anything of its own half way: while one of its functions holds a lock that callers
 * cannot see (an event's, a timer framework's, the one that guards thread handles), allocates, or writes a message,
 * the end is put off until that is done. Callbacks of timers are the caller's code and may be cancelled. All this is
 * about SIGUSR2; a platform's own pthread_cancel() is not for threads that use this library.
 *
 * ## Handles of threads that are gone
 *
 * The library remembers the threads it joined or detached, the latest 1024 of them. The handle of one that is gone
 * is never given to the platform; it is answered with the platform's error for no such thread, ESRCH. So cancelling
 * such a thread returns #TAVO_SUCCESS and logs nothing, and joining, detaching, killing it or setting its priority
 * fails. A new thread may be given the same value and is then an ordinary thread again; one that was not made through
 * this library is recognised while it runs, where the platform can tell (Linux with glibc). Handles of threads that
 * were joined or detached by other means are the caller's affair, as on the platform.
 */
#ifndef TAVO_OSAL_THREAD_H
#define TAVO_OSAL_THREAD_H

#include <pthread.h>
#include <stdint.h>

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** A thread's code. */
typedef void* (*TAVO_ThreadStart)(void* pvArg);

/** A signal's handler. */
typedef void (*TAVO_SignalHandler)(int iSignal);

/** Policies of tavo_osal_thread_set_real_time_priority(). */
enum {
    TAVO_THREAD_POLICY_RR = 1,  /**< SCHED_RR: threads of one priority take turns */
    TAVO_THREAD_POLICY_FIFO = 2 /**< SCHED_FIFO: a thread runs until it waits */
};

/**
 * Starts a thread, joinable and with the platform's default stack, and installs the handler of the cancellation
 * signal. A failure to install it is printed on standard output and standard error, and the call still succeeds,
 * since the thread runs.
 * @param pThread receives the handle; untouched when the arguments are refused
 * @param pfStart the thread's code
 * @param pvArg   its argument
 * @retval TAVO_SUCCESS       the thread runs; join or detach it
 * @retval TAVO_INVALID_PARAM pThread or pfStart is null
 * @retval TAVO_FAILURE       the platform could not start a thread
 */
TAVO_API TAVO_Status tavo_osal_thread_create(pthread_t* pThread, TAVO_ThreadStart pfStart, void* pvArg);

/** tavo_osal_thread_create(); the name is ignored and may be null. */
TAVO_API TAVO_Status tavo_osal_thread_create_with_name(pthread_t* pThread, TAVO_ThreadStart pfStart, void* pvArg,
                                                       const TAVO_CHAR* pcName);

/**
 * Waits until the thread has ended, and discards its result. A caller cancelled in this wait leaves the thread
 * joinable.
 * @retval TAVO_SUCCESS the thread is gone
 * @retval TAVO_FAILURE the platform refuses: no such thread, detached, the caller itself, or somebody else is joining
 */
TAVO_API TAVO_Status tavo_osal_thread_join(pthread_t thread);

/**
 * Lets another thread run.
 * @retval TAVO_SUCCESS done
 * @retval TAVO_FAILURE the platform reports an error
 */
TAVO_API TAVO_Status tavo_osal_thread_yield(void);

/**
 * Makes the platform release the thread by itself when it ends.
 * @retval TAVO_SUCCESS detached
 * @retval TAVO_FAILURE the platform refuses: no such thread, detached already, or somebody is joining it
 */
TAVO_API TAVO_Status tavo_osal_thread_detach(pthread_t thread);

/**
 * Sleeps for uiSeconds seconds.
 * @retval TAVO_SUCCESS slept
 * @retval TAVO_FAILURE a signal ended the sleep early; it is not resumed
 */
TAVO_API TAVO_Status tavo_osal_thread_sleep(uint32_t uiSeconds);

/**
 * Sleeps for uiMilliSeconds milliseconds.
 * @retval TAVO_SUCCESS slept
 * @retval TAVO_FAILURE a signal ended the sleep early, or the platform reports an error; it is not resumed
 */
TAVO_API TAVO_Status tavo_osal_thread_msleep(uint64_t uiMilliSeconds);

/**
 * Sleeps for uiMicroSeconds microseconds.
 * @retval TAVO_SUCCESS slept
 * @retval TAVO_FAILURE a signal ended the sleep early, or the platform reports an error; it is not resumed
 */
TAVO_API TAVO_Status tavo_osal_thread_usleep(uint32_t uiMicroSeconds);

/** Ends the calling thread with a null result. Does not return. */
TAVO_API void tavo_osal_thread_exit(void) __attribute__((noreturn));

/**
 * Sends the thread the cancellation signal and does not wait; join the thread to know that it has ended. See
 * "Cancellation" above. A signal sent is logged at level 3.
 * @retval TAVO_SUCCESS always: a signal that could not be sent is neither reported nor logged
 */
TAVO_API TAVO_Status tavo_osal_thread_cancel(pthread_t thread);

/**
 * Sends the thread SIGKILL, which ends the whole process.
 * @retval TAVO_SUCCESS sent; nobody is left to see it
 * @retval TAVO_FAILURE the signal could not be sent: no such thread
 */
TAVO_API TAVO_Status tavo_osal_thread_kill(pthread_t thread);

/**
 * Not supported on this platform. Ignores its arguments.
 * @retval TAVO_NOT_SUPPORTED always
 */
TAVO_API TAVO_Status tavo_osal_thread_set_affinity(pthread_t thread, unsigned int uiCpuMask);

/** Does nothing: a thread that is cancelled ends by itself. */
TAVO_API void tavo_osal_thread_testcancel(void);

/**
 * Gives the thread a real-time policy and priority. The policy and priority so far are logged at level 3; failing to
 * read them is logged at level 2 and does not matter otherwise.
 * @param thread    the thread
 * @param iPriority 1 or more; the platform has an upper limit
 * @param iPolicy   #TAVO_THREAD_POLICY_RR or #TAVO_THREAD_POLICY_FIFO
 * @retval TAVO_SUCCESS       set
 * @retval TAVO_INVALID_PARAM iPriority is below 1, or else iPolicy is neither of the two
 * @retval TAVO_FAILURE       the platform refuses; the number in the message is the calling thread's errno, not what
 *                            the platform answered
 */
TAVO_API TAVO_Status tavo_osal_thread_set_real_time_priority(pthread_t thread, int iPriority, int iPolicy);

/**
 * Installs a signal handler with BSD semantics: it stays installed, the signal is blocked while it runs, and
 * interrupted system calls are restarted. A null handler is refused, so the default action (SIG_DFL, which is null)
 * cannot be asked for. Failures are not logged.
 * @retval TAVO_SUCCESS       installed
 * @retval TAVO_INVALID_PARAM pfHandler is null
 * @retval TAVO_FAILURE       the platform refuses the signal
 */
TAVO_API TAVO_Status tavo_osal_signal(int iSignal, TAVO_SignalHandler pfHandler);

TAVO_END_DECLS

#endif
