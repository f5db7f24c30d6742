#include "tavo_osal/cpp/thread.hpp"

#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <memory>
#include <string>

#include "cpp/no_memory.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "thread/asleep.h"

namespace {

using namespace std::chrono_literals;
using tavo::Errc;
using tavo::Thread;
using tavo::test::Bedside;
using tavo::test::PlatformHook;

static_assert(std::is_nothrow_move_constructible_v<Thread> && !std::is_copy_constructible_v<Thread>);

TEST(CppThread, RunsWithItsArguments) {
    std::string seen;
    Thread thread(
        [&seen](const std::string& text, std::unique_ptr<int> number) { seen = text + std::to_string(*number); },
        "number ", std::make_unique<int>(7));
    EXPECT_TRUE(thread.joinable());
    thread.join();
    EXPECT_FALSE(thread.joinable());
    EXPECT_EQ(seen, "number 7");
}

struct Counter {
    int count = 0;
    void raise(int by) { count += by; }
};

TEST(CppThread, RunsMemberFunctions) {
    Counter counter;
    Thread(&Counter::raise, &counter, 3).join();
    EXPECT_EQ(counter.count, 3);
}

TEST(CppThread, IsJoinedWhenItsOwnerGoes) {
    std::atomic<bool> done = false;
    {
        const Thread thread([&] {
            tavo::this_thread::sleep_for(20ms);
            done = true;
        });
    }
    EXPECT_TRUE(done);
}

TEST(CppThread, AssignmentJoinsTheOldThread) {
    std::atomic<int> done = 0;
    const auto work = [&] {
        tavo::this_thread::sleep_for(5ms);
        ++done;
    };
    Thread thread(work);
    thread = Thread(work);
    EXPECT_GE(done, 1);
    Thread moved(std::move(thread));
    EXPECT_FALSE(thread.joinable());
    moved.join();
    EXPECT_EQ(done, 2);
}

TEST(CppThread, AnEmptyOneRefusesToBeUsed) {
    Thread thread;
    std::error_code error;
    thread.join(error);
    EXPECT_EQ(error, Errc::invalid_param);
    thread.detach(error);
    EXPECT_EQ(error, Errc::invalid_param);
    thread.cancel(error);
    EXPECT_EQ(error, Errc::invalid_param);
    thread.set_real_time_priority(TAVO_THREAD_POLICY_RR, 1, error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_THROW(thread.join(), std::system_error);
    EXPECT_THROW(thread.detach(), std::system_error);
    EXPECT_THROW(thread.cancel(), std::system_error);
    EXPECT_THROW(thread.set_real_time_priority(TAVO_THREAD_POLICY_RR, 1), std::system_error);
}

TEST(CppThread, JoiningTwiceIsRefused) {
    Thread thread([] {});
    thread.join();
    std::error_code error;
    thread.join(error);
    EXPECT_EQ(error, Errc::invalid_param);
}

TEST(CppThread, RunsOnByItselfWhenDetached) {
    Bedside bedside;
    Thread thread([&] { bedside.going_to_sleep(); });
    thread.detach();
    EXPECT_FALSE(thread.joinable());
    bedside.wait_until_gone();
}

// A plain function without anything to destroy, as cancelled threads should be.
void sleep_for_ever(Bedside* bedside) {
    bedside->going_to_sleep();
    for (;;) pause();
}

TEST(CppThread, EndsWhenCancelled) {
    Bedside bedside;
    Thread thread(sleep_for_ever, &bedside);
    bedside.wait_until_asleep();
    thread.cancel();
    thread.join();
}

TEST(CppThread, AThreadThatCannotBeMadeIsReportedAndItsFunctionFreed) {
    const PlatformHook hook(
        "libtavoosal.so", "pthread_create",
        +[](pthread_t*, const pthread_attr_t*, void* (*)(void*), void*) { return EAGAIN; });
    const auto counted = std::make_shared<int>(0);
    std::error_code error;
    const Thread thread(error, [counted] {});
    EXPECT_EQ(error, Errc::failure);
    EXPECT_FALSE(thread.joinable());
    EXPECT_EQ(counted.use_count(), 1);
    EXPECT_THROW(Thread([] {}), std::system_error);
}

TEST(CppThread, AFailedJoinLeavesItJoinable) {
    Thread thread([] {});
    {
        const PlatformHook hook(
            "libtavoosal.so", "pthread_join", +[](pthread_t, void**) { return EINVAL; });
        std::error_code error;
        thread.join(error);
        EXPECT_EQ(error, Errc::failure);
        EXPECT_TRUE(thread.joinable());
    }
    thread.join();
}

TEST(CppThread, RefusedPrioritiesAreReported) {
    Thread thread([] { tavo::this_thread::yield(); });
    std::error_code error;
    thread.set_real_time_priority(TAVO_THREAD_POLICY_RR, 0, error);
    EXPECT_EQ(error, Errc::invalid_param);
    thread.set_real_time_priority(99, 1, error);
    EXPECT_EQ(error, Errc::invalid_param);
}

TEST(CppThread, TheFunctionIsDestroyedWhenItHasRun) {
    const auto counted = std::make_shared<int>(0);
    Thread([counted] {}).join();
    EXPECT_EQ(counted.use_count(), 1);
}

useconds_t g_micros;
timespec g_duration;

TEST(CppSleep, IsRoundedUpToWhatTheCallTakes) {
    const PlatformHook micros(
        "libtavoosal.so", "usleep", +[](useconds_t duration) {
            g_micros = duration;
            return 0;
        });
    const PlatformHook nanos(
        "libtavoosal.so", "nanosleep", +[](const timespec* duration, timespec*) {
            g_duration = *duration;
            return 0;
        });
    tavo::this_thread::sleep_for(1ns);
    EXPECT_EQ(g_micros, 1U);
    tavo::this_thread::sleep_for(999999us);
    EXPECT_EQ(g_micros, 999999U);
    tavo::this_thread::sleep_for(1000000001ns);
    EXPECT_EQ(g_duration.tv_sec, 1);
    EXPECT_EQ(g_duration.tv_nsec, 1000000);
    tavo::this_thread::sleep_for(std::chrono::hours::max());
    EXPECT_EQ(g_duration.tv_sec, 2147483647);
    EXPECT_EQ(g_duration.tv_nsec, 0);
    g_micros = 42;
    tavo::this_thread::sleep_for(0s);
    tavo::this_thread::sleep_for(-1h);
    EXPECT_EQ(g_micros, 42U);
}

TEST(CppThread, WithoutMemoryThereIsNone) {
    const tavo::test::NoMemory hook;
    std::error_code error;
    const Thread none(error, [] { ADD_FAILURE() << "a thread runs"; });
    EXPECT_EQ(error, Errc::no_memory);
    EXPECT_FALSE(none.joinable());
}

TEST(CppSleep, AnInterruptedOneFails) {
    const PlatformHook micros(
        "libtavoosal.so", "usleep", +[](useconds_t) { return -1; });
    std::error_code error;
    tavo::this_thread::sleep_for(1ms, error);
    EXPECT_EQ(error, Errc::failure);
    EXPECT_THROW(tavo::this_thread::sleep_for(1ms), std::system_error);
}

}  // namespace
