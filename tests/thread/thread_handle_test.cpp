// Handles of threads that are gone, and of the threads that were given the same handle afterwards.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <condition_variable>
#include <cstdarg>
#include <cstdint>
#include <deque>
#include <future>
#include <mutex>
#include <utility>
#include <vector>

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

void* do_nothing(void*) { return nullptr; }

void* sleep_for_ever(void* bedside) {
    static_cast<Bedside*>(bedside)->going_to_sleep();
    for (;;) pause();
}

void* sleep_a_little(void*) {
    usleep(50000);
    return nullptr;
}

pthread_t joined_thread() {
    pthread_t thread = {};
    EXPECT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    return thread;
}

// Makes the platform's functions for handles of threads fail the test when they are called.
int refuse_touch(pthread_t) {
    ADD_FAILURE() << "a dead handle was given to the platform";
    return 0;
}
class NothingTouchesHandles {
    const PlatformHook kill_{kLibrary, "pthread_kill", +[](pthread_t thread, int) { return refuse_touch(thread); }};
    const PlatformHook join_{kLibrary, "pthread_join", +[](pthread_t thread, void**) { return refuse_touch(thread); }};
    const PlatformHook detach_{kLibrary, "pthread_detach", &refuse_touch};
    const PlatformHook get_{kLibrary, "pthread_getschedparam",
                            +[](pthread_t thread, int*, sched_param*) { return refuse_touch(thread); }};
    const PlatformHook set_{kLibrary, "pthread_setschedparam",
                            +[](pthread_t thread, int, const sched_param*) { return refuse_touch(thread); }};
};

// A thread made by other means that was given the dead thread's handle; false when the platform would not do it.
bool start_with_handle(pthread_t wanted, void* (*start)(void*), void* argument) {
    for (int i = 0; i < 20; ++i) {
        pthread_t thread = {};
        EXPECT_EQ(pthread_create(&thread, nullptr, start, argument), 0);
        if (pthread_equal(thread, wanted)) return true;
        EXPECT_EQ(pthread_kill(thread, SIGUSR2), 0);
        EXPECT_EQ(pthread_join(thread, nullptr), 0);
    }
    return false;
}

TEST(ThreadHandle, CancelOfAJoinedThreadSucceedsSilentlyWithoutTouchingIt) {
    const pthread_t thread = joined_thread();
    const NothingTouchesHandles guard;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(ThreadHandle, JoinKillAndDetachOfAJoinedThreadFailAsForNoSuchThread) {
    const pthread_t thread = joined_thread();
    const NothingTouchesHandles guard;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_kill(thread), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread join failed. iRet=3\n"},
                                             {1, kTag, "Thread kill Failed. Error= 3\n"},
                                             {1, kTag, "Thread detach failed. iRet=3\n"}}));
}

TEST(ThreadHandle, PriorityOfAJoinedThreadCannotBeReadOrSet) {
    const pthread_t thread = joined_thread();
    const NothingTouchesHandles guard;
    const LogCapture log;
    errno = 0;
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(thread, 5, 1), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{2, kTag, "pthread_getschedparam failed\n"}, {1, kTag, "Set sched_param failed. errno 0\n"}}));
}

TEST(ThreadHandle, NobodysHandleIsNoSuchThread) {
    const NothingTouchesHandles guard;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_cancel(pthread_t{}), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(tavo_osal_thread_join(pthread_t{}), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_detach(pthread_t{}), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_kill(pthread_t{}), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_t{}, 5, 1), TAVO_FAILURE);
}

TEST(ThreadHandle, ANewThreadWithAJoinedOnesHandleIsAnOrdinaryThread) {
    const pthread_t old = joined_thread();
    for (int i = 0; i < 20; ++i) {
        Bedside bedside;
        pthread_t thread = {};
        ASSERT_EQ(tavo_osal_thread_create(&thread, sleep_for_ever, &bedside), TAVO_SUCCESS);
        bedside.wait_until_asleep();
        EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
        if (pthread_equal(thread, old)) return;
    }
    GTEST_SKIP() << "the platform does not give a handle again";
}

