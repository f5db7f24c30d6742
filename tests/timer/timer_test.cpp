// Frameworks: making and ending them.
#include "tavo_osal/timer.h"

#include <gtest/gtest.h>
#include <pthread.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/memory.h"
#include "tick_driver.h"
#include "timer/timer_slots.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;
using tavo::test::TickDriver;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_TIMER";
constexpr char kThreadTag[] = "OSAL_THREAD";

// Blocks that passed through the library's own allocations and are still held.
int g_blocks;
int g_allocations_left;

void* counted_malloc(size_t size) {
    if (g_allocations_left == 0) return nullptr;
    --g_allocations_left;
    ++g_blocks;
    return malloc(size);
}

void counted_free(void* block) {
    if (block != nullptr) --g_blocks;
    free(block);
}

std::string formatted(const char* format, const void* pointer) {
    char text[100];
    snprintf(text, sizeof text, format, pointer);
    return text;
}

TEST(TimerFramework, InitReportsTheWorkersHandleAndUninitItsEnd) {
    const LogCapture log;
    TAVO_TimerFramework* framework = nullptr;
    ASSERT_EQ(tavo_osal_timer_framework_init(1, &framework), TAVO_SUCCESS);
    ASSERT_NE(framework, nullptr);
    char id[64];
    snprintf(id, sizeof id, "Thread create succeded. Thread ID = %#x\n", static_cast<unsigned>(framework->thread));
    const std::string exiting = formatted("Timer thread exiting psTimerFmw:%p\n", framework);
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, kThreadTag, "Mutex allocation success.\n"}, {3, kTag, id}}));
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework), TAVO_SUCCESS);
    EXPECT_TRUE(
        logged_exactly(log.lines(kTag), {{3, kTag, id}, {3, kTag, exiting}, {4, kTag, "Timer thread exited \n"}}));
}

TEST(TimerFramework, InitClearsEverySlotAndKeepsTheTick) {
    const TickDriver driver(7);
    const TAVO_TimerFramework& framework = *driver.framework();
    EXPECT_EQ(framework.tick_ms, 7);
    EXPECT_EQ(framework.exit, 0);
    for (const TAVO_Timer& timer : framework.timers) {
        EXPECT_STREQ(timer.acName, "");
        EXPECT_EQ(timer.in_use, 0);
        EXPECT_EQ(timer.running, 0);
        EXPECT_EQ(timer.callback, nullptr);
    }
}

TEST(TimerFramework, InitRefusesATickOfZeroAndStoresNull) {
    const LogCapture log;
    auto* framework = reinterpret_cast<TAVO_TimerFramework*>(&g_blocks);
    EXPECT_EQ(tavo_osal_timer_framework_init(0, &framework), 0x9002);
    EXPECT_EQ(framework, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameters \n"}}));
}

TEST(TimerFramework, InitRefusesANullPointer) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_framework_init(10, nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameters \n"}}));
}

class TimerInitFailure : public testing::Test {
protected:
    void SetUp() override {
        g_blocks = 0;
        g_allocations_left = 100;
    }

    // The result of an init that must leave nothing behind.
    TAVO_Status failed_init() {
        auto* framework = reinterpret_cast<TAVO_TimerFramework*>(&g_blocks);
        const TAVO_Status status = tavo_osal_timer_framework_init(10, &framework);
        EXPECT_EQ(framework, nullptr);
        EXPECT_EQ(g_blocks, 0);
        return status;
    }

    const PlatformHook malloc_{kLibrary, "malloc", &counted_malloc};
    const PlatformHook free_{kLibrary, "free", &counted_free};
};

TEST_F(TimerInitFailure, WithoutMemoryForTheFramework) {
    const LogCapture log;
    g_allocations_left = 0;
    EXPECT_EQ(failed_init(), TAVO_NO_MEMORY);
    EXPECT_TRUE(logged_exactly(log.lines(kTag), {{1, kTag, "Timer instance memory allocation failed \n"}}));
}

TEST_F(TimerInitFailure, WithoutMemoryForTheMutexGivesTheMutexsStatus) {
    const LogCapture log;
    g_allocations_left = 1;
    EXPECT_EQ(failed_init(), TAVO_NO_MEMORY);
    EXPECT_TRUE(logged_exactly(log.lines(kTag), {{1, kTag, "Unable to create mutex\n"}}));
}

TEST_F(TimerInitFailure, OfTheMutexGivesTheMutexsStatus) {
    const LogCapture log(2);
    const PlatformHook hook(
        kLibrary, "pthread_mutex_init", +[](pthread_mutex_t*, const pthread_mutexattr_t*) { return EAGAIN; });
    EXPECT_EQ(failed_init(), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, kThreadTag, "Mutex creation failed. Error = 11\n"}, {1, kTag, "Unable to create mutex\n"}}));
}

