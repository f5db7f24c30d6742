/**
 * @file
 * Turning a process into the server of the shared message queues and shared-memory blocks.
 */
#ifndef TAVO_OSAL_INIT_H
#define TAVO_OSAL_INIT_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/**
 * Publishes the service "android.tavo.osal" from this process and starts the binder thread pool.
 *
 * Applies the log preference "OSAL_LOG -s -a -l3" (unless LOG_PREF is set), leaves the marker file
 * "/sdcard/com.zorla.qirserver/android.tavo.osal" that clients look for, which is never removed, and
 * returns without blocking. The process must stay alive for as long as clients use the service. There is no call that
 * unpublishes it.
 *
 * Calling it again, here or in another process, publishes a second service in place of the first; the two
 * share nothing. Meant to be called once, on the main thread: it is not guarded against concurrent calls.
 *
 * Both numbers must not be 0: the service is published all the same, and refuses every request.
 *
 * @param uiMaxNumMsgQueues       queues to make room for at first; more can be created
 * @param uiMaxNumSharedMemBlocks blocks after which the log says that the maximum is reached; more can be created
 * @return #TAVO_SUCCESS; #TAVO_FAILURE: the marker file could not be created, and nothing was published;
 *         #TAVO_NO_MEMORY: no memory for a service object or for publishing it. Failures to publish and of the
 *         service's own initialisation are only logged
 */
TAVO_API TAVO_Status tavo_osal_init(unsigned int uiMaxNumMsgQueues, unsigned int uiMaxNumSharedMemBlocks);

TAVO_END_DECLS

#endif
