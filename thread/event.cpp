#include "tavo_osal/event.h"

#include <pthread.h>
#include <sys/time.h>

#include <cerrno>
#include <cstdlib>
#include <ctime>

#include "log/cancel_shield.h"
#include "log/module_log.h"
#include "tavo_osal/memory.h"
#include "thread/cancellation.h"
#include "thread/platform_call.h"
#include "thread/seconds.h"

struct TAVO_Event {
    uint32_t count;
    pthread_mutex_t lock;  // guards count and waiters
    pthread_cond_t condition;
    uint32_t waiters;  // threads asleep on the condition
};

namespace {

using tavo::CancelShield;
using tavo::checked;
using tavo::refused;

constexpr char kTag[] = "OSAL_THREAD";
constexpr char kInvalid[] = "Invalid params.\n";
constexpr uint32_t kShortestTimeoutMs = 1000;

// What the two waits say, and do not say, when something fails.
struct WaitStyle {
    const char* lock_failed;
    const char* unlock_failed;
    const char* clock_failed;  // null: not checked
    const char* unlimited_failed;
    const char* timed_failed;  // takes the error, then errno
};
constexpr WaitStyle kPlain = {
    "Mutex lock failed. Error=%d\n",
    "Mutex unlock failed. Error=%d\n",
    "Failed to get time of day.\n",
    "Inside indefnite wait - conditional wait failed. Error=%d\n",
    "Inside timed wait - conditional timedwait failed. Returned Error= %d.\n",
};
constexpr WaitStyle kWithFlag = {
    "Mutex lock failed \n",
    "Mutex unlock failed\n",
    nullptr,
    "Inside indefnite wait - conditional wait failed \n",
    "Inside timed wait - conditional timedwait failed %d. Errno=%d.\n",
};

void take(TAVO_Event& event, bool all) {
    if (event.count != 0) event.count = all ? 0 : event.count - 1;
}

// One wait, with the lock held before and after. A cancelled waiter gives the lock back as it goes.
int sleep_on(TAVO_Event& event, const timespec* deadline) {
    ++event.waiters;
    const int error = tavo::wait_cancellably(
        [&] {
            return deadline == nullptr ? pthread_cond_wait(&event.condition, &event.lock)
                                       : pthread_cond_timedwait(&event.condition, &event.lock, deadline);
        },
        [&] {
            --event.waiters;
            pthread_mutex_unlock(&event.lock);
        });
    --event.waiters;
    return error;
}

TAVO_Status wait_without_limit(TAVO_Event& event, bool all, const WaitStyle& style) {
    if (event.count == 0) {
        const TAVO_Status status = checked(kTag, sleep_on(event, nullptr), style.unlimited_failed);
        if (status != TAVO_SUCCESS) return status;
    }
    take(event, all);
    return TAVO_SUCCESS;
}

TAVO_Status wait_for_seconds(TAVO_Event& event, uint32_t seconds, bool all, const WaitStyle& style) {
    timeval now = {};
    if (gettimeofday(&now, nullptr) != 0 && style.clock_failed != nullptr) {
        return checked(kTag, errno, style.clock_failed);
    }
    TAVO_Status status = TAVO_SUCCESS;
    if (event.count == 0) {
        timespec deadline = {};
        deadline.tv_sec = tavo::seconds_after(now.tv_sec, seconds);
        deadline.tv_nsec = static_cast<long>(now.tv_usec * 1000);
        const int error = sleep_on(event, &deadline);
        if (error == ETIMEDOUT) {
            TAVO_LOG(kTag, TAVO_LOG_INFO, "Time out happened.\n");
            status = TAVO_TIMEOUT;
        } else if (error != 0) {
            TAVO_LOG(kTag, TAVO_LOG_ERROR, style.timed_failed, error, errno);
            return TAVO_FAILURE;
        }
    }
    // Also after a time-out: a set that came at the last moment is taken. Callers depend on it.
    take(event, all);
    return status;
}

TAVO_Status wait(TAVO_Event& event, uint32_t timeout_ms, bool all, const WaitStyle& style) {
    const CancelShield shield;
    TAVO_Status status = checked(kTag, pthread_mutex_lock(&event.lock), style.lock_failed);
    if (status != TAVO_SUCCESS) return status;
    if (timeout_ms == TAVO_EVENT_FOREVER) {
        status = wait_without_limit(event, all, style);
    } else if (timeout_ms < kShortestTimeoutMs) {
        // Refused whatever the count is. Callers depend on it.
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Inside timed wait - NOT HANDLED!!!!!!! \n");
        status = TAVO_FAILURE;
    } else {
        // Whole seconds only: callers depend on the rest being dropped.
        status = wait_for_seconds(event, timeout_ms / 1000, all, style);
    }
    const TAVO_Status unlocked = checked(kTag, pthread_mutex_unlock(&event.lock), style.unlock_failed);
    return unlocked != TAVO_SUCCESS ? unlocked : status;
}

// What the operations that change the count say when something fails.
struct ChangeStyle {
    const char* lock_failed;
    const char* signal_failed;  // null: wakes nobody
    const char* unlock_failed;
    bool prints_errno;  // and not the error the platform answered with
};
constexpr ChangeStyle kSet = {
    "Mutex lock failed. error=%d.\n",
    // A single signal, whatever the message says.
    "Broadcast condition signal failed. error=%d.\n",
    "Mutex unlock failed. error=%d.\n",
    false,
};
constexpr ChangeStyle kSetWithFlag = {
    "Mutex lock failed. errno=%d.\n",
    "pthread_cond_signal() failed. errno=%d.\n",
    "Mutex unlock failed. errno=%d.\n",
    true,
};
constexpr ChangeStyle kClear = {"Mutex lock failed. Error =%d\n", nullptr, "Mutex unlock failed. Error =%d\n", false};

TAVO_Status checked_change(const ChangeStyle& style, int error, const char* format, int line = __builtin_LINE()) {
    return style.prints_errno ? tavo::checked_errno(kTag, error, format, line) : checked(kTag, error, format, line);
}

template <typename Change>
TAVO_Status change_count(TAVO_Event& event, const ChangeStyle& style, Change change) {
    const CancelShield shield;
    TAVO_Status status = checked_change(style, pthread_mutex_lock(&event.lock), style.lock_failed);
    if (status != TAVO_SUCCESS) return status;
    event.count = change(event.count);
    if (style.signal_failed != nullptr) {
        status = checked_change(style, pthread_cond_signal(&event.condition), style.signal_failed);
    }
    const TAVO_Status unlocked = checked_change(style, pthread_mutex_unlock(&event.lock), style.unlock_failed);
    return unlocked != TAVO_SUCCESS ? unlocked : status;
}

// Sends the waiters of an event that is about to be destroyed away: neither the platform's condition nor the memory
// may go while a thread sleeps on them.
void dismiss_waiters(TAVO_Event& event) {
    constexpr timespec kPause = {0, 100000};
    while (pthread_mutex_lock(&event.lock) == 0) {
        const bool all_gone = event.waiters == 0;
        if (!all_gone) pthread_cond_broadcast(&event.condition);
        pthread_mutex_unlock(&event.lock);
        if (all_gone) return;
        nanosleep(&kPause, nullptr);
    }
}

// Initialises both parts of a new event. What is there already is not undone on a failure: callers depend on the
// number of platform calls.
TAVO_Status initialise(TAVO_Event& event) {
    event.count = 0;
    event.waiters = 0;
    const TAVO_Status status =
        checked(kTag, pthread_cond_init(&event.condition, nullptr), "Condition variable creation failed. Error=%d\n");
    if (status != TAVO_SUCCESS) return status;
    return checked(kTag, pthread_mutex_init(&event.lock, nullptr), "Mutex creation failed. Error=%d\n");
}

}  // namespace

