#include "tavo_osal/timer.h"

#include <cerrno>

#include "log/cancel_shield.h"
#include "log/module_log.h"
#include "tavo_osal/memory.h"
#include "tavo_osal/thread.h"
#include "thread/platform_call.h"
#include "timer/timer_slots.h"

namespace {

using tavo::CancelShield;
using tavo::refused;

constexpr char kTag[] = "OSAL_TIMER";
constexpr char kInvalid[] = "Invalid parameters \n";

// Runs an operation on a timer under the framework's mutex.
template <typename Operation>
TAVO_Status with_mutex(TAVO_TimerFramework& framework, Operation operation, int line = __builtin_LINE()) {
    const CancelShield shield;
    TAVO_Status status = tavo_osal_mutex_lock(framework.mutex);
    if (status != TAVO_SUCCESS) {
        TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "Mutex lock failed \n");
        return status;
    }
    operation();
    status = tavo_osal_mutex_unlock(framework.mutex);
    if (status != TAVO_SUCCESS) TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "Mutex unlock failed \n");
    return status;
}

// A tick's worth of counting. True when the count had come to 0 before, which is when a timer fires: callers depend
// on the one tick more, and on a remainder smaller than a tick never being subtracted.
bool count_down(TAVO_Timer& timer, int32_t tick_ms) {
    const int32_t count = timer.iCount;
    if (count == 0) return true;
    // Unsigned, because a tick beyond the signed range is negative here and must merely wrap.
    const auto left = static_cast<int32_t>(static_cast<uint32_t>(count) - static_cast<uint32_t>(tick_ms));
    const int32_t now = count >= tick_ms ? left : count;
    timer.iCount = now > 0 ? now : 0;
    return false;
}

// Runs without the mutex, so that the callback may use the framework, and with no shield, as the callback is the
// caller's code.
void expire(TAVO_Timer& timer) {
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Timer[%s] expiry \n", timer.acName);
    void* const argument = timer.argument;
    const TAVO_TimerCallback callback = timer.callback;
    if (callback != nullptr) callback(argument);
    if (timer.eType == TAVO_TIMER_ONE_SHOT) {
        timer.running = 0;  // Also when the callback restarted it: callers depend on it.
    } else {
        timer.iCount = timer.iReload;
    }
}

// False when the rest of the round is to be abandoned.
bool look_at(TAVO_TimerFramework& framework, TAVO_Timer& timer) {
    bool expired = false;
    {
        const CancelShield shield;
        if (tavo_osal_mutex_lock(framework.mutex) != TAVO_SUCCESS) {
            TAVO_LOG(kTag, TAVO_LOG_ERROR, "Mutex lock failed.\n");  // and on as if it had been locked
        }
        expired = timer.in_use != 0 && timer.running == 1 && count_down(timer, framework.tick_ms);
        if (tavo_osal_mutex_unlock(framework.mutex) != TAVO_SUCCESS) {
            if (expired) {
                TAVO_LOG(kTag, TAVO_LOG_ERROR, "Mutex unlock failed.\n");
            } else {
                TAVO_LOG(kTag, TAVO_LOG_ERROR, "Mutex unlock failed \n");
            }
            return false;
        }
    }
    if (expired) expire(timer);
    return true;
}

// The worker thread.
void* tavo_osal_timer_thread(void* argument) {
    auto& framework = *static_cast<TAVO_TimerFramework*>(argument);
    while (framework.exit == 0) {
        tavo_osal_thread_usleep(static_cast<uint32_t>(framework.tick_ms) * 1000U);
        for (TAVO_Timer& timer : framework.timers) {
            if (!look_at(framework, timer)) break;
        }
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Timer thread exiting psTimerFmw:%p\n", argument);
    return nullptr;
}

// Fills in a cleared framework and starts its worker. On a failure nothing is left but the memory.
TAVO_Status start_framework(TAVO_TimerFramework& framework) {
    TAVO_Status status = tavo_osal_mutex_create(&framework.mutex);
    if (status != TAVO_SUCCESS) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Unable to create mutex\n");
        return status;
    }
    framework.exit = 0;
    status = tavo_osal_thread_create_with_name(&framework.thread, tavo_osal_timer_thread, &framework, "Thread_1300");
    if (status != TAVO_SUCCESS) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Unable to create timer thread\n");
        tavo_osal_mutex_destroy(&framework.mutex);
    }
    return status;
}

TAVO_Timer* first_free(TAVO_TimerFramework& framework) {
    for (TAVO_Timer& timer : framework.timers) {
        if (timer.in_use == 0) return &timer;
    }
    return nullptr;
}

}  // namespace

