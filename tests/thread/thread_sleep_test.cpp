#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <ctime>
#include <functional>
#include <limits>
#include <thread>

#include "asleep.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/thread.h"

namespace {

using tavo::test::Bedside;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_THREAD";
constexpr char kNanosleepFailed[] =
    "nanosleep failed, this may be because of signal handler or other reasons. errno 4\n";

timespec g_duration;

int note_duration(const timespec* duration, timespec* remainder) {
    EXPECT_EQ(remainder, nullptr);
    g_duration = *duration;
    return 0;
}

double seconds_of(const std::function<void()>& action) {
    const auto start = std::chrono::steady_clock::now();
    action();
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

// Has a signal interrupt a sleep as soon as the sleep has begun, and gives the sleep's result.
TAVO_Status interrupted(TAVO_Status (*sleep_long)()) {
    struct sigaction action = {};
    action.sa_handler = [](int) {};
    sigaction(SIGUSR1, &action, nullptr);
    Bedside bedside;
    TAVO_Status status = TAVO_SUCCESS;
    std::thread sleeper([&] {
        bedside.going_to_sleep();
        status = sleep_long();
    });
    bedside.wait_until_asleep();
    pthread_kill(sleeper.native_handle(), SIGUSR1);
    sleeper.join();
    return status;
}

TEST(ThreadSleep, EverySleepTakesAsLongAsAsked) {
    const LogCapture log;
    EXPECT_GE(seconds_of([] { EXPECT_EQ(tavo_osal_thread_sleep(1), TAVO_SUCCESS); }), 0.99);
    EXPECT_GE(seconds_of([] { EXPECT_EQ(tavo_osal_thread_msleep(30), TAVO_SUCCESS); }), 0.03);
    EXPECT_GE(seconds_of([] { EXPECT_EQ(tavo_osal_thread_usleep(30000), TAVO_SUCCESS); }), 0.03);
    EXPECT_EQ(tavo_osal_thread_sleep(0), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_msleep(0), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_usleep(0), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(ThreadSleep, SleepReportsTheSecondsLeft) {
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "sleep", +[](unsigned) { return 7U; });
    EXPECT_EQ(tavo_osal_thread_sleep(10), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Sleep failed. uiRet = 7.\n"}}));
}

TEST(ThreadSleep, MillisecondsAreOneNanosleepWithoutARemainder) {
    const PlatformHook hook(kLibrary, "nanosleep", &note_duration);
    EXPECT_EQ(tavo_osal_thread_msleep(1999), TAVO_SUCCESS);
    EXPECT_EQ(g_duration.tv_sec, 1);
    EXPECT_EQ(g_duration.tv_nsec, 999000000L);
    EXPECT_EQ(tavo_osal_thread_msleep(0x100000000ULL), TAVO_SUCCESS);
    EXPECT_EQ(g_duration.tv_sec, 4294967);
    EXPECT_EQ(g_duration.tv_nsec, 296000000L);
}

TEST(ThreadSleep, MoreMillisecondsThanThePlatformCountsSecondsOfAreTheLongestSleepThereIs) {
    const PlatformHook hook(kLibrary, "nanosleep", &note_duration);
    EXPECT_EQ(tavo_osal_thread_msleep(UINT64_MAX), TAVO_SUCCESS);
    EXPECT_EQ(g_duration.tv_sec, std::min<int64_t>(UINT64_MAX / 1000, std::numeric_limits<time_t>::max()));
    EXPECT_EQ(g_duration.tv_nsec, 615000000L);
}

TEST(ThreadSleep, MicrosecondsArePassedOn) {
    static useconds_t asked;
    const PlatformHook hook(
        kLibrary, "usleep", +[](useconds_t duration) {
            asked = duration;
            return 0;
        });
    EXPECT_EQ(tavo_osal_thread_usleep(4000000000U), TAVO_SUCCESS);
    EXPECT_EQ(asked, 4000000000U);
}

TEST(ThreadSleep, MicrosecondsReportAFailureWithoutANumber) {
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "usleep", +[](useconds_t) {
            errno = EINVAL;
            return -1;
        });
    EXPECT_EQ(tavo_osal_thread_usleep(1), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Sleep failed.\n"}}));
}

TEST(ThreadSleep, ASignalEndsEverySleepWithAFailure) {
    const LogCapture log;
    EXPECT_EQ(interrupted([] { return tavo_osal_thread_sleep(1000); }), TAVO_FAILURE);
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.lines().front().message().rfind("Sleep failed. uiRet = ", 0), 0U);
    log.lines();
    EXPECT_EQ(interrupted([] { return tavo_osal_thread_msleep(1000000); }), TAVO_FAILURE);
    EXPECT_TRUE(logged(log.lines(), {1, kTag, kNanosleepFailed}));
    EXPECT_EQ(interrupted([] { return tavo_osal_thread_usleep(1000000000); }), TAVO_FAILURE);
    EXPECT_TRUE(logged(log.lines(), {1, kTag, "Sleep failed.\n"}));
    EXPECT_EQ(log.lines().size(), 3U);
}

}  // namespace