TAVO_Status tavo_osal_event_create(TAVO_Event** ppEvent) {
    if (ppEvent == nullptr) return refused(kTag, kInvalid);
    const CancelShield shield;
    *ppEvent = nullptr;
    auto* event = static_cast<TAVO_Event*>(tavo_osal_mem_malloc(sizeof(TAVO_Event)));
    if (event == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Event handle allocation failed\n");
        return TAVO_NO_MEMORY;
    }
    const TAVO_Status status = initialise(*event);
    if (status != TAVO_SUCCESS) {
        free(event);  // The C library's, not the library's own: programs that count the latter depend on it.
        return status;
    }
    *ppEvent = event;
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_event_waitset(TAVO_Event* pEvent, uint32_t uiTimeoutMs) {
    return wait(*pEvent, uiTimeoutMs, false, kPlain);
}

TAVO_Status tavo_osal_event_set(TAVO_Event* pEvent) {
    return change_count(*pEvent, kSet, [](uint32_t count) { return count + 1; });
}

TAVO_Status tavo_osal_event_waitset_with_flag(TAVO_Event* pEvent, uint32_t uiTimeoutMs, int iClearAll) {
    if (pEvent == nullptr) return refused(kTag, kInvalid);
    return wait(*pEvent, uiTimeoutMs, iClearAll != 0, kWithFlag);
}

TAVO_Status tavo_osal_event_set_with_flag(TAVO_Event* pEvent, int iReset) {
    if (pEvent == nullptr) return refused(kTag, kInvalid);
    return change_count(*pEvent, kSetWithFlag, [iReset](uint32_t count) { return iReset != 0 ? 1 : count + 1; });
}

TAVO_Status tavo_osal_event_clear(TAVO_Event* pEvent) {
    if (pEvent == nullptr) return refused(kTag, kInvalid);
    return change_count(*pEvent, kClear, [](uint32_t) { return 0U; });
}

TAVO_Status tavo_osal_event_destroy(TAVO_Event** ppEvent) {
    if (ppEvent == nullptr || *ppEvent == nullptr) return refused(kTag, kInvalid);
    const CancelShield shield;
    TAVO_Event& event = **ppEvent;
    dismiss_waiters(event);
    const TAVO_Status condition = checked(kTag, pthread_cond_destroy(&event.condition),
                                          "Condition variable cannot be destroyed. ret error = %d\n");
    const TAVO_Status lock =
        checked(kTag, pthread_mutex_destroy(&event.lock), "Mutex cannot be destroyed. ret error = %d\n");
    tavo_osal_mem_free(&event);
    *ppEvent = nullptr;
    return condition == TAVO_SUCCESS && lock == TAVO_SUCCESS ? TAVO_SUCCESS : TAVO_DESTROY_FAILED;
}
