#include "tavo_osal/condition.h"

#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/time.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <limits>
#include <thread>

#include "asleep.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/memory.h"

namespace {

using tavo::test::Bedside;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_THREAD";

class Condition : public testing::Test {
protected:
    void SetUp() override {
        ASSERT_EQ(tavo_osal_thread_condition_create(&condition_), TAVO_SUCCESS);
        ASSERT_EQ(tavo_osal_mutex_create(&mutex_), TAVO_SUCCESS);
    }
    void TearDown() override {
        if (condition_ != nullptr) {
            EXPECT_EQ(tavo_osal_thread_condition_destroy(&condition_), TAVO_SUCCESS);
        }
        EXPECT_EQ(tavo_osal_mutex_destroy(&mutex_), TAVO_SUCCESS);
    }

    // A wait that an error ends at once; the mutex is held during it.
    TAVO_Status timed_wait(uint64_t timeout_ms) {
        EXPECT_EQ(tavo_osal_mutex_lock(mutex_), TAVO_SUCCESS);
        const TAVO_Status status = tavo_osal_thread_condition_timedwait(condition_, mutex_, timeout_ms);
        EXPECT_EQ(tavo_osal_mutex_unlock(mutex_), TAVO_SUCCESS);
        return status;
    }

    TAVO_Condition* condition_ = nullptr;
    TAVO_Mutex* mutex_ = nullptr;
};

// The time of day that the library reads, and the deadline it makes of it.
timeval g_now;
timespec g_deadline;

int given_time(timeval* now, void*) {
    *now = g_now;
    return 0;
}

int note_deadline(pthread_cond_t*, pthread_mutex_t*, const timespec* deadline) {
    g_deadline = *deadline;
    return ETIMEDOUT;
}

TEST_F(Condition, CreateLogsNothing) {
    const LogCapture log;
    TAVO_Condition* condition = nullptr;
    EXPECT_EQ(tavo_osal_thread_condition_create(&condition), TAVO_SUCCESS);
    EXPECT_NE(condition, nullptr);
    EXPECT_EQ(tavo_osal_thread_condition_destroy(&condition), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST_F(Condition, CreateRefusesANullPointer) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_condition_create(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid condition variable pointer\n"}}));
}

TEST_F(Condition, CreateWithoutMemoryReportsItAndClearsTheHandle) {
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "malloc", +[](size_t) -> void* { return nullptr; });
    TAVO_Condition* condition = condition_;
    EXPECT_EQ(tavo_osal_thread_condition_create(&condition), TAVO_NO_MEMORY);
    EXPECT_EQ(condition, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(kTag), {{1, kTag, "Memory allocation for condition variable failed\n"}}));
}

TEST_F(Condition, CreateThatThePlatformRefusesLeavesTheBlockInTheHandle) {
    const LogCapture log;
    TAVO_Condition* condition = nullptr;
    {
        const PlatformHook hook(
            kLibrary, "pthread_cond_init", +[](pthread_cond_t*, const pthread_condattr_t*) { return ENOMEM; });
        EXPECT_EQ(tavo_osal_thread_condition_create(&condition), TAVO_FAILURE);
    }
    ASSERT_NE(condition, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Condition variable initialization failed: error=12\n"}}));
    tavo_osal_mem_free(condition);  // The block is the caller's: without this the leak check complains.
}

TEST_F(Condition, CreatePassesNoAttributes) {
    static bool with_attributes;
    with_attributes = true;
    const PlatformHook hook(
        kLibrary, "pthread_cond_init", +[](pthread_cond_t* condition, const pthread_condattr_t* attributes) {
            with_attributes = attributes != nullptr;
            return pthread_cond_init(condition, attributes);
        });
    TAVO_Condition* condition = nullptr;
    ASSERT_EQ(tavo_osal_thread_condition_create(&condition), TAVO_SUCCESS);
    EXPECT_FALSE(with_attributes);
    EXPECT_EQ(tavo_osal_thread_condition_destroy(&condition), TAVO_SUCCESS);
}

TEST_F(Condition, SignalWakesOneWaiterAndBroadcastTheRest) {
    Bedside bedsides[3];
    int awake = 0;
    std::thread waiters[3];
    for (int i = 0; i < 3; ++i) {
        waiters[i] = std::thread([&, i] {
            tavo_osal_mutex_lock(mutex_);
            bedsides[i].going_to_sleep();
            EXPECT_EQ(tavo_osal_thread_condition_wait(condition_, mutex_), TAVO_SUCCESS);
            ++awake;
            tavo_osal_mutex_unlock(mutex_);
        });
        bedsides[i].wait_until_asleep();
    }
    const auto awake_now = [&] {
        tavo_osal_mutex_lock(mutex_);
        const int count = awake;
        tavo_osal_mutex_unlock(mutex_);
        return count;
    };
    EXPECT_EQ(tavo_osal_thread_condition_signal(condition_), TAVO_SUCCESS);
    while (awake_now() == 0) std::this_thread::yield();
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(awake_now(), 1);
    EXPECT_EQ(tavo_osal_thread_condition_broadcast(condition_), TAVO_SUCCESS);
    for (std::thread& waiter : waiters) waiter.join();
    EXPECT_EQ(awake, 3);
}

TEST_F(Condition, WaitsRefuseNullHandles) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_condition_wait(nullptr, mutex_), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_thread_condition_wait(condition_, nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_thread_condition_timedwait(nullptr, mutex_, 0), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_thread_condition_timedwait(condition_, nullptr, 0), TAVO_INVALID_PARAM);
    const tavo::test::ExpectedLine wait{1, kTag, "Invalid mutex or condition variable \n"};
    const tavo::test::ExpectedLine timed{1, kTag, "Invalid mutex or condition variable pointer \n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {wait, wait, timed, timed}));
}

TEST_F(Condition, WaitReportsThePlatformsError) {
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "pthread_cond_wait", +[](pthread_cond_t*, pthread_mutex_t*) { return EPERM; });
    EXPECT_EQ(tavo_osal_thread_condition_wait(condition_, mutex_), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Wait on condition variable failed: Error=1\n"}}));
}

TEST_F(Condition, TimedWaitIsEndedByASignal) {
    Bedside bedside;
    std::thread waiter([&] {
        tavo_osal_mutex_lock(mutex_);
        bedside.going_to_sleep();
        EXPECT_EQ(tavo_osal_thread_condition_timedwait(condition_, mutex_, 60000), TAVO_SUCCESS);
        tavo_osal_mutex_unlock(mutex_);
    });
    bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_condition_signal(condition_), TAVO_SUCCESS);
    waiter.join();
}

TEST_F(Condition, TimedWaitOfZeroTimesOutAtOnceWithoutAMessageAndHoldsTheMutexAgain) {
    const LogCapture log(3);
    ASSERT_EQ(tavo_osal_mutex_lock(mutex_), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_condition_timedwait(condition_, mutex_, 0), TAVO_CONDITION_TIMEOUT);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(tavo_osal_mutex_try_lock(mutex_), TAVO_BUSY);
    EXPECT_EQ(tavo_osal_mutex_unlock(mutex_), TAVO_SUCCESS);
}

TEST_F(Condition, TimedWaitWaitsAboutAsLongAsAsked) {
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(timed_wait(1000), TAVO_CONDITION_TIMEOUT);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(900));
}

