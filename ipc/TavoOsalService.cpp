// The queues, and the service's life. Its blocks are in TavoOsalServiceBlocks.cpp.
#include "ipc/TavoOsalService.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <new>
#include <utility>

#include "ipc/TAVO_MessageQueue.h"
#include "ipc/service_lock.h"
#include "log/module_log.h"
#include "tavo_osal/memory.h"

namespace android {
namespace {

constexpr char kTag[] = "MSGQUEUE_BINDER";
constexpr char kKeyIndexFile[] = TAVO_STORAGE_ROOT "/shm_key_index_file.txt";

// Sets the file back to one 32-bit 1. False when it could not be opened. items_left is what a read behind that
// number finds, which is nothing.
bool reset_key_index_file(int& items_left) {
    FILE* file = fopen(kKeyIndexFile, "w+e");
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Opening file in write mode, fp = %p.\n", static_cast<void*>(file));
    if (file == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Opening file in read write mode failed with errno =%d\n", errno);
        return false;
    }
    int32_t index = 0;
    items_left = static_cast<int>(fread(&index, sizeof index, 1, file));
    TAVO_LOG(kTag, TAVO_LOG_INFO, "After reading, iRet = %d, index = %d.\n", items_left, index);
    if (items_left == 0) {
        index = 1;
        fseek(file, 0, SEEK_SET);  // between a read and a write, as C wants it
        fwrite(&index, sizeof index, 1, file);
    }
    fseek(file, 0, SEEK_CUR);
    items_left = static_cast<int>(fread(&index, sizeof index, 1, file));
    fseek(file, 0, SEEK_SET);
    TAVO_LOG(kTag, TAVO_LOG_INFO, "After reading, iRet = %d, index = %d.\n", items_left, index);
    fclose(file);
    return true;
}

}  // namespace

TavoOsalService::TavoOsalService() = default;
TavoOsalService::~TavoOsalService() { TavoOsalServiceDeInit(); }

int TavoOsalService::TavoOsalServiceInit(unsigned int uiMaxNumMsgQueues, unsigned int uiMaxNumSharedMemBlocks) {
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "++Entered\n");
    TAVO_LOG(kTag, TAVO_LOG_VERBOSE, "Param1: uiMaxNumMsgQueues = %d\n", static_cast<int>(uiMaxNumMsgQueues));
    TAVO_LOG(kTag, TAVO_LOG_VERBOSE, "Param2: uiMaxNumSharedMemBlocks = %d\n",
             static_cast<int>(uiMaxNumSharedMemBlocks));
    if (uiMaxNumMsgQueues == 0 || uiMaxNumSharedMemBlocks == 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid input parameters.\n");
        TAVO_LOG(kTag, TAVO_LOG_TRACE, "--Exiting\n");
        return TAVO_FAILURE;
    }
    if (m_pBlocks != nullptr || m_ppQueues != nullptr) TavoOsalServiceDeInit();

    const std::lock_guard<std::mutex> lock(tavo::service_lock());
    const int status = initBlockList(uiMaxNumSharedMemBlocks);
    if (status != TAVO_SUCCESS) {
        TAVO_LOG(kTag, TAVO_LOG_TRACE, "--Exiting\n");
        return status;
    }
    int items_left = 0;
    if (!reset_key_index_file(items_left)) {
        // Without the file there is no queue table, and the caller is not told. Callers depend on the 0.
        TAVO_LOG(kTag, TAVO_LOG_TRACE, "--Exiting\n");
        return TAVO_SUCCESS;
    }
    // Deliberately as much as whole records would take, although an entry is one pointer.
    size_t bytes = 0;
    if (!__builtin_mul_overflow(size_t{uiMaxNumMsgQueues}, sizeof(KeyRecord), &bytes)) {
        m_ppQueues = static_cast<KeyRecord**>(malloc(bytes));
    }
    if (m_ppQueues == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Memory allocation failed !!!\n");
        return -1;
    }
    m_uiQueueRoom = uiMaxNumMsgQueues;
    m_uiQueueCount = 0;
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Service class created\n");
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "--Exiting\n");
    return items_left;
}

int TavoOsalService::TavoOsalServiceDeInit() {
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "++Entered\n");
    std::unique_lock<std::mutex> lock(tavo::service_lock());
    BlockList* blocks = std::exchange(m_pBlocks, nullptr);
    KeyRecord** queues = std::exchange(m_ppQueues, nullptr);
    const uint32_t queue_count = std::exchange(m_uiQueueCount, 0U);
    m_uiQueueRoom = 0;
    m_queuesByKey = {};
    m_queueOrders = {};
    m_blocksByKey = {};
    lock.unlock();

    if (blocks != nullptr && blocks->pHead != nullptr) freeBlocks(blocks);
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Freeing shared memory list info ptr.\n");
    tavo_osal_mem_free(blocks);

    for (uint32_t i = 0; i < queue_count; ++i) {
        delete static_cast<TAVO_MessageQueue*>(queues[i]->pvObject);
        free(queues[i]);
    }
    free(queues);
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "--Exiting\n");
    return 0;
}

