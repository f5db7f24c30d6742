#include "tavo_osal/testing/manual_ticks.hpp"

#include <gtest/gtest.h>

#include <atomic>

#include "tavo_osal.h"
#include "tavo_osal.hpp"

namespace {

using namespace std::chrono_literals;
using namespace tavo::test;
using tavo::Timer;
using tavo::Timers;
using Kind = Timer::Kind;

TEST(ManualTicks, TimeStandsStillUntilTheTestTicks) {
    ManualTicks ticks;
    Timers timers(10ms);
    EXPECT_EQ(ticks.asleep(), 1U);
    EXPECT_EQ(ticks.last_sleep(), 10000U);
    int fired = 0;
    Timer timer(timers, Kind::one_shot, 30ms, [&] { ++fired; });
    timer.start();
    ticks.tick(3);
    EXPECT_EQ(fired, 0);
    ticks.tick();
    EXPECT_EQ(fired, 1);
    ticks.tick(100);
    EXPECT_EQ(fired, 1);
}

TEST(ManualTicks, PeriodicTimersFireEveryCountAndOneTick) {
    ManualTicks ticks;
    Timers timers(1h);
    int fired = 0;
    Timer timer(timers, Kind::periodic, 4h, [&] { ++fired; });
    timer.start();
    ticks.tick(50);
    EXPECT_EQ(fired, 10);
}

TEST(ManualTicks, MovesSeveralFrameworksAtOnce) {
    ManualTicks ticks;
    Timers slow(20ms);
    Timers fast(10ms);
    EXPECT_EQ(ticks.asleep(), 2U);
    std::atomic<int> fired = 0;
    Timer first(slow, Kind::one_shot, 20ms, [&] { ++fired; });
    Timer second(fast, Kind::one_shot, 10ms, [&] { ++fired; });
    first.start();
    second.start();
    ticks.tick(2);
    EXPECT_EQ(fired, 2);
    slow.close();
    EXPECT_EQ(ticks.asleep(), 1U);
}

TEST(ManualTicks, FrameworksEndAsUsual) {
    ManualTicks ticks;
    for (int i = 0; i < 3; ++i) {
        Timers timers(10ms);
        ticks.tick();
    }
    EXPECT_EQ(ticks.asleep(), 0U);
    ticks.tick();
}

TEST(ManualTicks, AWorkerThatEndsInACallbackIsNotWaitedFor) {
    ManualTicks ticks;
    TAVO_TimerFramework* framework = nullptr;
    TAVO_Timer* timer = nullptr;
    ASSERT_EQ(tavo_osal_timer_framework_init(10, &framework), TAVO_SUCCESS);
    ASSERT_EQ(tavo_osal_timer_create(
                  framework, "", TAVO_TIMER_ONE_SHOT, 10, 10, +[](void*) -> void* { tavo_osal_thread_exit(); }, nullptr,
                  &timer),
              TAVO_SUCCESS);
    ASSERT_EQ(tavo_osal_timer_start(framework, timer, 10), TAVO_SUCCESS);
    ticks.tick(2);
    EXPECT_EQ(ticks.asleep(), 0U);
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework), TAVO_SUCCESS);
}

TEST(ManualTicks, ACallbackThatBlocksCanBeLetRun) {
    ManualTicks ticks;
    Timers timers(10ms);
    tavo::Event entered;
    tavo::Event go_on;
    Timer timer(timers, Kind::one_shot, 10ms, [&] {
        entered.set();
        go_on.wait();
    });
    timer.start();
    ticks.tick();
    ticks.begin_tick();
    entered.wait();
    go_on.set();
    ticks.tick();
    EXPECT_FALSE(timer.running());
}

TEST(ManualTicks, OtherSleepsGoOnAsUsual) {
    ManualTicks ticks;
    EXPECT_EQ(tavo_osal_thread_usleep(1), TAVO_SUCCESS);
    EXPECT_EQ(ticks.asleep(), 0U);
}

TEST(ManualTicks, WorkersSleepByThemselvesAgainAfterwards) {
    std::unique_ptr<Timers> timers;
    tavo::Event fired;
    {
        ManualTicks ticks;
        timers = std::make_unique<Timers>(1ms);
    }
    Timer timer(*timers, Kind::one_shot, 1ms, [&] { fired.set(); });
    timer.start();
    EXPECT_TRUE(fired.wait_for(30s));
    timers->close();
}

TEST(ManualTicks, AFrameworkThatCannotBeMadeIsNotWaitedFor) {
    ManualTicks ticks;
    const PlatformHook hook(
        "libtavoosal.so", "pthread_create",
        +[](pthread_t*, const pthread_attr_t*, void* (*)(void*), void*) { return EAGAIN; });
    std::error_code error;
    const Timers timers(10ms, error);
    EXPECT_TRUE(error);
    EXPECT_EQ(ticks.asleep(), 0U);
}

}  // namespace
