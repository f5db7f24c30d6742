// Callbacks that use the framework they are called by.
#include <gtest/gtest.h>

#include "../thread/asleep.h"
#include "support/log_capture.h"
#include "tavo_osal/thread.h"
#include "tick_driver.h"
#include "timer/timer_slots.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;

// What a callback is to do, and to whom.
struct Order {
    TAVO_TimerFramework* framework = nullptr;
    TAVO_Timer* timer = nullptr;
    int calls = 0;
    TAVO_Status status = -1;
};

class TimerCallback : public tavo::test::DrivenTimers {
protected:
    // Creates a timer whose callback gives the order; the order is about this timer itself unless changed.
    TAVO_Timer* ordered(unsigned type, int reload, TAVO_TimerCallback callback, Order& order) {
        order.framework = framework();
        order.timer = create(type, 10, reload, callback, &order);
        return order.timer;
    }

    static void* restart(void* opaque) {
        auto& order = *static_cast<Order*>(opaque);
        ++order.calls;
        order.status = tavo_osal_timer_restart(order.framework, order.timer);
        return nullptr;
    }
    static void* start_again(void* opaque) {
        auto& order = *static_cast<Order*>(opaque);
        ++order.calls;
        order.status = tavo_osal_timer_start(order.framework, order.timer, 10);
        return nullptr;
    }
    static void* stop(void* opaque) {
        auto& order = *static_cast<Order*>(opaque);
        ++order.calls;
        order.status = tavo_osal_timer_stop(order.framework, order.timer);
        return nullptr;
    }
    static void* give_back(void* opaque) {
        auto& order = *static_cast<Order*>(opaque);
        ++order.calls;
        order.status = tavo_osal_timer_free(order.framework, order.timer);
        return nullptr;
    }

    Order order_;
    int calls_ = 0;
};

TEST_F(TimerCallback, AOneShotTimerRestartedInItsOwnCallbackIsStoppedAgain) {
    TAVO_Timer* timer = ordered(TAVO_TIMER_ONE_SHOT, 20, restart, order_);
    start(timer, 10);
    tick(10);
    EXPECT_EQ(order_.status, TAVO_SUCCESS);
    EXPECT_EQ(order_.calls, 1);
    EXPECT_EQ(running(timer), 0);
    EXPECT_EQ(timer->iCount, 20) << "reloaded all the same";
}

TEST_F(TimerCallback, APeriodicTimerStoppedInItsOwnCallbackStaysStoppedAndReloaded) {
    TAVO_Timer* timer = ordered(TAVO_TIMER_PERIODIC, 20, stop, order_);
    start(timer, 10);
    tick(10);
    EXPECT_EQ(order_.calls, 1);
    EXPECT_EQ(running(timer), 0);
    EXPECT_EQ(timer->iCount, 20);
}

TEST_F(TimerCallback, APeriodicTimerRestartedInItsOwnCallbackGoesOn) {
    TAVO_Timer* timer = ordered(TAVO_TIMER_PERIODIC, 20, restart, order_);
    start(timer, 10);
    tick(8);
    EXPECT_EQ(order_.calls, 3);
    EXPECT_EQ(running(timer), 1);
}

TEST_F(TimerCallback, ATimerStartsAnother) {
    TAVO_Timer* timer = ordered(TAVO_TIMER_ONE_SHOT, 0, start_again, order_);
    order_.timer = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    start(timer, 10);
    tick(2);
    EXPECT_EQ(order_.calls, 1);
    EXPECT_EQ(order_.timer->iCount, 0) << "the later slot was counted down in the same round";
    tick();
    EXPECT_EQ(calls_, 1);
}

TEST_F(TimerCallback, AOneShotTimerFreedInItsOwnCallbackIsFree) {
    TAVO_Timer* timer = ordered(TAVO_TIMER_ONE_SHOT, 0, give_back, order_);
    start(timer, 10);
    tick(10);
    EXPECT_EQ(order_.calls, 1);
    EXPECT_EQ(timer->in_use, 0);
    EXPECT_EQ(create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_), timer);
}

