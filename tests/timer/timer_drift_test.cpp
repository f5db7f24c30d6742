// Shows, in real time, by how much a periodic timer drifts: its worker's period is a tick and the time of the round.
// Fails only when the timer does not fire; how late it is depends on the machine and is only printed.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <thread>

#include "tavo_osal/timer.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr int kTickMs = 10;
constexpr int kCalls = 20;

struct Calls {
    std::atomic<int> count{0};
    Clock::time_point last;
};

TEST(TimerDrift, IsShownAndNotJudged) {
    Calls calls;
    const auto note = +[](void* opaque) -> void* {
        auto& noted = *static_cast<Calls*>(opaque);
        if (noted.count >= kCalls) return nullptr;
        noted.last = Clock::now();
        ++noted.count;
        return nullptr;
    };
    TAVO_TimerFramework* framework = nullptr;
    TAVO_Timer* timer = nullptr;
    ASSERT_EQ(tavo_osal_timer_framework_init(kTickMs, &framework), TAVO_SUCCESS);
    ASSERT_EQ(tavo_osal_timer_create(framework, "drift", TAVO_TIMER_PERIODIC, kTickMs, kTickMs, note, &calls, &timer),
              TAVO_SUCCESS);
    const Clock::time_point start = Clock::now();
    ASSERT_EQ(tavo_osal_timer_start(framework, timer, kTickMs), TAVO_SUCCESS);
    while (calls.count < kCalls) std::this_thread::sleep_for(std::chrono::milliseconds(5));
    EXPECT_EQ(tavo_osal_timer_framework_uninit(framework), TAVO_SUCCESS);

    // A count of one tick fires every second tick.
    const double ideal_ms = 2.0 * kTickMs * kCalls;
    const double real_ms = std::chrono::duration<double, std::milli>(calls.last - start).count();
    printf("%d calls, %d ms apart by the ticks: %.1f ms instead of %.1f, %.3f ms of drift per tick\n", kCalls,
           2 * kTickMs, real_ms, ideal_ms, (real_ms - ideal_ms) / (2.0 * kCalls));
    RecordProperty("drift_us_per_tick", static_cast<int>(1000 * (real_ms - ideal_ms) / (2.0 * kCalls)));
}

}  // namespace
