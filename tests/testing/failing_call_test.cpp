#include "tavo_osal/testing/failing_call.hpp"

#include <gtest/gtest.h>

#include "tavo_osal.h"
#include "tavo_osal/testing/log_capture.hpp"

namespace {

using namespace tavo::test;

void* nothing(void*) { return nullptr; }

TEST(FailingCall, MakesTheNthCallFailAndNoOther) {
    const FailingCall<tavo_osal_mutex_create> fault(2, TAVO_NO_MEMORY);
    TAVO_Mutex* first = nullptr;
    TAVO_Mutex* const untouched = reinterpret_cast<TAVO_Mutex*>(&first);
    TAVO_Mutex* second = untouched;
    TAVO_Mutex* third = nullptr;
    EXPECT_EQ(tavo_osal_mutex_create(&first), TAVO_SUCCESS);
    EXPECT_FALSE(fault.failed());
    EXPECT_EQ(tavo_osal_mutex_create(&second), TAVO_NO_MEMORY);
    EXPECT_EQ(second, untouched);
    EXPECT_TRUE(fault.failed());
    EXPECT_EQ(tavo_osal_mutex_create(&third), TAVO_SUCCESS);
    EXPECT_EQ(fault.calls(), 3U);
    EXPECT_EQ(tavo_osal_mutex_destroy(&first), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_mutex_destroy(&third), TAVO_SUCCESS);
}

TEST(FailingCall, MakesEveryCallFailWhenAsked) {
    const FailingCall<tavo_osal_thread_create> fault(kEveryCall, TAVO_FAILURE);
    pthread_t thread;
    EXPECT_FALSE(fault.failed());
    EXPECT_EQ(tavo_osal_thread_create(&thread, nothing, nullptr), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_thread_create(&thread, nothing, nullptr), TAVO_FAILURE);
    EXPECT_TRUE(fault.failed());
}

TEST(FailingCall, EndsWithItsScopeAndBeginsToCountAnew) {
    for (int i = 0; i < 2; ++i) {
        const FailingCall<tavo_osal_thread_yield> fault(1, TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_thread_yield(), TAVO_FAILURE);
        EXPECT_EQ(fault.calls(), 1U);
    }
    EXPECT_EQ(tavo_osal_thread_yield(), TAVO_SUCCESS);
}

TEST(FailingCall, WorksForFunctionsWithOtherResults) {
    const FailingCall<tavo_osal_mem_malloc> fault(1, nullptr);
    EXPECT_EQ(tavo_osal_mem_malloc(8), nullptr);
    void* const block = tavo_osal_mem_malloc(8);
    EXPECT_NE(block, nullptr);
    tavo_osal_mem_free(block);
}

TEST(FailingCall, SeveralFunctionsFailAtOnce) {
    const FailingCall<tavo_osal_mutex_create> mutex_fault(1, TAVO_FAILURE);
    const FailingCall<tavo_osal_event_create> event_fault(1, TAVO_NO_MEMORY);
    TAVO_Mutex* mutex = nullptr;
    TAVO_Event* event = nullptr;
    EXPECT_EQ(tavo_osal_event_create(&event), TAVO_NO_MEMORY);
    EXPECT_EQ(tavo_osal_mutex_create(&mutex), TAVO_FAILURE);
}

// An event is made of a mutex and a condition: what the library calls for itself is its own affair.
TEST(FailingCall, LeavesTheLibrarysOwnCallsAlone) {
    const FailingCall<tavo_osal_mem_malloc> fault(1, nullptr);
    TAVO_Event* event = nullptr;
    EXPECT_EQ(tavo_osal_event_create(&event), TAVO_SUCCESS);
    EXPECT_EQ(fault.calls(), 0U);
    EXPECT_EQ(tavo_osal_event_destroy(&event), TAVO_SUCCESS);
    tavo_osal_mem_free(tavo_osal_mem_malloc(1));
}

TEST(FailingCallDeathTest, EndsTheProgramWhenNobodyCallsTheFunction) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_DEATH((FailingCall<tavo_osal_timer_restart>(1, TAVO_FAILURE)), "nothing calls tavo_osal_timer_restart");
}

}  // namespace
