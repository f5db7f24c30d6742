#include "tavo_osal/mutex.h"

#include <pthread.h>

#include <cerrno>
#include <cstdlib>

#include "log/cancel_shield.h"
#include "log/module_log.h"
#include "tavo_osal/memory.h"
#include "thread/platform_call.h"

struct TAVO_Mutex {
    pthread_mutex_t platform;
};

namespace {

using tavo::CancelShield;
using tavo::checked;
using tavo::refused;

constexpr char kTag[] = "OSAL_THREAD";
constexpr char kInvalid[] = "Invalid Mutex\n";

}  // namespace

TAVO_Status tavo_osal_mutex_create(TAVO_Mutex** ppMutex) {
    if (ppMutex == nullptr) return refused(kTag, kInvalid);
    const CancelShield shield;
    *ppMutex = nullptr;
    auto* mutex = static_cast<TAVO_Mutex*>(tavo_osal_mem_malloc(sizeof(TAVO_Mutex)));
    if (mutex == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Mutex allocation failed.\n");
        return TAVO_NO_MEMORY;
    }
    const TAVO_Status status =
        checked(kTag, pthread_mutex_init(&mutex->platform, nullptr), "Mutex creation failed. Error = %d\n");
    if (status != TAVO_SUCCESS) {
        free(mutex);  // The C library's, not the library's own: programs that count the latter depend on it.
        return status;
    }
    *ppMutex = mutex;
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Mutex allocation success.\n");
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_mutex_lock(TAVO_Mutex* pMutex) {
    if (pMutex == nullptr) return refused(kTag, kInvalid);
    return checked(kTag, pthread_mutex_lock(&pMutex->platform), "Mutex lock failed. Error=%d\n");
}

TAVO_Status tavo_osal_mutex_unlock(TAVO_Mutex* pMutex) {
    if (pMutex == nullptr) return refused(kTag, kInvalid);
    return checked(kTag, pthread_mutex_unlock(&pMutex->platform), "Mutex unlock failed. Error=%d\n");
}

TAVO_Status tavo_osal_mutex_try_lock(TAVO_Mutex* pMutex) {
    if (pMutex == nullptr) return refused(kTag, kInvalid);
    const int error = pthread_mutex_trylock(&pMutex->platform);
    if (error == EBUSY) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Mutex already locked! Error=%d\n", error);
        return TAVO_BUSY;
    }
    return checked(kTag, error, "Mutex lock failed. Error=%d\n");
}

// Unlike the destruction of a condition variable, this accepts a null handle, releases the memory even when the
// platform refuses, and leaves the handle variable as it was. Callers depend on each of the three.
TAVO_Status tavo_osal_mutex_destroy(TAVO_Mutex** ppMutex) {
    if (ppMutex == nullptr) return refused(kTag, kInvalid);
    TAVO_Mutex* mutex = *ppMutex;
    if (mutex == nullptr) return TAVO_SUCCESS;
    const CancelShield shield;
    const TAVO_Status status =
        checked(kTag, pthread_mutex_destroy(&mutex->platform), "Mutex destroy failed. Error=%d\n");
    tavo_osal_mem_free(mutex);
    return status;
}
