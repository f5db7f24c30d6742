#include "tavo_osal/thread.h"

#include <gtest/gtest.h>
#include <signal.h>

#include <cerrno>
#include <cstring>

#include "asleep.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;
using tavo::test::Process;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_THREAD";

void* do_nothing(void*) { return nullptr; }

void* note_self(void* where) {
    *static_cast<pthread_t*>(where) = pthread_self();
    return where;
}

struct sigaction installed_for(int signal) {
    struct sigaction action = {};
    EXPECT_EQ(sigaction(signal, nullptr, &action), 0);
    return action;
}

TEST(Thread, CreateRunsTheCodeWithItsArgumentOnTheThreadOfTheHandle) {
    const LogCapture log;
    pthread_t thread = {};
    pthread_t self = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, note_self, &self), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    EXPECT_TRUE(pthread_equal(self, thread));
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(Thread, CreateRefusesNullPointers) {
    const LogCapture log;
    pthread_t thread = {};
    EXPECT_EQ(tavo_osal_thread_create(nullptr, do_nothing, nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_thread_create(&thread, nullptr, nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_thread_create_with_name(nullptr, do_nothing, nullptr, "name"), TAVO_INVALID_PARAM);
    const tavo::test::ExpectedLine line{1, kTag, "Invalid params.\n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line, line}));
}

TEST(Thread, CreatePassesNoAttributes) {
    static bool with_attributes;
    with_attributes = true;
    const PlatformHook hook(
        kLibrary, "pthread_create",
        +[](pthread_t* thread, const pthread_attr_t* attributes, void* (*start)(void*), void* argument) {
            with_attributes = attributes != nullptr;
            return pthread_create(thread, attributes, start, argument);
        });
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    EXPECT_FALSE(with_attributes);
}

TEST(Thread, CreateInstallsTheCancellationHandlerWithoutFlagsOrMask) {
    EXPECT_EQ(installed_for(SIGUSR2).sa_handler, SIG_DFL);
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    const struct sigaction action = installed_for(SIGUSR2);
    EXPECT_NE(action.sa_handler, SIG_DFL);
    constexpr int kFlags[] = {SA_RESTART, SA_NODEFER, static_cast<int>(SA_RESETHAND), SA_SIGINFO, SA_ONSTACK};
    for (const int flag : kFlags) EXPECT_FALSE(action.sa_flags & flag) << flag;
    for (int signal = 1; signal < 32; ++signal) EXPECT_EQ(sigismember(&action.sa_mask, signal), 0) << signal;
}

TEST(Thread, EveryCreateInstallsTheCancellationHandlerAgain) {
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    signal(SIGUSR2, SIG_IGN);
    ASSERT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    EXPECT_NE(installed_for(SIGUSR2).sa_handler, SIG_IGN);
}

TEST(Thread, CreateThatThePlatformRefusesReportsItAndInstallsNoHandler) {
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "pthread_create", +[](pthread_t*, const pthread_attr_t*, void* (*)(void*), void*) { return EAGAIN; });
    pthread_t thread = {};
    EXPECT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread creation failed. retval = 11\n"}}));
    EXPECT_EQ(installed_for(SIGUSR2).sa_handler, SIG_DFL);
}

TEST(Thread, CreateWithoutAHandlerPrintsItAndSucceedsSinceTheThreadRuns) {
    const LogCapture log;
    pthread_t thread = {};
    pthread_t self = {};
    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();
    {
        const PlatformHook hook(
            kLibrary, "sigaction", +[](int, const struct sigaction*, struct sigaction*) {
                errno = EINVAL;
                return -1;
            });
        EXPECT_EQ(tavo_osal_thread_create(&thread, note_self, &self), TAVO_SUCCESS);
    }
    fflush(stdout);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "Rigistered signal handler failed");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), " sigaction \n: Invalid argument\n");
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    EXPECT_TRUE(pthread_equal(self, thread));
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(Thread, CreateWithNameIgnoresTheName) {
    static char name[32];
    const auto read_name = +[](void*) -> void* {
        pthread_getname_np(pthread_self(), name, sizeof name);
        return nullptr;
    };
    char own_name[32] = {};
    pthread_getname_np(pthread_self(), own_name, sizeof own_name);
    for (const char* given : {"Thread_1300", "a name far longer than a platform takes", ""}) {
        pthread_t thread = {};
        ASSERT_EQ(tavo_osal_thread_create_with_name(&thread, read_name, nullptr, given), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
        EXPECT_STREQ(name, own_name);
    }
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create_with_name(&thread, read_name, nullptr, nullptr), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
}

TEST(Thread, JoinReportsThePlatformsError) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_join(pthread_self()), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread join failed. iRet=35\n"}}));
}

