#include "tavo_osal/log.h"

#include <gtest/gtest.h>
#include <sys/time.h>

#include <cerrno>
#include <cstdarg>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <regex>
#include <string>
#include <vector>

#include "log/log_state.h"
#include "log/module_log.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::LogLine;
using tavo::test::LogState;
using tavo::test::PlatformHook;

class PrintLog : public LogState {};
class ModuleLog : public LogState {};

TEST(LogGlobals, StartWithTheirDocumentedValues) {
    EXPECT_EQ(g_uiMxEnabledLogLevel, 2U);
    EXPECT_EQ(g_uiOutputStreamId, 1U);
    EXPECT_EQ(g_uiEnabledModuleMask, 0xFFFFFFFFU);
    EXPECT_STREQ(g_acFilePath, "/tmp/ZORLA_LOG.txt");
    EXPECT_EQ(sizeof g_acFilePath, 32U);
    EXPECT_EQ(g_fpLogCallback, nullptr);
    EXPECT_EQ(g_pvCallbackParam, nullptr);
    EXPECT_EQ(g_uiPerformance, 0U);
    EXPECT_EQ(g_uiEnvValueRead, 0U);
}

TEST(LogGlobals, KeepTheProgramsOwnStorage) {
    EXPECT_EQ(guiMaxFileSize, 0x700000U);
    EXPECT_EQ(g_uiFileSize, 0U);
    EXPECT_EQ(g_uiFirstTime, 1U);
    EXPECT_EQ(uiTotalTimeSecs, 0U);
    EXPECT_EQ(uiTotalTimeMilliSecs, 0U);
    EXPECT_EQ(tv1.tv_sec, 0);
    EXPECT_EQ(tv1.tv_usec, 0);
    EXPECT_EQ(tv2.tv_sec, 0);
    EXPECT_EQ(tv2.tv_usec, 0);
}

TEST_F(PrintLog, DropsInformationAndWritesWarningsByDefault) {
    const LogCapture log(2);
    tavo_print_log(3, 0, 10, "TAG", "information\n");
    tavo_print_log(2, 0, 11, "TAG", "warning %d\n", 5);
    EXPECT_TRUE(logged_exactly(log.lines(), {{2, "TAG", "warning 5\n"}}));
}

// Every row of the filter, over all levels and maximum levels, with and without performance messages.
TEST_F(PrintLog, FiltersByLevelMaskAndModule) {
    struct Row {
        const char* name;
        uint32_t mask;
        uint32_t module;
        bool (*passes)(uint32_t level, uint32_t max);
    };
    const Row rows[] = {
        {"all modules, module 0", UINT32_MAX, 0, [](uint32_t level, uint32_t max) { return level <= max; }},
        {"all modules, module 3", UINT32_MAX, 4, [](uint32_t level, uint32_t max) { return level <= max; }},
        {"listed module", 0x6, 4, [](uint32_t level, uint32_t max) { return level <= max; }},
        {"one of two listed", 0x6, 0x14, [](uint32_t level, uint32_t max) { return level <= max; }},
        {"unlisted module", 0x6, 0x8, [](uint32_t level, uint32_t) { return level <= 2; }},
        {"empty list", 0, UINT32_MAX, [](uint32_t level, uint32_t) { return level <= 2; }},
        {"list set, module 0", 0x6, 0, [](uint32_t level, uint32_t max) { return level <= 2 && level <= max; }},
        {"empty list, module 0", 0, 0, [](uint32_t level, uint32_t max) { return level <= 2 && level <= max; }},
    };
    LogCapture log;
    for (const Row& row : rows) {
        for (const uint32_t max : {0U, 1U, 2U, 3U, 6U, 7U, 9U, UINT32_MAX}) {
            for (const uint32_t level : {0U, 1U, 2U, 3U, 4U, 5U, 6U, 7U, 8U, UINT32_MAX}) {
                for (const uint32_t performance : {0U, 1U, 2U}) {
                    g_uiEnabledModuleMask = row.mask;
                    g_uiMxEnabledLogLevel = max;
                    g_uiPerformance = performance;
                    log.clear();
                    tavo_print_log(level, row.module, 1, "TAG", "text");
                    const bool expected = row.passes(level, max) && (level != 0 || performance != 0);
                    EXPECT_EQ(log.lines().size(), expected ? 1U : 0U)
                        << row.name << ", level " << level << ", maximum " << max << ", performance " << performance;
                }
            }
        }
    }
}

