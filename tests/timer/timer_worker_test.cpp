// The worker: what fails in it, what interrupts it, and what is left of it.
#include <gtest/gtest.h>
#include <pthread.h>
#include <signal.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <thread>

#include "../thread/asleep.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/thread.h"
#include "tick_driver.h"
#include "timer/timer_slots.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_TIMER";
constexpr char kThreadTag[] = "OSAL_THREAD";

// Which of the worker's calls are to fail, counted from 1 within a round.
std::atomic<int> g_failing_lock;
std::atomic<int> g_failing_unlock;
std::atomic<int> g_locks;
std::atomic<int> g_unlocks;
pthread_t g_test_thread;

bool on_worker() { return !pthread_equal(pthread_self(), g_test_thread); }

// Both do their work even where they claim to have failed, so that the mutex stays usable.
int lock(pthread_mutex_t* mutex) {
    const bool fails = on_worker() && ++g_locks == g_failing_lock;
    pthread_mutex_lock(mutex);
    return fails ? EINVAL : 0;
}

int unlock(pthread_mutex_t* mutex) {
    const bool fails = on_worker() && ++g_unlocks == g_failing_unlock;
    pthread_mutex_unlock(mutex);
    return fails ? EPERM : 0;
}

class TimerWorkerFailure : public tavo::test::DrivenTimers {
protected:
    void SetUp() override {
        g_test_thread = pthread_self();
        g_failing_lock = g_failing_unlock = 0;
    }
    // One round in which the n-th lock or unlock fails, 0 for none.
    void failing_tick(int failing_lock, int failing_unlock) {
        g_locks = g_unlocks = 0;
        g_failing_lock = failing_lock;
        g_failing_unlock = failing_unlock;
        const PlatformHook lock_hook(kLibrary, "pthread_mutex_lock", &lock);
        const PlatformHook unlock_hook(kLibrary, "pthread_mutex_unlock", &unlock);
        tick();
    }

    int calls_ = 0;
};

TEST_F(TimerWorkerFailure, OfALockIsLoggedAndTheSlotIsServedAsIfItWereLocked) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 20, 0, count_call, &calls_);
    const LogCapture log(2);
    failing_tick(1, 0);
    EXPECT_EQ(timer->iCount, 10);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{1, kThreadTag, "Mutex lock failed. Error=22\n"}, {1, kTag, "Mutex lock failed.\n"}}));
    EXPECT_EQ(g_unlocks, 5) << "the round goes on";
}

TEST_F(TimerWorkerFailure, OfAnOrdinaryUnlockAbandonsTheRound) {
    TAVO_Timer* first = create_started(TAVO_TIMER_ONE_SHOT, 20, 0, count_call, &calls_);
    TAVO_Timer* second = create_started(TAVO_TIMER_ONE_SHOT, 20, 0, count_call, &calls_);
    const LogCapture log(2);
    failing_tick(0, 1);
    EXPECT_EQ(first->iCount, 10) << "the change stays";
    EXPECT_EQ(second->iCount, 20);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, kThreadTag, "Mutex unlock failed. Error=1\n"}, {1, kTag, "Mutex unlock failed \n"}}));
    tick(2);
    EXPECT_EQ(calls_, 1);
    tick();
    EXPECT_EQ(calls_, 2);
}

TEST_F(TimerWorkerFailure, OfTheUnlockOfAFreeSlotAbandonsTheRoundToo) {
    TAVO_Timer* free_one = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    TAVO_Timer* second = create_started(TAVO_TIMER_ONE_SHOT, 20, 0, count_call, &calls_);
    ASSERT_EQ(tavo_osal_timer_free(framework(), free_one), TAVO_SUCCESS);
    const LogCapture log(2);
    failing_tick(0, 1);
    EXPECT_EQ(second->iCount, 20);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, kThreadTag, "Mutex unlock failed. Error=1\n"}, {1, kTag, "Mutex unlock failed \n"}}));
}

TEST_F(TimerWorkerFailure, OfTheUnlockAtAnExpiryPutsTheCallbackOffToALaterRound) {
    TAVO_Timer* first = create_started(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    TAVO_Timer* second = create_started(TAVO_TIMER_ONE_SHOT, 20, 0, count_call, &calls_);
    tick();
    const LogCapture log(2);
    failing_tick(0, 1);
    EXPECT_EQ(calls_, 0);
    EXPECT_EQ(running(first), 1);
    EXPECT_EQ(first->iCount, 0);
    EXPECT_EQ(second->iCount, 10) << "the rest of the round is abandoned";
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, kThreadTag, "Mutex unlock failed. Error=1\n"}, {1, kTag, "Mutex unlock failed.\n"}}));
    tick();
    EXPECT_EQ(calls_, 1);
    EXPECT_EQ(running(first), 0);
}

TEST(TimerWorker, AFailingSleepOnlyMakesTheTickShort) {
    static std::atomic<int> sleeps;
    sleeps = 0;
    const LogCapture log(2);
    TAVO_TimerFramework* framework = nullptr;
    const PlatformHook hook(
        kLibrary, "usleep", +[](useconds_t) {
            ++sleeps;
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
            errno = EINTR;
            return -1;
        });
    ASSERT_EQ(tavo_osal_timer_framework_init(1000, &framework), TAVO_SUCCESS);
    while (sleeps < 3) std::this_thread::yield();
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework), TAVO_SUCCESS);
    for (const auto& line : log.lines()) EXPECT_EQ(line, (tavo::test::ExpectedLine{1, kThreadTag, "Sleep failed.\n"}));
    EXPECT_GE(log.lines().size(), 3U);
}