TEST(ThreadHandle, AThreadOfOtherOriginWithAJoinedOnesHandleCanBeCancelled) {
    const pthread_t old = joined_thread();
    const auto pause_for_ever = +[](void*) -> void* {
        for (;;) pause();
    };
    // At once, lest only threads that got as far as their own code are recognised.
    if (!start_with_handle(old, pause_for_ever, nullptr)) GTEST_SKIP() << "the platform does not give a handle again";
    EXPECT_EQ(tavo_osal_thread_cancel(old), TAVO_SUCCESS);
    EXPECT_EQ(pthread_join(old, nullptr), 0);
}

TEST(ThreadHandle, AThreadOfOtherOriginWithAJoinedOnesHandleCanBeJoinedOnce) {
    const pthread_t old = joined_thread();
    if (!start_with_handle(old, sleep_a_little, nullptr)) GTEST_SKIP() << "the platform does not give a handle again";
    const LogCapture log(2);
    EXPECT_EQ(tavo_osal_thread_join(old), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(tavo_osal_thread_join(old), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread join failed. iRet=3\n"}}));
}

// Joins of made-up handles, each of which lasts until the test ends it. Threads are made up as well: all have handle 0.
class MadeUpThreads {
public:
    struct Join {
        size_t place;
        std::future<TAVO_Status> result;
    };

    MadeUpThreads() { g_threads = this; }
    ~MadeUpThreads() { g_threads = nullptr; }
    MadeUpThreads(const MadeUpThreads&) = delete;
    MadeUpThreads& operator=(const MadeUpThreads&) = delete;

    static pthread_t handle(size_t number) { return static_cast<pthread_t>(0x1000 * (number + 1)); }

    static void create() {
        pthread_t thread = {};
        EXPECT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
        EXPECT_TRUE(pthread_equal(thread, handle(0)));
    }
    // Returns when the join waits for the thread's end.
    Join begin_join(pthread_t thread) {
        std::unique_lock<std::mutex> lock(mutex_);
        const size_t place = ends_.size();
        auto result = std::async(std::launch::async, [thread] { return tavo_osal_thread_join(thread); });
        begun_.wait(lock, [&] { return ends_.size() > place; });
        return {place, std::move(result)};
    }
    TAVO_Status end(Join& join) {
        {
            const std::lock_guard<std::mutex> lock(mutex_);
            ends_[join.place].set_value();
        }
        return join.result.get();
    }

private:
    int join() {
        std::future<void> end;
        {
            const std::lock_guard<std::mutex> lock(mutex_);
            end = ends_.emplace_back().get_future();
        }
        begun_.notify_one();
        end.wait();
        return 0;
    }

    static inline MadeUpThreads* g_threads = nullptr;
    std::mutex mutex_;
    std::condition_variable begun_;
    std::deque<std::promise<void>> ends_;  // of all joins, in the order they began in
    const PlatformHook create_{kLibrary, "pthread_create",
                               +[](pthread_t* thread, const pthread_attr_t*, void* (*)(void*), void*) {
                                   *thread = handle(0);
                                   return 0;
                               }};
    const PlatformHook join_{kLibrary, "pthread_join", +[](pthread_t, void**) { return g_threads->join(); }};
    const PlatformHook detach_{kLibrary, "pthread_detach", +[](pthread_t) { return 0; }};
};

TEST(ThreadHandle, MoreJoinsAtOnceThanAreRememberedAreAllCarriedOut) {
    constexpr size_t kRemembered = 1024;
    MadeUpThreads threads;
    std::vector<MadeUpThreads::Join> joins;
    for (size_t i = 0; i <= kRemembered; ++i) joins.push_back(threads.begin_join(threads.handle(i)));
    const LogCapture log;
    // That a join is going on is known of those that are remembered, and a detached thread is forgotten as well.
    EXPECT_EQ(tavo_osal_thread_join(threads.handle(0)), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread join failed. iRet=22\n"}}));
    joins.push_back(threads.begin_join(threads.handle(kRemembered)));
    EXPECT_EQ(tavo_osal_thread_detach(threads.handle(kRemembered + 1)), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_detach(threads.handle(kRemembered + 1)), TAVO_SUCCESS);
    for (MadeUpThreads::Join& join : joins) EXPECT_EQ(threads.end(join), TAVO_SUCCESS);
    // There are places again.
    EXPECT_EQ(tavo_osal_thread_detach(threads.handle(kRemembered + 1)), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_detach(threads.handle(kRemembered + 1)), TAVO_FAILURE);
}

TEST(ThreadHandle, AJoinThatEndsLateSaysNothingOfTheNextThreadWithItsHandle) {
    MadeUpThreads threads;
    const pthread_t thread = threads.handle(0);
    MadeUpThreads::Join first = threads.begin_join(thread);
    threads.create();
    EXPECT_EQ(threads.end(first), TAVO_SUCCESS);
    MadeUpThreads::Join second = threads.begin_join(thread);
    threads.create();
    MadeUpThreads::Join third = threads.begin_join(thread);
    EXPECT_EQ(threads.end(second), TAVO_SUCCESS);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread join failed. iRet=22\n"}}));
    threads.create();
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_SUCCESS);
    EXPECT_EQ(threads.end(third), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_FAILURE);
}

TEST(ThreadHandle, AThreadThatHasEndedAndIsBeingJoinedCannotBeKilled) {
    MadeUpThreads threads;
    MadeUpThreads::Join join = threads.begin_join(threads.handle(0));
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_kill(threads.handle(0)), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread kill Failed. Error= 3\n"}}));
    EXPECT_EQ(threads.end(join), TAVO_SUCCESS);
}

TEST(ThreadHandle, ADetachedThreadCanBeCancelledButNotJoinedOrDetachedAgain) {
    Bedside bedside;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, sleep_for_ever, &bedside), TAVO_SUCCESS);
    bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_SUCCESS);
    const LogCapture log(2);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, kTag, "Thread join failed. iRet=22\n"}, {1, kTag, "Thread detach failed. iRet=22\n"}}));
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
}

