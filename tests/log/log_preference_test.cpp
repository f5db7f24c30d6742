#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "log/log_state.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/log.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::LogState;
using tavo::test::PlatformHook;

void callback(void*) {}

// Applies a preference with stand-ins for the callback and its parameter, and answers with the standard output.
int g_param = 0;
std::string apply(const char* preference) {
    testing::internal::CaptureStdout();
    tavo_set_log_preference(preference, callback, &g_param);
    return testing::internal::GetCapturedStdout();
}

class LogPreference : public LogState {
protected:
    LogPreference() { unsetenv("LOG_PREF"); }
    ~LogPreference() override { unsetenv("LOG_PREF"); }
};

const char kInvalidX[] = "Invalid string is passed. string = x.\n";

TEST_F(LogPreference, SelectsTheStream) {
    g_uiOutputStreamId = 9;
    apply("-s");
    EXPECT_EQ(g_uiOutputStreamId, 1U);
    apply("-f");
    EXPECT_EQ(g_uiOutputStreamId, 2U);
    apply("-f -s");
    EXPECT_EQ(g_uiOutputStreamId, 1U);
}

TEST_F(LogPreference, SelectsTheConsoleWhenTheStringNamesNoStream) {
    g_uiOutputStreamId = 2;
    apply("-t");
    EXPECT_EQ(g_uiOutputStreamId, 1U);
}

TEST_F(LogPreference, RecordsTheCallbackOnlyWithItsOption) {
    apply("-s -f -a");
    EXPECT_EQ(g_fpLogCallback, nullptr);
    EXPECT_EQ(g_pvCallbackParam, nullptr);
    apply("-c");
    EXPECT_EQ(g_uiOutputStreamId, 3U);
    EXPECT_EQ(g_fpLogCallback, callback);
    EXPECT_EQ(g_pvCallbackParam, &g_param);
}

TEST_F(LogPreference, TurnsPerformanceMessagesOn) {
    apply("-t");
    EXPECT_EQ(g_uiPerformance, 1U);
}

TEST_F(LogPreference, EnablesAllModules) {
    g_uiEnabledModuleMask = 5;
    apply("-a");
    EXPECT_EQ(g_uiEnabledModuleMask, UINT32_MAX);
}

TEST_F(LogPreference, SetsTheLevelFromOneDigit) {
    for (uint32_t level = 0; level <= 6; ++level) {
        apply(("-l" + std::to_string(level)).c_str());
        EXPECT_EQ(g_uiMxEnabledLogLevel, level);
    }
}

TEST_F(LogPreference, IgnoresLevelsItDoesNotHave) {
    const LogCapture log(4);
    for (const char* token : {"-l7", "-l8", "-l9", "-l12", "-l", "-l10", "-lxx", "-L3"}) {
        apply(token);
        EXPECT_EQ(g_uiMxEnabledLogLevel, 4U) << token;
    }
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(LogPreference, SetsLevelZeroAfterReportingALevelThatIsNoDigit) {
    LogCapture log(4);
    apply("-lx");
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "TAVO_LOG", kInvalidX}}));
    EXPECT_EQ(g_uiMxEnabledLogLevel, 0U);

    log.clear();
    g_uiMxEnabledLogLevel = 4;
    apply("-l-");
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "TAVO_LOG", "Invalid string is passed. string = -.\n"}}));
    EXPECT_EQ(g_uiMxEnabledLogLevel, 0U);
}

TEST_F(LogPreference, BuildsTheModuleMask) {
    struct Row {
        const char* preference;
        uint32_t mask;
    };
    const Row rows[] = {
        {"-m1", 0x1},
        {"-m2", 0x2},
        {"-m32", 0x80000000},
        {"-m1,3,7", 0x45},
        {"-m1 -m3 -m7", 0x45},
        {"-m3,3", 0x4},
        {"-m,,4,,", 0x8},
        {"-m0,33", 0xF0},            // no valid number: the mask stays
        {"-m-1,4294967297", 0xF0},   // likewise
        {"-m,", 0xF0},               // a list without items
        {"-m", 0xF0},                // no list at all
        {"-m0,33,5,-2", 0x10},       // the valid one counts
        {"-m1 -a", 0xFFFFFFFF},      // a later -a undoes
        {"-a -m1", 0x1},             // a later -m builds afresh
        {"-m1 -a -m2", 0xFFFFFFFF},  // only the first valid number of a call clears
        {"-m1,2 -t -m0 -m4", 0xB},   // other tokens between
        {"-m99999999999999999999", 0xF0},
    };
    const LogCapture log;
    for (const Row& row : rows) {
        g_uiEnabledModuleMask = 0xF0;
        apply(row.preference);
        EXPECT_EQ(g_uiEnabledModuleMask, row.mask) << row.preference;
    }
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(LogPreference, BuildsTheModuleMaskAfreshInEveryCall) {
    apply("-m1");
    apply("-m2");
    EXPECT_EQ(g_uiEnabledModuleMask, 0x2U);
}

TEST_F(LogPreference, ReportsModulesThatAreNoNumbersAndSkipsThem) {
    LogCapture log(2);
    apply("-m3x,2,x");
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, "TAVO_LOG", "Invalid string is passed. string = 3x.\n"}, {1, "TAVO_LOG", kInvalidX}}));
    EXPECT_EQ(g_uiEnabledModuleMask, 0x2U);

    g_uiEnabledModuleMask = 0xF0;
    apply("-mx");
    EXPECT_EQ(g_uiEnabledModuleMask, 0xF0U);
}

