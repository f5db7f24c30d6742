#include "tavo_osal/cpp/timer.hpp"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <string>
#include <vector>

#include "cpp/no_memory.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/cpp/event.hpp"

namespace {

using namespace std::chrono_literals;
using tavo::Errc;
using tavo::Event;
using tavo::Timer;
using tavo::Timers;
using tavo::test::LogCapture;
using tavo::test::logged;
using tavo::test::PlatformHook;
using Kind = Timer::Kind;

TEST(CppTimer, FiresOnce) {
    Timers timers(1ms);
    EXPECT_NE(timers.native_handle(), nullptr);
    Event fired;
    Timer timer(timers, Kind::one_shot, 3ms, [&] { fired.set(); });
    EXPECT_FALSE(timer.running());
    timer.start();
    EXPECT_TRUE(fired.wait_for(30s));
    timers.close();
    EXPECT_FALSE(fired.wait_for(1ms));
}

TEST(CppTimer, FiresAgainAndAgain) {
    Timers timers(1ms);
    Event fired;
    Timer timer(timers, Kind::periodic, 2ms, [&] { fired.set(); });
    timer.start(1ms);
    for (int i = 0; i < 3; ++i) EXPECT_TRUE(fired.wait_for(30s));
    EXPECT_TRUE(timer.running());
    timer.stop();
    EXPECT_FALSE(timer.running());
    timer.restart();
    EXPECT_TRUE(fired.wait_for(30s));
    timers.close();
}

TEST(CppTimer, DurationsAreRoundedUpToTicks) {
    Timers timers(10ms);
    const auto intervals_of = [&](auto duration) {
        const LogCapture log;
        const Timer timer(timers, Kind::periodic, duration, [] {});
        for (const auto& line : log.lines("OSAL_TIMER")) {
            if (line.message().rfind("Timer create", 0) == 0) return line.message();
        }
        return std::string();
    };
    EXPECT_EQ(intervals_of(10ms), "Timer create:  eType[1] duration[10] iReload[10]\n");
    EXPECT_EQ(intervals_of(1ns), "Timer create:  eType[1] duration[10] iReload[10]\n");
    EXPECT_EQ(intervals_of(0s), "Timer create:  eType[1] duration[10] iReload[10]\n");
    EXPECT_EQ(intervals_of(-1h), "Timer create:  eType[1] duration[10] iReload[10]\n");
    EXPECT_EQ(intervals_of(11ms), "Timer create:  eType[1] duration[20] iReload[20]\n");
    EXPECT_EQ(intervals_of(25ms), "Timer create:  eType[1] duration[30] iReload[30]\n");
    EXPECT_EQ(intervals_of(std::chrono::hours::max()),
              "Timer create:  eType[1] duration[2147483640] iReload[2147483640]\n");

    Timer timer(timers, Kind::one_shot, 10ms, [] {});
    const LogCapture log;
    timer.start(12ms);
    EXPECT_TRUE(logged(log.lines(), {4, "OSAL_TIMER", "Timer start:  iCount[20]\n"}));
    timer.stop();
    timer.start();
    EXPECT_TRUE(logged(log.lines(), {4, "OSAL_TIMER", "Timer start:  iCount[10]\n"}));
}

TEST(CppTimer, TheLongestTickIsItsOwnLongestDuration) {
    const PlatformHook hook(
        "libtavoosal.so", "usleep", +[](useconds_t) { return 0; });
    Timers timers(std::chrono::hours::max());
    Timer timer(timers, Kind::periodic, std::chrono::hours::max(), [] {});
    EXPECT_TRUE(timer);
}

TEST(CppTimer, TheSixthIsRefused) {
    Timers timers(10ms);
    std::vector<Timer> taken;
    for (int i = 0; i < 5; ++i) taken.emplace_back(timers, Kind::one_shot, 10ms, [] {});
    std::error_code error;
    const Timer sixth(
        timers, Kind::one_shot, 10ms, [] {}, error);
    EXPECT_EQ(error, Errc::no_memory);
    EXPECT_FALSE(sixth);
    EXPECT_THROW(Timer(timers, Kind::one_shot, 10ms, [] {}), std::system_error);
    taken.pop_back();
    const Timer again(
        timers, Kind::one_shot, 10ms, [] {}, error);
    EXPECT_FALSE(error);
}

TEST(CppTimer, WithoutMemoryThereIsNoFramework) {
    const tavo::test::NoMemory hook;
    std::error_code error;
    const Timers none(1s, error);
    EXPECT_EQ(error, Errc::no_memory);
    EXPECT_FALSE(none);
    EXPECT_EQ(none.native_handle(), nullptr);
    EXPECT_THROW(Timers(1s), std::system_error);
}

TEST(CppTimer, BadTicksAndCallbacksAreRefused) {
    std::error_code error;
    const Timers none(0ms, error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_FALSE(none);
    EXPECT_THROW(Timers(-1s), std::system_error);
    Timers timers(1s);
    const Timer timer(timers, Kind::one_shot, 1s, nullptr, error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_FALSE(timer);
    Timers moved(std::move(timers));
    const Timer empty(
        timers, Kind::one_shot, 1s, [] {}, error);
    EXPECT_EQ(error, Errc::invalid_param);
}

TEST(CppTimer, ATimerOutlivesItsFrameworkWithoutHarm) {
    Timer timer = [] {
        Timers timers(1ms);
        return Timer(timers, Kind::periodic, 1ms, [] {});
    }();
    std::error_code error;
    timer.start(error);
    EXPECT_EQ(error, Errc::invalid_param);
    timer.restart(error);
    EXPECT_EQ(error, Errc::invalid_param);
    timer.stop(error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_FALSE(timer.running());
    EXPECT_THROW(timer.start(), std::system_error);
    EXPECT_THROW(timer.start(1ms), std::system_error);
    EXPECT_THROW(timer.restart(), std::system_error);
    EXPECT_THROW(timer.stop(), std::system_error);
    timer.close();
    timer.close();
    timer.start(1ms, error);
    EXPECT_EQ(error, Errc::invalid_param);
}

TEST(CppTimer, MovesWithItsCallback) {
    Timers first(1ms);
    Timers timers(std::move(first));
    EXPECT_FALSE(first);
    Event fired;
    Timer timer(timers, Kind::one_shot, 1ms, [&] { fired.set(); });
    Timer moved(std::move(timer));
    EXPECT_FALSE(timer);
    moved.start();
    EXPECT_TRUE(fired.wait_for(30s));
    Timer other(timers, Kind::one_shot, 1ms, [&] { fired.set(); });
    moved = std::move(other);
    moved.start();
    EXPECT_TRUE(fired.wait_for(30s));
}

// The closure must stay for as long as it runs, whoever frees its timer meanwhile.
TEST(CppTimer, ATimerMayFreeItselfInItsCallback) {
    Timers timers(1ms);
    Event fired;
    std::unique_ptr<Timer> timer;
    const auto kept = std::make_shared<int>(7);
    std::atomic<int> seen = 0;
    timer = std::make_unique<Timer>(timers, Kind::periodic, 1ms, [&, kept] {
        timer.reset();
        seen = *kept;
        fired.set();
    });
    timer->start();
    EXPECT_TRUE(fired.wait_for(30s));
    EXPECT_EQ(seen, 7);
    timers.close();
    EXPECT_EQ(kept.use_count(), 1);
}

// The worker may have decided to call, but the timer is freed, and its place taken by another, before it does.
TEST(CppTimer, AFreedTimersCallbackIsNotCalledAnyMore) {
    auto& callbacks = tavo::detail::Callbacks::instance();
    int calls = 0;
    const uintptr_t first = callbacks.add([&] { ++calls; });
    void* const argument = reinterpret_cast<void*>(first);
    tavo::detail::Callbacks::call(argument);
    EXPECT_EQ(calls, 1);
    callbacks.remove(first);
    const uintptr_t second = callbacks.add([&] { calls += 100; });
    EXPECT_NE(first, second);
    tavo::detail::Callbacks::call(argument);
    EXPECT_EQ(calls, 1);
    callbacks.remove(second);
    callbacks.remove(second);
}

TEST(CppTimer, ClosingInACallbackFailsAndCanBeTriedAgain) {
    Timers timers(1ms);
    Event closed;
    std::error_code error;
    Timer timer(timers, Kind::one_shot, 1ms, [&] {
        timers.close(error);
        closed.set();
    });
    timer.start();
    EXPECT_TRUE(closed.wait_for(30s));
    EXPECT_EQ(error, Errc::failure);
    EXPECT_TRUE(timers);
    timers.close(error);
    EXPECT_FALSE(error);
    timers.close();
    EXPECT_FALSE(timers);
    EXPECT_EQ(timers.native_handle(), nullptr);
}

}  // namespace
