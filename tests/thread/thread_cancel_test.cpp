// Cancellation of threads that sleep, wait or work. What a signal finds in the middle of the library's own doings is
// in thread_cancel_shield_test.cpp.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <signal.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <ctime>
#include <string>

#include "asleep.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/condition.h"
#include "tavo_osal/event.h"
#include "tavo_osal/semaphore.h"
#include "tavo_osal/thread.h"

namespace {

using tavo::test::Bedside;
using tavo::test::kThreadSanitizer;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kTag[] = "OSAL_THREAD";

// What a thread waits for. Nothing of it ever comes.
struct Place {
    Place() {
        EXPECT_EQ(pipe2(pipe_ends, O_CLOEXEC), 0);
        EXPECT_EQ(tavo_osal_mutex_create(&mutex), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_thread_condition_create(&condition), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_event_create(&event), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_semaphore_create(&semaphore, 0, 0), TAVO_SUCCESS);
    }
    // Fails or hangs where a cancelled thread left something locked or unaccounted for.
    ~Place() {
        close(pipe_ends[0]);
        close(pipe_ends[1]);
        EXPECT_EQ(tavo_osal_event_set(event), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_event_waitset(event, TAVO_EVENT_FOREVER), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_event_destroy(&event), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_semaphore_destroy(&semaphore), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_thread_condition_destroy(&condition), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_mutex_destroy(&mutex), TAVO_SUCCESS);
    }

    Bedside bedside;
    int pipe_ends[2] = {-1, -1};
    TAVO_Mutex* mutex = nullptr;
    TAVO_Condition* condition = nullptr;
    TAVO_Event* event = nullptr;
    sem_t semaphore;
    pthread_t other = {};
    bool unlocked = false;
};

// Ways of waiting. A thread that comes back from one returns its place, which is not null.
void* in_sleep(void* opaque) {
    static_cast<Place*>(opaque)->bedside.going_to_sleep();
    tavo_osal_thread_sleep(1000);
    return opaque;
}

void* in_msleep(void* opaque) {
    static_cast<Place*>(opaque)->bedside.going_to_sleep();
    tavo_osal_thread_msleep(1000000);
    return opaque;
}

void* in_usleep(void* opaque) {
    static_cast<Place*>(opaque)->bedside.going_to_sleep();
    tavo_osal_thread_usleep(1000000000);
    return opaque;
}

void* in_read(void* opaque) {
    auto* place = static_cast<Place*>(opaque);
    char byte = 0;
    place->bedside.going_to_sleep();
    return read(place->pipe_ends[0], &byte, 1) == 1 ? nullptr : opaque;
}

void* in_semaphore(void* opaque) {
    auto* place = static_cast<Place*>(opaque);
    place->bedside.going_to_sleep();
    tavo_osal_semaphore_wait(&place->semaphore);
    return opaque;
}

void* in_event(void* opaque) {
    auto* place = static_cast<Place*>(opaque);
    place->bedside.going_to_sleep();
    tavo_osal_event_waitset(place->event, TAVO_EVENT_FOREVER);
    return opaque;
}

void* in_timed_event(void* opaque) {
    auto* place = static_cast<Place*>(opaque);
    place->bedside.going_to_sleep();
    tavo_osal_event_waitset_with_flag(place->event, 1000000, 1);
    return opaque;
}

void unlock(void* opaque) {
    auto* place = static_cast<Place*>(opaque);
    place->unlocked = tavo_osal_mutex_unlock(place->mutex) == TAVO_SUCCESS;
}

void* in_condition(void* opaque) {
    auto* place = static_cast<Place*>(opaque);
    tavo_osal_mutex_lock(place->mutex);
    pthread_cleanup_push(unlock, place);
    place->bedside.going_to_sleep();
    tavo_osal_thread_condition_wait(place->condition, place->mutex);
    pthread_cleanup_pop(1);
    return opaque;
}

void* in_timed_condition(void* opaque) {
    auto* place = static_cast<Place*>(opaque);
    tavo_osal_mutex_lock(place->mutex);
    pthread_cleanup_push(unlock, place);
    place->bedside.going_to_sleep();
    tavo_osal_thread_condition_timedwait(place->condition, place->mutex, 1000000);
    pthread_cleanup_pop(1);
    return opaque;
}

void* in_join(void* opaque) {
    auto* place = static_cast<Place*>(opaque);
    place->bedside.going_to_sleep();
    tavo_osal_thread_join(place->other);
    return opaque;
}

struct Way {
    const char* name;
    void* (*wait)(void*);
    // Interrupted in one of the C library's waits that keep an account of the waiters.
    bool accounted;
};

void PrintTo(const Way& way, std::ostream* out) { *out << way.name; }

// ThreadSanitizer has the C library's own cancellation end an accounted wait, with the result that goes with it.
void* expected_result(const Way& way) { return kThreadSanitizer && way.accounted ? PTHREAD_CANCELED : nullptr; }

class ThreadCancel : public testing::TestWithParam<Way> {};

constexpr Way kWays[] = {
    {"Sleep", in_sleep, false},
    {"Milliseconds", in_msleep, false},
    {"Microseconds", in_usleep, false},
    {"BlockingRead", in_read, false},
    {"Semaphore", in_semaphore, false},
    {"Event", in_event, true},
    {"TimedEvent", in_timed_event, true},
    {"Condition", in_condition, true},
    {"TimedCondition", in_timed_condition, true},
};
INSTANTIATE_TEST_SUITE_P(In, ThreadCancel, testing::ValuesIn(kWays),
                         [](const auto& instance) { return std::string(instance.param.name); });

TEST_P(ThreadCancel, EndsTheThreadAtOnceWithANullResult) {
    Place place;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, GetParam().wait, &place), TAVO_SUCCESS);
    place.bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    void* result = &place;
    EXPECT_EQ(pthread_join(thread, &result), 0);
    EXPECT_EQ(result, expected_result(GetParam()));
}

