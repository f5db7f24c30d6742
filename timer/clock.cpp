#include "tavo_osal/clock.h"

#include <sys/time.h>

#include <ctime>

#include "log/module_log.h"
#include "tavo_osal/memory.h"
#include "thread/platform_call.h"

namespace {

using tavo::refused;

constexpr char kTag[] = "OSAL_TIMER";
constexpr char kInvalid[] = "Invalid params:\n";
constexpr int32_t kSecondsPerDay = 86400;
constexpr int32_t kLastSafeSecond = INT32_MAX - kSecondsPerDay;

bool read_time_of_day(timeval& now) {
    if (__builtin_expect(gettimeofday(&now, nullptr) == 0, 1)) return true;
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "Failed to get time of day.\n");
    return false;
}

}  // namespace

TAVO_Status tavo_osal_get_current_time(TAVO_TimeVal* pTime) {
    timeval now = {};
    if (!read_time_of_day(now)) return TAVO_FAILURE;
    tavo_osal_memset(pTime, 0, sizeof *pTime);
    pTime->tv_sec = static_cast<int32_t>(now.tv_sec);
    pTime->tv_usec = static_cast<int32_t>(now.tv_usec);
    if (pTime->tv_sec > kLastSafeSecond) {
        TAVO_LOG(kTag, TAVO_LOG_WARNING,
                 "Check the system date and time, system time value may give incorrect time due to overflow within a "
                 "day.");
    }
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "System time:sec: %d\n", pTime->tv_sec);
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "System time:usec: %d\n", pTime->tv_usec);
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_get_current_time_us(TAVO_INT64* plMicroSeconds) {
    if (plMicroSeconds == nullptr) return refused(kTag, kInvalid);
    timeval now = {};
    if (!read_time_of_day(now)) return TAVO_FAILURE;
    *plMicroSeconds = int64_t{now.tv_sec} * 1000000 + int64_t{now.tv_usec};
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_get_current_time_ns(TAVO_INT64* plNanoSeconds) {
    if (plNanoSeconds == nullptr) return refused(kTag, kInvalid);
    timespec now = {};
    if (clock_gettime(CLOCK_MONOTONIC, &now) == -1) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "clock_gettime failed.\n");
        return TAVO_FAILURE;
    }
    *plNanoSeconds = int64_t{now.tv_sec} * 1000000000 + int64_t{now.tv_nsec};
    return TAVO_SUCCESS;
}
