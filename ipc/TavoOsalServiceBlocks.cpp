// The service's shared-memory blocks.
#include <binder/MemoryHeapBase.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <memory>
#include <mutex>
#include <new>

#include "ipc/TavoOsalService.h"
#include "ipc/service_lock.h"
#include "log/module_log.h"
#include "tavo_osal/memory.h"

namespace tavo {

std::mutex& service_lock() {
    // Never destroyed: the binder threads are still there when static objects go. In memory that is always there.
    alignas(std::mutex) static unsigned char memory[sizeof(std::mutex)];
    static std::mutex& lock = *new (memory) std::mutex;
    return lock;
}

}  // namespace tavo

namespace android {
namespace {

constexpr char kTag[] = "MSGQUEUE_BINDER";
constexpr char kCountTag[] = "OSAL_SHM";
constexpr char kComparing[] = "Comparing input memory index with values available in memory list nodes.\n";

// Every live block of the process: keeps it whatever becomes of the service object. Released when the process exits.
class HeapTable {
public:
    void add(const sp<IMemoryHeap>& heap) { heaps_.emplace(heap->getBase(), heap); }
    // Hands out the first heap that was added at this address; null when there is none.
    sp<IMemoryHeap> remove(const void* base) {
        const auto heap = heaps_.lower_bound(base);
        if (heap == heaps_.end() || heap->first != base) return nullptr;
        sp<IMemoryHeap> removed = heap->second;
        heaps_.erase(heap);
        return removed;
    }
    size_t count() const { return heaps_.size(); }

private:
    // Heaps that could not be mapped have one address in common. They stay in the order of their coming.
    std::multimap<const void*, sp<IMemoryHeap>> heaps_;
};

HeapTable g_heaps;

void log_heap_count(const char* change) {
    TAVO_LOG(kCountTag, TAVO_LOG_INFO, "uiCnt%s = %lu pid = %lu \n", change,
             static_cast<unsigned long>(g_heaps.count()), static_cast<unsigned long>(getpid()));
}

// A new heap, entered in the table, in a holder of its own. Null when there is no memory for any of it; whether the
// heap could be mapped is not looked at.
std::unique_ptr<sp<IMemoryHeap>> make_heap(int size, const char* name) {
    try {
        const sp<IMemoryHeap> heap = new MemoryHeapBase(static_cast<size_t>(size), 0, name);
        auto holder = std::make_unique<sp<IMemoryHeap>>(heap);
        g_heaps.add(heap);
        return holder;
    } catch (const std::bad_alloc&) {
        return nullptr;
    }
}

// Takes a heap out of the table and says what it held.
sp<IMemoryHeap> forget_heap(const void* base) {
    uint32_t first_word = 0;
    if (base != MAP_FAILED) memcpy(&first_word, base, sizeof first_word);
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Memory value returned = %p.\n", base);
    TAVO_LOG(kTag, TAVO_LOG_INFO, "base=%p Data=0x%x\n", base, first_word);
    sp<IMemoryHeap> heap = g_heaps.remove(base);
    log_heap_count("--");
    return heap;
}

}  // namespace

int TavoOsalService::initBlockList(unsigned int uiMaximum) {
    m_pBlocks = static_cast<BlockList*>(tavo_osal_mem_malloc(sizeof(BlockList)));
    if (m_pBlocks != nullptr) {
        *m_pBlocks = {};
        m_pBlocks->uiMaximum = uiMaximum;
        // Without a head the record stays, and says that there is no list, until it is freed with the service.
        m_pBlocks->pHead = static_cast<TAVO_ListNode*>(tavo_osal_mem_malloc(sizeof(TAVO_ListNode)));
    }
    if (m_pBlocks == nullptr || m_pBlocks->pHead == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "ERROR in malloc::\n");
        return TAVO_NO_MEMORY;
    }
    tavo_osal_init_list_head(m_pBlocks->pHead);
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Shared memory list head node allocation done.\n");
    return TAVO_SUCCESS;
}

bool TavoOsalService::hasBlockList() const {
    if (m_pBlocks != nullptr && m_pBlocks->pHead != nullptr) return true;
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "ERROR::Memory list still not initialized. This is fatal.\n");
    return false;
}

TavoOsalService::KeyRecord* TavoOsalService::recordOf(TAVO_ListNode* pLink) {
    return reinterpret_cast<KeyRecord*>(reinterpret_cast<char*>(pLink) - offsetof(KeyRecord, stLink));
}

sp<IMemoryHeap>* TavoOsalService::holderOf(KeyRecord* pRecord) {
    return static_cast<sp<IMemoryHeap>*>(pRecord->pvObject);
}

TavoOsalService::KeyRecord* TavoOsalService::findBlock(int key, uint32_t uiMatchLevel) const {
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, kComparing);
    const auto found = m_blocksByKey.find(key);
    KeyRecord* match = found != m_blocksByKey.end() ? found->second : nullptr;
    // The log tells of every record on the way, so there is a way only while somebody reads it.
    if (tavo::log_enabled(TAVO_LOG_DEBUG)) logWayTo(match);
    if (match != nullptr) {
        TAVO_LOG(kTag, uiMatchLevel, "Match found at node %p.\n", static_cast<void*>(match));
    }
    return match;
}

