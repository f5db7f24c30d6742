#include "tavo_osal/mutex.h"

#include <gtest/gtest.h>
#include <pthread.h>

#include <cerrno>
#include <cstdlib>
#include <thread>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/memory.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_THREAD";

int g_released_by_library = 0;
int g_released_by_c_library = 0;

void count_library_release(void* block) {
    ++g_released_by_library;
    free(block);
}

void count_c_library_release(void* block) {
    ++g_released_by_c_library;
    free(block);
}

TAVO_Mutex* created() {
    TAVO_Mutex* mutex = nullptr;
    EXPECT_EQ(tavo_osal_mutex_create(&mutex), TAVO_SUCCESS);
    return mutex;
}

TEST(Mutex, CreateStoresAHandleAndReportsSuccessAsInformation) {
    const LogCapture log;
    TAVO_Mutex* mutex = nullptr;
    EXPECT_EQ(tavo_osal_mutex_create(&mutex), TAVO_SUCCESS);
    EXPECT_NE(mutex, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, kTag, "Mutex allocation success.\n"}}));
    EXPECT_EQ(tavo_osal_mutex_destroy(&mutex), TAVO_SUCCESS);
}

TEST(Mutex, CreateRefusesANullPointer) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_mutex_create(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid Mutex\n"}}));
}

TEST(Mutex, HandleIsTheAddressOfAPlatformMutexWithDefaultAttributes) {
    TAVO_Mutex* mutex = created();
    auto* platform = reinterpret_cast<pthread_mutex_t*>(mutex);
    EXPECT_EQ(pthread_mutex_lock(platform), 0);
    EXPECT_EQ(tavo_osal_mutex_try_lock(mutex), TAVO_BUSY) << "not recursive";
    EXPECT_EQ(pthread_mutex_unlock(platform), 0);
    tavo_osal_mutex_destroy(&mutex);
}

TEST(Mutex, CreatePassesNoAttributes) {
    static bool with_attributes;
    with_attributes = true;
    const PlatformHook hook(
        kLibrary, "pthread_mutex_init", +[](pthread_mutex_t* mutex, const pthread_mutexattr_t* attributes) {
            with_attributes = attributes != nullptr;
            return pthread_mutex_init(mutex, attributes);
        });
    TAVO_Mutex* mutex = created();
    EXPECT_FALSE(with_attributes);
    tavo_osal_mutex_destroy(&mutex);
}

TEST(Mutex, CreateWithoutMemoryReportsItAndClearsTheHandle) {
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "malloc", +[](size_t) -> void* { return nullptr; });
    TAVO_Mutex* mutex = reinterpret_cast<TAVO_Mutex*>(&mutex);
    EXPECT_EQ(tavo_osal_mutex_create(&mutex), TAVO_NO_MEMORY);
    EXPECT_EQ(mutex, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(kTag), {{1, kTag, "Mutex allocation failed.\n"}}));
}