long refuse_to_signal(long number, ...) {
    va_list values;
    va_start(values, number);
    long value[4];
    for (long& one : value) one = va_arg(values, long);
    va_end(values);
    if (number != SYS_tgkill) return syscall(number, value[0], value[1], value[2], value[3]);
    errno = EPERM;
    return -1;
}

TEST(ThreadHandle, ADetachedThreadThatRunsIsReachedByTheKernelsIdAndIsAlive) {
    Bedside bedside;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, sleep_for_ever, &bedside), TAVO_SUCCESS);
    bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_SUCCESS);
    const LogCapture log(2);
    {
        const PlatformHook hook(kLibrary, "syscall", refuse_to_signal);
        EXPECT_EQ(tavo_osal_thread_kill(thread), TAVO_FAILURE);
        EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread kill Failed. Error= 1\n"}}));
    }
    const PlatformHook hook(
        kLibrary, "pthread_setschedparam", +[](pthread_t, int, const sched_param*) { return 0; });
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(thread, 5, 1), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    bedside.wait_until_gone();
}

// Detaches the calling thread, says so, and ends.
void* detach_and_end(void* bedside) {
    EXPECT_EQ(tavo_osal_thread_detach(pthread_self()), TAVO_SUCCESS);
    static_cast<Bedside*>(bedside)->going_to_sleep();
    return nullptr;
}

TEST(ThreadHandle, ADetachedThreadThatHasEndedIsNoSuchThread) {
    Bedside bedside;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, detach_and_end, &bedside), TAVO_SUCCESS);
    bedside.wait_until_gone();
    const NothingTouchesHandles guard;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(tavo_osal_thread_kill(thread), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread kill Failed. Error= 3\n"},
                                             {1, kTag, "Thread join failed. iRet=3\n"},
                                             {1, kTag, "Thread detach failed. iRet=3\n"}}));
}

