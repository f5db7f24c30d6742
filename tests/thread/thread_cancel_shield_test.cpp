// Cancellations that arrive at inconvenient moments: hooks send the calling thread the signal from within the library.
#include <gtest/gtest.h>
#include <sched.h>
#include <signal.h>
#include <sys/time.h>
#include <unistd.h>

#include <atomic>
#include <cstdarg>
#include <cstdlib>
#include <vector>

#include "asleep.h"
#include "event_counts.h"
#include "support/platform_fault.h"
#include "tavo_osal/condition.h"
#include "tavo_osal/event.h"
#include "tavo_osal/log.h"
#include "tavo_osal/thread.h"

namespace {

using tavo::test::kThreadSanitizer;
using tavo::test::PlatformHook;
using tavo::test::take_counts;

constexpr char kLibrary[] = "libtavoosal.so";

void* do_nothing(void*) { return nullptr; }

// One event and one thread that uses it; afterwards the event must be as usable as before.
class ThreadCancelShield : public testing::Test {
protected:
    void SetUp() override {
        ASSERT_EQ(tavo_osal_event_create(&event_), TAVO_SUCCESS);
        // The hooks do not ask the library to send the signal, so its handler must be there before the thread is.
        pthread_t thread = {};
        ASSERT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
        ASSERT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
        g_came_back = false;
        g_in_hook = 0;
    }
    void TearDown() override { EXPECT_EQ(tavo_osal_event_destroy(&event_), TAVO_SUCCESS); }

