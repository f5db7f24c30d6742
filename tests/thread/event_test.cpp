// Events: creation, counting, destruction, and what fails. Waits that sleep are in event_wait_test.cpp.
#include "tavo_osal/event.h"

#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/time.h>

#include <cerrno>
#include <cstdlib>

#include "event_counts.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/memory.h"

namespace {

using tavo::test::ExpectedLine;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_THREAD";
constexpr char kNotHandled[] = "Inside timed wait - NOT HANDLED!!!!!!! \n";

int answer_eperm(pthread_mutex_t*) { return EPERM; }

// Unlocks, and reports a failure all the same, so that the event stays usable.
int unlock_and_fail(pthread_mutex_t* mutex) {
    pthread_mutex_unlock(mutex);
    errno = ENOENT;
    return EPERM;
}

int fail_to_lock(pthread_mutex_t*) {
    errno = ENOENT;
    return EINVAL;
}

int fail_to_signal(pthread_cond_t*) {
    errno = ENOENT;
    return EINVAL;
}

class Event : public testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(tavo_osal_event_create(&event_), TAVO_SUCCESS); }
    void TearDown() override {
        if (event_ != nullptr) {
            EXPECT_EQ(tavo_osal_event_destroy(&event_), TAVO_SUCCESS);
        }
    }

    void set(int times) {
        for (int i = 0; i < times; ++i) ASSERT_EQ(tavo_osal_event_set(event_), TAVO_SUCCESS);
    }

    int counts() { return tavo::test::take_counts(event_); }

    TAVO_Event* event_ = nullptr;
};

TEST_F(Event, CreateStartsWithoutCountAndLogsNothing) {
    const LogCapture log;
    TAVO_Event* event = nullptr;
    EXPECT_EQ(tavo_osal_event_create(&event), TAVO_SUCCESS);
    EXPECT_NE(event, nullptr);
    EXPECT_EQ(tavo_osal_event_destroy(&event), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(counts(), 0);
}

TEST_F(Event, CreateRefusesANullPointer) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_event_create(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid params.\n"}}));
}

TEST_F(Event, CreateWithoutMemoryReportsItAndClearsTheHandle) {
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "malloc", +[](size_t) -> void* { return nullptr; });
    TAVO_Event* event = event_;
    EXPECT_EQ(tavo_osal_event_create(&event), TAVO_NO_MEMORY);
    EXPECT_EQ(event, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(kTag), {{1, kTag, "Event handle allocation failed\n"}}));
}

int g_library_releases;
int g_c_library_releases;
int g_destroyed_conditions;
int g_initialised_mutexes;

class EventCreationFailure : public Event {
protected:
    void SetUp() override {
        Event::SetUp();
        g_library_releases = g_c_library_releases = g_destroyed_conditions = g_initialised_mutexes = 0;
    }

    const PlatformHook library_free_{kLibrary, "tavo_osal_mem_free", +[](void* block) {
                                         ++g_library_releases;
                                         free(block);
                                     }};
    const PlatformHook c_library_free_{kLibrary, "free", +[](void* block) {
                                           ++g_c_library_releases;
                                           free(block);
                                       }};
    const PlatformHook cond_destroy_{kLibrary, "pthread_cond_destroy", +[](pthread_cond_t* condition) {
                                         ++g_destroyed_conditions;
                                         return pthread_cond_destroy(condition);
                                     }};
};