TEST_F(Condition, TimedWaitDeadlineDoesNotCarryNanosecondsIntoTheSeconds) {
    const PlatformHook clock(kLibrary, "gettimeofday", &given_time);
    const PlatformHook wait(kLibrary, "pthread_cond_timedwait", &note_deadline);
    g_now = {1000, 600000};
    EXPECT_EQ(timed_wait(1500), TAVO_CONDITION_TIMEOUT);
    EXPECT_EQ(g_deadline.tv_sec, 1001);
    EXPECT_EQ(g_deadline.tv_nsec, 1100000000L);
    g_now = {1000, 499999};
    EXPECT_EQ(timed_wait(2500), TAVO_CONDITION_TIMEOUT);
    EXPECT_EQ(g_deadline.tv_sec, 1002);
    EXPECT_EQ(g_deadline.tv_nsec, 999999000L);
}

TEST_F(Condition, TimedWaitTakesA64BitTimeout) {
    const PlatformHook clock(kLibrary, "gettimeofday", &given_time);
    const PlatformHook wait(kLibrary, "pthread_cond_timedwait", &note_deadline);
    g_now = {1, 0};
    EXPECT_EQ(timed_wait(0x100000000ULL), TAVO_CONDITION_TIMEOUT);
    EXPECT_EQ(g_deadline.tv_sec, 1 + 4294967);
    EXPECT_EQ(g_deadline.tv_nsec, 296000000L);
}