void TavoOsalService::logWayTo(const KeyRecord* pRecord) const {
    for (TAVO_ListNode* link = m_pBlocks->pHead->next; link != m_pBlocks->pHead; link = link->next) {
        TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Trying with node %p.\n", static_cast<void*>(recordOf(link)));
        if (recordOf(link) == pRecord) return;
    }
}

sp<IMemoryHeap> TavoOsalService::get_shared_mem(int key, int size) {
    TAVO_LOG(kTag, TAVO_LOG_VERBOSE, "Param1: iKey = %d\n", key);
    TAVO_LOG(kTag, TAVO_LOG_VERBOSE, "Param2: iSize = %d\n", size);
    if (key == 0 || size < 1) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid input parameters\n");
        return nullptr;
    }
    const std::lock_guard<std::mutex> lock(tavo::service_lock());
    if (!hasBlockList()) return nullptr;
    if (KeyRecord* record = findBlock(key, TAVO_LOG_DEBUG)) {
        // The count goes up even when there turns out to be no heap. Callers' deletes rely on it.
        ++record->uiUseCount;
        if (record->pvObject != nullptr && *holderOf(record) != nullptr) {
            TAVO_LOG(kTag, TAVO_LOG_TRACE, "--Exiting\n");
            return *holderOf(record);
        }
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Unexpected error!!shared memory allocated is NULL !!\n");
        return nullptr;
    }
    return addBlock(key, size);
}

// False when there is no memory for it.
bool TavoOsalService::indexBlock(int key, KeyRecord* pRecord) {
    try {
        m_blocksByKey[key] = pRecord;
        return true;
    } catch (const std::bad_alloc&) {
        return false;
    }
}

sp<IMemoryHeap> TavoOsalService::addBlock(int key, int size) {
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Current num of shared memory blocks = %d\n", static_cast<int>(m_pBlocks->uiCount));
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Max num of shared memory blocks = %d\n", static_cast<int>(m_pBlocks->uiMaximum));
    if (m_pBlocks->uiCount == m_pBlocks->uiMaximum) {
        // Advisory: the block is made all the same.
        TAVO_LOG(kTag, TAVO_LOG_INFO, "Max number of memory blocks allocated already\n");
    }
    char name[64];
    snprintf(name, sizeof name, "SharedMemory_%d\n", key);  // the newline is part of the name, and kept
    auto* record = static_cast<KeyRecord*>(calloc(1, sizeof(KeyRecord)));
    auto holder = record != nullptr && indexBlock(key, record) ? make_heap(size, name) : nullptr;
    if (holder == nullptr) {
        m_blocksByKey.erase(key);
        free(record);
        return nullptr;
    }
    record->iKey = key;
    record->iSize = size;
    record->uiUseCount = 1;
    record->pvObject = holder.release();
    tavo_osal_add_to_queue(&record->stLink, m_pBlocks->pHead);
    ++m_pBlocks->uiCount;
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "New node added %p.\n", static_cast<void*>(record));
    log_heap_count("++");
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Shared Memory name = %s\n", name);
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Exiting\n");
    return *holderOf(record);
}

int TavoOsalService::delete_shared_mem(int key) {
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "++Entered\n");
    TAVO_LOG(kTag, TAVO_LOG_VERBOSE, "Param1: iKey = %d\n", key);
    // Blocks of negative keys can be made but not deleted. Callers depend on the asymmetry.
    if (key <= 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid input parameters\n");
        return TAVO_FAILURE;
    }
    sp<IMemoryHeap> heap, last;  // declared first: unmapped without the lock
    const std::lock_guard<std::mutex> lock(tavo::service_lock());
    if (!hasBlockList()) return -1;
    KeyRecord* record = findBlock(key, TAVO_LOG_INFO);
    if (record == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_INFO, "Matching node not found\n");
        return 0;
    }
    if (--record->uiUseCount > 0) {
        TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Memory is still using by some other process!!\n");
        return 0;
    }
    sp<IMemoryHeap>* holder = holderOf(record);
    if (holder == nullptr || *holder == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Unexpected error !! Failed to free shared memory\n");
        return -1;
    }
    heap = *holder;
    delete holder;
    last = forget_heap(heap->getBase());

    tavo_osal_list_delete(&record->stLink);
    m_blocksByKey.erase(key);
    free(record);
    --m_pBlocks->uiCount;
    return 0;
}

void TavoOsalService::freeBlocks(BlockList* pBlocks) {
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, kComparing);
    for (TAVO_ListNode* link = pBlocks->pHead->next; link != pBlocks->pHead;) {
        KeyRecord* record = recordOf(link);
        link = link->next;
        TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Trying with node %p.\n", static_cast<void*>(record));
        delete holderOf(record);
        tavo_osal_list_delete(&record->stLink);
        TAVO_LOG(kTag, TAVO_LOG_INFO, "Freeing node ptr=%p.\n", static_cast<void*>(record));
        free(record);
        --pBlocks->uiCount;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Freeing shared memory list head node ptr.\n");
    tavo_osal_mem_free(pBlocks->pHead);
}

}  // namespace android
