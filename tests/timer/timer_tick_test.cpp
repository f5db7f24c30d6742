// Counting down, tick by tick.
#include <gtest/gtest.h>

#include <climits>
#include <vector>

#include "support/log_capture.h"
#include "tick_driver.h"
#include "timer/timer_slots.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::TickDriver;

constexpr char kTag[] = "OSAL_TIMER";

class TimerTick : public tavo::test::DrivenTimers {
protected:
    // The ticks, counted from the next one, at which the timer is called.
    std::vector<int> ticks_of_calls(int ticks) {
        std::vector<int> calls;
        for (int i = 1; i <= ticks; ++i) {
            const int before = calls_;
            tick();
            if (calls_ != before) calls.push_back(i);
        }
        return calls;
    }

    int calls_ = 0;
};

using Ticks = std::vector<int>;

TEST_F(TimerTick, ACountOfNTicksFiresAtTheFollowingTick) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    EXPECT_EQ(ticks_of_calls(6), Ticks({2}));
    start(timer, 20);
    EXPECT_EQ(ticks_of_calls(6), Ticks({3})) << "20 at a tick of 10 fires on the third tick";
    start(timer, 50);
    EXPECT_EQ(ticks_of_calls(10), Ticks({6}));
}

TEST_F(TimerTick, AOneShotTimerIsStoppedOnceItHasFired) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 20, 0, count_call, &calls_);
    tick(2);
    EXPECT_EQ(running(timer), 1);
    tick();
    EXPECT_EQ(running(timer), 0);
    EXPECT_EQ(timer->in_use, 1);
}

TEST_F(TimerTick, APeriodicTimerFiresEveryReloadAndATick) {
    create_started(TAVO_TIMER_PERIODIC, 10, 20, count_call, &calls_);
    EXPECT_EQ(ticks_of_calls(12), Ticks({2, 5, 8, 11}));
}

TEST_F(TimerTick, APeriodicTimerStaysRunning) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_PERIODIC, 10, 20, count_call, &calls_);
    tick(2);
    EXPECT_EQ(calls_, 1);
    EXPECT_EQ(running(timer), 1);
    EXPECT_EQ(timer->iCount, 20);
}

TEST_F(TimerTick, ARemainderOfATickNeverFires) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 25, 0, count_call, &calls_);
    EXPECT_EQ(ticks_of_calls(50), Ticks({}));
    EXPECT_EQ(running(timer), 1);
    EXPECT_EQ(timer->iCount, 5);
}

TEST_F(TimerTick, APeriodicReloadWithARemainderFiresOnce) {
    create_started(TAVO_TIMER_PERIODIC, 10, 15, count_call, &calls_);
    EXPECT_EQ(ticks_of_calls(50), Ticks({2}));
}

TEST_F(TimerTick, RestartOfAOneShotTimerWithoutReloadFiresAtTheNextTick) {
    TAVO_Timer* timer = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    EXPECT_EQ(tavo_osal_timer_restart(framework(), timer), TAVO_SUCCESS);
    EXPECT_EQ(ticks_of_calls(5), Ticks({1}));
}

TEST_F(TimerTick, RestartBeginsTheReloadAnew) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 30, 20, count_call, &calls_);
    tick(2);
    EXPECT_EQ(tavo_osal_timer_restart(framework(), timer), TAVO_SUCCESS);
    EXPECT_EQ(ticks_of_calls(6), Ticks({3}));
}

TEST_F(TimerTick, StartAfterStopForgetsWhatWasLeft) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 50, 0, count_call, &calls_);
    tick(4);
    EXPECT_EQ(tavo_osal_timer_stop(framework(), timer), TAVO_SUCCESS);
    start(timer, 20);
    EXPECT_EQ(ticks_of_calls(6), Ticks({3}));
}

TEST_F(TimerTick, TheDurationGivenAtCreationHasNoEffect) {
    TAVO_Timer* timer = create(TAVO_TIMER_ONE_SHOT, 1000, 0, count_call, &calls_);
    start(timer, 10);
    EXPECT_EQ(ticks_of_calls(5), Ticks({2}));
}

