// Drives the ticks of one timer framework by hand: its worker's sleep ends when the test says so.
#pragma once

#include <gtest/gtest.h>

#include "tavo_osal/testing/manual_ticks.hpp"
#include "tavo_osal/timer.h"

namespace tavo::test {

class TickDriver {
public:
    // Makes a framework, whose worker goes to sleep for its first tick.
    explicit TickDriver(unsigned tick_ms) {
        EXPECT_EQ(tavo_osal_timer_framework_init(tick_ms, &framework_), TAVO_SUCCESS);
    }
    // Ends the framework unless forget() was called.
    ~TickDriver() {
        if (framework_ != nullptr) {
            EXPECT_EQ(uninit(), TAVO_SUCCESS);
        }
    }
    TickDriver(const TickDriver&) = delete;
    TickDriver& operator=(const TickDriver&) = delete;

    TAVO_TimerFramework* framework() const { return framework_; }

    // Lets the worker through one sleep after another and returns when it has gone back to sleep.
    void tick(int times = 1) { ticks_.tick(static_cast<unsigned>(times)); }
    // Lets the worker through one sleep and does not wait for it: it is going to end, or to wait for the test.
    void last_tick() { ticks_.begin_tick(); }
    // Ends the framework: the worker does one more round. The result of tavo_osal_timer_framework_uninit().
    TAVO_Status uninit() {
        const TAVO_Status status = tavo_osal_timer_framework_uninit(framework_);
        if (status == TAVO_SUCCESS) forget();
        return status;
    }
    // The framework is gone, or is the test's affair from now on.
    void forget() { framework_ = nullptr; }

    // What the worker last asked to sleep for, in microseconds.
    uint32_t asked_for() const { return ticks_.last_sleep(); }

private:
    ManualTicks ticks_;
    TAVO_TimerFramework* framework_ = nullptr;
};

// One framework with a tick of 10 ms, and short forms for using it.
class DrivenTimers : public testing::Test {
protected:
    static constexpr unsigned kTick = 10;

    TAVO_Timer* create(unsigned type, int duration, int reload, TAVO_TimerCallback callback, void* argument) {
        TAVO_Timer* timer = nullptr;
        EXPECT_EQ(tavo_osal_timer_create(framework(), "name", type, duration, reload, callback, argument, &timer),
                  TAVO_SUCCESS);
        return timer;
    }
    TAVO_Timer* create_started(unsigned type, int count, int reload, TAVO_TimerCallback callback, void* argument) {
        TAVO_Timer* timer = create(type, 10, reload, callback, argument);
        start(timer, static_cast<unsigned>(count));
        return timer;
    }
    void start(TAVO_Timer* timer, unsigned count) {
        EXPECT_EQ(tavo_osal_timer_start(framework(), timer, count), TAVO_SUCCESS);
    }
    int running(TAVO_Timer* timer) { return tavo_osal_is_timer_running(framework(), timer); }
    TAVO_TimerFramework* framework() { return driver_.framework(); }
    void tick(int times = 1) { driver_.tick(times); }

    // Callbacks that count their calls.
    static void* count_call(void* count) {
        ++*static_cast<int*>(count);
        return nullptr;
    }

    TickDriver driver_{kTick};
};

}  // namespace tavo::test
