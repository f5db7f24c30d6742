// Waits for events that sleep, are made to fail, or are overtaken by the event's end.
#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/time.h>

#include <cerrno>
#include <chrono>
#include <limits>
#include <thread>

#include "asleep.h"
#include "event_counts.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/event.h"

namespace {

using tavo::test::Bedside;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_THREAD";

timeval g_now;
timespec g_deadline;
TAVO_Event* g_event;

int given_time(timeval* now, void*) {
    *now = g_now;
    return 0;
}

int no_time(timeval*, void*) {
    errno = EFAULT;
    return -1;
}

int time_out(pthread_cond_t*, pthread_mutex_t*, const timespec* deadline) {
    g_deadline = *deadline;
    return ETIMEDOUT;
}

// A set that comes at the last moment: while the waiter is on its way back from the wait.
void set_during_wait(pthread_mutex_t* mutex) {
    pthread_mutex_unlock(mutex);
    EXPECT_EQ(tavo_osal_event_set(g_event), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_event_set(g_event), TAVO_SUCCESS);
    pthread_mutex_lock(mutex);
}

int set_and_time_out(pthread_cond_t*, pthread_mutex_t* mutex, const timespec*) {
    set_during_wait(mutex);
    return ETIMEDOUT;
}

int wake_for_nothing(pthread_cond_t*, pthread_mutex_t*) { return 0; }

int fail_timed_wait(pthread_cond_t*, pthread_mutex_t* mutex, const timespec*) {
    set_during_wait(mutex);
    errno = ENOENT;
    return EINVAL;
}

class EventWait : public testing::Test {
protected:
    void SetUp() override {
        ASSERT_EQ(tavo_osal_event_create(&event_), TAVO_SUCCESS);
        g_event = event_;
    }
    void TearDown() override {
        if (event_ != nullptr) {
            EXPECT_EQ(tavo_osal_event_destroy(&event_), TAVO_SUCCESS);
        }
    }

    int counts() { return tavo::test::take_counts(event_); }

    // Sets the event while a thread sleeps in the wait; the wait's result.
    template <typename Wait>
    TAVO_Status woken(Wait wait) {
        Bedside bedside;
        TAVO_Status status = TAVO_FAILURE;
        std::thread waiter([&] {
            bedside.going_to_sleep();
            status = wait();
        });
        bedside.wait_until_asleep();
        EXPECT_EQ(tavo_osal_event_set(event_), TAVO_SUCCESS);
        waiter.join();
        return status;
    }

    TAVO_Event* event_ = nullptr;
};

TEST_F(EventWait, ASetWakesASleepingWaiterThatTakesTheCount) {
    const LogCapture log;
    EXPECT_EQ(woken([&] { return tavo_osal_event_waitset(event_, TAVO_EVENT_FOREVER); }), TAVO_SUCCESS);
    EXPECT_EQ(woken([&] { return tavo_osal_event_waitset(event_, 60000); }), TAVO_SUCCESS);
    EXPECT_EQ(woken([&] { return tavo_osal_event_waitset_with_flag(event_, TAVO_EVENT_FOREVER, 0); }), TAVO_SUCCESS);
    EXPECT_EQ(woken([&] { return tavo_osal_event_waitset_with_flag(event_, 60000, 1); }), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(counts(), 0);
}

TEST_F(EventWait, EverySetWakesOneOfSeveralWaiters) {
    Bedside bedsides[3];
    std::thread waiters[3];
    for (int i = 0; i < 3; ++i) {
        waiters[i] = std::thread([&, i] {
            bedsides[i].going_to_sleep();
            EXPECT_EQ(tavo_osal_event_waitset(event_, TAVO_EVENT_FOREVER), TAVO_SUCCESS);
        });
        bedsides[i].wait_until_asleep();
    }
    for (int i = 0; i < 3; ++i) EXPECT_EQ(tavo_osal_event_set(event_), TAVO_SUCCESS);
    for (std::thread& waiter : waiters) waiter.join();
    EXPECT_EQ(counts(), 0);
}

TEST_F(EventWait, WaitsForWholeSecondsOnly) {
    const LogCapture log;
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(tavo_osal_event_waitset(event_, 1999), TAVO_TIMEOUT);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(900));
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, kTag, "Time out happened.\n"}}));
}

TEST_F(EventWait, DeadlineIsAtMostTheLastSecondThePlatformCounts) {
    const PlatformHook clock(kLibrary, "gettimeofday", &given_time);
    const PlatformHook wait(kLibrary, "pthread_cond_timedwait", &time_out);
    constexpr time_t kLast = std::numeric_limits<time_t>::max();
    g_now = {kLast - 5, 0};
    EXPECT_EQ(tavo_osal_event_waitset(event_, 0xFFFFFFFEU), TAVO_TIMEOUT);
    EXPECT_EQ(g_deadline.tv_sec, kLast);
}

TEST_F(EventWait, DeadlineIsTheTimeOfDayPlusWholeSeconds) {
    const PlatformHook clock(kLibrary, "gettimeofday", &given_time);
    const PlatformHook wait(kLibrary, "pthread_cond_timedwait", &time_out);
    g_now = {1000, 999999};
    EXPECT_EQ(tavo_osal_event_waitset(event_, 2500), TAVO_TIMEOUT);
    EXPECT_EQ(g_deadline.tv_sec, 1002);
    EXPECT_EQ(g_deadline.tv_nsec, 999999000L);
    EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, 0xFFFFFFFEU, 0), TAVO_TIMEOUT);
    EXPECT_EQ(g_deadline.tv_sec, 1000 + 4294967);
    EXPECT_EQ(g_deadline.tv_nsec, 999999000L);
}