TEST_F(PrintLog, GivesEveryLevelItsAndroidPriority) {
    LogCapture log(UINT32_MAX);
    g_uiPerformance = 1;
    const int priorities[] = {2, 6, 5, 4, 3, 2, 2, 0, 0};
    for (uint32_t level = 0; level < std::size(priorities); ++level) {
        log.clear();
        tavo_print_log(level, 0, 1, "TAG", "text");
        ASSERT_EQ(log.lines().size(), 1U) << level;
        EXPECT_EQ(log.lines()[0].priority, priorities[level]) << level;
    }
    log.clear();
    tavo_print_log(UINT32_MAX, 0, 1, "TAG", "text");
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.lines()[0].priority, 0);
}

TEST_F(PrintLog, WritesTheSourceLineInFrontAndTheTagUnchanged) {
    const LogCapture log;
    tavo_print_log(1, 0, 260, "OSAL_THREAD", "Thread creation failed. retval = %d\n", 11);
    tavo_print_log(1, 0, -7, "", "%s and %s", "one", "two");
    const std::vector<LogLine> lines = log.lines();
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[0].text, "260::Thread creation failed. retval = 11\n");
    EXPECT_EQ(lines[0].tag, "OSAL_THREAD");
    EXPECT_FALSE(lines[0].by_print);
    EXPECT_EQ(lines[1].text, "-7::one and two");
    EXPECT_EQ(lines[1].tag, "");
}

TEST_F(PrintLog, ExpandsTheValuesAgainstThePrefixedFormat) {
    static std::string format;
    const PlatformHook hook(
        "libtavoosal.so", "__android_log_vprint", +[](int, const char*, const char* text, va_list) {
            format = text;
            return 0;
        });
    tavo_print_log(1, 0, 8, "TAG", "%d of %s", 3, "many");
    EXPECT_EQ(format, "8::%d of %s");
}

uint64_t micros_now() {
    timeval now = {};
    gettimeofday(&now, nullptr);
    return static_cast<uint64_t>(now.tv_sec) * 1000000 + static_cast<uint64_t>(now.tv_usec);
}

TEST_F(PrintLog, StampsPerformanceMessagesWithTheTimeInMicroseconds) {
    LogCapture log;
    tavo_print_log(0, 0, 42, "TAG", "dropped\n");
    EXPECT_TRUE(log.lines().empty());

    g_uiPerformance = 1;
    const uint64_t before = micros_now();
    tavo_print_log(0, 0, 42, "TAG", "step %d\n", 7);
    const uint64_t after = micros_now();
    ASSERT_EQ(log.lines().size(), 1U);
    const std::string text = log.lines()[0].text;
    std::smatch match;
    ASSERT_TRUE(std::regex_match(text, match, std::regex("([0-9]+) ::42::step 7\n"))) << text;
    const uint64_t stamp = std::stoull(match[1]);
    EXPECT_GE(stamp, before);
    EXPECT_LE(stamp, after);
    EXPECT_EQ(log.lines()[0].priority, 2);
}

TEST_F(PrintLog, StampsTimesBeyond32Bits) {
    LogCapture log;
    g_uiPerformance = 1;
    const PlatformHook hook(
        "libtavoosal.so", "gettimeofday", +[](timeval* now, void*) {
            now->tv_sec = INT32_MAX;
            now->tv_usec = 999999;
            return 0;
        });
    tavo_print_log(0, 0, 1, "TAG", "x");
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.lines()[0].text, "2147483647999999 ::1::x");
}

// A format made at run time. The unused value keeps the compiler from asking for a literal.
void print_format(uint32_t level, int line, const std::string& format) {
    tavo_print_log(level, 0, line, "TAG", format.c_str(), 0);
}

TEST_F(PrintLog, CutsPrefixAndFormatTo299Characters) {
    LogCapture log;
    const std::string fits(294, 'x');
    print_format(1, 123, fits);
    print_format(1, 1234, fits);
    const std::vector<LogLine> lines = log.lines();
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[0].text, "123::" + fits);
    EXPECT_EQ(lines[1].text, "1234::" + fits.substr(1));
}

