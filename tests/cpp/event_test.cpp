#include "tavo_osal/cpp/event.hpp"

#include <gtest/gtest.h>

#include <cerrno>
#include <thread>

#include "support/platform_fault.h"

namespace {

using namespace std::chrono_literals;
using tavo::Errc;
using tavo::Event;
using tavo::test::PlatformHook;

timespec g_deadline;
const auto time_is_up = +[](pthread_cond_t*, pthread_mutex_t*, const timespec* deadline) {
    g_deadline = *deadline;
    return ETIMEDOUT;
};

TEST(CppEvent, SetsAreCountedAndTaken) {
    Event event;
    event.set();
    event.set();
    event.wait();
    EXPECT_TRUE(event.wait_for(1s));
    EXPECT_FALSE(event.wait_for(1ms));
}

TEST(CppEvent, AWaitTakesAllWhenAsked) {
    Event event;
    event.set();
    event.set();
    event.wait(Event::Take::all);
    EXPECT_FALSE(event.wait_for(1ms));
    event.set();
    event.set();
    EXPECT_TRUE(event.wait_for(1s, Event::Take::all));
    EXPECT_FALSE(event.wait_for(1ms));
}

TEST(CppEvent, TheCountIsClearedAndSetToOne) {
    Event event;
    event.set();
    event.set();
    event.set_to_one();
    event.wait();
    EXPECT_FALSE(event.wait_for(1ms));
    event.set();
    event.clear();
    EXPECT_FALSE(event.wait_for(1ms));
}

TEST(CppEvent, WakesAnotherThread) {
    Event event;
    std::thread setter([&] { event.set(); });
    event.wait();
    setter.join();
}

TEST(CppEvent, TimeOutsAreWholeSecondsRoundedUp) {
    Event event;
    const PlatformHook clock(
        "libtavoosal.so", "gettimeofday", +[](timeval* now, void*) {
            *now = {1000, 0};
            return 0;
        });
    const PlatformHook hook("libtavoosal.so", "pthread_cond_timedwait", time_is_up);
    EXPECT_FALSE(event.wait_for(1ns));
    EXPECT_EQ(g_deadline.tv_sec, 1001);
    EXPECT_FALSE(event.wait_for(1999ms));
    EXPECT_EQ(g_deadline.tv_sec, 1002);
    EXPECT_FALSE(event.wait_for(24h * 365));
    EXPECT_EQ(g_deadline.tv_sec, 1000 + 0xFFFFFFFF / 1000);
}

TEST(CppEvent, MoreThanAYearIsNoLimit) {
    Event event;
    static int waits;
    waits = 0;
    const PlatformHook hook(
        "libtavoosal.so", "pthread_cond_wait", +[](pthread_cond_t*, pthread_mutex_t*) {
            ++waits;
            return 0;
        });
    EXPECT_TRUE(event.wait_for(std::chrono::hours::max()));
    EXPECT_EQ(waits, 1);
}

TEST(CppEvent, NoTimeAtAllIsRefused) {
    Event event;
    event.set();
    std::error_code error;
    EXPECT_FALSE(event.wait_for(0s, error));
    EXPECT_EQ(error, Errc::failure);
    EXPECT_FALSE(event.wait_for(-1h, error));
    EXPECT_EQ(error, Errc::failure);
    EXPECT_THROW(event.wait_for(0s), std::system_error);
}

TEST(CppEvent, AnEmptyOneRefusesToBeUsed) {
    Event event;
    const Event taken(std::move(event));
    std::error_code error;
    event.set(error);
    EXPECT_EQ(error, Errc::invalid_param);
    event.set_to_one(error);
    EXPECT_EQ(error, Errc::invalid_param);
    event.clear(error);
    EXPECT_EQ(error, Errc::invalid_param);
    event.wait(error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_FALSE(event.wait_for(1s, error));
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_THROW(event.set(), std::system_error);
    EXPECT_THROW(event.set_to_one(), std::system_error);
    EXPECT_THROW(event.clear(), std::system_error);
    EXPECT_THROW(event.wait(), std::system_error);
    event.close();
}

TEST(CppEvent, AFailedDestroyIsReportedAndStillTheEnd) {
    Event event;
    const PlatformHook hook(
        "libtavoosal.so", "pthread_cond_destroy", +[](pthread_cond_t*) { return EBUSY; });
    std::error_code error;
    event.close(error);
    EXPECT_EQ(error, Errc::destroy_failed);
    EXPECT_FALSE(event);
}

TEST(CppEvent, WithoutMemoryThereIsNone) {
    const PlatformHook hook(
        "libtavoosal.so", "tavo_osal_mem_malloc", +[](unsigned int) -> void* { return nullptr; });
    std::error_code error;
    const Event event(error);
    EXPECT_EQ(error, Errc::no_memory);
    EXPECT_FALSE(event);
}

}  // namespace