TEST_F(EventWait, ASetAtTheDeadlineIsTakenAlthoughTheWaitTimesOut) {
    const LogCapture log;
    const PlatformHook wait(kLibrary, "pthread_cond_timedwait", &set_and_time_out);
    EXPECT_EQ(tavo_osal_event_waitset(event_, 1000), TAVO_TIMEOUT);
    EXPECT_EQ(counts(), 1) << "of two";
    EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, 1000, 1), TAVO_TIMEOUT);
    EXPECT_EQ(counts(), 0) << "of two";
    const tavo::test::ExpectedLine line{3, kTag, "Time out happened.\n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
}

TEST_F(EventWait, AWakeUpForNothingIsASuccess) {
    const LogCapture log;
    {
        const PlatformHook unlimited(kLibrary, "pthread_cond_wait", &wake_for_nothing);
        const PlatformHook timed(
            kLibrary, "pthread_cond_timedwait", +[](pthread_cond_t*, pthread_mutex_t*, const timespec*) { return 0; });
        EXPECT_EQ(tavo_osal_event_waitset(event_, TAVO_EVENT_FOREVER), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_event_waitset(event_, 1000), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, TAVO_EVENT_FOREVER, 1), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, 1000, 1), TAVO_SUCCESS);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(counts(), 0);
}

TEST_F(EventWait, AnUnlimitedWaitReportsThePlatformsError) {
    const LogCapture log;
    const PlatformHook wait(
        kLibrary, "pthread_cond_wait", +[](pthread_cond_t*, pthread_mutex_t*) { return EPERM; });
    EXPECT_EQ(tavo_osal_event_waitset(event_, TAVO_EVENT_FOREVER), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, TAVO_EVENT_FOREVER, 0), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Inside indefnite wait - conditional wait failed. Error=1\n"},
                                             {1, kTag, "Inside indefnite wait - conditional wait failed \n"}}));
}

TEST_F(EventWait, ATimedWaitReportsThePlatformsErrorAndTakesNothing) {
    const LogCapture log;
    const PlatformHook wait(kLibrary, "pthread_cond_timedwait", &fail_timed_wait);
    EXPECT_EQ(tavo_osal_event_waitset(event_, 1000), TAVO_FAILURE);
    EXPECT_EQ(counts(), 2);
    EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, 1000, 1), TAVO_FAILURE);
    EXPECT_EQ(counts(), 2);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{1, kTag, "Inside timed wait - conditional timedwait failed. Returned Error= 22.\n"},
                                {1, kTag, "Inside timed wait - conditional timedwait failed 22. Errno=2.\n"}}));
}

TEST_F(EventWait, ATimedWaitReadsTheClockBeforeItLooksAtTheCount) {
    ASSERT_EQ(tavo_osal_event_set(event_), TAVO_SUCCESS);
    const LogCapture log;
    {
        const PlatformHook clock(kLibrary, "gettimeofday", &no_time);
        EXPECT_EQ(tavo_osal_event_waitset(event_, 1000), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Failed to get time of day.\n"}}));
    EXPECT_EQ(counts(), 1);
}

TEST_F(EventWait, TheVariantWithAFlagDoesNotCheckTheClock) {
    ASSERT_EQ(tavo_osal_event_set(event_), TAVO_SUCCESS);
    const LogCapture log;
    {
        const PlatformHook clock(kLibrary, "gettimeofday", &no_time);
        EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, 1000, 0), TAVO_SUCCESS);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST_F(EventWait, AFailingUnlockReplacesTheResultOfATimedOutWait) {
    const LogCapture log;
    {
        const PlatformHook wait(kLibrary, "pthread_cond_timedwait", &time_out);
        const PlatformHook unlock(
            kLibrary, "pthread_mutex_unlock", +[](pthread_mutex_t* mutex) {
                pthread_mutex_unlock(mutex);
                return EPERM;
            });
        EXPECT_EQ(tavo_osal_event_waitset(event_, 1000), TAVO_FAILURE);
    }
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{3, kTag, "Time out happened.\n"}, {1, kTag, "Mutex unlock failed. Error=1\n"}}));
}

TEST_F(EventWait, DestroyWakesWaitersAndWaitsForThemToLeave) {
    const LogCapture log;
    Bedside bedsides[2];
    std::thread unlimited([&] {
        TAVO_Event* event = event_;
        bedsides[0].going_to_sleep();
        EXPECT_EQ(tavo_osal_event_waitset(event, TAVO_EVENT_FOREVER), TAVO_SUCCESS);
    });
    bedsides[0].wait_until_asleep();
    std::thread timed([&] {
        TAVO_Event* event = event_;
        bedsides[1].going_to_sleep();
        EXPECT_EQ(tavo_osal_event_waitset_with_flag(event, 60000, 1), TAVO_SUCCESS);
    });
    bedsides[1].wait_until_asleep();
    EXPECT_EQ(tavo_osal_event_destroy(&event_), TAVO_SUCCESS);
    EXPECT_EQ(event_, nullptr);
    unlimited.join();
    timed.join();
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

// What many threads take is what many threads set.
TEST_F(EventWait, CountsAreNeitherLostNorInvented) {
    constexpr int kThreads = 3;
    constexpr int kSets = 2000;
    std::thread setters[kThreads];
    for (std::thread& setter : setters) {
        setter = std::thread([&] {
            for (int i = 0; i < kSets; ++i) ASSERT_EQ(tavo_osal_event_set(event_), TAVO_SUCCESS);
        });
    }
    for (std::thread& setter : setters) setter.join();
    EXPECT_EQ(counts(), kThreads * kSets);
}

}  // namespace
