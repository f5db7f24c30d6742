/**
 * @file
 * tavo::test::ManualTicks: timers that count when the test says so, and never by themselves.
 */
#ifndef TAVO_OSAL_TESTING_MANUAL_TICKS_HPP
#define TAVO_OSAL_TESTING_MANUAL_TICKS_HPP

#include <cstddef>
#include <cstdint>

#include "tavo_osal/testing/platform_hook.hpp"

namespace tavo::test {

/**
 * While it lives, the workers of timer frameworks sleep until the test lets them go on: time stands still between
 * ticks, and no test waits for it. Made before the component under test makes its frameworks; other sleeps go on as
 * usual. tavo_osal_timer_framework_uninit() lets the worker finish by itself, so components end as usual too.
 *
 *     ManualTicks ticks;
 *     Blinker blinker;       // makes a framework with a tick of 10 ms, and starts a timer of 50 ms
 *     ticks.tick(5);
 *     EXPECT_FALSE(blinker.on());
 *     ticks.tick();          // timers fire one tick after their count has ended
 *     EXPECT_TRUE(blinker.on());
 *
 * One at a time. When it ends, workers that are still there sleep by themselves again.
 */
class ManualTicks {
public:
    ManualTicks();
    ~ManualTicks();
    ManualTicks(const ManualTicks&) = delete;
    ManualTicks& operator=(const ManualTicks&) = delete;

    /** Lets every worker through one sleep after another, and returns when each has gone to sleep again, or has
     *  ended: the callbacks that were due have returned. Not for callbacks. @param times how many ticks */
    void tick(unsigned times = 1);
    /** Lets every worker through one sleep, without waiting for what it does then, for callbacks that block. */
    void begin_tick();
    /** How many workers sleep. */
    size_t asleep() const;
    /** The microseconds that a worker asked to sleep for last. */
    uint32_t last_sleep() const;

private:
    PlatformHook sleep_;
    PlatformHook create_;
    PlatformHook join_;
};

}  // namespace tavo::test

#endif
