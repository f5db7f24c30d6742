#include "tavo_osal/process.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cmath>
#include <cstdint>
#include <limits>
#include <string>

#include "support/log_capture.h"
#include "support/platform_fault.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

TEST(Wait, SleepsTheSecondsGivenAndAnswersWithTheRest) {
    static unsigned int asked = 0;
    const PlatformHook hook(
        "libtavoosal.so", "sleep", +[](unsigned int seconds) {
            asked = seconds;
            return 7U;
        });
    const LogCapture log;
    EXPECT_EQ(tavo_osal_wait(12), 7);
    EXPECT_EQ(asked, 12U);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{6, "OSAL_MISC_FUNC", "++Entered++.\n"}, {5, "OSAL_MISC_FUNC", "Param 1::iSec = 12\n"}}));
}

TEST(Wait, AnswersZeroAfterAWholeSleep) { EXPECT_EQ(tavo_osal_wait(0), 0); }

TEST(Wait, RefusesNegativeSeconds) {
    static int calls = 0;
    const PlatformHook hook(
        "libtavoosal.so", "sleep", +[](unsigned int) {
            ++calls;
            return 0U;
        });
    for (const int seconds : {-1, INT_MIN}) {
        const LogCapture log;
        EXPECT_EQ(tavo_osal_wait(seconds), -1);
        EXPECT_TRUE(
            logged_exactly(log.lines(), {{6, "OSAL_MISC_FUNC", "++Entered++.\n"},
                                         {5, "OSAL_MISC_FUNC", "Param 1::iSec = " + std::to_string(seconds) + "\n"},
                                         {1, "OSAL_MISC_FUNC", "Invalid parameter.\n"}}));
    }
    EXPECT_EQ(calls, 0);
}

TEST(SystemCall, RunsTheCommandInAShell) {
    const LogCapture log;
    const int status = tavo_osal_system_call("exit 3");
    EXPECT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 3);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{6, "OSAL_MISC_FUNC", "++Entered++\n"}, {5, "OSAL_MISC_FUNC", "Param 1::pcCmd = exit 3\n"}}));
}

TEST(SystemCall, PassesTheShellsAnswerOnUnchanged) {
    static std::string asked;
    const PlatformHook hook(
        "libtavoosal.so", "system", +[](const char* command) {
            asked = command;
            return -12345;
        });
    EXPECT_EQ(tavo_osal_system_call("any %s"), -12345);
    EXPECT_EQ(asked, "any %s");
}

TEST(SystemCall, RefusesNull) {
    static int calls = 0;
    const PlatformHook hook(
        "libtavoosal.so", "system", +[](const char*) { return ++calls; });
    const LogCapture log;
    EXPECT_EQ(tavo_osal_system_call(nullptr), -1);
    EXPECT_EQ(calls, 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, "OSAL_MISC_FUNC", "++Entered++\n"},
                                             {5, "OSAL_MISC_FUNC", "Param 1::pcCmd = (null)\n"},
                                             {1, "OSAL_MISC_FUNC", "Invalid parameter.\n"}}));
}

TEST(Ceil, RoundsUp) {
    struct Row {
        float value;
        unsigned int result;
    };
    const Row rows[] = {
        {2.1F, 3},
        {2.0F, 2},
        {0.0F, 0},
        {-0.5F, 0},
        {-0.0F, 0},
        {std::numeric_limits<float>::denorm_min(), 1},
        {16777216.0F, 16777216},
        {4294967040.0F, 4294967040},  // the largest float below 2 to the 32nd
    };
    for (const Row& row : rows) EXPECT_EQ(tavo_osal_misc_math_ceil(row.value), row.result) << row.value;
}

TEST(Ceil, CutsWhatTheResultCannotHold) {
    EXPECT_EQ(tavo_osal_misc_math_ceil(-1.5F), 0U);
    EXPECT_EQ(tavo_osal_misc_math_ceil(-INFINITY), 0U);
    EXPECT_EQ(tavo_osal_misc_math_ceil(NAN), 0U);
    EXPECT_EQ(tavo_osal_misc_math_ceil(4294967296.0F), UINT32_MAX);
    EXPECT_EQ(tavo_osal_misc_math_ceil(INFINITY), UINT32_MAX);
}

TEST(Ceil, TracesEntryAndExit) {
    const LogCapture log;
    tavo_osal_misc_math_ceil(1.5F);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{6, "OSAL_MISC_FUNC", "++Entered.\n"}, {6, "OSAL_MISC_FUNC", "--Exiting.\n"}}));
}

}  // namespace
