#include "tavo_osal/testing/log_capture.hpp"

#include <gtest/gtest.h>

#include <sstream>
#include <thread>

#include "tavo_osal.h"
#include "tavo_osal/testing/gtest.hpp"

namespace {

using namespace tavo::test;

TEST(LogCapture, HasLevelTagAndTextOfEveryLine) {
    const LogCapture log;
    tavo_print_log(TAVO_LOG_ERROR, 0, 12, "MY_TAG", "value %d\n", 7);
    tavo_print_log(TAVO_LOG_TRACE, 0, 13, "OTHER", "++Entered\n");
    ASSERT_EQ(log.lines().size(), 2U);
    EXPECT_EQ(log.lines()[0].text, "12::value 7\n");
    EXPECT_EQ(log.lines()[0].message(), "value 7\n");
    EXPECT_EQ(log.lines()[0].priority, 6);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "MY_TAG", "value 7\n"}, {6, "OTHER", "++Entered\n"}}));
    EXPECT_TRUE(logged_exactly(log.lines("OTHER"), {{6, "OTHER", "++Entered\n"}}));
}

TEST(LogCapture, HasWhatTheLibraryWrites) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_mutex_lock(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_THREAD", "Invalid Mutex\n"}}));
    EXPECT_FALSE(log.lines()[0].by_print);
}

TEST(LogCapture, LeavesTheFilterToTheTest) {
    const LogCapture log(TAVO_LOG_WARNING);
    tavo_print_log(TAVO_LOG_INFO, 0, 1, "TAG", "filtered out");
    EXPECT_TRUE(log.lines().empty());
}

TEST(LogCapture, PutsLevelAndModulesBack) {
    g_uiMxEnabledLogLevel = 3;
    g_uiEnabledModuleMask = 6;
    {
        const LogCapture log;
        g_uiEnabledModuleMask = 1;
    }
    EXPECT_EQ(g_uiMxEnabledLogLevel, 3U);
    EXPECT_EQ(g_uiEnabledModuleMask, 6U);
}

TEST(LogCapture, BeginsEmptyAndForgetsWhenTold) {
    { const LogCapture earlier; }
    tavo_print_log(TAVO_LOG_ERROR, 0, 1, "TAG", "between two captures");
    LogCapture log;
    EXPECT_TRUE(log.lines().empty());
    tavo_print_log(TAVO_LOG_ERROR, 0, 1, "TAG", "one");
    log.clear();
    EXPECT_TRUE(log.lines().empty());
}

TEST(LogCapture, TakesLinesFromAnyThread) {
    const LogCapture log;
    const auto write = [] {
        for (int i = 0; i < 500; ++i) tavo_print_log(TAVO_LOG_ERROR, 0, 1, "TAG", "line %d", i);
    };
    std::thread first(write);
    std::thread second(write);
    first.join();
    second.join();
    EXPECT_EQ(log.lines().size(), 1000U);
}

TEST(LogCapture, FailedChecksShowTheLines) {
    const LogCapture log;
    tavo_print_log(TAVO_LOG_ERROR, 0, 3, "TAG", "a \"line\"\n");
    const auto result = logged(log.lines(), {2, "TAG", "a \"line\"\n"});
    EXPECT_FALSE(result);
    EXPECT_NE(std::string(result.message()).find("priority 6, tag TAG, \"3::a \\\"line\\\"\\n\""), std::string::npos)
        << result.message();
    EXPECT_FALSE(logged_exactly(log.lines(), {}));
    EXPECT_FALSE(has_line(log.lines(), {1, "GAT", "a \"line\"\n"}));
    EXPECT_TRUE(has_line(log.lines(), {1, "TAG", "a \"line\"\n"}));
}

}  // namespace
