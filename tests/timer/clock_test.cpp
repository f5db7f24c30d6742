#include "tavo_osal/clock.h"

#include <gtest/gtest.h>
#include <sys/time.h>

#include <cerrno>
#include <cstring>
#include <ctime>
#include <string>

#include "support/log_capture.h"
#include "support/platform_fault.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_TIMER";
constexpr char kOverflowWarning[] =
    "Check the system date and time, system time value may give incorrect time due to overflow within a day.";

timeval g_now;
timespec g_monotonic;
clockid_t g_clock;

int given_time(timeval* now, void*) {
    *now = g_now;
    return 0;
}

int no_time(timeval*, void*) {
    errno = EFAULT;
    return -1;
}

int given_monotonic(clockid_t clock, timespec* now) {
    g_clock = clock;
    *now = g_monotonic;
    return 0;
}

TEST(Clock, CurrentTimeIsTheTimeOfDay) {
    timeval before = {};
    timeval after = {};
    TAVO_TimeVal now = {};
    gettimeofday(&before, nullptr);
    EXPECT_EQ(tavo_osal_get_current_time(&now), TAVO_SUCCESS);
    gettimeofday(&after, nullptr);
    const auto micros = [](auto seconds, auto rest) { return int64_t{seconds} * 1000000 + int64_t{rest}; };
    EXPECT_LE(micros(before.tv_sec, before.tv_usec), micros(now.tv_sec, now.tv_usec));
    EXPECT_LE(micros(now.tv_sec, now.tv_usec), micros(after.tv_sec, after.tv_usec));
}

TEST(Clock, CurrentTimeLogsItsFieldsAtTheDebugLevel) {
    const LogCapture log;
    const PlatformHook clock(kLibrary, "gettimeofday", &given_time);
    g_now = {1700000000, 999999};
    TAVO_TimeVal now = {};
    EXPECT_EQ(tavo_osal_get_current_time(&now), TAVO_SUCCESS);
    EXPECT_EQ(now.tv_sec, 1700000000);
    EXPECT_EQ(now.tv_usec, 999999);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{4, kTag, "System time:sec: 1700000000\n"}, {4, kTag, "System time:usec: 999999\n"}}));
}

TEST(Clock, CurrentTimeFillsExactlyTwo32BitFields) {
    static_assert(sizeof(TAVO_TimeVal) == 8);
    unsigned char bytes[16];
    memset(bytes, 0xA5, sizeof bytes);
    EXPECT_EQ(tavo_osal_get_current_time(reinterpret_cast<TAVO_TimeVal*>(bytes)), TAVO_SUCCESS);
    for (int i = 8; i < 16; ++i) EXPECT_EQ(bytes[i], 0xA5) << i;
}

TEST(Clock, CurrentTimeWarnsWithinTheLastDayOf32BitSeconds) {
    const LogCapture log(2);
    const PlatformHook clock(kLibrary, "gettimeofday", &given_time);
    TAVO_TimeVal now = {};
    g_now = {2147397247, 0};
    EXPECT_EQ(tavo_osal_get_current_time(&now), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {})) << "a day to go";
    for (const int32_t second : {2147397248, 2147483647}) {
        g_now = {second, 5};
        EXPECT_EQ(tavo_osal_get_current_time(&now), TAVO_SUCCESS);
        EXPECT_EQ(now.tv_sec, second);
        EXPECT_EQ(now.tv_usec, 5);
    }
    const tavo::test::ExpectedLine line{2, kTag, kOverflowWarning};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
}

TEST(Clock, CurrentTimeKeeps32BitsOfLaterSeconds) {
    if (sizeof(time_t) == 4) GTEST_SKIP() << "there are none";
    const LogCapture log(2);
    const PlatformHook clock(kLibrary, "gettimeofday", &given_time);
    TAVO_TimeVal now = {};
    g_now = {static_cast<time_t>(int64_t{2147483648}), 0};
    EXPECT_EQ(tavo_osal_get_current_time(&now), TAVO_SUCCESS);
    EXPECT_EQ(now.tv_sec, INT32_MIN);
    EXPECT_TRUE(logged_exactly(log.lines(), {})) << "compared signed";
}

TEST(Clock, CurrentTimeReportsAnUnreadableClockAndLeavesTheResultAlone) {
    const LogCapture log;
    const PlatformHook clock(kLibrary, "gettimeofday", &no_time);
    TAVO_TimeVal now = {7, 8};
    EXPECT_EQ(tavo_osal_get_current_time(&now), TAVO_FAILURE);
    EXPECT_EQ(now.tv_sec, 7);
    EXPECT_EQ(now.tv_usec, 8);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Failed to get time of day.\n"}}));
}

TEST(Clock, MicrosecondsAreA64BitProduct) {
    const LogCapture log;
    const PlatformHook clock(kLibrary, "gettimeofday", &given_time);
    g_now = {2147483647, 999999};
    TAVO_INT64 micros = 0;
    EXPECT_EQ(tavo_osal_get_current_time_us(&micros), TAVO_SUCCESS);
    EXPECT_EQ(micros, 2147483647999999LL);
    g_now = {-1, 0};
    EXPECT_EQ(tavo_osal_get_current_time_us(&micros), TAVO_SUCCESS);
    EXPECT_EQ(micros, -1000000);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(Clock, MicrosecondsReportAnUnreadableClockAndLeaveTheResultAlone) {
    const LogCapture log;
    const PlatformHook clock(kLibrary, "gettimeofday", &no_time);
    TAVO_INT64 micros = 7;
    EXPECT_EQ(tavo_osal_get_current_time_us(&micros), TAVO_FAILURE);
    EXPECT_EQ(micros, 7);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Failed to get time of day.\n"}}));
}

TEST(Clock, NanosecondsAreA64BitProductOfTheMonotonicClock) {
    const LogCapture log;
    const PlatformHook monotonic(kLibrary, "clock_gettime", &given_monotonic);
    const PlatformHook wall(kLibrary, "gettimeofday", &no_time);
    g_monotonic = {2147483647, 999999999};
    TAVO_INT64 nanos = 0;
    EXPECT_EQ(tavo_osal_get_current_time_ns(&nanos), TAVO_SUCCESS);
    EXPECT_EQ(nanos, 2147483647999999999LL);
    EXPECT_EQ(g_clock, CLOCK_MONOTONIC);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(Clock, NanosecondsNeverRunBackwards) {
    TAVO_INT64 last = 0;
    for (int i = 0; i < 1000; ++i) {
        TAVO_INT64 now = 0;
        ASSERT_EQ(tavo_osal_get_current_time_ns(&now), TAVO_SUCCESS);
        ASSERT_GE(now, last);
        last = now;
    }
}

TEST(Clock, NanosecondsReportAnUnreadableClockAndLeaveTheResultAlone) {
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "clock_gettime", +[](clockid_t, timespec*) {
            errno = EINVAL;
            return -1;
        });
    TAVO_INT64 nanos = 7;
    EXPECT_EQ(tavo_osal_get_current_time_ns(&nanos), TAVO_FAILURE);
    EXPECT_EQ(nanos, 7);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "clock_gettime failed.\n"}}));
}

TEST(Clock, The64BitReadingsRefuseNull) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_get_current_time_us(nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_get_current_time_ns(nullptr), TAVO_INVALID_PARAM);
    const tavo::test::ExpectedLine line{1, kTag, "Invalid params:\n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
}

}  // namespace