TEST(ThreadHandle, AThreadThatHadEndedWhenItWasDetachedIsNoSuchThread) {
    Bedside bedside;
    pthread_t thread = {};
    const auto end = +[](void* opaque) -> void* {
        static_cast<Bedside*>(opaque)->going_to_sleep();
        return nullptr;
    };
    ASSERT_EQ(tavo_osal_thread_create(&thread, end, &bedside), TAVO_SUCCESS);
    bedside.wait_until_gone();
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_SUCCESS);
    const NothingTouchesHandles guard;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(ThreadHandle, AThreadOfOtherOriginWithADetachedOnesHandleCanBeJoined) {
    Bedside bedside;
    pthread_t old = {};
    ASSERT_EQ(tavo_osal_thread_create(&old, detach_and_end, &bedside), TAVO_SUCCESS);
    bedside.wait_until_gone();
    if (!start_with_handle(old, sleep_a_little, nullptr)) GTEST_SKIP() << "the platform does not give a handle again";
    EXPECT_EQ(tavo_osal_thread_join(old), TAVO_SUCCESS);
}

TEST(ThreadHandle, AThreadThatIsBeingJoinedCannotBeJoinedOrDetachedByAnother) {
    Bedside bedside;
    static Bedside* joiners_bedside;
    Bedside second;
    joiners_bedside = &second;
    static pthread_t thread;
    ASSERT_EQ(tavo_osal_thread_create(&thread, sleep_for_ever, &bedside), TAVO_SUCCESS);
    const auto join = +[](void*) -> void* {
        joiners_bedside->going_to_sleep();
        EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
        return nullptr;
    };
    pthread_t joiner = {};
    ASSERT_EQ(tavo_osal_thread_create(&joiner, join, nullptr), TAVO_SUCCESS);
    second.wait_until_asleep();
    const LogCapture log(2);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, kTag, "Thread join failed. iRet=22\n"}, {1, kTag, "Thread detach failed. iRet=22\n"}}));
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(joiner), TAVO_SUCCESS);
}

// A kernel, or a C library, that does not tell which threads run.
long answer_no_system_call(long, ...) {
    errno = ENOSYS;
    return -1;
}

TEST(ThreadHandle, WhereRunningThreadsCannotBeToldAJoinedHandleStaysDead) {
    const PlatformHook hook(kLibrary, "syscall", &answer_no_system_call);
    const pthread_t thread = joined_thread();
    const NothingTouchesHandles guard;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread join failed. iRet=3\n"}}));
}

TEST(ThreadHandle, WhereRunningThreadsCannotBeToldErrnoStaysTheCallers) {
    const PlatformHook hook(kLibrary, "syscall", &answer_no_system_call);
    const pthread_t thread = joined_thread();
    const LogCapture log;
    errno = ENOTTY;
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(thread, 5, 1), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{2, kTag, "pthread_getschedparam failed\n"}, {1, kTag, "Set sched_param failed. errno 25\n"}}));
}

TEST(ThreadHandle, WhereRunningThreadsCannotBeToldADetachedHandleCannotBeJoinedAndIsCancelledThroughThePlatform) {
    const PlatformHook hook(kLibrary, "syscall", &answer_no_system_call);
    Bedside bedside;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, sleep_for_ever, &bedside), TAVO_SUCCESS);
    bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_SUCCESS);
    const LogCapture log(2);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread join failed. iRet=22\n"}}));
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    bedside.wait_until_gone();
}

// Values that are nobody's handles, as addresses in the first page, with a platform that takes them.
pthread_t made_up(uintptr_t number) { return static_cast<pthread_t>(number); }

TEST(ThreadHandle, TheLatest1024JoinedHandlesAreRemembered) {
    static int touched;
    const PlatformHook join(
        kLibrary, "pthread_join", +[](pthread_t, void**) { return 0; });
    const PlatformHook kill(
        kLibrary, "pthread_kill", +[](pthread_t, int) {
            ++touched;
            return ESRCH;
        });
    constexpr uintptr_t kJoined = 3000;
    for (uintptr_t i = 1; i <= kJoined; ++i) ASSERT_EQ(tavo_osal_thread_join(made_up(i)), TAVO_SUCCESS);
    touched = 0;
    for (uintptr_t i = kJoined - 1023; i <= kJoined; ++i) tavo_osal_thread_cancel(made_up(i));
    EXPECT_EQ(touched, 0);
    for (uintptr_t i = 1; i <= kJoined - 1024; ++i) tavo_osal_thread_cancel(made_up(i));
    EXPECT_EQ(touched, static_cast<int>(kJoined - 1024)) << "and no more, lest memory grows without bound";
}

}  // namespace
