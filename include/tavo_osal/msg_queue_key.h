/**
 * @file
 * Message queues by integer key: the queues of msg_queue.h under older names, and keys made from a file.
 *
 * A queue that is opened here with key 7 is the queue that tavo_msg_queue_sender_init() attaches to with the text
 * "7", and handles of both kinds can be used with the functions of both. Beware: sending and receiving take the
 * size before the buffer here, and the buffer before the size there.
 */
#ifndef TAVO_OSAL_MSG_QUEUE_KEY_H
#define TAVO_OSAL_MSG_QUEUE_KEY_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/**
 * Makes a key with ftok() from the file "/sdcard/key_gen_file.txt", which is created or emptied first.
 *
 * The key depends on the file's identity and the low 8 bits of iProjId only: it is the same at every call and in every
 * process until the file is deleted.
 *
 * Sets the process's file mode creation mask to 0, and leaves it so. May be called from any thread.
 *
 * @param piKey   receives the key; untouched on failure
 * @param iProjId number to tell keys apart
 * @return #TAVO_SUCCESS; #TAVO_INVALID_PARAM: piKey is null, and neither file nor mask were touched;
 *         #TAVO_MQ_KEY_FAILED: ftok() failed, for example because the file could not be created
 */
TAVO_API TAVO_Status tavo_msg_queue_key_create(int32_t* piKey, int iProjId);

/**
 * tavo_msg_queue_sender_init() for an integer key.
 * @param iKey   the key, any number but 0
 * @param piMqId receives the handle
 * @return as there
 */
TAVO_API TAVO_Status tavo_msg_queue_init(int iKey, TAVO_INT64* piMqId);

/** tavo_msg_queue_init(). @param iKey as there @param iFlags ignored @param piMqId as there @return as there */
TAVO_API TAVO_Status tavo_msg_queue_init_with_flags(int iKey, int iFlags, TAVO_INT64* piMqId);

/** tavo_msg_queue_put(). @param iMqId handle @param uiSize the message's bytes @param pbMsg the message
 *  @return as there */
TAVO_API TAVO_Status tavo_msg_queue_sendmessage(TAVO_INT64 iMqId, unsigned int uiSize, unsigned char* pbMsg);

/** tavo_msg_queue_get(). @param iMqId handle @param puiSize receives the message's bytes @param pbMsg receives the
 *  message, see there @return as there */
TAVO_API TAVO_Status tavo_msg_queue_receivemessage(TAVO_INT64 iMqId, unsigned int* puiSize, unsigned char* pbMsg);

/** tavo_msg_queue_destroy(). @param iMqId handle @return as there */
TAVO_API TAVO_Status tavo_msg_queue_close(TAVO_INT64 iMqId);

TAVO_END_DECLS

#endif
