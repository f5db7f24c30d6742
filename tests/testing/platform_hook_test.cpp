#include "tavo_osal/testing/platform_hook.hpp"

#include <gtest/gtest.h>
#include <sched.h>

#include "tavo_osal.h"

namespace {

using namespace tavo::test;

int refuse() { return -1; }

TEST(PlatformHook, RedirectsTheLibrarysCallsAndNoOthers) {
    {
        const PlatformHook hook("libtavoosal.so", "sched_yield", &refuse);
        EXPECT_TRUE(hook.active());
        EXPECT_EQ(tavo_osal_thread_yield(), TAVO_FAILURE);
        EXPECT_EQ(sched_yield(), 0);
    }
    EXPECT_EQ(tavo_osal_thread_yield(), TAVO_SUCCESS);
}

TEST(PlatformHook, NestsInOrder) {
    const PlatformHook outer("libtavoosal.so", "sched_yield", &refuse);
    {
        const PlatformHook inner(
            "libtavoosal.so", "sched_yield", +[] { return 0; });
        EXPECT_EQ(tavo_osal_thread_yield(), TAVO_SUCCESS);
    }
    EXPECT_EQ(tavo_osal_thread_yield(), TAVO_FAILURE);
}

TEST(PlatformHook, WithAFilterMayFindNothing) {
    const PlatformHook hook(object_named("no such object"), "sched_yield", reinterpret_cast<void*>(&refuse));
    EXPECT_FALSE(hook.active());
    const PlatformHook other(object_named("libtavoosal.so"), "no_such_function", reinterpret_cast<void*>(&refuse));
    EXPECT_FALSE(other.active());
}

TEST(PlatformHook, FindsFunctionsByName) {
    EXPECT_EQ(function_named("tavo_osal_thread_yield"), reinterpret_cast<void*>(&tavo_osal_thread_yield));
}

TEST(PlatformHookDeathTest, EndsTheProgramWhenThereIsNothingToHook) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_DEATH(PlatformHook("libtavoosal.so", "no_such_function", &refuse), "does not import no_such_function");
    EXPECT_DEATH(function_named("no_such_function"), "no function no_such_function");
}

}  // namespace
