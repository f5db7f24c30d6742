#include "tavo_osal/semaphore.h"

#include <cerrno>
#include <ctime>

#include "log/module_log.h"
#include "thread/platform_call.h"
#include "thread/seconds.h"

namespace {

using tavo::checked_errno;
using tavo::refused;

constexpr char kTag[] = "TAVO_OSAL";
constexpr char kInvalid[] = "Invalid argument passed \n";

// Traces the way into a function and every way out of it.
class Trace {
public:
    Trace() { TAVO_LOG(kTag, TAVO_LOG_TRACE, "++Entered \n"); }
    ~Trace() { TAVO_LOG(kTag, TAVO_LOG_TRACE, "--Exiting \n"); }
    Trace(const Trace&) = delete;
    Trace& operator=(const Trace&) = delete;
};

}  // namespace

TAVO_Status tavo_osal_semaphore_create(sem_t* pSemaphore, int iShared, uint32_t uiValue) {
    return checked_errno(kTag, sem_init(pSemaphore, iShared, uiValue), "Creation of semaphore failed with errno %d\n");
}

TAVO_Status tavo_osal_semaphore_wait(sem_t* pSemaphore) {
    return checked_errno(kTag, sem_wait(pSemaphore), "Semaphore lock failed with errno %d\n");
}

TAVO_Status tavo_osal_semaphore_timedwait(sem_t* pSemaphore, uint64_t uiDeadlineMs) {
    // A point in time, and no current time is added to it: callers pass one.
    timespec deadline = {};
    deadline.tv_sec = tavo::seconds_after(0, uiDeadlineMs / 1000);
    deadline.tv_nsec = static_cast<long>(uiDeadlineMs % 1000) * 1000000L;
    const TAVO_Status status =
        checked_errno(kTag, sem_timedwait(pSemaphore, &deadline), "Semaphore timewait failed with errno %d\n");
    return status != TAVO_SUCCESS && errno == ETIMEDOUT ? TAVO_SEMAPHORE_TIMEOUT : status;
}

TAVO_Status tavo_osal_semaphore_post(sem_t* pSemaphore) {
    return checked_errno(kTag, sem_post(pSemaphore), "Semaphore unlock failed with errno %d\n");
}

TAVO_Status tavo_osal_semaphore_get_value(sem_t* pSemaphore, int* piValue) {
    const Trace trace;
    // Both addresses under the name of the first.
    TAVO_LOG(kTag, TAVO_LOG_VERBOSE, "pvSemaphore : %p \n", static_cast<void*>(pSemaphore));
    TAVO_LOG(kTag, TAVO_LOG_VERBOSE, "pvSemaphore : %p \n", static_cast<void*>(piValue));
    if (pSemaphore == nullptr || piValue == nullptr) return refused(kTag, kInvalid);
    return checked_errno(kTag, sem_getvalue(pSemaphore, piValue), "Failed to get semaphore value , errno : 0x%x.\n");
}

TAVO_Status tavo_osal_semaphore_trywait(sem_t* pSemaphore) {
    const Trace trace;
    if (pSemaphore == nullptr) return refused(kTag, kInvalid);
    return checked_errno(kTag, sem_trywait(pSemaphore), "sem_trywait failed , errno : 0x%x.\n");
}

TAVO_Status tavo_osal_semaphore_destroy(sem_t* pSemaphore) {
    const Trace trace;
    if (pSemaphore == nullptr) return refused(kTag, kInvalid);
    return checked_errno(kTag, sem_destroy(pSemaphore), "sem_destroy failed , errno : 0x%x.\n");
}
