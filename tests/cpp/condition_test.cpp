#include "tavo_osal/cpp/condition.hpp"

#include <gtest/gtest.h>

#include <cerrno>
#include <thread>

#include "support/platform_fault.h"

namespace {

using namespace std::chrono_literals;
using tavo::Condition;
using tavo::Errc;
using tavo::Mutex;
using tavo::test::PlatformHook;

static_assert(std::is_nothrow_move_constructible_v<Condition> && !std::is_copy_constructible_v<Condition>);

timespec g_deadline;
bool g_without_limit;

// Notes the deadline and says that it has passed.
const auto time_is_up = +[](pthread_cond_t*, pthread_mutex_t*, const timespec* deadline) {
    g_deadline = *deadline;
    return ETIMEDOUT;
};
const auto woken = +[](pthread_cond_t*, pthread_mutex_t*) {
    g_without_limit = true;
    return 0;
};

TEST(CppCondition, WakesAWaiter) {
    Mutex mutex;
    Condition condition;
    bool ready = false;
    std::thread notifier([&] {
        const std::lock_guard<Mutex> guard(mutex);
        ready = true;
        condition.notify_one();
    });
    std::unique_lock<Mutex> lock(mutex);
    condition.wait(lock, [&] { return ready; });
    EXPECT_TRUE(ready);
    EXPECT_TRUE(lock.owns_lock());
    lock.unlock();
    notifier.join();
}

TEST(CppCondition, WakesAllWaiters) {
    Mutex mutex;
    Condition condition;
    bool ready = false;
    int woken_up = 0;
    const auto wait = [&] {
        std::unique_lock<Mutex> lock(mutex);
        if (condition.wait_for(lock, 30s, [&] { return ready; })) ++woken_up;
    };
    std::thread first(wait);
    std::thread second(wait);
    {
        const std::lock_guard<Mutex> guard(mutex);
        ready = true;
    }
    condition.notify_all();
    first.join();
    second.join();
    EXPECT_EQ(woken_up, 2);
}

TEST(CppCondition, TellsWhenTheTimeIsUp) {
    Mutex mutex;
    Condition condition;
    std::unique_lock<Mutex> lock(mutex);
    EXPECT_FALSE(condition.wait_for(lock, 0s));
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_FALSE(condition.wait_for(lock, 1ms, [] { return false; }));
    EXPECT_GE(std::chrono::steady_clock::now() - begin, 1ms);
    EXPECT_TRUE(condition.wait_for(lock, -1s, [] { return true; }));
}

TEST(CppCondition, TimeOutsAreWholeSecondsRoundedUp) {
    Mutex mutex;
    Condition condition;
    std::unique_lock<Mutex> lock(mutex);
    const PlatformHook clock(
        "libtavoosal.so", "gettimeofday", +[](timeval* now, void*) {
            *now = {1000, 999999};
            return 0;
        });
    const PlatformHook hook("libtavoosal.so", "pthread_cond_timedwait", time_is_up);
    EXPECT_FALSE(condition.wait_for(lock, 1ms));
    EXPECT_EQ(g_deadline.tv_sec, 1001);
    EXPECT_EQ(g_deadline.tv_nsec, 999999000);
    EXPECT_FALSE(condition.wait_for(lock, 2001ms));
    EXPECT_EQ(g_deadline.tv_sec, 1003);
}

TEST(CppCondition, MoreThanAYearIsNoLimit) {
    Mutex mutex;
    Condition condition;
    std::unique_lock<Mutex> lock(mutex);
    g_without_limit = false;
    const PlatformHook hook("libtavoosal.so", "pthread_cond_wait", woken);
    EXPECT_TRUE(condition.wait_for(lock, std::chrono::hours::max()));
    EXPECT_TRUE(g_without_limit);
    int asked = 0;
    EXPECT_TRUE(condition.wait_for(lock, std::chrono::hours::max(), [&] { return ++asked > 2; }));
}

TEST(CppCondition, WaitsWithoutTheMutexAreRefused) {
    Mutex mutex;
    Condition condition;
    std::unique_lock<Mutex> lock(mutex, std::defer_lock);
    std::error_code error;
    condition.wait(lock, error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_FALSE(condition.wait_for(lock, 1s, error));
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_FALSE(condition.wait_for(
        lock, 1s, [] { return false; }, error));
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_THROW(condition.wait(lock), std::system_error);
    EXPECT_THROW(condition.wait_for(lock, 1s), std::system_error);
    EXPECT_THROW(condition.wait(lock, [] { return false; }), std::system_error);
    EXPECT_THROW(condition.wait_for(lock, 1s, [] { return false; }), std::system_error);
}

TEST(CppCondition, AnEmptyOneRefusesToBeUsed) {
    Condition condition;
    Condition moved(std::move(condition));
    EXPECT_TRUE(moved);
    std::error_code error;
    condition.notify_one(error);
    EXPECT_EQ(error, Errc::invalid_param);
    condition.notify_all(error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_THROW(condition.notify_one(), std::system_error);
    EXPECT_THROW(condition.notify_all(), std::system_error);
    condition.close(error);
    EXPECT_FALSE(error);
}

TEST(CppCondition, AFailedDestroyKeepsIt) {
    Condition condition;
    {
        const PlatformHook hook(
            "libtavoosal.so", "pthread_cond_destroy", +[](pthread_cond_t*) { return EBUSY; });
        std::error_code error;
        condition.close(error);
        EXPECT_EQ(error, Errc::failure);
        EXPECT_TRUE(condition);
    }
    condition.close();
    EXPECT_FALSE(condition);
}

// The leak would be found by AddressSanitizer.
TEST(CppCondition, AFailedInitialisationLeavesNothing) {
    const PlatformHook hook(
        "libtavoosal.so", "pthread_cond_init", +[](pthread_cond_t*, const pthread_condattr_t*) { return EAGAIN; });
    std::error_code error;
    const Condition condition(error);
    EXPECT_EQ(error, Errc::failure);
    EXPECT_FALSE(condition);
    EXPECT_THROW(Condition(), std::system_error);
}

}  // namespace
