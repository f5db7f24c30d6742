#include "tavo_osal/cpp/mutex.hpp"

#include <gtest/gtest.h>

#include <cerrno>
#include <mutex>
#include <thread>
#include <vector>

#include "support/log_capture.h"
#include "support/platform_fault.h"

namespace {

using tavo::Errc;
using tavo::Mutex;
using tavo::test::LogCapture;
using tavo::test::PlatformHook;

static_assert(!std::is_copy_constructible_v<Mutex> && !std::is_copy_assignable_v<Mutex>);
static_assert(std::is_nothrow_move_constructible_v<Mutex> && std::is_nothrow_move_assignable_v<Mutex>);

int g_destroyed = 0;
int count_destroy(pthread_mutex_t* mutex) {
    ++g_destroyed;
    return pthread_mutex_destroy(mutex);
}
const auto refuse = +[](pthread_mutex_t*) { return EINVAL; };

TEST(CppMutex, GuardsWhatThreadsShare) {
    Mutex mutex;
    int count = 0;
    const auto raise = [&] {
        for (int i = 0; i < 10000; ++i) {
            const std::lock_guard<Mutex> guard(mutex);
            ++count;
        }
    };
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) threads.emplace_back(raise);
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(count, 40000);
}

TEST(CppMutex, TryLockTellsWhetherItIsHeld) {
    Mutex mutex;
    std::unique_lock<Mutex> lock(mutex, std::try_to_lock);
    EXPECT_TRUE(lock.owns_lock());
    std::error_code error = Errc::failure;
    EXPECT_FALSE(mutex.try_lock(error));
    EXPECT_FALSE(error) << error.message();
    EXPECT_FALSE(mutex.try_lock());
    lock.unlock();
    EXPECT_TRUE(mutex.try_lock());
    mutex.unlock();
}

TEST(CppMutex, SeveralAreLockedAtOnce) {
    Mutex first;
    Mutex second;
    const std::scoped_lock lock(first, second);
    EXPECT_FALSE(first.try_lock());
    EXPECT_FALSE(second.try_lock());
}

TEST(CppMutex, IsDestroyedOnceHoweverOftenItMoves) {
    g_destroyed = 0;
    const PlatformHook hook("libtavoosal.so", "pthread_mutex_destroy", &count_destroy);
    {
        Mutex first;
        TAVO_Mutex* const handle = first.native_handle();
        Mutex second(std::move(first));
        EXPECT_FALSE(first);
        EXPECT_EQ(second.native_handle(), handle);
        Mutex third;
        third = std::move(second);
        EXPECT_EQ(g_destroyed, 1);
        EXPECT_EQ(third.native_handle(), handle);
        Mutex& same = third;
        third = std::move(same);
    }
    EXPECT_EQ(g_destroyed, 2);
}

TEST(CppMutex, ClosingTwiceDestroysOnce) {
    g_destroyed = 0;
    const PlatformHook hook("libtavoosal.so", "pthread_mutex_destroy", &count_destroy);
    Mutex mutex;
    mutex.close();
    EXPECT_FALSE(mutex);
    std::error_code error = Errc::failure;
    mutex.close(error);
    EXPECT_FALSE(error);
    EXPECT_EQ(g_destroyed, 1);
}

TEST(CppMutex, AnEmptyOneRefusesToBeUsed) {
    Mutex mutex;
    mutex.close();
    std::error_code error;
    mutex.lock(error);
    EXPECT_EQ(error, Errc::invalid_param);
    mutex.unlock(error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_FALSE(mutex.try_lock(error));
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_THROW(mutex.lock(), std::system_error);
    EXPECT_THROW(mutex.unlock(), std::system_error);
    EXPECT_THROW(static_cast<void>(mutex.try_lock()), std::system_error);
}

TEST(CppMutex, FailuresOfThePlatformAreReported) {
    const PlatformHook init(
        "libtavoosal.so", "pthread_mutex_init", +[](pthread_mutex_t*, const pthread_mutexattr_t*) { return EAGAIN; });
    std::error_code error;
    const Mutex mutex(error);
    EXPECT_EQ(error, Errc::failure);
    EXPECT_FALSE(mutex);
    try {
        const Mutex thrown;
        FAIL() << "nothing was thrown";
    } catch (const std::system_error& failure) {
        EXPECT_EQ(failure.code(), Errc::failure);
    }
}

TEST(CppMutex, AFailedDestroyIsReportedAndStillTheEnd) {
    Mutex mutex;
    const PlatformHook hook("libtavoosal.so", "pthread_mutex_destroy", refuse);
    std::error_code error;
    mutex.close(error);
    EXPECT_EQ(error, Errc::failure);
    EXPECT_FALSE(mutex);
}

TEST(CppMutex, AFailedLockThrows) {
    Mutex mutex;
    const PlatformHook hook("libtavoosal.so", "pthread_mutex_lock", refuse);
    EXPECT_THROW(mutex.lock(), std::system_error);
}

TEST(CppMutex, HandlesAreTakenOverAndGivenUp) {
    TAVO_Mutex* handle = nullptr;
    ASSERT_EQ(tavo_osal_mutex_create(&handle), TAVO_SUCCESS);
    Mutex mutex = Mutex::adopt(handle);
    mutex.lock();
    mutex.unlock();
    EXPECT_EQ(mutex.release(), handle);
    EXPECT_FALSE(mutex);
    EXPECT_EQ(tavo_osal_mutex_destroy(&handle), TAVO_SUCCESS);
}

}  // namespace
