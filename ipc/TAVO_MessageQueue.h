// One message queue on one pipe: whole messages of variable length between threads and processes.
#pragma once

#include <stdint.h>

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

namespace android {

/**
 * A message queue carried by one anonymous pipe.
 *
 * Constructing makes a fresh pipe. A process that received a queue's descriptors from elsewhere constructs an
 * object and gives it those with tavo_android_msg_queue_set_fd() and tavo_android_msg_queue_set_write_fd(), which
 * close the fresh pipe's ends. The object owns its descriptors. Those it makes are close-on-exec and never 0.
 *
 * On the pipe a message is a frame: its length as an unsigned 32-bit number in the host's byte order, then that many
 * bytes. A pipe is made larger, within what the platform grants, when a message larger than a memory page is put.
 *
 * An absent descriptor is told by three different conventions. Callers depend on each of them:
 * - reading, waiting and putting take 0 as absent (a queue whose pipe could not be made has 0 in both fields);
 * - the two setters close the descriptor they replace unless it is -1, so also descriptor 0;
 * - the destructor closes every descriptor that is 0 or more, so also descriptor 0.
 *
 * Thread safety: no locks. Several writers, in one process or many, may put messages of up to 4092 bytes, which go out
 * in one atomic write; longer messages of two writers could mix, so they take a single writer. There is one
 * reader. Putting while no process holds a read end raises SIGPIPE, like any write to such a pipe.
 *
 * The log tag is "MSGQUEUE". errno is what the failed platform call left when a method has failed by one.
 */
class TAVO_API TAVO_MessageQueue {
public:
    enum : unsigned int {
        MAX_MESSAGE_SIZE = 0x64000,     ///< bytes of the longest message
        READ_END_NOT_INITIALIZED = 237  ///< is_empty's third answer: the low 8 bits of -19. Callers depend on it
    };

    /** Makes the pipe. When that fails, both descriptors are 0: see has_pipe(). */
    TAVO_MessageQueue();
    /** Closes both descriptors that are 0 or more. */
    ~TAVO_MessageQueue();
    TAVO_MessageQueue(const TAVO_MessageQueue&) = delete;
    TAVO_MessageQueue& operator=(const TAVO_MessageQueue&) = delete;

    /**
     * Sends one message. Blocks while the pipe is full, unless the write end is non-blocking. A frame that is partly
     * in the pipe is finished in spite of interruptions; a non-blocking write end waits up to one second for each
     * part, then fails with EAGAIN and leaves the part in the pipe.
     *
     * @param pbMsg  the message; read only
     * @param uiSize its bytes, 0 to #MAX_MESSAGE_SIZE
     * @return 0; #TAVO_INVALID_PARAM: pbMsg is null; #TAVO_MQ_NOT_AVAILABLE: the write end is 0;
     *         #TAVO_MQ_MSG_TOO_LARGE; #TAVO_NO_MEMORY: no buffer for the frame; -1: a write failed, see errno (its
     *         frame buffer is then lost: this path is known to leak, and is kept)
     */
    int32_t tavo_android_msg_queue_put(unsigned char* pbMsg, unsigned int uiSize);

    /**
     * Receives one message. Blocks until one comes, unless the read end is non-blocking.
     *
     * When a message comes in parts the rest is waited for, up to one second for each part; what is there
     * when no more comes in time, or the last writer has gone, is the result.
     *
     * @param pbMsg   receives the message. It must hold the longest message that can be in the queue, and at least 4
     *                bytes; more than #MAX_MESSAGE_SIZE bytes are never stored, whatever length the pipe announces
     * @param puiSize its value on entry is only logged, never used as a limit; receives the bytes stored
     * @return the bytes stored, 0 also at the end of the file; -1: a null argument, a read end of 0, or a failed
     *         read, see errno
     */
    int32_t tavo_android_msg_queue_get(unsigned char* pbMsg, unsigned int* puiSize);

    /** @return 1: nothing is pending; 0: something is, or the poll failed; #READ_END_NOT_INITIALIZED: the read end
     *          is 0. Sets #bMsg unless the poll failed */
    uint8_t tavo_android_msg_queue_is_empty();

    /** Receives and drops the pending messages. Stops at the first failure. */
    void tavo_android_msg_queue_clear();

    /**
     * Waits until one or more of up to three queues have something pending, and sets #bMsg of those. No queue is
     * preferred, and the flags of the others stay as they were.
     *
     * May be called on any object: it works on its arguments only. q3 without q2 is not waited for; callers depend
     * on the fixed slots.
     *
     * @param iTimeout milliseconds; negative waits without limit, 0 only looks
     * @return the number of queues with something pending; 0: the time has passed; -22: q1 is null; -19: the read end
     *         of a queue is 0; otherwise poll's negative result, see errno
     */
    int32_t tavo_android_msg_queue_wait_for_msg(TAVO_MessageQueue* q1, TAVO_MessageQueue* q2, TAVO_MessageQueue* q3,
                                                int iTimeout);

    /**
     * Counts what is pending, in bytes in spite of its name: lengths and messages together.
     * @param piCount receives the count on success
     * @return 0; #TAVO_INVALID_PARAM: piCount is null; #TAVO_FAILURE: the read end could not be asked, see errno
     */
    TAVO_Status tavo_android_get_num_of_messages(int* piCount);

    /** Takes ownership of a read end; closes the one before unless it was -1. */
    void tavo_android_msg_queue_set_fd(int iFd);
    /** Takes ownership of a write end; closes the one before unless it was -1. */
    void tavo_android_msg_queue_set_write_fd(int iFd);
    /** @return the read end, still owned by the queue */
    int tavo_android_msg_queue_get_fd();
    /** @return the write end, still owned by the queue */
    int tavo_android_msg_queue_get_write_fd();

    /** Stores #uiId. @return 0 */
    int32_t tavo_android_msg_queue_set_id(unsigned int uiId);
    /** Copies at most 64 bytes; a longer name, or one of 64, is kept without a terminator.
     *  @return 0; #TAVO_INVALID_PARAM: pcName is null */
    int32_t tavo_android_msg_queue_set_service_name(unsigned char* pcName);
    /** @return #acServiceName, 64 bytes that need not hold a terminator */
    char* tavo_android_msg_queue_get_service_name();
    /** Stores #bMsg. */
    void tavo_android_msg_queue_set_msg(unsigned char bMsg);

    /** False right after construction when the pipe could not be made. */
    bool has_pipe() const { return iReadFd != 0 || iWriteFd != 0; }

    /** Gives both descriptors up without closing them. The owner of a queue whose pipe could not be made calls this
     *  before deleting it: the destructor would otherwise close descriptor 0, which is not the queue's. */
    void disown_descriptors() { iReadFd = iWriteFd = -1; }

    /** @name The queue's record
     *  Its layout is part of the binary interface: whoever waits on several queues reads #bMsg of each.
     *  @{ */
    int32_t iReadFd;         ///< read end of the pipe
    int32_t iWriteFd;        ///< write end of the pipe
    uint8_t bMsg;            ///< 1 when the last look saw something pending, else 0
    uint8_t uiRoomFor;       ///< put's own: room was made for frames of up to 2 to this power; 0 for none
    uint32_t uiId;           ///< the owner's number for the queue; only stored
    char acServiceName[64];  ///< the queue's name, for messages; zeroed at first
    /** @} */
};

}  // namespace android