TEST_F(LogPreference, HoldsTheLibrarysOwnMessagesToWarningsOnceAListIsSet) {
    const LogCapture log;
    apply("-m2 -l6");
    tavo_print_log(3, 0, 1, "TAG", "of the library");
    tavo_print_log(2, 0, 1, "TAG", "warning of the library");
    tavo_print_log(6, 2, 1, "TAG", "of module 2");
    EXPECT_TRUE(logged_exactly(log.lines(), {{2, "TAG", "warning of the library"}, {6, "TAG", "of module 2"}}));
}

TEST_F(LogPreference, IgnoresUnknownOptions) {
    const LogCapture log(2);
    apply("-f");
    const std::string path = g_acFilePath;
    for (const char* token : {"-", "--", "-x", "-S", "-ss", "-ff", "-cc", "-aa", "-tt", "-s1"}) {
        const std::string preference = std::string("-f ") + token;
        apply(preference.c_str());
        EXPECT_EQ(g_uiOutputStreamId, 2U) << token;
        EXPECT_EQ(g_uiMxEnabledLogLevel, 2U) << token;
        EXPECT_EQ(g_uiEnabledModuleMask, UINT32_MAX) << token;
        EXPECT_EQ(g_uiPerformance, 0U) << token;
        EXPECT_EQ(g_fpLogCallback, nullptr) << token;
        EXPECT_EQ(g_acFilePath, path) << token;
    }
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(LogPreference, MakesTheFilePathOfANameToken) {
    apply("OSAL_LOG");
    EXPECT_STREQ(g_acFilePath, "/tmp/OSAL_LOG.txt");
    apply("first second");
    EXPECT_STREQ(g_acFilePath, "/tmp/second.txt");
}

TEST_F(LogPreference, CutsTheFilePathTo31Characters) {
    const std::string name = "abcdefghijklmnopqrstuvwxyz0123";
    ASSERT_EQ(name.size(), 30U);
    apply(name.c_str());
    EXPECT_EQ(g_acFilePath, ("/tmp/" + name).substr(0, 31));
    apply("abcdefghijklmnopqrstuvwxyz0");  // 27 characters leave no room for the extension's end
    EXPECT_STREQ(g_acFilePath, "/tmp/abcdefghijklmnopqrstuvwxyz");
    apply("abcdefghijklmnopqrstuv");  // 22 characters fit exactly
    EXPECT_STREQ(g_acFilePath, "/tmp/abcdefghijklmnopqrstuv.txt");
}

TEST_F(LogPreference, AppliesTokensFromLeftToRightAndSkipsRepeatedBlanks) {
    apply("  OSAL_LOG  -f -s   -m1 -a -l3 ");
    EXPECT_STREQ(g_acFilePath, "/tmp/OSAL_LOG.txt");
    EXPECT_EQ(g_uiOutputStreamId, 1U);
    EXPECT_EQ(g_uiEnabledModuleMask, UINT32_MAX);
    EXPECT_EQ(g_uiMxEnabledLogLevel, 3U);
}

TEST_F(LogPreference, LeavesTheCallersStringAlone) {
    char preference[] = "-s -m1,2 -l4";
    apply(preference);
    EXPECT_STREQ(preference, "-s -m1,2 -l4");
}

TEST_F(LogPreference, TellsOnStandardOutputWhatItApplies) {
    EXPECT_EQ(apply("-s -l3"), "No preferences received from env LOG_PREF Log preference is set to -s -l3\n");
    EXPECT_EQ(apply(""), "No preferences received from env LOG_PREF Log preference is set to \n");
}

TEST_F(LogPreference, RefusesNull) {
    const LogCapture log(2);
    g_uiOutputStreamId = 2;
    EXPECT_EQ(apply(nullptr), "No preferences received from env LOG_PREF Invalid log prefrence passed");
    EXPECT_EQ(g_uiOutputStreamId, 2U);
    EXPECT_EQ(g_uiEnvValueRead, 0U);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(LogPreference, PrefersTheEnvironmentAndConsumesItOnce) {
    setenv("LOG_PREF", "-l5 -t", 1);
    g_uiOutputStreamId = 2;
    EXPECT_EQ(apply("-l1 -m3 -s"), "Environment variable LOG_PREF is -l5 -t\nLog preference is set to -l5 -t\n");
    EXPECT_EQ(g_uiMxEnabledLogLevel, 5U);
    EXPECT_EQ(g_uiPerformance, 1U);
    EXPECT_EQ(g_uiEnabledModuleMask, UINT32_MAX);
    EXPECT_EQ(g_uiOutputStreamId, 2U);  // the environment does not reset it
    EXPECT_EQ(g_uiEnvValueRead, 1U);
    EXPECT_STREQ(getenv("LOG_PREF"), "-l5");  // split in place

    setenv("LOG_PREF", "-l6", 1);
    EXPECT_EQ(apply("-l1"), "g_uiEnvValueRead var read and use already set pref");
    EXPECT_EQ(apply(nullptr), "g_uiEnvValueRead var read and use already set pref");
    EXPECT_EQ(g_uiMxEnabledLogLevel, 5U);
}

TEST_F(LogPreference, TakesNullAndAnEmptyValueFromTheEnvironment) {
    setenv("LOG_PREF", "", 1);
    EXPECT_EQ(apply(nullptr), "Environment variable LOG_PREF is \nLog preference is set to \n");
    EXPECT_EQ(g_uiEnvValueRead, 1U);
}

TEST_F(LogPreference, KeepsTheEnvironmentUnreadUntilItIsSet) {
    apply("-l3");
    EXPECT_EQ(g_uiEnvValueRead, 0U);
    setenv("LOG_PREF", "-c -l4", 1);
    apply("-l1");
    EXPECT_EQ(g_uiMxEnabledLogLevel, 4U);
    EXPECT_EQ(g_fpLogCallback, callback);
    EXPECT_EQ(g_pvCallbackParam, &g_param);
}

TEST_F(LogPreference, TakesOnlyTheValueOneAsConsumed) {
    g_uiEnvValueRead = 2;
    apply("-l3");
    EXPECT_EQ(g_uiMxEnabledLogLevel, 3U);
    setenv("LOG_PREF", "-l4", 1);
    apply("-l1");
    EXPECT_EQ(g_uiMxEnabledLogLevel, 4U);
    EXPECT_EQ(g_uiEnvValueRead, 1U);
}

// Counts the library's copies of texts, and lets the n-th one fail.
int g_copies_until_failure = -1;
std::vector<void*> g_copies;

char* counted_strdup(const char* text) {
    if (g_copies_until_failure-- == 0) return nullptr;
    g_copies.push_back(strdup(text));
    return static_cast<char*>(g_copies.back());
}

void counted_free(void* block) {
    g_copies.erase(std::remove(g_copies.begin(), g_copies.end(), block), g_copies.end());
    free(block);
}

class LogPreferenceAllocations : public LogPreference {
protected:
    LogPreferenceAllocations() { g_copies_until_failure = -1; }

private:
    const PlatformHook strdup_hook_{"libtavoosal.so", "strdup", counted_strdup};
    const PlatformHook free_hook_{"libtavoosal.so", "free", counted_free};
};

TEST_F(LogPreferenceAllocations, ReportsAFailedCopyOfThePreference) {
    const LogCapture log;
    g_copies_until_failure = 0;
    g_uiOutputStreamId = 2;
    EXPECT_EQ(apply("-l3"), "No preferences received from env LOG_PREF ");
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "TAVO_LOG", " pcLogPreference memory allocation failed.\n"}}));
    EXPECT_EQ(g_uiOutputStreamId, 1U);
    EXPECT_EQ(g_uiMxEnabledLogLevel, 6U);
}