TAVO_Status tavo_osal_timer_framework_init(unsigned int uiTickMs, TAVO_TimerFramework** ppFramework) {
    if (uiTickMs == 0 || ppFramework == nullptr) {
        if (ppFramework != nullptr) *ppFramework = nullptr;
        return refused(kTag, kInvalid);
    }
    const CancelShield shield;
    *ppFramework = nullptr;
    void* block = tavo_osal_mem_malloc(sizeof(tavo::FrameworkBlock));
    if (block == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Timer instance memory allocation failed \n");
        return TAVO_NO_MEMORY;
    }
    tavo_osal_memset(block, 0, sizeof(tavo::FrameworkBlock));
    TAVO_TimerFramework& framework = static_cast<tavo::FrameworkBlock*>(block)->framework;
    framework.tick_ms = static_cast<int32_t>(uiTickMs);
    const TAVO_Status status = start_framework(framework);
    if (status != TAVO_SUCCESS) {
        tavo_osal_mem_free(block);
        return status;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Thread create succeded. Thread ID = %#x\n",
             static_cast<unsigned int>(framework.thread));
    *ppFramework = &framework;
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_timer_framework_uninit(TAVO_TimerFramework* pFramework) {
    if (pFramework == nullptr) return refused(kTag, kInvalid);
    pFramework->exit = 1;
    TAVO_Status status = tavo_osal_thread_join(pFramework->thread);
    if (status != TAVO_SUCCESS) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Timer thread join failed \n");
        return status;
    }
    const CancelShield shield;
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Timer thread exited \n");
    status = tavo_osal_mutex_destroy(&pFramework->mutex);
    // errno as it happens to be: callers depend on when the memory is kept.
    if (status != TAVO_SUCCESS && errno != 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Mutex destroy failed \n");
        return status;
    }
    tavo_osal_mem_free(pFramework);
    return status;
}

TAVO_Status tavo_osal_timer_create(TAVO_TimerFramework* pFramework, const TAVO_CHAR* /*pcName*/, unsigned int uiType,
                                   int iDurationMs, int iReloadMs, TAVO_TimerCallback pfCallback, void* pvArg,
                                   TAVO_Timer** ppTimer) {
    const bool periodic = uiType == TAVO_TIMER_PERIODIC;
    if (pFramework == nullptr || pfCallback == nullptr || ppTimer == nullptr || uiType > TAVO_TIMER_PERIODIC ||
        (periodic && iReloadMs == 0)) {
        return refused(kTag, kInvalid);
    }
    if (iDurationMs < pFramework->tick_ms || (periodic && iReloadMs < pFramework->tick_ms)) {
        return refused(kTag, "Duration/reload value is lesser than tick granularity \n");
    }
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Timer create:  eType[%d] duration[%d] iReload[%d]\n", static_cast<int>(uiType),
             iDurationMs, iReloadMs);
    return with_mutex(*pFramework, [&] {
        TAVO_Timer* timer = first_free(*pFramework);
        if (timer != nullptr) {
            timer->eType = uiType;
            timer->iCount = iDurationMs;
            timer->iReload = iReloadMs;
            timer->callback = pfCallback;
            timer->running = 0;
            timer->argument = pvArg;
            timer->in_use = 1;
        }
        // A full table hands out the address behind it and succeeds. Callers depend on the success.
        *ppTimer = timer != nullptr ? timer : pFramework->timers + TAVO_TIMERS_PER_FRAMEWORK;
    });
}

TAVO_Status tavo_osal_timer_free(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer) {
    if (pFramework == nullptr || pTimer == nullptr) return refused(kTag, kInvalid);
    return with_mutex(*pFramework, [pTimer] {
        if (pTimer->in_use == 0) return;
        pTimer->running = 0;
        pTimer->iCount = 0;
        pTimer->iReload = 0;
        pTimer->callback = nullptr;
        pTimer->argument = nullptr;
        pTimer->in_use = 0;
    });
}

TAVO_Status tavo_osal_timer_start(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer, unsigned int uiCountMs) {
    if (pFramework == nullptr || pTimer == nullptr || uiCountMs == 0) return refused(kTag, kInvalid);
    if (uiCountMs < static_cast<unsigned int>(pFramework->tick_ms)) {
        return refused(kTag, "Timer count value is lesser than tick granularity \n");
    }
    const auto count = static_cast<int32_t>(uiCountMs);
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Timer start:  iCount[%d]\n", count);
    return with_mutex(*pFramework, [pTimer, count] {
        if (pTimer->in_use == 0 || pTimer->running != 0) return;
        pTimer->running = 1;
        pTimer->iCount = count;
    });
}

TAVO_Status tavo_osal_timer_restart(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer) {
    if (pFramework == nullptr || pTimer == nullptr) return refused(kTag, kInvalid);
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Timer restart: acName[%s]\n", pTimer->acName);
    return with_mutex(*pFramework, [pTimer] {
        if (pTimer->in_use == 0) return;
        pTimer->iCount = pTimer->iReload;
        pTimer->running = 1;
    });
}

TAVO_Status tavo_osal_timer_stop(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer) {
    if (pFramework == nullptr || pTimer == nullptr) return refused(kTag, kInvalid);
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Timer stop: acName[%s]\n", pTimer->acName);
    return with_mutex(*pFramework, [pTimer] {
        if (pTimer->in_use != 0 && pTimer->running != 0) pTimer->running = 0;
    });
}

int tavo_osal_is_timer_running(TAVO_TimerFramework* pFramework, TAVO_Timer* pTimer) {
    if (pFramework == nullptr && pTimer == nullptr) {
        // No blank before the line feed, unlike everywhere else.
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid parameters\n");
        return 0;
    }
    return pTimer != nullptr ? pTimer->running : 0;
}
