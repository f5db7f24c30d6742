// The one object behind the binder interface: who owns message queues and shared-memory blocks by key.
#pragma once

#include <binder/IMemory.h>

#include <cstdint>

#include "ipc/ITavoBinder.h"
#include "tavo_osal/export.h"
#include "tavo_osal/list.h"
#include "tavo_osal/status.h"

namespace tavo {
struct ServiceFigures;
}  // namespace tavo

namespace android {

class TAVO_MessageQueue;

/**
 * Keys are agreed on by the clients; the service never makes one up. Both tables count users per key, and an
 * object goes with its last user. Blocks are also kept by a table of the whole process until they are deleted.
 *
 * The operations may run on several threads: one lock of the process, shared by all service objects because the
 * table of heaps is, serialises them. It is not held while queues and heaps are taken down.
 */
class TAVO_API TavoOsalService : public BnTavoBinder {
public:
    TavoOsalService();
    ~TavoOsalService() override;

    /**
     * Builds both tables and sets the key index file back to 1. Called once, before the object is published; a second
     * call frees the tables of the first.
     * @param uiMaxNumMsgQueues        room in the queue table to begin with; it grows. Not 0
     * @param uiMaxNumSharedMemBlocks  advisory: reaching it is only logged. Not 0
     * @return 0, also when the index file cannot be opened: there is no queue table then, and every
     *         create_message_queue() fails; TAVO_FAILURE: an argument is 0; TAVO_NO_MEMORY; -1: no memory for the
     *         queue table
     */
    int TavoOsalServiceInit(unsigned int uiMaxNumMsgQueues, unsigned int uiMaxNumSharedMemBlocks);

    /** Frees both tables. Heaps stay with the process's own table until it exits. @return 0 */
    int TavoOsalServiceDeInit();

    /** @return the pipe's read end, still the queue's, or -1 */
    int get_fd(int key) override;
    /** @return the pipe's write end, still the queue's, or -1 */
    int get_write_fd(int key) override;
    int create_message_queue(int key) override;
    int delete_message_queue(int key) override;
    sp<IMemoryHeap> get_shared_mem(int key, int size) override;
    int delete_shared_mem(int key) override;

    /**
     * Writes the figures of both tables, as the platform's dump call asks for them: a text for people, or, with an
     * argument "--json", one line of JSON. Holds up neither the other operations nor, for more than two seconds, its
     * own thread when nobody reads.
     * @param fd   where to write; stays the caller's
     * @param args "--json", or "-h" for help; others are ignored
     * @return 0; TIMED_OUT: nobody read; WOULD_BLOCK: too many others are being written; NO_MEMORY; or the negative
     *         errno of a failed write
     */
    status_t dump(int fd, const Vector<String16>& args) override;

private:
    // One layout for both tables.
    struct KeyRecord {
        int32_t iKey;
        int32_t iSize;         // bytes of a block, 0 for a queue
        uint32_t uiUseCount;   // creates and gets that no delete has answered yet
        void* pvObject;        // a queue's TAVO_MessageQueue, a block's sp<IMemoryHeap>, both owned
        TAVO_ListNode stLink;  // of a block
    };
    struct BlockList {
        TAVO_ListNode* pHead;  // null while there is no list
        uint32_t uiCount;
        uint32_t uiMaximum;  // only said in the log
    };

    TAVO_LOCAL int initBlockList(unsigned int uiMaximum);
    TAVO_LOCAL TAVO_MessageQueue* queueOf(int key) const;
    TAVO_LOCAL int findQueue(int key) const;
    TAVO_LOCAL int addQueue(int key);
    TAVO_LOCAL KeyRecord* findBlock(int key, uint32_t uiMatchLevel) const;
    TAVO_LOCAL sp<IMemoryHeap> addBlock(int key, int size);
    TAVO_LOCAL bool hasBlockList() const;
    TAVO_LOCAL static void freeBlocks(BlockList* pBlocks);
    TAVO_LOCAL static KeyRecord* recordOf(TAVO_ListNode* pLink);
    TAVO_LOCAL static sp<IMemoryHeap>* holderOf(KeyRecord* pRecord);
    TAVO_LOCAL tavo::ServiceFigures collectFigures() const;
    TAVO_LOCAL tavo::ServiceFigures snapshot() const;
    TAVO_LOCAL int duplicateReadEnd(int key) const;

    KeyRecord** m_ppQueues = nullptr;  // null while there is no table; its used entries have no holes
    uint32_t m_uiQueueCount = 0;
    BlockList* m_pBlocks = nullptr;
    uint32_t m_uiQueueRoom = 0;
};

}  // namespace android