TEST_F(LogPreferenceAllocations, DropsTheRestWhenAModuleListCannotBeCopied) {
    const LogCapture log;
    g_copies_until_failure = 2;
    apply("-m1 -f -m2 -t -s");
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "TAVO_LOG", "pcTempString memory allocation failed.\n"}}));
    EXPECT_EQ(g_uiEnabledModuleMask, 0x1U);
    EXPECT_EQ(g_uiOutputStreamId, 2U);
    EXPECT_EQ(g_uiPerformance, 0U);
    EXPECT_TRUE(g_copies.empty());
}

TEST_F(LogPreferenceAllocations, FreesItsCopiesAndNothingElse) {
    apply("-m1 -m2 -m name -l3");  // a bare -m has no list to copy
    EXPECT_EQ(g_copies_until_failure, -1 - 3);
    EXPECT_TRUE(g_copies.empty());

    setenv("LOG_PREF", "-m1 -l3", 1);
    apply("-l1");  // the environment's value is neither copied nor freed
    EXPECT_EQ(g_copies_until_failure, -1 - 4);
    EXPECT_TRUE(g_copies.empty());
    EXPECT_STREQ(getenv("LOG_PREF"), "-m1");
}

// Fails for the format of the file path only: messages are made with it, too.
int snprintf_without_paths(char* buffer, size_t size, const char* format, ...) {
    if (strcmp(format, "%s%s%s") == 0) return -1;
    va_list values;
    va_start(values, format);
    const int length = vsnprintf(buffer, size, format, values);
    va_end(values);
    return length;
}

