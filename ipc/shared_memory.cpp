#include "tavo_osal/shared_memory.h"

#include <binder/IMemory.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <mutex>
#include <new>
#include <utility>

#include "ipc/service_lookup.h"
#include "log/module_log.h"

namespace {

constexpr char kTag[] = "TAVO_OSAL_SHARED_MEM";
constexpr char kCountTag[] = "OSAL_SHM";

using Heap = android::sp<android::IMemoryHeap>;

// Every acquisition of the process, in the order of acquiring, without holes. Released when the library is unloaded.
// Never locked while the service or the platform is called.
class AcquiredHeaps {
public:
    // Sets a place aside for an acquisition that is about to be made; false when none is left.
    bool reserve() {
        const std::lock_guard<std::mutex> lock(lock_);
        if (count_ + reserved_ == entries_.size()) return false;
        ++reserved_;
        return true;
    }
    void cancel_reservation() {
        const std::lock_guard<std::mutex> lock(lock_);
        --reserved_;
    }
    // Fills a place that was reserved. The count afterwards.
    unsigned long add(const Heap& heap, void* base) {
        const std::lock_guard<std::mutex> lock(lock_);
        --reserved_;
        entries_[count_] = {heap, base};
        return ++count_;
    }
    // Takes the first acquisition of this address out, if there is one; the count afterwards. The heap is handed out
    // for the caller to drop, which may unmap it.
    unsigned long remove(void* base, Heap& heap) {
        const std::lock_guard<std::mutex> lock(lock_);
        const auto end = entries_.begin() + count_;
        const auto found =
            std::find_if(entries_.begin(), end, [base](const Entry& entry) { return entry.base == base; });
        if (found == end) return count_;
        heap = std::exchange(found->heap, nullptr);
        std::move(found + 1, end, found);
        entries_[--count_] = {};
        return count_;
    }

private:
    struct Entry {
        Heap heap;
        void* base;
    };

    std::mutex lock_;
    std::array<Entry, TAVO_SHM_MAX_ACQUIRED> entries_ = {};
    unsigned count_ = 0;
    unsigned reserved_ = 0;
};

AcquiredHeaps g_heaps;

// A place in the table that is given back unless it gets filled.
class Reservation {
public:
    Reservation() : held_(g_heaps.reserve()) {}
    ~Reservation() {
        if (held_) g_heaps.cancel_reservation();
    }
    Reservation(const Reservation&) = delete;
    Reservation& operator=(const Reservation&) = delete;

    bool held() const { return held_; }
    unsigned long fill(const Heap& heap, void* base) {
        held_ = false;
        return g_heaps.add(heap, base);
    }

private:
    bool held_;
};

void log_count(const char* format, unsigned long count, int line = __builtin_LINE()) {
    TAVO_LOG_AT(line, kCountTag, TAVO_LOG_INFO, format, count, static_cast<unsigned long>(getpid()));
}

android::sp<android::ITavoBinder> find_service() {
    const android::sp<android::ITavoBinder> service = tavo::find_service(tavo::kSharedMemoryLookup);
    if (service == nullptr) TAVO_LOG(kTag, TAVO_LOG_INFO, "The TavoOsalServer is not published\n");
    return service;
}

// Keys and sizes above the largest signed number arrive at the service as negative ones.
int as_signed(uint32_t value) { return static_cast<int>(value); }

// Where a heap is mapped here; null when it cannot be, for want of memory or otherwise.
void* base_of(const android::IMemoryHeap& heap) {
    try {
        void* base = heap.getBase();
        return base != MAP_FAILED ? base : nullptr;
    } catch (const std::bad_alloc&) {
        return nullptr;
    }
}

// The service's block for a handle, with its address here; null when there is none.
Heap get_mapped(android::ITavoBinder& service, const TavoShmHandle& handle, void*& base) {
    Heap heap = service.get_shared_mem(as_signed(handle.uiKey), as_signed(handle.uiSize));
    if (heap == nullptr) return nullptr;
    base = base_of(*heap);
    if (base != nullptr) return heap;
    // The service has counted a use that nobody is going to delete.
    service.delete_shared_mem(as_signed(handle.uiKey));
    return nullptr;
}

}  // namespace

TAVO_Status tavo_shm_init(uint32_t uiKey, TavoShmHandle** ppHandle, uint32_t uiSize) {
    TAVO_TRACE_SCOPE_AS(kTag, "++Entered\n", "--Exiting \n");
    if (ppHandle == nullptr || uiSize == 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid paramters \n");
        return TAVO_INVALID_PARAM;
    }
    *ppHandle = static_cast<TavoShmHandle*>(malloc(sizeof(TavoShmHandle)));
    if (*ppHandle == nullptr) return TAVO_NO_MEMORY;
    **ppHandle = {uiKey, uiSize};
    return TAVO_SUCCESS;
}

TAVO_Status tavo_shm_acquire(TavoShmHandle* pHandle, void** ppvAddr) {
    TAVO_TRACE_SCOPE_AS(kTag, "++Entered\n", "--Exiting \n");
    if (pHandle == nullptr || ppvAddr == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid parameter \n");
        return TAVO_INVALID_PARAM;
    }
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "calling get shared memory \n");
    const android::sp<android::ITavoBinder> service = find_service();
    if (service == nullptr) return TAVO_FAILURE;
    Reservation place;
    if (!place.held()) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "All %d acquisitions of this process are in use\n", TAVO_SHM_MAX_ACQUIRED);
        return TAVO_NO_MEMORY;
    }
    void* base = nullptr;
    const Heap heap = get_mapped(*service, *pHandle, base);
    if (heap == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "No shared memory for key %u, size %u\n", pHandle->uiKey, pHandle->uiSize);
        return TAVO_FAILURE;
    }
    log_count("uiCnt++ = %lu pid = %lu \n", place.fill(heap, base));
    *ppvAddr = base;
    return TAVO_SUCCESS;
}

TAVO_Status tavo_shm_release(void* pvAddr) {
    TAVO_TRACE_SCOPE_AS(kTag, "++Entered\n", "--Exiting \n");
    if (pvAddr == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid parameters \n");
        return TAVO_INVALID_PARAM;
    }
    // An address that was never acquired is no failure; callers release twice.
    Heap released;
    const unsigned long count = g_heaps.remove(pvAddr, released);
    released = nullptr;
    log_count("uiCnt-- = %lu pid = %lu \n", count);
    return TAVO_SUCCESS;
}

TAVO_Status tavo_shm_release_by_size(uint32_t, void* pvAddr) {
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "++Entered\n");
    return tavo_shm_release(pvAddr);
}

TAVO_Status tavo_shm_delete(TavoShmHandle* pHandle) {
    TAVO_TRACE_SCOPE_AS(kTag, "++Entered\n", "--Exiting \n");
    if (pHandle == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid parameters \n");
        return TAVO_INVALID_PARAM;
    }
    const android::sp<android::ITavoBinder> service = find_service();
    if (service == nullptr) return TAVO_FAILURE;
    const TAVO_Status status = service->delete_shared_mem(as_signed(pHandle->uiKey));
    free(pHandle);
    return status;
}