TEST_P(ThreadCancel, LetsJoinCollectTheThread) {
    Place place;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, GetParam().wait, &place), TAVO_SUCCESS);
    place.bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
}

TEST_P(ThreadCancel, EndsAThreadThisLibraryDidNotMake) {
    Place place;
    pthread_t first = {};
    ASSERT_EQ(tavo_osal_thread_create(
                  &first, +[](void* argument) { return argument; }, nullptr),
              TAVO_SUCCESS);
    pthread_t thread = {};
    ASSERT_EQ(pthread_create(&thread, nullptr, GetParam().wait, &place), 0);
    place.bedside.wait_until_asleep();
    EXPECT_EQ(pthread_kill(thread, SIGUSR2), 0);
    void* result = &place;
    EXPECT_EQ(pthread_join(thread, &result), 0);
    EXPECT_EQ(result, expected_result(GetParam()));
    EXPECT_EQ(tavo_osal_thread_join(first), TAVO_SUCCESS);
}

TEST(ThreadCancellation, LeavesTheMutexOfAConditionToTheThreadsCleanupHandler) {
    Place place;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, in_condition, &place), TAVO_SUCCESS);
    place.bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    EXPECT_TRUE(place.unlocked);
    EXPECT_EQ(tavo_osal_mutex_try_lock(place.mutex), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_mutex_unlock(place.mutex), TAVO_SUCCESS);
}

TEST(ThreadCancellation, OfAThreadThatJoinsLeavesTheOtherThreadJoinable) {
    if (kThreadSanitizer) GTEST_SKIP() << "ThreadSanitizer's own pthread_join() cannot be cancelled";
    Place place;
    Place others_place;
    ASSERT_EQ(tavo_osal_thread_create(&place.other, in_read, &others_place), TAVO_SUCCESS);
    pthread_t joiner = {};
    ASSERT_EQ(tavo_osal_thread_create(&joiner, in_join, &place), TAVO_SUCCESS);
    place.bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_cancel(joiner), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(joiner), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_cancel(place.other), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(place.other), TAVO_SUCCESS);
}

