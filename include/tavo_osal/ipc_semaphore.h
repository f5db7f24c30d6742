/**
 * @file
 * Binary semaphores between processes, by key, without a service.
 *
 * A semaphore is a POSIX semaphore in a file that every process maps, "/sdcard/KEY" with the key in decimal. The file
 * is made, with a count of 1, by the first tavo_semaphore_init() of its key, and stays for good: nothing here removes
 * it, and a file left from earlier runs is used with whatever count it holds. A process that ends while it holds
 * a semaphore does not release it.
 *
 * Any number of processes may make the same semaphore at once: it is initialised exactly once, and no process sees it
 * before that. A process that was killed while making it leaves a file that the next one finishes. One that
 * was stopped while making it is waited for, five seconds at most.
 *
 * No locks are taken beyond that, and nothing is kept. Every function may be called from any thread. A thread that is
 * cancelled ends at once while it waits in tavo_semaphore_acquire(), and after a tavo_semaphore_init() that it is in.
 * Processes that share a semaphore must be of the same word size.
 *
 * Not to be confused with the tavo_osal_semaphore_* functions of tavo_osal/semaphore.h: those are counting semaphores
 * in the caller's storage.
 */
#ifndef TAVO_OSAL_IPC_SEMAPHORE_H
#define TAVO_OSAL_IPC_SEMAPHORE_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** Does nothing: users choose their keys themselves. @return #TAVO_SUCCESS */
TAVO_API TAVO_Status tavo_semaphore_key_create(void);

/**
 * Maps the semaphore of a key into this process, and makes it if there is none. Each call maps it anew.
 *
 * The file gets mode 0775 when it is made, so other users may look at the semaphore but not use it.
 *
 * @param uiKey the key
 * @param piSem receives the handle; untouched on failure. -1 when the file is there but could not be mapped, for
 *              which tavo_semaphore_acquire() and tavo_semaphore_release() fail
 * @return #TAVO_SUCCESS; #TAVO_INVALID_PARAM: piSem is null; #TAVO_FAILURE: the file could not be opened or made, is
 *         no semaphore, or another process has been making it for five seconds
 */
TAVO_API TAVO_Status tavo_semaphore_init(uint32_t uiKey, TAVO_INT64* piSem);

/**
 * Takes the semaphore. Blocks until it is released, or a signal handler interrupts the call.
 *
 * @param iSem handle from tavo_semaphore_init()
 * @return #TAVO_SUCCESS; #TAVO_FAILURE: interrupted (errno is EINTR), or no handle (EINVAL)
 */
TAVO_API TAVO_Status tavo_semaphore_acquire(TAVO_INT64 iSem);

/**
 * Releases the semaphore. Not checked: any process may, and releasing twice lets two in.
 *
 * @param iSem handle from tavo_semaphore_init()
 * @return #TAVO_SUCCESS; #TAVO_FAILURE: the count would overflow (errno is EOVERFLOW), or no handle (EINVAL)
 */
TAVO_API TAVO_Status tavo_semaphore_release(TAVO_INT64 iSem);

/**
 * Unmaps the semaphore in this process. The semaphore and its file stay.
 *
 * @param iSem handle from tavo_semaphore_init(), or 0
 * @return #TAVO_SUCCESS, also for 0; #TAVO_SEM_DELETE_FAILED: could not be unmapped, see errno
 */
TAVO_API TAVO_Status tavo_semaphore_delete(TAVO_INT64 iSem);

TAVO_END_DECLS

#endif