TEST_F(EventCreationFailure, OfTheConditionComesFirstAndReleasesTheRecordWithTheCLibrary) {
    const LogCapture log;
    const PlatformHook init(
        kLibrary, "pthread_cond_init", +[](pthread_cond_t*, const pthread_condattr_t*) { return ENOMEM; });
    const PlatformHook mutex(
        kLibrary, "pthread_mutex_init", +[](pthread_mutex_t*, const pthread_mutexattr_t*) {
            ++g_initialised_mutexes;
            return 0;
        });
    TAVO_Event* event = event_;
    EXPECT_EQ(tavo_osal_event_create(&event), TAVO_FAILURE);
    EXPECT_EQ(event, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Condition variable creation failed. Error=12\n"}}));
    EXPECT_EQ(g_initialised_mutexes, 0);
    EXPECT_EQ(g_library_releases, 0);
    EXPECT_EQ(g_c_library_releases, 1);
}

TEST_F(EventCreationFailure, OfTheMutexReleasesTheRecordButLeavesTheConditionUndestroyed) {
    const LogCapture log;
    const PlatformHook init(
        kLibrary, "pthread_mutex_init", +[](pthread_mutex_t*, const pthread_mutexattr_t*) { return EAGAIN; });
    TAVO_Event* event = event_;
    EXPECT_EQ(tavo_osal_event_create(&event), TAVO_FAILURE);
    EXPECT_EQ(event, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Mutex creation failed. Error=11\n"}}));
    EXPECT_EQ(g_destroyed_conditions, 0);
    EXPECT_EQ(g_library_releases, 0);
    EXPECT_EQ(g_c_library_releases, 1);
}

TEST_F(Event, EverySetBeforeAWaitLetsOneWaitReturnAtOnce) {
    const LogCapture log;
    set(2);
    EXPECT_EQ(tavo_osal_event_waitset(event_, TAVO_EVENT_FOREVER), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_event_waitset(event_, 1000), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(counts(), 0);
}

TEST_F(Event, AWaitWithTheClearAllFlagTakesEveryCount) {
    set(3);
    EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, TAVO_EVENT_FOREVER, 1), TAVO_SUCCESS);
    EXPECT_EQ(counts(), 0);
    set(3);
    EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, 5000, -1), TAVO_SUCCESS);
    EXPECT_EQ(counts(), 0);
}

TEST_F(Event, AWaitWithTheFlagAtZeroTakesOneCount) {
    set(3);
    EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, TAVO_EVENT_FOREVER, 0), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, 5000, 0), TAVO_SUCCESS);
    EXPECT_EQ(counts(), 1);
}

TEST_F(Event, ASetWithTheResetFlagMakesTheCountExactlyOne) {
    set(5);
    EXPECT_EQ(tavo_osal_event_set_with_flag(event_, 1), TAVO_SUCCESS);
    EXPECT_EQ(counts(), 1);
    EXPECT_EQ(tavo_osal_event_set_with_flag(event_, 7), TAVO_SUCCESS);
    EXPECT_EQ(counts(), 1) << "also from none";
}

TEST_F(Event, ASetWithTheFlagAtZeroRaisesTheCount) {
    set(2);
    EXPECT_EQ(tavo_osal_event_set_with_flag(event_, 0), TAVO_SUCCESS);
    EXPECT_EQ(counts(), 3);
}

TEST_F(Event, ClearForgetsEveryCount) {
    const LogCapture log;
    set(3);
    EXPECT_EQ(tavo_osal_event_clear(event_), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(counts(), 0);
}

TEST_F(Event, TimeoutsBelowASecondAreNotHandledWhateverTheCountIs) {
    set(1);
    const LogCapture log;
    for (const uint32_t timeout : {0U, 500U, 999U}) {
        EXPECT_EQ(tavo_osal_event_waitset(event_, timeout), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, timeout, 1), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), std::vector<ExpectedLine>(6, {1, kTag, kNotHandled})));
    EXPECT_EQ(counts(), 1) << "nothing is taken, and the lock is released";
}

TEST_F(Event, OperationsWithFlagsClearAndDestroyRefuseNull) {
    const LogCapture log;
    TAVO_Event* none = nullptr;
    EXPECT_EQ(tavo_osal_event_waitset_with_flag(nullptr, 0, 0), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_event_set_with_flag(nullptr, 0), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_event_clear(nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_event_destroy(&none), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_event_destroy(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), std::vector<ExpectedLine>(5, {1, kTag, "Invalid params.\n"})));
}

TEST_F(Event, EveryOperationReportsALockThatFailsInItsOwnWords) {
    const LogCapture log;
    {
        const PlatformHook hook(kLibrary, "pthread_mutex_lock", &fail_to_lock);
        EXPECT_EQ(tavo_osal_event_waitset(event_, 1000), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, 1000, 0), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_event_set(event_), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_event_set_with_flag(event_, 0), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_event_clear(event_), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Mutex lock failed. Error=22\n"},
                                             {1, kTag, "Mutex lock failed \n"},
                                             {1, kTag, "Mutex lock failed. error=22.\n"},
                                             {1, kTag, "Mutex lock failed. errno=2.\n"},
                                             {1, kTag, "Mutex lock failed. Error =22\n"}}));
    EXPECT_EQ(counts(), 0);
}