TEST_F(TimerTick, ExpiryIsLoggedAsInformationBeforeTheCallback) {
    create_started(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    const LogCapture log;
    tick(2);
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, kTag, "Timer[] expiry \n"}}));
}

std::vector<int> g_order;

TEST_F(TimerTick, CallbacksOfOneRoundRunInTheOrderOfTheSlots) {
    g_order.clear();
    static int ids[5] = {0, 1, 2, 3, 4};
    const auto note = +[](void* id) -> void* {
        g_order.push_back(*static_cast<int*>(id));
        return id;
    };
    TAVO_Timer* timers[5];
    for (int i = 0; i < 5; ++i) timers[i] = create(TAVO_TIMER_ONE_SHOT, 10, 0, note, &ids[i]);
    for (const int i : {3, 0, 4, 1, 2}) start(timers[i], 20);
    tick(3);
    EXPECT_EQ(g_order, std::vector<int>({0, 1, 2, 3, 4}));
}

TEST_F(TimerTick, ACallbackThatWasTakenAwayIsNotCalledButTheTimerStops) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    timer->callback = nullptr;
    tick(2);
    EXPECT_EQ(calls_, 0);
    EXPECT_EQ(running(timer), 0);
}

TEST_F(TimerTick, ACountBeyondTheSignedRangeIsNegativeAndFiresAtTheSecondTick) {
    create_started(TAVO_TIMER_ONE_SHOT, INT_MIN, 0, count_call, &calls_);
    EXPECT_EQ(ticks_of_calls(4), Ticks({2}));
}

TEST_F(TimerTick, ANegativeReloadOfAOneShotTimerCountsAsReached) {
    TAVO_Timer* timer = create(TAVO_TIMER_ONE_SHOT, 10, -7, count_call, &calls_);
    EXPECT_EQ(tavo_osal_timer_restart(framework(), timer), TAVO_SUCCESS);
    EXPECT_EQ(ticks_of_calls(4), Ticks({2}));
}

TEST(TimerHugeTick, ATickBeyondTheSignedRangeIsNegativeAndCountsUpwardsUntilItWraps) {
    TickDriver driver(0xFFFFFFFFU);
    int calls = 0;
    TAVO_Timer* timer = nullptr;
    const auto count = +[](void* counter) -> void* {
        ++*static_cast<int*>(counter);
        return nullptr;
    };
    EXPECT_EQ(
        tavo_osal_timer_create(driver.framework(), nullptr, TAVO_TIMER_ONE_SHOT, 0, INT_MAX - 1, count, &calls, &timer),
        TAVO_SUCCESS)
        << "compared signed";
    EXPECT_EQ(tavo_osal_timer_start(driver.framework(), timer, 1000), TAVO_INVALID_PARAM) << "compared unsigned";
    EXPECT_EQ(tavo_osal_timer_restart(driver.framework(), timer), TAVO_SUCCESS);
    driver.tick();
    EXPECT_EQ(timer->iCount, INT_MAX);
    driver.tick();
    EXPECT_EQ(timer->iCount, 0);
    EXPECT_EQ(calls, 0);
    driver.tick();
    EXPECT_EQ(calls, 1);
}

TEST(TimerUninit, DiscardsTimersThatStillRun) {
    int calls = 0;
    TickDriver driver(10);
    TAVO_Timer* timer = nullptr;
    const auto count = +[](void* counter) -> void* {
        ++*static_cast<int*>(counter);
        return nullptr;
    };
    ASSERT_EQ(tavo_osal_timer_create(driver.framework(), nullptr, TAVO_TIMER_PERIODIC, 10, 10, count, &calls, &timer),
              TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_start(driver.framework(), timer, 1000), TAVO_SUCCESS);
    driver.tick();
    EXPECT_EQ(driver.uninit(), TAVO_SUCCESS);
    EXPECT_EQ(calls, 0);
}

}  // namespace