TEST(TimerWorker, CancelledInItsSleepLeavesAFrameworkThatCanBeUsedAndEnded) {
    TAVO_TimerFramework* framework = nullptr;
    ASSERT_EQ(tavo_osal_timer_framework_init(1000000, &framework), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_cancel(framework->thread), TAVO_SUCCESS);
    TAVO_Timer* timer = nullptr;
    EXPECT_EQ(tavo_osal_timer_create(
                  framework, nullptr, TAVO_TIMER_ONE_SHOT, 1000000, 0, +[](void* argument) { return argument; },
                  nullptr, &timer),
              TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_start(framework, timer, 1000000), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework), TAVO_SUCCESS);
}

class TimerCancellation : public tavo::test::DrivenTimers {};

TEST_F(TimerCancellation, OfAThreadInTheFrameworksMutexIsPutOffUntilItHasLeft) {
    static TAVO_TimerFramework* the_framework;
    static TAVO_Timer* the_timer;
    static bool came_back;
    came_back = false;
    the_framework = framework();
    the_timer = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, nullptr);
    {
        const PlatformHook hook(
            kLibrary, "pthread_mutex_lock", +[](pthread_mutex_t* mutex) {
                const int error = pthread_mutex_lock(mutex);
                if (static_cast<void*>(mutex) == static_cast<void*>(the_framework->mutex)) {
                    pthread_kill(pthread_self(), SIGUSR2);
                }
                return error;
            });
        pthread_t thread = {};
        ASSERT_EQ(pthread_create(
                      &thread, nullptr,
                      +[](void*) -> void* {
                          tavo_osal_timer_start(the_framework, the_timer, 10);
                          came_back = true;
                          return nullptr;
                      },
                      nullptr),
                  0);
        ASSERT_EQ(pthread_join(thread, nullptr), 0);
    }
    EXPECT_FALSE(came_back);
    EXPECT_EQ(running(the_timer), 1);
    EXPECT_EQ(tavo_osal_timer_stop(framework(), the_timer), TAVO_SUCCESS) << "without a deadlock";
}

TEST(TimerWorker, AThousandFrameworksLeaveNothingBehind) {
    static std::atomic<int> blocks;
    blocks = 0;
    const PlatformHook allocate(
        kLibrary, "malloc", +[](size_t size) {
            ++blocks;
            return malloc(size);
        });
    const PlatformHook release(
        kLibrary, "free", +[](void* block) {
            if (block != nullptr) --blocks;
            free(block);
        });
    const PlatformHook sleep(
        kLibrary, "usleep", +[](useconds_t) { return sched_yield(); });
    const auto round = [] {
        TAVO_TimerFramework* framework = nullptr;
        ASSERT_EQ(tavo_osal_timer_framework_init(1, &framework), TAVO_SUCCESS);
        ASSERT_EQ(tavo_osal_timer_framework_uninit(framework), TAVO_SUCCESS);
    };
    round();
    const size_t threads = tavo::test::count_threads();
    const size_t descriptors = tavo::test::count_descriptors();
    const size_t mappings = tavo::test::count_mappings();
    for (int i = 0; i < 1000; ++i) round();
    // The kernel takes a joined thread off its list a moment after the join.
    for (int i = 0; i < 1000 && tavo::test::count_threads() != threads; ++i) usleep(1000);
    EXPECT_EQ(tavo::test::count_threads(), threads);
    EXPECT_EQ(tavo::test::count_descriptors(), descriptors);
    if (!tavo::test::kThreadSanitizer) {  // which maps memory of its own
        EXPECT_LE(tavo::test::count_mappings(), mappings + 8) << "a stack each would be a thousand";
    }
    EXPECT_EQ(blocks, 0);
}

// A real worker and three threads that do everything at once, for the sanitizers' benefit.
TEST(TimerWorker, EveryOperationMayRunAtAnyTime) {
    TAVO_TimerFramework* framework = nullptr;
    ASSERT_EQ(tavo_osal_timer_framework_init(1, &framework), TAVO_SUCCESS);
    std::atomic<int> calls{0};
    const auto count = +[](void* counter) -> void* {
        ++*static_cast<std::atomic<int>*>(counter);
        return nullptr;
    };
    std::atomic<bool> done{false};
    const auto use = [&] {
        while (!done) {
            TAVO_Timer* timer = nullptr;
            ASSERT_EQ(tavo_osal_timer_create(framework, "n", TAVO_TIMER_PERIODIC, 1, 1, count, &calls, &timer),
                      TAVO_SUCCESS);
            ASSERT_EQ(tavo_osal_timer_start(framework, timer, 1), TAVO_SUCCESS);
            while (!done && calls < 5 && tavo_osal_is_timer_running(framework, timer) == 1) std::this_thread::yield();
            ASSERT_EQ(tavo_osal_timer_stop(framework, timer), TAVO_SUCCESS);
            ASSERT_EQ(tavo_osal_timer_restart(framework, timer), TAVO_SUCCESS);
            std::this_thread::sleep_for(std::chrono::microseconds(500));
            ASSERT_EQ(tavo_osal_timer_free(framework, timer), TAVO_SUCCESS);
        }
    };
    std::thread users[3];
    for (std::thread& user : users) user = std::thread(use);
    // Users who keep taking the mutex leave the worker few chances to fire, and fewest of all under ThreadSanitizer.
    while (calls < 10) std::this_thread::sleep_for(std::chrono::milliseconds(1));
    done = true;
    for (std::thread& user : users) user.join();
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework), TAVO_SUCCESS);
}

}  // namespace
