#include "tavo_osal/condition.h"

#include <pthread.h>
#include <sys/time.h>

#include <cerrno>

#include "log/cancel_shield.h"
#include "log/module_log.h"
#include "tavo_osal/memory.h"
#include "thread/cancellation.h"
#include "thread/platform_call.h"
#include "thread/seconds.h"

struct TAVO_Condition {
    pthread_cond_t platform;
};

namespace {

using tavo::CancelShield;
using tavo::checked;
using tavo::refused;

constexpr char kTag[] = "OSAL_THREAD";

// The mutex's handle is the address of the platform's object.
pthread_mutex_t* platform(TAVO_Mutex* mutex) { return reinterpret_cast<pthread_mutex_t*>(mutex); }

// The platform's wait. What a cancelled thread leaves locked is the caller's affair, as everywhere else.
int wait(TAVO_Condition& condition, TAVO_Mutex& mutex, const timespec* deadline) {
    const CancelShield shield;
    return tavo::wait_cancellably(
        [&] {
            return deadline == nullptr ? pthread_cond_wait(&condition.platform, platform(&mutex))
                                       : pthread_cond_timedwait(&condition.platform, platform(&mutex), deadline);
        },
        [] {});
}

// No carry from the nanoseconds into the seconds: callers depend on the failure of the waits this rules out.
timespec deadline_after(const timeval& now, uint64_t timeout_ms) {
    timespec deadline = {};
    deadline.tv_sec = tavo::seconds_after(now.tv_sec, timeout_ms / 1000);
    deadline.tv_nsec = static_cast<long>(now.tv_usec * 1000) + static_cast<long>(timeout_ms % 1000) * 1000000L;
    return deadline;
}

}  // namespace

TAVO_Status tavo_osal_thread_condition_create(TAVO_Condition** ppCondition) {
    if (ppCondition == nullptr) return refused(kTag, "Invalid condition variable pointer\n");
    const CancelShield shield;
    *ppCondition = static_cast<TAVO_Condition*>(tavo_osal_mem_malloc(sizeof(TAVO_Condition)));
    if (*ppCondition == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Memory allocation for condition variable failed\n");
        return TAVO_NO_MEMORY;
    }
    // A failure leaves the block in the caller's handle: callers release it from there.
    return checked(kTag, pthread_cond_init(&(*ppCondition)->platform, nullptr),
                   "Condition variable initialization failed: error=%d\n");
}

TAVO_Status tavo_osal_thread_condition_wait(TAVO_Condition* pCondition, TAVO_Mutex* pMutex) {
    if (pCondition == nullptr || pMutex == nullptr) {
        return refused(kTag, "Invalid mutex or condition variable \n");
    }
    return checked(kTag, wait(*pCondition, *pMutex, nullptr), "Wait on condition variable failed: Error=%d\n");
}

TAVO_Status tavo_osal_thread_condition_timedwait(TAVO_Condition* pCondition, TAVO_Mutex* pMutex, uint64_t uiTimeoutMs) {
    if (pCondition == nullptr || pMutex == nullptr) {
        return refused(kTag, "Invalid mutex or condition variable pointer \n");
    }
    timeval now = {};
    if (gettimeofday(&now, nullptr) != 0) return checked(kTag, errno, "Failed to get time of day.\n");
    const timespec deadline = deadline_after(now, uiTimeoutMs);
    const int error = wait(*pCondition, *pMutex, &deadline);
    if (error == ETIMEDOUT) return TAVO_CONDITION_TIMEOUT;
    return checked(kTag, error, "Wait on condition variable failed: errno=%d\n");
}

TAVO_Status tavo_osal_thread_condition_signal(TAVO_Condition* pCondition) {
    if (pCondition == nullptr) return refused(kTag, "Invalid condition variable \n");
    return checked(kTag, pthread_cond_signal(&pCondition->platform),
                   "Failed to unblock the thread waiting on condition variable. Error=%d\n");
}

TAVO_Status tavo_osal_thread_condition_broadcast(TAVO_Condition* pCondition) {
    if (pCondition == nullptr) return refused(kTag, "Invalid condition variable \n");
    return checked(kTag, pthread_cond_broadcast(&pCondition->platform),
                   "Failed to unblock all threads waiting on condition variable. Error=%d\n");
}

// Unlike the destruction of a mutex, this rejects a null handle, keeps the memory when the platform refuses, and
// clears the handle variable on success. Callers depend on each of the three.
TAVO_Status tavo_osal_thread_condition_destroy(TAVO_Condition** ppCondition) {
    if (ppCondition == nullptr || *ppCondition == nullptr) return refused(kTag, "Invalid condition variable \n");
    const CancelShield shield;
    const TAVO_Status status = checked(kTag, pthread_cond_destroy(&(*ppCondition)->platform),
                                       "Failed to destroy the condition variable: RetVal=%d\n");
    if (status != TAVO_SUCCESS) return status;
    tavo_osal_mem_free(*ppCondition);
    *ppCondition = nullptr;
    return TAVO_SUCCESS;
}