TEST(Mutex, CreateThatThePlatformRefusesReleasesTheBlockWithTheCLibrary) {
    const LogCapture log;
    const PlatformHook init(
        kLibrary, "pthread_mutex_init", +[](pthread_mutex_t*, const pthread_mutexattr_t*) { return EAGAIN; });
    const PlatformHook library_free(kLibrary, "tavo_osal_mem_free", &count_library_release);
    const PlatformHook c_library_free(kLibrary, "free", &count_c_library_release);
    TAVO_Mutex* mutex = reinterpret_cast<TAVO_Mutex*>(&mutex);
    EXPECT_EQ(tavo_osal_mutex_create(&mutex), TAVO_FAILURE);
    EXPECT_EQ(mutex, nullptr);
    EXPECT_EQ(g_released_by_library, 0);
    EXPECT_EQ(g_released_by_c_library, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Mutex creation failed. Error = 11\n"}}));
}

TEST(Mutex, LockAndUnlockExcludeOtherThreads) {
    TAVO_Mutex* mutex = created();
    int count = 0;
    const auto work = [&] {
        for (int i = 0; i < 10000; ++i) {
            ASSERT_EQ(tavo_osal_mutex_lock(mutex), TAVO_SUCCESS);
            ++count;
            ASSERT_EQ(tavo_osal_mutex_unlock(mutex), TAVO_SUCCESS);
        }
    };
    std::thread other(work);
    work();
    other.join();
    EXPECT_EQ(count, 20000);
    EXPECT_EQ(tavo_osal_mutex_destroy(&mutex), TAVO_SUCCESS);
}

TEST(Mutex, OperationsRefuseANullHandle) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_mutex_lock(nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_mutex_unlock(nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_mutex_try_lock(nullptr), TAVO_INVALID_PARAM);
    const tavo::test::ExpectedLine line{1, kTag, "Invalid Mutex\n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line, line}));
}

TEST(Mutex, LockReportsThePlatformsError) {
    TAVO_Mutex* mutex = created();
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "pthread_mutex_lock", +[](pthread_mutex_t*) { return EDEADLK; });
    EXPECT_EQ(tavo_osal_mutex_lock(mutex), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Mutex lock failed. Error=35\n"}}));
    tavo_osal_mutex_destroy(&mutex);
}

TEST(Mutex, UnlockReportsThePlatformsError) {
    TAVO_Mutex* mutex = created();
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "pthread_mutex_unlock", +[](pthread_mutex_t*) { return EPERM; });
    EXPECT_EQ(tavo_osal_mutex_unlock(mutex), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Mutex unlock failed. Error=1\n"}}));
    tavo_osal_mutex_destroy(&mutex);
}

TEST(Mutex, TryLockOfAMutexHeldByTheCallerOrAnotherThreadIsBusyAndSaysSo) {
    TAVO_Mutex* mutex = created();
    ASSERT_EQ(tavo_osal_mutex_try_lock(mutex), TAVO_SUCCESS);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_mutex_try_lock(mutex), TAVO_BUSY);
    std::thread([mutex] { EXPECT_EQ(tavo_osal_mutex_try_lock(mutex), TAVO_BUSY); }).join();
    const tavo::test::ExpectedLine line{1, kTag, "Mutex already locked! Error=16\n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
    EXPECT_EQ(tavo_osal_mutex_unlock(mutex), TAVO_SUCCESS);
    tavo_osal_mutex_destroy(&mutex);
}

TEST(Mutex, TryLockReportsOtherErrorsAsFailuresToLock) {
    TAVO_Mutex* mutex = created();
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "pthread_mutex_trylock", +[](pthread_mutex_t*) { return EINVAL; });
    EXPECT_EQ(tavo_osal_mutex_try_lock(mutex), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Mutex lock failed. Error=22\n"}}));
    tavo_osal_mutex_destroy(&mutex);
}

TEST(Mutex, DestroyOfANullHandleSucceedsSilently) {
    const LogCapture log;
    TAVO_Mutex* mutex = nullptr;
    EXPECT_EQ(tavo_osal_mutex_destroy(&mutex), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(Mutex, DestroyRefusesANullPointer) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_mutex_destroy(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid Mutex\n"}}));
}

TEST(Mutex, DestroyLeavesTheHandleVariableAsItWas) {
    TAVO_Mutex* mutex = created();
    const TAVO_Mutex* before = mutex;
    const LogCapture log;
    const PlatformHook hook(kLibrary, "tavo_osal_mem_free", &count_library_release);
    EXPECT_EQ(tavo_osal_mutex_destroy(&mutex), TAVO_SUCCESS);
    EXPECT_EQ(mutex, before);
    EXPECT_EQ(g_released_by_library, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST(Mutex, DestroyReleasesTheBlockEvenWhenThePlatformRefuses) {
    TAVO_Mutex* mutex = created();
    ASSERT_EQ(tavo_osal_mutex_lock(mutex), TAVO_SUCCESS);
    const TAVO_Mutex* before = mutex;
    const LogCapture log;
    const PlatformHook hook(kLibrary, "tavo_osal_mem_free", &count_library_release);
    const PlatformHook destroy(
        kLibrary, "pthread_mutex_destroy", +[](pthread_mutex_t* held) {
            pthread_mutex_unlock(held);
            pthread_mutex_destroy(held);
            return EBUSY;
        });
    EXPECT_EQ(tavo_osal_mutex_destroy(&mutex), TAVO_FAILURE);
    EXPECT_EQ(mutex, before);
    EXPECT_EQ(g_released_by_library, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Mutex destroy failed. Error=16\n"}}));
}

}  // namespace