TEST_F(TimerInitFailure, OfTheThreadDestroysTheMutexAndGivesTheThreadsStatus) {
    static int destroyed;
    destroyed = 0;
    const LogCapture log(2);
    const PlatformHook create(
        kLibrary, "pthread_create", +[](pthread_t*, const pthread_attr_t*, void* (*)(void*), void*) { return EAGAIN; });
    const PlatformHook destroy(
        kLibrary, "pthread_mutex_destroy", +[](pthread_mutex_t* mutex) {
            ++destroyed;
            return pthread_mutex_destroy(mutex);
        });
    EXPECT_EQ(failed_init(), TAVO_FAILURE);
    EXPECT_EQ(destroyed, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kThreadTag, "Thread creation failed. retval = 11\n"},
                                             {1, kTag, "Unable to create timer thread\n"}}));
}

TEST(TimerFramework, UninitRefusesNull) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_framework_uninit(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameters \n"}}));
}

TEST(TimerFramework, UninitThatCannotJoinKeepsTheFramework) {
    TickDriver driver(10);
    const LogCapture log(2);
    {
        const PlatformHook hook(
            kLibrary, "pthread_join", +[](pthread_t, void**) { return EINVAL; });
        EXPECT_EQ(tavo_osal_timer_framework_uninit(driver.framework()), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, kThreadTag, "Thread join failed. iRet=22\n"}, {1, kTag, "Timer thread join failed \n"}}));
    EXPECT_EQ(driver.framework()->exit, 1);
    EXPECT_EQ(driver.uninit(), TAVO_SUCCESS);
}

// errno as a refused destruction leaves it.
int g_errno;

int refuse_destruction(pthread_mutex_t* mutex) {
    pthread_mutex_destroy(mutex);
    errno = g_errno;
    return EBUSY;
}

TEST(TimerFramework, UninitThatCannotDestroyTheMutexKeepsTheFrameworkWhenErrnoIsSet) {
    g_blocks = 0;
    g_allocations_left = 100;
    g_errno = EBUSY;
    TAVO_TimerFramework* framework = nullptr;
    const PlatformHook allocate(kLibrary, "malloc", &counted_malloc);
    const PlatformHook release(kLibrary, "free", &counted_free);
    const PlatformHook destroy(kLibrary, "pthread_mutex_destroy", &refuse_destruction);
    const LogCapture log(2);
    ASSERT_EQ(tavo_osal_timer_framework_init(1, &framework), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, kThreadTag, "Mutex destroy failed. Error=16\n"}, {1, kTag, "Mutex destroy failed \n"}}));
    EXPECT_EQ(g_blocks, 1) << "the mutex's memory is released, the framework's is not";
    tavo_osal_mem_free(framework);
}

TEST(TimerFramework, UninitThatCannotDestroyTheMutexFreesTheFrameworkWhenErrnoIsZero) {
    g_blocks = 0;
    g_allocations_left = 100;
    g_errno = 0;
    TAVO_TimerFramework* framework = nullptr;
    const PlatformHook allocate(kLibrary, "malloc", &counted_malloc);
    const PlatformHook release(kLibrary, "free", &counted_free);
    const PlatformHook destroy(kLibrary, "pthread_mutex_destroy", &refuse_destruction);
    const LogCapture log(2);
    ASSERT_EQ(tavo_osal_timer_framework_init(1, &framework), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kThreadTag, "Mutex destroy failed. Error=16\n"}}));
    EXPECT_EQ(g_blocks, 0);
}

TEST(TimerFramework, WorkerSleepsOneTickPerRoundInMicroseconds) {
    TickDriver driver(25);
    EXPECT_EQ(driver.asked_for(), 25000U);
    driver.tick();
    EXPECT_EQ(driver.asked_for(), 25000U);
}

TEST(TimerFramework, WorkerSleepsWhatIsLeftOf32BitsForAHugeTick) {
    const TickDriver driver(5000000);
    EXPECT_EQ(driver.asked_for(), static_cast<useconds_t>(5000000000ULL & 0xFFFFFFFFULL));
}

}  // namespace