TEST_F(Event, EveryOperationReportsAnUnlockThatFailsInItsOwnWordsAndFailsThough) {
    set(3);
    const LogCapture log;
    {
        const PlatformHook hook(kLibrary, "pthread_mutex_unlock", &unlock_and_fail);
        EXPECT_EQ(tavo_osal_event_waitset(event_, 1000), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_event_waitset_with_flag(event_, 1000, 0), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_event_set(event_), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_event_set_with_flag(event_, 0), TAVO_FAILURE);
    }
    EXPECT_EQ(counts(), 3) << "two were taken and two added all the same";
    set(1);
    {
        const PlatformHook hook(kLibrary, "pthread_mutex_unlock", &unlock_and_fail);
        EXPECT_EQ(tavo_osal_event_clear(event_), TAVO_FAILURE);
    }
    EXPECT_EQ(counts(), 0) << "cleared all the same";
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Mutex unlock failed. Error=1\n"},
                                             {1, kTag, "Mutex unlock failed\n"},
                                             {1, kTag, "Mutex unlock failed. error=1.\n"},
                                             {1, kTag, "Mutex unlock failed. errno=2.\n"},
                                             {1, kTag, "Mutex unlock failed. Error =1\n"}}));
}

TEST_F(Event, ASignalThatFailsIsCalledABroadcastAndLeavesTheCountRaised) {
    const LogCapture log;
    {
        const PlatformHook hook(kLibrary, "pthread_cond_signal", &fail_to_signal);
        EXPECT_EQ(tavo_osal_event_set(event_), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_event_set_with_flag(event_, 0), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Broadcast condition signal failed. error=22.\n"},
                                             {1, kTag, "pthread_cond_signal() failed. errno=2.\n"}}));
    EXPECT_EQ(counts(), 2);
}

TEST_F(Event, DestroyReleasesTheRecordWithTheLibrarysAllocatorAndClearsTheHandle) {
    static int released;
    released = 0;
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "tavo_osal_mem_free", +[](void* block) {
            ++released;
            free(block);
        });
    EXPECT_EQ(tavo_osal_event_destroy(&event_), TAVO_SUCCESS);
    EXPECT_EQ(event_, nullptr);
    EXPECT_EQ(released, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST_F(Event, DestroyReleasesTheRecordAlsoWhenThePlatformRefusesBothParts) {
    static int released;
    released = 0;
    const LogCapture log;
    const PlatformHook hook(
        kLibrary, "tavo_osal_mem_free", +[](void* block) {
            ++released;
            free(block);
        });
    const PlatformHook condition(
        kLibrary, "pthread_cond_destroy", +[](pthread_cond_t*) { return EBUSY; });
    const PlatformHook mutex(kLibrary, "pthread_mutex_destroy", &answer_eperm);
    EXPECT_EQ(tavo_osal_event_destroy(&event_), TAVO_DESTROY_FAILED);
    EXPECT_EQ(event_, nullptr);
    EXPECT_EQ(released, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Condition variable cannot be destroyed. ret error = 16\n"},
                                             {1, kTag, "Mutex cannot be destroyed. ret error = 1\n"}}));
}

TEST_F(Event, DestroyFailsWhenOnlyOnePartIsRefused) {
    const LogCapture log(0);
    {
        const PlatformHook condition(
            kLibrary, "pthread_cond_destroy", +[](pthread_cond_t*) { return EBUSY; });
        EXPECT_EQ(tavo_osal_event_destroy(&event_), TAVO_DESTROY_FAILED);
        EXPECT_EQ(event_, nullptr);
    }
    ASSERT_EQ(tavo_osal_event_create(&event_), TAVO_SUCCESS);
    const PlatformHook mutex(kLibrary, "pthread_mutex_destroy", &answer_eperm);
    EXPECT_EQ(tavo_osal_event_destroy(&event_), TAVO_DESTROY_FAILED);
    EXPECT_EQ(event_, nullptr);
}

}  // namespace
