#include "tavo_osal/log.h"

#include <gtest/gtest.h>

#include "support/log_capture.h"
#include "support/platform_fault.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;

TEST(PrintLog, DefaultLevelDropsInformationAndWritesWarnings) {
    LogCapture log(2);
    tavo_print_log(3, 0, 10, "TAG", "information\n");
    tavo_print_log(2, 0, 11, "TAG", "warning %d\n", 5);
    EXPECT_TRUE(logged_exactly(log.lines(), {{2, "TAG", "warning 5\n"}}));
    EXPECT_EQ(log.lines().front().text, "11::warning 5\n");
}

TEST(LogPreference, ReportsAFailedCopyOfThePreference) {
    const LogCapture log;
    const tavo::test::PlatformHook hook(
        "libtavoosal.so", "strdup", +[](const char*) -> char* { return nullptr; });
    tavo_set_log_preference("-l6", nullptr, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "TAVO_LOG", " pcLogPreference memory allocation failed.\n"}}));
}

}  // namespace