TEST(ThreadCancellation, OfAThreadThatIsBeingJoinedLetsTheJoinReturn) {
    Place place;
    Place joiners_place;
    ASSERT_EQ(tavo_osal_thread_create(&joiners_place.other, in_read, &place), TAVO_SUCCESS);
    pthread_t joiner = {};
    ASSERT_EQ(tavo_osal_thread_create(&joiner, in_join, &joiners_place), TAVO_SUCCESS);
    joiners_place.bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_cancel(joiners_place.other), TAVO_SUCCESS);
    void* result = nullptr;
    EXPECT_EQ(pthread_join(joiner, &result), 0);
    EXPECT_EQ(result, &joiners_place) << "the join has returned";
}

TEST(ThreadCancellation, EndsAThreadThatNeverSleeps) {
    pthread_t thread = {};
    static std::atomic<bool> working;
    working = false;
    const auto work = +[](void*) -> void* {
        for (;;) {
            timespec now = {};
            clock_gettime(CLOCK_MONOTONIC, &now);
            working = true;
        }
    };
    ASSERT_EQ(tavo_osal_thread_create(&thread, work, nullptr), TAVO_SUCCESS);
    while (!working) sched_yield();
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
}

TEST(ThreadCancellation, OfTheCallerRunsNoFurtherCodeOfIt) {
    const LogCapture log(2);
    const auto cancel_self = +[](void* argument) -> void* {
        tavo_osal_thread_cancel(pthread_self());
        return argument;
    };
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, cancel_self, &thread), TAVO_SUCCESS);
    void* result = &thread;
    EXPECT_EQ(pthread_join(thread, &result), 0);
    EXPECT_EQ(result, nullptr);
}

TEST(ThreadCancellation, IsReportedByTheCallerAndByTheThread) {
    Place place;
    const LogCapture log;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, in_event, &place), TAVO_SUCCESS);
    place.bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    const auto lines = log.lines();
    EXPECT_EQ(lines.size(), 3U);
    EXPECT_TRUE(logged(lines, {3, kTag, " thread canceled " + std::to_string(thread) + " "}));
    EXPECT_TRUE(logged(lines, {3, kTag, " Processing for pthread cancel \n"}));
    EXPECT_TRUE(logged(lines, {3, kTag, " This signal is 12 \n"}));
}

TEST(ThreadCancellation, ByThePlatformsOwnMeansReleasesAnEventToo) {
    Place place;
    const LogCapture log;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, in_event, &place), TAVO_SUCCESS);
    place.bedside.wait_until_asleep();
    EXPECT_EQ(pthread_cancel(thread), 0);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(ThreadCancellation, ASignalThatCannotBeSentIsSilentAndSucceeds) {
    Place place;
    const LogCapture log;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, in_read, &place), TAVO_SUCCESS);
    place.bedside.wait_until_asleep();
    {
        const PlatformHook hook(
            "libtavoosal.so", "pthread_kill", +[](pthread_t, int) { return EAGAIN; });
        EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    ASSERT_EQ(write(place.pipe_ends[1], "", 1), 1);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
}

// The handler as a program finds it, called as a plain function on a thread of its own.
using Handler = void (*)(int);

Handler installed_handler() {
    pthread_t thread = {};
    EXPECT_EQ(tavo_osal_thread_create(
                  &thread, +[](void* argument) { return argument; }, nullptr),
              TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    struct sigaction action = {};
    sigaction(SIGUSR2, nullptr, &action);
    return action.sa_handler;
}

TEST(ThreadCancellation, HandlerReportsAndEndsTheThreadForItsOwnSignal) {
    Handler handler = installed_handler();
    const LogCapture log;
    const auto call = +[](void* opaque) -> void* {
        (*static_cast<Handler*>(opaque))(12);
        return opaque;
    };
    pthread_t thread = {};
    ASSERT_EQ(pthread_create(&thread, nullptr, call, &handler), 0);
    void* result = &handler;
    EXPECT_EQ(pthread_join(thread, &result), 0);
    EXPECT_EQ(result, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{3, kTag, " Processing for pthread cancel \n"}, {3, kTag, " This signal is 12 \n"}}));
}

TEST(ThreadCancellation, HandlerOnlyReportsAnyOtherSignal) {
    Handler handler = installed_handler();
    const LogCapture log;
    handler(SIGUSR1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, kTag, "\n>> Halt Signal: 10\n\n"}}));
}

}  // namespace