TEST(Thread, JoinThatThePlatformRefusedMayBeTriedAgain) {
    const LogCapture log;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
    {
        const PlatformHook hook(
            kLibrary, "pthread_join", +[](pthread_t, void**) { return EINVAL; });
        EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread join failed. iRet=22\n"}}));
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
}

TEST(Thread, YieldSucceedsOrReportsThePlatformsAnswer) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_yield(), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    const PlatformHook hook(
        kLibrary, "sched_yield", +[] { return -1; });
    EXPECT_EQ(tavo_osal_thread_yield(), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread yield failed. iRet=-1\n"}}));
}

TEST(Thread, DetachReportsThePlatformsError) {
    const LogCapture log;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
    {
        const PlatformHook hook(
            kLibrary, "pthread_detach", +[](pthread_t) { return EINVAL; });
        EXPECT_EQ(tavo_osal_thread_detach(thread), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread detach failed. iRet=22\n"}}));
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS) << "still joinable";
}

TEST(Thread, ExitEndsTheThreadWithANullResult) {
    static bool went_on;
    went_on = false;
    const auto leave = +[](void*) -> void* {
        tavo_osal_thread_exit();
        went_on = true;
        return &went_on;
    };
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, leave, nullptr), TAVO_SUCCESS);
    void* result = &went_on;
    EXPECT_EQ(pthread_join(thread, &result), 0);
    EXPECT_EQ(result, nullptr);
    EXPECT_FALSE(went_on);
}

TEST_ROLE(kills_a_thread) {
    pthread_t thread = {};
    tavo_osal_thread_create(
        &thread,
        +[](void*) -> void* {
            for (;;) pause();
        },
        nullptr);
    tavo_osal_thread_kill(thread);
    for (;;) pause();
}

TEST(Thread, KillEndsTheWholeProcess) {
    Process process = Process::start("kills_a_thread");
    EXPECT_EQ(process.wait(), -SIGKILL);
}

TEST(Thread, KillReportsThePlatformsError) {
    const LogCapture log;
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, do_nothing, nullptr), TAVO_SUCCESS);
    {
        const PlatformHook hook(
            kLibrary, "pthread_kill", +[](pthread_t, int) { return EPERM; });
        EXPECT_EQ(tavo_osal_thread_kill(thread), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Thread kill Failed. Error= 1\n"}}));
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
}

TEST(Thread, SetAffinityIsNeverSupported) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_thread_set_affinity(pthread_self(), 1), TAVO_NOT_SUPPORTED);
    EXPECT_EQ(tavo_osal_thread_set_affinity(pthread_t{}, 0), 0x9005);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(Thread, TestCancelDoesNothing) {
    const LogCapture log;
    tavo_osal_thread_testcancel();
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

volatile sig_atomic_t g_signal = 0;

TEST(Signal, InstallsTheHandlerWithBsdSemantics) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_signal(SIGUSR1, [](int signal) { g_signal = signal; }), TAVO_SUCCESS);
    const struct sigaction action = installed_for(SIGUSR1);
    if (!tavo::test::kThreadSanitizer) {  // which has a signal() of its own
        EXPECT_NE(action.sa_flags & SA_RESTART, 0) << "interrupted calls are restarted";
    }
    for (int i = 0; i < 2; ++i) {
        g_signal = 0;
        raise(SIGUSR1);
        EXPECT_EQ(g_signal, SIGUSR1) << "it stays installed";
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(Signal, RefusesANullHandlerSilently) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_signal(SIGUSR1, nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(Signal, FailsSilentlyForASignalThatCannotBeHandled) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_signal(SIGKILL, [](int) {}), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_signal(12345, [](int) {}), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

}  // namespace
