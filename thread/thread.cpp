#include "tavo_osal/thread.h"

#include <sched.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <ctime>

#include "log/cancel_shield.h"
#include "log/module_log.h"
#include "thread/known_threads.h"
#include "thread/platform_call.h"
#include "thread/seconds.h"

namespace {

using tavo::checked;
using tavo::checked_errno;
using tavo::refused;

constexpr char kTag[] = "OSAL_THREAD";

int real_time_policy(int selector) { return selector == TAVO_THREAD_POLICY_RR ? SCHED_RR : SCHED_FIFO; }

}  // namespace

TAVO_Status tavo_osal_thread_create(pthread_t* pThread, TAVO_ThreadStart pfStart, void* pvArg) {
    if (pThread == nullptr || pfStart == nullptr) return refused(kTag, "Invalid params.\n");
    return checked(kTag, tavo::create_thread(pThread, pfStart, pvArg), "Thread creation failed. retval = %d\n");
}

TAVO_Status tavo_osal_thread_create_with_name(pthread_t* pThread, TAVO_ThreadStart pfStart, void* pvArg,
                                              const TAVO_CHAR* /*pcName*/) {
    return tavo_osal_thread_create(pThread, pfStart, pvArg);
}

TAVO_Status tavo_osal_thread_join(pthread_t thread) {
    return checked(kTag, tavo::join_thread(thread), "Thread join failed. iRet=%d\n");
}

TAVO_Status tavo_osal_thread_yield(void) { return checked(kTag, sched_yield(), "Thread yield failed. iRet=%d\n"); }

TAVO_Status tavo_osal_thread_detach(pthread_t thread) {
    return checked(kTag, tavo::detach_thread(thread), "Thread detach failed. iRet=%d\n");
}

TAVO_Status tavo_osal_thread_sleep(uint32_t uiSeconds) {
    return checked(kTag, static_cast<int>(sleep(uiSeconds)), "Sleep failed. uiRet = %d.\n");
}

TAVO_Status tavo_osal_thread_msleep(uint64_t uiMilliSeconds) {
    timespec duration = {};
    duration.tv_sec = tavo::seconds_after(0, uiMilliSeconds / 1000);
    duration.tv_nsec = static_cast<long>(uiMilliSeconds % 1000) * 1000000L;
    return checked_errno(kTag, nanosleep(&duration, nullptr),
                         "nanosleep failed, this may be because of signal handler or other reasons. errno %d\n");
}

TAVO_Status tavo_osal_thread_usleep(uint32_t uiMicroSeconds) {
    return checked(kTag, usleep(uiMicroSeconds), "Sleep failed.\n");
}

void tavo_osal_thread_exit(void) { pthread_exit(nullptr); }

TAVO_Status tavo_osal_thread_cancel(pthread_t thread) {
    if (tavo::signal_thread(thread, tavo::kCancelSignal) == 0) {
        // By now the thread may be gone and its handle with it; only its value is printed.
        TAVO_LOG(kTag, TAVO_LOG_INFO, " thread canceled %lu ", static_cast<unsigned long>(thread));
    }
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_thread_kill(pthread_t thread) {
    return checked(kTag, tavo::signal_thread(thread, SIGKILL), "Thread kill Failed. Error= %d\n");
}

TAVO_Status tavo_osal_thread_set_affinity(pthread_t /*thread*/, unsigned int /*uiCpuMask*/) {
    return TAVO_NOT_SUPPORTED;
}

void tavo_osal_thread_testcancel(void) {}

TAVO_Status tavo_osal_thread_set_real_time_priority(pthread_t thread, int iPriority, int iPolicy) {
    if (iPriority < 1) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid thread priority %d\n", iPriority);
        return TAVO_INVALID_PARAM;
    }
    if (iPolicy != TAVO_THREAD_POLICY_RR && iPolicy != TAVO_THREAD_POLICY_FIFO) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid thread policy %d\n", iPolicy);
        return TAVO_INVALID_PARAM;
    }
    const bool dead = tavo::is_dead(thread);
    int policy = 0;
    sched_param parameters = {};
    if (dead || pthread_getschedparam(thread, &policy, &parameters) != 0) {
        TAVO_LOG(kTag, TAVO_LOG_WARNING, "pthread_getschedparam failed\n");
    } else {
        TAVO_LOG(kTag, TAVO_LOG_INFO, "Existing policy %d, priority %d\n", policy, parameters.sched_priority);
    }
    parameters.sched_priority = iPriority;
    const int error = dead ? ESRCH : pthread_setschedparam(thread, real_time_policy(iPolicy), &parameters);
    // errno, and not what the platform answered, is what callers have always found in the message.
    return checked_errno(kTag, error, "Set sched_param failed. errno %d\n");
}

TAVO_Status tavo_osal_signal(int iSignal, TAVO_SignalHandler pfHandler) {
    if (pfHandler == nullptr) return TAVO_INVALID_PARAM;
    // signal() has had BSD semantics everywhere this runs since before bsd_signal() was withdrawn.
    return signal(iSignal, pfHandler) == SIG_ERR ? TAVO_FAILURE : TAVO_SUCCESS;
}