TEST_F(PrintLog, CutsBeforeTheValuesAreExpanded) {
    LogCapture log;
    const std::string value(500, 'v');
    const std::string format = "%s" + std::string(400, 'x') + "%d";
    tavo_print_log(1, 0, 1, "TAG", format.c_str(), value.c_str(), 9);
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.lines()[0].text, "1::" + value + std::string(299 - 5, 'x'));
}

TEST_F(PrintLog, CutsPerformanceMessagesTogetherWithTheirStamp) {
    LogCapture log;
    g_uiPerformance = 1;
    print_format(0, 1, std::string(400, 'x'));
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.lines()[0].text.size(), 299U);
}

TEST_F(PrintLog, PreservesErrnoWhateverTheLogDoesWithIt) {
    const PlatformHook hook(
        "libtavoosal.so", "__android_log_vprint", +[](int, const char*, const char*, va_list) {
            errno = EIO;
            return -1;
        });
    g_uiPerformance = 1;
    for (const uint32_t level : {0U, 1U, 6U}) {
        errno = ENOENT;
        tavo_print_log(level, 0, 1, "TAG", "text");
        EXPECT_EQ(errno, ENOENT) << level;
    }
}

TEST_F(PrintLog, ExpandsThePercentMOfTheCallersErrno) {
    const PlatformHook hook(
        "libtavoosal.so", "gettimeofday", +[](timeval*, void*) {
            errno = EIO;
            return -1;
        });
    const LogCapture log;
    g_uiPerformance = 1;
    errno = ENOENT;
    tavo_print_log(0, 0, 1, "TAG", "%m");
    ASSERT_EQ(log.lines().size(), 1U);
    EXPECT_EQ(log.lines()[0].text, std::string("0 ::1::") + strerror(ENOENT));
}

// The filter in front of the library's own messages, level by level, which must agree with the writer's.
template <uint32_t Level>
void expect_values_evaluated_only_when_written(LogCapture& log) {
    log.clear();
    int evaluated = 0;
    TAVO_LOG("TAG", Level, "value %d", ++evaluated);
    const size_t written = log.lines().size();
    EXPECT_EQ(static_cast<size_t>(evaluated), written) << "level " << Level << ", maximum " << g_uiMxEnabledLogLevel;

    log.clear();
    tavo_print_log(Level, 0, __LINE__, "TAG", "value");
    EXPECT_EQ(log.lines().size(), written) << "level " << Level << ", maximum " << g_uiMxEnabledLogLevel;
}

TEST_F(ModuleLog, EvaluatesNoValueOfAFilteredMessage) {
    LogCapture log;
    for (const uint32_t mask : {UINT32_MAX, 0U, 2U}) {
        for (const uint32_t max : {0U, 1U, 2U, 3U, 4U, 5U, 6U, 7U}) {
            for (const uint32_t performance : {0U, 1U}) {
                g_uiEnabledModuleMask = mask;
                g_uiMxEnabledLogLevel = max;
                g_uiPerformance = performance;
                expect_values_evaluated_only_when_written<0>(log);
                expect_values_evaluated_only_when_written<1>(log);
                expect_values_evaluated_only_when_written<2>(log);
                expect_values_evaluated_only_when_written<3>(log);
                expect_values_evaluated_only_when_written<4>(log);
                expect_values_evaluated_only_when_written<5>(log);
                expect_values_evaluated_only_when_written<6>(log);
            }
        }
    }
}

TEST_F(ModuleLog, GivesTheCallersLineOrTheOneHandedIn) {
    const LogCapture log;
    TAVO_LOG("TAG", TAVO_LOG_ERROR, "here");
    const int line = __LINE__ - 1;
    TAVO_LOG_AT(77, "TAG", TAVO_LOG_ERROR, "there %d", 1);
    ASSERT_EQ(log.lines().size(), 2U);
    EXPECT_EQ(log.lines()[0].text, std::to_string(line) + "::here");
    EXPECT_EQ(log.lines()[1].text, "77::there 1");
}

}  // namespace
