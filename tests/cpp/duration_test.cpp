#include "tavo_osal/cpp/duration.hpp"

#include <gtest/gtest.h>

#include <cmath>

namespace {

using namespace std::chrono_literals;
using tavo::detail::from_now;
using tavo::detail::rounded_up;
using tavo::detail::whole_seconds_in_ms;
using Milli = std::chrono::milliseconds;
using FloatSeconds = std::chrono::duration<double>;

constexpr uint64_t kMost64 = std::numeric_limits<uint64_t>::max();
constexpr uint32_t kMost32 = std::numeric_limits<uint32_t>::max();

template <typename Duration>
constexpr uint64_t ms(Duration duration) {
    return rounded_up<uint64_t, Milli>(duration);
}

TEST(CppDuration, WholeUnitsStay) {
    static_assert(ms(0ms) == 0);
    static_assert(ms(17ms) == 17);
    static_assert(ms(2min) == 120000);
    static_assert(ms(std::chrono::duration<int8_t, std::ratio<1>>(100)) == 100000);
}

TEST(CppDuration, PartsOfAUnitAreRoundedUp) {
    EXPECT_EQ(ms(1ns), 1U);
    EXPECT_EQ(ms(1000000ns), 1U);
    EXPECT_EQ(ms(1000001ns), 2U);
    EXPECT_EQ(ms(std::chrono::duration<int, std::ratio<1, 3>>(1)), 334U);
    EXPECT_EQ(ms(std::chrono::duration<int, std::ratio<1, 3>>(3)), 1000U);
    EXPECT_EQ(ms(FloatSeconds(0.0015)), 2U);
    EXPECT_EQ(ms(FloatSeconds(0.25)), 250U);
}

TEST(CppDuration, NegativeOnesAndWhatIsNoNumberAreZero) {
    EXPECT_EQ(ms(-1ns), 0U);
    EXPECT_EQ(ms(std::chrono::hours::min()), 0U);
    EXPECT_EQ(ms(FloatSeconds(-3.5)), 0U);
    EXPECT_EQ(ms(FloatSeconds(std::nan(""))), 0U);
}

TEST(CppDuration, WhatIsTooLongIsTheLongest) {
    EXPECT_EQ(ms(std::chrono::hours::max()), kMost64);
    EXPECT_EQ(ms(FloatSeconds(std::numeric_limits<double>::infinity())), kMost64);
    EXPECT_EQ((rounded_up<uint32_t, Milli>(Milli(int64_t{kMost32}))), kMost32);
    EXPECT_EQ((rounded_up<uint32_t, Milli>(Milli(int64_t{kMost32} + 1))), kMost32);
    EXPECT_EQ((rounded_up<uint32_t, Milli>(Milli(int64_t{kMost32} - 1))), kMost32 - 1);
    EXPECT_EQ((rounded_up<uint32_t, Milli>(10s, 5000U)), 5000U);
    EXPECT_EQ((rounded_up<uint32_t, Milli>(FloatSeconds(1e9))), kMost32);
}

TEST(CppDuration, TheLongestOfTheClocksIsExactWhereItFits) {
    EXPECT_EQ(ms(std::chrono::nanoseconds::max()), 9223372036855U);
    EXPECT_EQ(ms(std::chrono::seconds(std::numeric_limits<int64_t>::max() / 1000)), 9223372036854775000U);
}

TEST(CppDuration, WholeSecondsAreRoundedUpAndStayWhole) {
    EXPECT_EQ(whole_seconds_in_ms<uint32_t>(0s), 0U);
    EXPECT_EQ(whole_seconds_in_ms<uint32_t>(1ns), 1000U);
    EXPECT_EQ(whole_seconds_in_ms<uint32_t>(1000ms), 1000U);
    EXPECT_EQ(whole_seconds_in_ms<uint32_t>(1001ms), 2000U);
    EXPECT_EQ(whole_seconds_in_ms<uint32_t>(std::chrono::hours::max()), kMost32 / 1000 * 1000);
    EXPECT_EQ(whole_seconds_in_ms<uint64_t>(std::chrono::hours::max()), kMost64 / 1000 * 1000);
}

TEST(CppDuration, PointsBeyondTheClockAreItsLast) {
    using Clock = std::chrono::steady_clock;
    EXPECT_EQ(from_now<Clock>(std::chrono::hours::max()), Clock::time_point::max());
    const Clock::time_point before = Clock::now();
    const Clock::time_point point = from_now<Clock>(1h);
    EXPECT_GE(point, before + 1h);
    EXPECT_LE(point, Clock::now() + 1h);
    const Clock::time_point past = from_now<Clock>(-1h);
    EXPECT_LE(past, Clock::now());
}

}  // namespace
