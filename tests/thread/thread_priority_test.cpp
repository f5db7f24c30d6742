#include <gtest/gtest.h>
#include <sched.h>

#include <cerrno>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/thread.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_THREAD";

int g_policy;
int g_priority;

int give_policy(pthread_t, int* policy, sched_param* parameters) {
    *policy = SCHED_RR;
    parameters->sched_priority = 42;
    return 0;
}

int note_policy(pthread_t, int policy, const sched_param* parameters) {
    g_policy = policy;
    g_priority = parameters->sched_priority;
    return 0;
}

TEST(ThreadPriority, APriorityBelowOneIsRefusedBeforeTheSelectorIsLookedAt) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_self(), 0, 3), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_self(), -7, 1), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{1, kTag, "Invalid thread priority 0\n"}, {1, kTag, "Invalid thread priority -7\n"}}));
}

TEST(ThreadPriority, ASelectorOtherThanOneOrTwoIsRefused) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_self(), 5, 3), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_self(), 5, 0), TAVO_INVALID_PARAM);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Invalid thread policy 3\n"}, {1, kTag, "Invalid thread policy 0\n"}}));
}

TEST(ThreadPriority, SelectorsMeanRoundRobinAndFirstInFirstOut) {
    const LogCapture log;
    const PlatformHook get(kLibrary, "pthread_getschedparam", &give_policy);
    const PlatformHook set(kLibrary, "pthread_setschedparam", &note_policy);
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_self(), 5, 1), TAVO_SUCCESS);
    EXPECT_EQ(g_policy, SCHED_RR);
    EXPECT_EQ(g_priority, 5);
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_self(), 1000, 2), TAVO_SUCCESS) << "no upper bound here";
    EXPECT_EQ(g_policy, SCHED_FIFO);
    EXPECT_EQ(g_priority, 1000);
    const tavo::test::ExpectedLine line{3, kTag, "Existing policy 2, priority 42\n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
}

TEST(ThreadPriority, AnUnreadablePolicyIsAWarningOnly) {
    const LogCapture log;
    const PlatformHook get(
        kLibrary, "pthread_getschedparam", +[](pthread_t, int*, sched_param*) { return EPERM; });
    const PlatformHook set(kLibrary, "pthread_setschedparam", &note_policy);
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_self(), 5, 1), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {{2, kTag, "pthread_getschedparam failed\n"}}));
}

TEST(ThreadPriority, ARefusalPrintsErrnoAndNotWhatThePlatformAnswered) {
    const LogCapture log;
    const PlatformHook get(kLibrary, "pthread_getschedparam", &give_policy);
    const PlatformHook set(
        kLibrary, "pthread_setschedparam", +[](pthread_t, int, const sched_param*) {
            errno = ENOENT;
            return EPERM;
        });
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_self(), 5, 1), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{3, kTag, "Existing policy 2, priority 42\n"}, {1, kTag, "Set sched_param failed. errno 2\n"}}));
}

TEST(ThreadPriority, ThePlatformRejectsAPriorityOutOfItsRange) {
    const LogCapture log;
    errno = 0;
    EXPECT_EQ(tavo_osal_thread_set_real_time_priority(pthread_self(), 100000, 2), TAVO_FAILURE);
    ASSERT_EQ(log.lines().size(), 2U);
    EXPECT_EQ(log.lines()[0].message(), "Existing policy 0, priority 0\n");
}

}  // namespace
