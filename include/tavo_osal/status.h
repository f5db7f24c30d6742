/**
 * @file
 * The status type, its codes, and the names of the scalar types used in the API.
 *
 * Every operation that can fail answers with a ::TAVO_Status unless its own documentation says
 * otherwise. Success is exactly 0. Codes come in blocks of 0x100 by family; the values that are
 * missing from a block are unassigned and stay so, because callers compare numbers they stored.
 */
#ifndef TAVO_OSAL_STATUS_H
#define TAVO_OSAL_STATUS_H

#include <stdint.h>

/** 32-bit status: #TAVO_SUCCESS, or one of the codes below. */
typedef int32_t TAVO_Status;

/** 8-bit character; texts are NUL-terminated arrays of it. */
typedef char TAVO_CHAR;

/** Signed 64-bit integer; carries the process-local address behind queue and semaphore handles. */
typedef int64_t TAVO_INT64;

/** Seconds and microseconds, 32 bits each on every platform. */
typedef struct TAVO_TimeVal {
    int32_t tv_sec;  /**< seconds */
    int32_t tv_usec; /**< microseconds, 0 to 999999 */
} TAVO_TimeVal;

/** The status codes. */
enum {
    TAVO_SUCCESS = 0, /**< the operation succeeded */

    TAVO_FAILURE = 0x9001,        /**< a wrapped platform call failed, or the service is unreachable */
    TAVO_INVALID_PARAM = 0x9002,  /**< null pointer, null handle or argument out of range */
    TAVO_NO_MEMORY = 0x9003,      /**< an allocation failed */
    TAVO_DESTROY_FAILED = 0x9004, /**< an event's parts could not be destroyed; the event is freed all the same */
    TAVO_NOT_SUPPORTED = 0x9005,  /**< the operation does not exist on this platform */
    TAVO_BUSY = 0x9006,           /**< the mutex is held */
    TAVO_OUT_OF_RANGE = 0x9007,   /**< the number does not fit in 32 bits */

    TAVO_TIMEOUT = 0x9101, /**< an event wait expired */

    TAVO_SOCKET_CREATE_FAILED = 0x9201,  /**< the socket could not be created */
    TAVO_SOCKET_CONNECT_FAILED = 0x9202, /**< connect, bind, netlink bind or accept failed */
    TAVO_SOCKET_CLOSE_FAILED = 0x9203,   /**< close, shutdown or linger reset failed */
    TAVO_SOCKET_SELECT_TIMEOUT = 0x9204, /**< a socket wait expired */
    TAVO_SOCKET_SELECT_FAILED = 0x9205,  /**< a socket wait failed */
    TAVO_SOCKET_SEND_FAILED = 0x9206,    /**< fewer bytes were sent than asked */
    TAVO_SOCKET_OPTION_FAILED = 0x9207,  /**< a socket option could not be set */

    TAVO_MQ_KEY_FAILED = 0x9301,      /**< no message-queue key could be generated */
    TAVO_MQ_INVALID_POINTER = 0x9302, /**< null handle pointer or null key text */
    TAVO_MQ_FAILURE = 0x9303,         /**< no queue object, or a failed receive */
    TAVO_MQ_MSG_TOO_LARGE = 0x9305,   /**< the message is larger than a queue carries */
    TAVO_MQ_NOT_AVAILABLE = 0x9306,   /**< no write end, no such queue in the service, or a removed queue */

    TAVO_CONDITION_TIMEOUT = 0x9501, /**< a condition-variable wait expired */

    TAVO_SEM_DELETE_FAILED = 0x9602, /**< a cross-process semaphore could not be unmapped */
    TAVO_SEMAPHORE_TIMEOUT = 0x9608, /**< a semaphore wait expired */

    TAVO_DL_OPEN_FAILED = 0x9801,   /**< the shared object could not be loaded */
    TAVO_DL_SYMBOL_FAILED = 0x9802, /**< the symbol was not found */
    TAVO_DL_CLOSE_FAILED = 0x9803   /**< the shared object could not be closed */
};

#endif