TEST_F(TimerCallback, APeriodicTimerFreedInItsOwnCallbackIsFree) {
    TAVO_Timer* timer = ordered(TAVO_TIMER_PERIODIC, 20, give_back, order_);
    start(timer, 10);
    tick(10);
    EXPECT_EQ(order_.calls, 1);
    EXPECT_EQ(timer->in_use, 0);
    EXPECT_EQ(running(timer), 0);
    EXPECT_EQ(timer->iCount, 0);
}

TEST_F(TimerCallback, ATimerFreedByAnEarlierOneOfTheSameRoundDoesNotFire) {
    TAVO_Timer* timer = ordered(TAVO_TIMER_ONE_SHOT, 0, give_back, order_);
    order_.timer = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    start(timer, 20);
    start(order_.timer, 20);
    tick(10);
    EXPECT_EQ(order_.calls, 1);
    EXPECT_EQ(calls_, 0);
}

TEST_F(TimerCallback, ATimerCreatesAnother) {
    const auto make = +[](void* opaque) -> void* {
        auto& order = *static_cast<Order*>(opaque);
        order.status = tavo_osal_timer_create(order.framework, nullptr, TAVO_TIMER_ONE_SHOT, 10, 0, count_call,
                                              &order.calls, &order.timer);
        tavo_osal_timer_start(order.framework, order.timer, 10);
        return nullptr;
    };
    TAVO_Timer* timer = ordered(TAVO_TIMER_ONE_SHOT, 0, make, order_);
    start(timer, 10);
    tick(3);
    EXPECT_EQ(order_.status, TAVO_SUCCESS);
    EXPECT_EQ(order_.timer, &framework()->timers[1]);
    EXPECT_EQ(order_.calls, 1);
}

TEST_F(TimerCallback, UninitFromACallbackFailsAndAnotherThreadFinishesIt) {
    const auto end = +[](void* opaque) -> void* {
        auto& order = *static_cast<Order*>(opaque);
        ++order.calls;
        order.status = tavo_osal_timer_framework_uninit(order.framework);
        return nullptr;
    };
    TAVO_Timer* timer = ordered(TAVO_TIMER_ONE_SHOT, 0, end, order_);
    start(timer, 10);
    tick();
    const LogCapture log(2);
    driver_.last_tick();  // the worker ends after this round
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework()), TAVO_SUCCESS);
    driver_.forget();
    EXPECT_EQ(order_.calls, 1);
    EXPECT_EQ(order_.status, TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_THREAD", "Thread join failed. iRet=35\n"},
                                             {1, "OSAL_TIMER", "Timer thread join failed \n"}}));
}

TEST_F(TimerCallback, ACallbackThatEndsItsThreadLeavesAFrameworkThatCanBeUsedAndEnded) {
    const auto leave = +[](void*) -> void* { tavo_osal_thread_exit(); };
    TAVO_Timer* timer = create_started(TAVO_TIMER_PERIODIC, 10, 10, leave, nullptr);
    tick();
    driver_.last_tick();
    EXPECT_EQ(tavo_osal_timer_stop(framework(), timer), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_free(framework(), timer), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework()), TAVO_SUCCESS);
    driver_.forget();
}

TEST_F(TimerCallback, ACallbackCanBeCancelled) {
    static pthread_t worker;
    static tavo::test::Bedside* bedside;
    tavo::test::Bedside callbacks_bedside;
    bedside = &callbacks_bedside;
    const auto block = +[](void*) -> void* {
        worker = pthread_self();
        bedside->going_to_sleep();
        tavo_osal_thread_sleep(1000);
        return nullptr;
    };
    TAVO_Timer* timer = create_started(TAVO_TIMER_PERIODIC, 10, 10, block, nullptr);
    tick();
    driver_.last_tick();
    callbacks_bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_timer_stop(framework(), timer), TAVO_SUCCESS) << "without a deadlock";
    EXPECT_EQ(tavo_osal_thread_cancel(worker), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework()), TAVO_SUCCESS);
    driver_.forget();
}

}  // namespace
