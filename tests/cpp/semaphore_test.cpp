#include "tavo_osal/cpp/semaphore.hpp"

#include <gtest/gtest.h>
#include <sys/mman.h>

#include <cerrno>
#include <climits>
#include <filesystem>
#include <thread>

#include "cpp/no_memory.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"

namespace {

using namespace std::chrono_literals;
using std::chrono::system_clock;
using tavo::Errc;
using tavo::ProcessSemaphore;
using tavo::Semaphore;
using tavo::test::PlatformHook;

timespec g_deadline;
const auto time_is_up = +[](sem_t*, const timespec* deadline) {
    g_deadline = *deadline;
    errno = ETIMEDOUT;
    return -1;
};

TEST(CppSemaphore, CountsAreTakenAndGivenBack) {
    Semaphore semaphore(2);
    EXPECT_EQ(semaphore.value(), 2);
    semaphore.acquire();
    EXPECT_TRUE(semaphore.try_acquire());
    std::error_code error = Errc::failure;
    EXPECT_FALSE(semaphore.try_acquire(error));
    EXPECT_FALSE(error) << error.message();
    semaphore.release();
    EXPECT_EQ(semaphore.value(), 1);
}

TEST(CppSemaphore, WithoutMemoryThereIsNone) {
    const tavo::test::NoMemory hook;
    std::error_code error;
    const Semaphore none(1, error);
    EXPECT_EQ(error, Errc::no_memory);
    EXPECT_FALSE(none);
}

TEST(CppSemaphore, WakesAnotherThread) {
    Semaphore semaphore(0);
    std::thread releaser([&] { semaphore.release(); });
    semaphore.acquire();
    releaser.join();
}

TEST(CppSemaphore, WaitsAtMostForATime) {
    Semaphore semaphore(1);
    EXPECT_TRUE(semaphore.try_acquire_for(0s));
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_FALSE(semaphore.try_acquire_for(2ms));
    EXPECT_GE(std::chrono::steady_clock::now() - begin, 1ms);
    EXPECT_FALSE(semaphore.try_acquire_until(system_clock::now() - 1h));
    EXPECT_FALSE(semaphore.try_acquire_for(-1h));
}

TEST(CppSemaphore, PointsInTimeAreRoundedUpToMilliseconds) {
    Semaphore semaphore(0);
    const PlatformHook hook("libtavoosal.so", "sem_timedwait", time_is_up);
    const system_clock::time_point point(1500ms + 1ns);
    EXPECT_FALSE(semaphore.try_acquire_until(point));
    EXPECT_EQ(g_deadline.tv_sec, 1);
    EXPECT_EQ(g_deadline.tv_nsec, 501000000);
    EXPECT_FALSE(semaphore.try_acquire_until(system_clock::time_point(-5h)));
    EXPECT_EQ(g_deadline.tv_sec, 0);
    EXPECT_EQ(g_deadline.tv_nsec, 0);
}

TEST(CppSemaphore, MoreThanAYearIsNoLimit) {
    Semaphore semaphore(2);
    const PlatformHook hook("libtavoosal.so", "sem_timedwait", time_is_up);
    EXPECT_TRUE(semaphore.try_acquire_for(std::chrono::hours::max()));
    EXPECT_TRUE(semaphore.try_acquire_until(system_clock::time_point::max()));
    EXPECT_EQ(semaphore.value(), 0);
}

TEST(CppSemaphore, AnInterruptedWaitFails) {
    Semaphore semaphore(0);
    const PlatformHook hook(
        "libtavoosal.so", "sem_wait", +[](sem_t*) {
            errno = EINTR;
            return -1;
        });
    std::error_code error;
    semaphore.acquire(error);
    EXPECT_EQ(error, Errc::failure);
    EXPECT_EQ(errno, EINTR);
    EXPECT_THROW(semaphore.acquire(), std::system_error);
}

TEST(CppSemaphore, ACountTooLargeIsRefused) {
    std::error_code error;
    const Semaphore semaphore(0xFFFFFFFFU, error);
    EXPECT_EQ(error, Errc::failure);
    EXPECT_FALSE(semaphore);
    EXPECT_THROW(Semaphore(0xFFFFFFFFU), std::system_error);
    Semaphore full(SEM_VALUE_MAX);
    full.release(error);
    EXPECT_EQ(error, Errc::failure);
}

TEST(CppSemaphore, IsDestroyedOnceAndKeepsItsAddressWhenMoved) {
    static int destroyed;
    destroyed = 0;
    const PlatformHook hook(
        "libtavoosal.so", "sem_destroy", +[](sem_t* semaphore) {
            ++destroyed;
            return sem_destroy(semaphore);
        });
    {
        Semaphore first(3);
        sem_t* const handle = first.native_handle();
        Semaphore second(std::move(first));
        EXPECT_FALSE(first);
        EXPECT_EQ(second.native_handle(), handle);
        EXPECT_EQ(second.value(), 3);
        second.close();
        second.close();
        EXPECT_EQ(destroyed, 1);
        Semaphore third(0);
        third = Semaphore(1);
        EXPECT_EQ(destroyed, 2);
    }
    EXPECT_EQ(destroyed, 3);
}

TEST(CppSemaphore, AnEmptyOneRefusesToBeUsed) {
    Semaphore semaphore(1);
    semaphore.close();
    std::error_code error;
    semaphore.acquire(error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_FALSE(semaphore.try_acquire(error));
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_FALSE(semaphore.try_acquire_for(1s, error));
    EXPECT_EQ(error, Errc::invalid_param);
    semaphore.release(error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_EQ(semaphore.value(error), 0);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_THROW(semaphore.release(), std::system_error);
    EXPECT_THROW(static_cast<void>(semaphore.try_acquire()), std::system_error);
    EXPECT_THROW(static_cast<void>(semaphore.value()), std::system_error);
}

TEST(CppProcessSemaphore, IsOneForAllWhoKnowTheKey) {
    ProcessSemaphore mine(4660);
    ProcessSemaphore other(4660);
    mine.acquire();
    std::thread waiter([&] { other.acquire(); });
    mine.release();
    waiter.join();
    other.release();
    EXPECT_TRUE(std::filesystem::exists("/sdcard/4660"));
}

TEST(CppProcessSemaphore, IsUnmappedOnceHoweverOftenItMoves) {
    static int unmapped;
    unmapped = 0;
    const PlatformHook hook(
        "libtavoosal.so", "munmap", +[](void* address, size_t size) {
            ++unmapped;
            return munmap(address, size);
        });
    {
        ProcessSemaphore first(10);
        ProcessSemaphore second(std::move(first));
        EXPECT_FALSE(first);
        EXPECT_TRUE(second);
        second.close();
        second.close();
        EXPECT_EQ(unmapped, 1);
        ProcessSemaphore third(11);
        third = ProcessSemaphore(12);
        EXPECT_EQ(unmapped, 2);
    }
    EXPECT_EQ(unmapped, 3);
}

TEST(CppProcessSemaphore, AnEmptyOneRefusesToBeUsed) {
    ProcessSemaphore semaphore(10);
    semaphore.close();
    EXPECT_EQ(semaphore.native_handle(), 0);
    std::error_code error;
    semaphore.acquire(error);
    EXPECT_EQ(error, Errc::failure);
    semaphore.release(error);
    EXPECT_EQ(error, Errc::failure);
    EXPECT_THROW(semaphore.acquire(), std::system_error);
    EXPECT_THROW(semaphore.release(), std::system_error);
}

TEST(CppProcessSemaphore, AFileThatCannotBeMappedIsAFailureHere) {
    const ProcessSemaphore there(10);
    const PlatformHook hook(
        "libtavoosal.so", "mmap", +[](void*, size_t, int, int, int, off_t) {
            errno = ENOMEM;
            return MAP_FAILED;
        });
    std::error_code error;
    const ProcessSemaphore semaphore(10, error);
    EXPECT_EQ(error, Errc::failure);
    EXPECT_FALSE(semaphore);
    EXPECT_THROW(ProcessSemaphore(10), std::system_error);
}

TEST(CppProcessSemaphore, AFailedUnmappingIsReported) {
    ProcessSemaphore semaphore(10);
    const TAVO_INT64 handle = semaphore.native_handle();
    std::error_code error;
    {
        const PlatformHook hook(
            "libtavoosal.so", "munmap", +[](void*, size_t) {
                errno = EINVAL;
                return -1;
            });
        semaphore.close(error);
    }
    EXPECT_EQ(error, Errc::semaphore_delete_failed);
    EXPECT_FALSE(semaphore);
    EXPECT_EQ(tavo_semaphore_delete(handle), TAVO_SUCCESS);
}

}  // namespace