// What optimised builds call in its place.
int checked_snprintf_without_paths(char* buffer, size_t size, int, size_t, const char* format, ...) {
    if (strcmp(format, "%s%s%s") == 0) return -1;
    va_list values;
    va_start(values, format);
    const int length = vsnprintf(buffer, size, format, values);
    va_end(values);
    return length;
}

PlatformHook fail_to_format_paths() {
    constexpr char kChecked[] = "__snprintf_chk";
    if (PlatformHook::imports("libtavoosal.so", kChecked)) {
        return PlatformHook("libtavoosal.so", kChecked, checked_snprintf_without_paths);
    }
    return PlatformHook("libtavoosal.so", "snprintf", snprintf_without_paths);
}

TEST_F(LogPreference, ReportsAFilePathThatCouldNotBeFormatted) {
    const PlatformHook hook = fail_to_format_paths();
    const LogCapture log;
    apply("name -t");
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "TAVO_LOG", "snprintf failed.\n"}}));
    EXPECT_STREQ(g_acFilePath, "/tmp/ZORLA_LOG.txt");
    EXPECT_EQ(g_uiPerformance, 1U);
}

// ThreadSanitizer's lane makes this more than a test of not crashing.
TEST_F(LogPreference, MayBeSetByManyThreadsWhileOthersPrint) {
    LogCapture log;
    testing::internal::CaptureStdout();
    std::atomic<bool> done = false;
    std::vector<std::thread> printers;
    for (int i = 0; i < 2; ++i) {
        printers.emplace_back([&done] {
            do {
                for (uint32_t level = 0; level < 8; ++level) tavo_print_log(level, level, 1, "TAG", "level %u", level);
            } while (!done);
        });
    }
    std::vector<std::thread> setters;
    for (const char* preference : {"-l3 -m1,2 first -t", "-c -a -l5 second"}) {
        setters.emplace_back([preference] {
            for (int i = 0; i < 50; ++i) tavo_set_log_preference(preference, callback, &g_param);
        });
    }
    for (std::thread& thread : setters) thread.join();
    done = true;
    for (std::thread& thread : printers) thread.join();
    testing::internal::GetCapturedStdout();
    EXPECT_FALSE(log.lines().empty());
    EXPECT_EQ(g_fpLogCallback, callback);
    EXPECT_TRUE(g_uiMxEnabledLogLevel == 3 || g_uiMxEnabledLogLevel == 5);
}

TEST_F(LogPreference, GivesTheEnvironmentToOneOfManyThreads) {
    setenv("LOG_PREF", "-m1 -t -m3 -l4", 1);
    testing::internal::CaptureStdout();
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) threads.emplace_back([] { tavo_set_log_preference("-l1 -m9", nullptr, nullptr); });
    for (std::thread& thread : threads) thread.join();
    const std::string output = testing::internal::GetCapturedStdout();
    EXPECT_EQ(g_uiEnabledModuleMask, 0x5U);
    EXPECT_EQ(g_uiMxEnabledLogLevel, 4U);
    EXPECT_EQ(g_uiPerformance, 1U);

    const std::string applied = "Log preference is set to";
    const size_t first = output.find(applied);
    ASSERT_NE(first, std::string::npos);
    EXPECT_EQ(output.find(applied, first + 1), std::string::npos);
}

}  // namespace