    // Runs the code to the thread's end. True when the thread was cancelled.
    bool cancelled_in(void* (*code)(void*)) {
        pthread_t thread = {};
        EXPECT_EQ(tavo_osal_thread_create(&thread, code, event_), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
        return !g_came_back;
    }

    static bool g_came_back;
    static volatile sig_atomic_t g_in_hook;
    TAVO_Event* event_ = nullptr;
};

bool ThreadCancelShield::g_came_back;
volatile sig_atomic_t ThreadCancelShield::g_in_hook;

void cancel_this_thread() { pthread_kill(pthread_self(), SIGUSR2); }

TEST_F(ThreadCancelShield, ASetIsFinishedBeforeTheThreadEnds) {
    const PlatformHook hook(
        kLibrary, "pthread_cond_signal", +[](pthread_cond_t* condition) {
            cancel_this_thread();
            g_in_hook = 1;
            return pthread_cond_signal(condition);
        });
    EXPECT_TRUE(cancelled_in(+[](void* event) -> void* {
        tavo_osal_event_set(static_cast<TAVO_Event*>(event));
        g_came_back = true;
        return nullptr;
    }));
    EXPECT_EQ(g_in_hook, 1) << "put off until the event's lock is released";
    EXPECT_EQ(take_counts(event_), 1);
}

TEST_F(ThreadCancelShield, AWaitThatHasNotBegunToSleepEndsTheThreadInsteadAndReleasesTheLock) {
    const PlatformHook hook(
        kLibrary, "gettimeofday", +[](timeval* now, void*) {
            cancel_this_thread();
            g_in_hook = 1;
            return gettimeofday(now, nullptr);
        });
    EXPECT_TRUE(cancelled_in(+[](void* event) -> void* {
        tavo_osal_event_waitset(static_cast<TAVO_Event*>(event), 1000000);
        g_came_back = true;
        return nullptr;
    }));
    EXPECT_EQ(g_in_hook, 1);
    EXPECT_EQ(take_counts(event_), 0);
}

TEST_F(ThreadCancelShield, ASignalRightBeforeTheSleepEndsTheThread) {
    {
        const PlatformHook hook(
            kLibrary, "pthread_cond_wait", +[](pthread_cond_t* condition, pthread_mutex_t* mutex) {
                cancel_this_thread();
                g_in_hook = 1;
                return pthread_cond_wait(condition, mutex);
            });
        EXPECT_TRUE(cancelled_in(+[](void* event) -> void* {
            tavo_osal_event_waitset(static_cast<TAVO_Event*>(event), TAVO_EVENT_FOREVER);
            g_came_back = true;
            return nullptr;
        }));
    }
    EXPECT_EQ(g_in_hook, 1) << "not ended where the C library's accounts are open";
    EXPECT_EQ(take_counts(event_), 0);
}

TEST_F(ThreadCancelShield, ASignalRightAfterTheSleepEndsTheThreadOnceTheWaitIsFinished) {
    {
        const PlatformHook hook(
            kLibrary, "pthread_cond_wait", +[](pthread_cond_t*, pthread_mutex_t*) {
                cancel_this_thread();
                g_in_hook = 1;
                return 0;
            });
        EXPECT_TRUE(cancelled_in(+[](void* event) -> void* {
            tavo_osal_event_waitset(static_cast<TAVO_Event*>(event), TAVO_EVENT_FOREVER);
            g_came_back = true;
            return nullptr;
        }));
    }
    EXPECT_EQ(g_in_hook, 1);
    EXPECT_EQ(take_counts(event_), 0);
}

TEST_F(ThreadCancelShield, AnAllocationIsFinishedBeforeTheThreadEnds) {
    static TAVO_Mutex* mutex;
    mutex = nullptr;
    const PlatformHook hook(
        kLibrary, "malloc", +[](size_t size) {
            cancel_this_thread();
            g_in_hook = 1;
            return malloc(size);
        });
    EXPECT_TRUE(cancelled_in(+[](void*) -> void* {
        tavo_osal_mutex_create(&mutex);
        g_came_back = true;
        return nullptr;
    }));
    EXPECT_EQ(g_in_hook, 1);
    ASSERT_NE(mutex, nullptr);
    EXPECT_EQ(tavo_osal_mutex_destroy(&mutex), TAVO_SUCCESS);
}

TEST_F(ThreadCancelShield, AMessageIsFinishedBeforeTheThreadEnds) {
    const PlatformHook hook(
        kLibrary, "__android_log_vprint", +[](int, const char*, const char*, va_list) {
            if (g_in_hook == 0) cancel_this_thread();
            g_in_hook = 1;
            return 1;
        });
    EXPECT_TRUE(cancelled_in(+[](void*) -> void* {
        tavo_print_log(TAVO_LOG_ERROR, 0, __LINE__, "TAG", "interrupted\n");
        g_came_back = true;
        return nullptr;
    }));
    EXPECT_EQ(g_in_hook, 1);
}

// Cancels threads that never stop using one event, at whatever instruction they happen to be. What is left behind must
// not keep the next one, or the test, from using it.
TEST_F(ThreadCancelShield, NoMomentIsABadOneForCancellingAThreadThatUsesAnEvent) {
    // Under load it was seen to keep a delivered signal to itself until the thread's next blocking call, which a
    // thread that uses an event on its own need not make.
    if (kThreadSanitizer) GTEST_SKIP() << "ThreadSanitizer may hold a signal back for ever";
    // Threads of a sanitizer's must not be ended before they have begun.
    static std::atomic<int> begun;
    const auto use = +[](void* opaque) -> void* {
        auto* event = static_cast<TAVO_Event*>(opaque);
        ++begun;
        for (;;) {
            tavo_osal_event_set(event);
            tavo_osal_event_waitset(event, TAVO_EVENT_FOREVER);
            tavo_osal_event_set_with_flag(event, 1);
            tavo_osal_event_waitset_with_flag(event, 5000, 1);
            tavo_osal_event_clear(event);
        }
    };
    constexpr int rounds = 500;
    constexpr size_t at_once = 2;
    for (int round = 0; round < rounds; ++round) {
        std::vector<pthread_t> threads(at_once);
        begun = 0;
        for (pthread_t& thread : threads) ASSERT_EQ(tavo_osal_thread_create(&thread, use, event_), TAVO_SUCCESS);
        while (begun != static_cast<int>(at_once)) sched_yield();
        usleep(static_cast<useconds_t>(round % 50) * 10);
        for (const pthread_t thread : threads) EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
        for (const pthread_t thread : threads) EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
        ASSERT_EQ(tavo_osal_event_clear(event_), TAVO_SUCCESS);
    }
}

}  // namespace
