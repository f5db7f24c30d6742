/**
 * @file
 * Message queues between processes, by key, and local ones between threads.
 *
 * A queue is known to all processes by an integer key, written as a decimal text, and lives in the service
 * (tavo_osal_init()), which owns one pipe per key. Sender and receiver attach in the same way, with
 * tavo_msg_queue_sender_init(); the sender then only puts, the receiver only gets. Messages go through
 * the pipe directly, without the service, and go on going when the service is gone.
 *
 * A handle is the address of a process-local object, always positive on success. It is valid until
 * tavo_msg_queue_destroy(); a handle that is not valid is not recognised, and using it is undefined.
 *
 * Every handle holds both ends of the pipe. So a put never meets a pipe without a reader, raises no SIGPIPE,
 * and waits for room in a full queue even when no receiver is left.
 *
 * No locks are taken. Several threads and processes may put messages of up to 4092 bytes at once; longer ones
 * need a single writer. One thread at a time gets. Calls to the service block until it answers.
 */
#ifndef TAVO_OSAL_MSG_QUEUE_H
#define TAVO_OSAL_MSG_QUEUE_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** Bytes of the longest message. */
#define TAVO_MSG_QUEUE_MAX_SIZE 409600U

/**
 * Makes a queue of this process's own, for its threads. It must not be given to tavo_msg_queue_destroy(), which would
 * drop a use of a key from the service.
 *
 * @param piMqId receives the handle, or -1 on failure
 * @return #TAVO_SUCCESS; #TAVO_MQ_INVALID_POINTER: piMqId is null; #TAVO_MQ_FAILURE: no queue object could be made
 */
TAVO_API TAVO_Status tavo_android_msg_queue_init(TAVO_INT64* piMqId);

/**
 * Attaches to the service's queue of a key, which is created when it does not exist, and counts one use of it.
 *
 * @param pcServiceName the key as decimal text; a text that is no number is key 0, which no queue has. A number
 *                      beyond 32 bits counts as the nearest that fits. At most 64 characters are looked at
 * @param piMqId        receives the handle; untouched on failure
 * @return #TAVO_SUCCESS; #TAVO_MQ_INVALID_POINTER: a pointer is null; a plain 1: the service is not reachable, which
 *         takes five seconds to tell where a server has been before;
 *         #TAVO_MQ_NOT_AVAILABLE: the service has no queue for the key; #TAVO_NO_MEMORY: no queue object could be made
 */
TAVO_API TAVO_Status tavo_msg_queue_sender_init(TAVO_CHAR* pcServiceName, TAVO_INT64* piMqId);

/**
 * Sends one message. Blocks while the queue is full: it holds 64 KiB of lengths and messages, more once large messages
 * are put, so that a thread that puts to itself must get in between.
 *
 * @param iMqId  handle; not checked
 * @param pbMsg  the message; only read
 * @param uiSize its bytes, 0 to #TAVO_MSG_QUEUE_MAX_SIZE
 * @return #TAVO_SUCCESS; #TAVO_INVALID_PARAM: pbMsg is null; #TAVO_MQ_MSG_TOO_LARGE; #TAVO_NO_MEMORY;
 *         #TAVO_MQ_NOT_AVAILABLE: the queue has no write end, or was removed (EIDRM); -1: the write failed, see errno
 */
TAVO_API TAVO_Status tavo_msg_queue_put(TAVO_INT64 iMqId, unsigned char* pbMsg, unsigned int uiSize);

/**
 * Receives one message. Blocks until there is one, for ever when nobody sends: every process that is attached holds
 * both ends. A message whose rest does not come within a second is
 * given as far as it came.
 *
 * @param iMqId   handle; not checked
 * @param pbMsg   receives the message. Must hold the longest message in the queue, and at least 4 bytes: the value
 *                in puiSize is not a limit
 * @param puiSize receives the message's bytes
 * @return #TAVO_SUCCESS; #TAVO_MQ_FAILURE: a null pointer, no read end, or a failed read; #TAVO_MQ_NOT_AVAILABLE: the
 *         queue was removed (EIDRM)
 */
TAVO_API TAVO_Status tavo_msg_queue_get(TAVO_INT64 iMqId, unsigned char* pbMsg, unsigned int* puiSize);

/**
 * Drops this process's use of the key in the service and closes the handle. The service forgets the key with its last
 * use; processes that are still attached go on using the pipe.
 *
 * @param iMqId handle from tavo_msg_queue_sender_init()
 * @return #TAVO_SUCCESS; #TAVO_FAILURE: the handle is 0 or negative, or the service is not reachable, in which case
 *         the handle stays valid
 */
TAVO_API TAVO_Status tavo_msg_queue_destroy(TAVO_INT64 iMqId);

TAVO_END_DECLS

#endif