int TavoOsalService::create_message_queue(int key) {
    if (key == 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid key!!\n");
        return -1;
    }
    const std::lock_guard<std::mutex> lock(tavo::service_lock());
    if (m_ppQueues == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "NO LIST\n");
        return -1;
    }
    const Queue* queue = findQueue(key);
    if (queue == nullptr) return addQueue(key);
    ++queue->pRecord->uiUseCount;
    return static_cast<int>(placeOf(*queue));
}

// A queue that cannot be made, for want of descriptors or memory, leaves the table as it was.
int TavoOsalService::addQueue(int key) {
    if (m_uiQueueCount == m_uiQueueRoom) {
        // NOLINTNEXTLINE(bugprone-sizeof-expression): an entry is a pointer
        auto** grown = static_cast<KeyRecord**>(realloc(m_ppQueues, size_t{m_uiQueueRoom} * 2 * sizeof(KeyRecord*)));
        if (grown == nullptr) return -1;
        m_ppQueues = grown;
        m_uiQueueRoom *= 2;
    }
    auto queue = std::unique_ptr<TAVO_MessageQueue>(new (std::nothrow) TAVO_MessageQueue);
    if (queue == nullptr) return -1;
    if (!queue->has_pipe()) {
        queue->disown_descriptors();
        return -1;
    }
    // Not with the last descriptor: those who want to give a queue back must be let in first.
    const int spare = fcntl(queue->iReadFd, F_DUPFD_CLOEXEC, 0);
    if (spare < 0) return -1;
    close(spare);
    auto* record = static_cast<KeyRecord*>(calloc(1, sizeof(KeyRecord)));
    if (record == nullptr) return -1;
    if (!indexQueue(key, record)) {
        free(record);
        return -1;
    }
    record->iKey = key;
    record->uiUseCount = 1;
    record->pvObject = queue.release();
    m_ppQueues[m_uiQueueCount] = record;
    return static_cast<int>(m_uiQueueCount++);
}

int TavoOsalService::delete_message_queue(int key) {
    if (key == 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid key!!\n");
        return -1;
    }
    std::unique_ptr<TAVO_MessageQueue> deleted;  // declared first: closes its pipe without the lock
    const std::lock_guard<std::mutex> lock(tavo::service_lock());
    const Queue* queue = findQueue(key);
    if (queue == nullptr) return -1;
    KeyRecord* record = queue->pRecord;
    if (--record->uiUseCount > 0) return 0;
    deleted.reset(static_cast<TAVO_MessageQueue*>(record->pvObject));
    const uint32_t place = placeOf(*queue);
    std::copy(m_ppQueues + place + 1, m_ppQueues + m_uiQueueCount, m_ppQueues + place);
    m_ppQueues[--m_uiQueueCount] = nullptr;
    m_queueOrders.erase(m_queueOrders.begin() + place);
    m_queuesByKey.erase(key);
    free(record);
    return 0;
}

int TavoOsalService::get_fd(int key) {
    // Unlike get_write_fd, this says nothing of an invalid key. Callers poll with it.
    if (key == 0) return -1;
    const std::lock_guard<std::mutex> lock(tavo::service_lock());
    TAVO_MessageQueue* queue = queueOf(key);
    return queue != nullptr ? queue->tavo_android_msg_queue_get_fd() : -1;
}

int TavoOsalService::get_write_fd(int key) {
    if (key == 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid key!!\n");
        return -1;
    }
    const std::lock_guard<std::mutex> lock(tavo::service_lock());
    TAVO_MessageQueue* queue = queueOf(key);
    return queue != nullptr ? queue->tavo_android_msg_queue_get_write_fd() : -1;
}

TAVO_MessageQueue* TavoOsalService::queueOf(int key) const {
    const Queue* queue = findQueue(key);
    return queue != nullptr ? static_cast<TAVO_MessageQueue*>(queue->pRecord->pvObject) : nullptr;
}

const TavoOsalService::Queue* TavoOsalService::findQueue(int key) const {
    const auto found = m_queuesByKey.find(key);
    return found != m_queuesByKey.end() ? &found->second : nullptr;
}

// Enters a queue that is about to become the table's last. False, and nothing has changed, when there is no memory.
bool TavoOsalService::indexQueue(int key, KeyRecord* pRecord) {
    try {
        if (m_queueOrders.size() == m_queueOrders.capacity()) m_queueOrders.reserve(m_queueOrders.size() * 2 + 1);
        m_queuesByKey.emplace(key, Queue{pRecord, m_uiLastOrder + 1});
    } catch (const std::bad_alloc&) {
        return false;
    }
    m_queueOrders.push_back(++m_uiLastOrder);
    return true;
}

// The queue's place in the packed table, which moves when an earlier one goes.
uint32_t TavoOsalService::placeOf(const Queue& queue) const {
    const auto place = std::lower_bound(m_queueOrders.begin(), m_queueOrders.end(), queue.uiOrder);
    return static_cast<uint32_t>(place - m_queueOrders.begin());
}

}  // namespace android