TEST_F(Condition, TimedWaitBeyondThePlatformsTimeLastsAsLongAsAnyCan) {
    const PlatformHook clock(kLibrary, "gettimeofday", &given_time);
    const PlatformHook wait(kLibrary, "pthread_cond_timedwait", &note_deadline);
    constexpr time_t kLast = std::numeric_limits<time_t>::max();
    g_now = {kLast - 5, 0};
    EXPECT_EQ(timed_wait(4999), TAVO_CONDITION_TIMEOUT);
    EXPECT_EQ(g_deadline.tv_sec, kLast - 1);
    EXPECT_EQ(timed_wait(6000), TAVO_CONDITION_TIMEOUT);
    EXPECT_EQ(g_deadline.tv_sec, kLast);
    EXPECT_EQ(timed_wait(UINT64_MAX), TAVO_CONDITION_TIMEOUT);
    EXPECT_EQ(g_deadline.tv_sec, kLast);
}

TEST_F(Condition, TimedWaitWhoseNanosecondsReachASecondFailsInsteadOfWaiting) {
    const LogCapture log(2);
    const PlatformHook clock(
        kLibrary, "gettimeofday", +[](timeval* now, void*) {
            const int result = gettimeofday(now, nullptr);
            now->tv_usec = 500000;
            return result;
        });
    EXPECT_EQ(timed_wait(1500), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Wait on condition variable failed: errno=22\n"}}));
}

TEST_F(Condition, TimedWaitReportsAnUnreadableClock) {
    const LogCapture log(2);
    const PlatformHook clock(
        kLibrary, "gettimeofday", +[](timeval*, void*) {
            errno = EFAULT;
            return -1;
        });
    EXPECT_EQ(timed_wait(1000), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Failed to get time of day.\n"}}));
}

TEST_F(Condition, SignalAndBroadcastRefuseANullHandle) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_condition_signal(nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_thread_condition_broadcast(nullptr), TAVO_INVALID_PARAM);
    const tavo::test::ExpectedLine line{1, kTag, "Invalid condition variable \n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
}

TEST_F(Condition, SignalAndBroadcastReportThePlatformsError) {
    const LogCapture log;
    const PlatformHook signal(
        kLibrary, "pthread_cond_signal", +[](pthread_cond_t*) { return EINVAL; });
    const PlatformHook broadcast(
        kLibrary, "pthread_cond_broadcast", +[](pthread_cond_t*) { return EPERM; });
    EXPECT_EQ(tavo_osal_thread_condition_signal(condition_), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_condition_broadcast(condition_), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{1, kTag, "Failed to unblock the thread waiting on condition variable. Error=22\n"},
                                {1, kTag, "Failed to unblock all threads waiting on condition variable. Error=1\n"}}));
}

TEST_F(Condition, DestroyRefusesANullPointerAndANullHandle) {
    const LogCapture log;
    TAVO_Condition* none = nullptr;
    EXPECT_EQ(tavo_osal_thread_condition_destroy(nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_thread_condition_destroy(&none), TAVO_INVALID_PARAM);
    const tavo::test::ExpectedLine line{1, kTag, "Invalid condition variable \n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
}

int g_released = 0;

void count_release(void* block) {
    ++g_released;
    free(block);
}

TEST_F(Condition, DestroyReleasesTheBlockAndClearsTheHandle) {
    const PlatformHook hook(kLibrary, "tavo_osal_mem_free", &count_release);
    EXPECT_EQ(tavo_osal_thread_condition_destroy(&condition_), TAVO_SUCCESS);
    EXPECT_EQ(condition_, nullptr);
    EXPECT_EQ(g_released, 1);
}

TEST_F(Condition, DestroyThatThePlatformRefusesKeepsTheBlockAndTheHandle) {
    const TAVO_Condition* before = condition_;
    const LogCapture log;
    {
        const PlatformHook hook(kLibrary, "tavo_osal_mem_free", &count_release);
        const PlatformHook destroy(
            kLibrary, "pthread_cond_destroy", +[](pthread_cond_t*) { return EBUSY; });
        EXPECT_EQ(tavo_osal_thread_condition_destroy(&condition_), TAVO_FAILURE);
    }
    EXPECT_EQ(condition_, before);
    EXPECT_EQ(g_released, 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Failed to destroy the condition variable: RetVal=16\n"}}));
}

}  // namespace
