#include "tavo_osal/dl.h"

#include <dlfcn.h>
#include <gtest/gtest.h>

#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <string>
#include <vector>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"

namespace {

using tavo::test::count_mappings;
using tavo::test::ExpectedLine;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kFixture[] = TAVO_DL_FIXTURE;
constexpr char kMissing[] = "/sdcard/libmissing.so";

std::string text_of(const void* handle) {
    char text[32];
    snprintf(text, sizeof text, "%p", handle);
    return text;
}

class LoadedFixture : public testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(tavo_osal_dlopen(kFixture, RTLD_NOW, &handle), TAVO_SUCCESS); }
    void TearDown() override { EXPECT_EQ(tavo_osal_dlclose(handle), TAVO_SUCCESS); }

    void* handle = nullptr;
};

TEST(DynamicLoading, OpensCallsAndClosesASharedObject) {
    EXPECT_EQ(count_mappings(0, kFixture), 0U);
    LogCapture log;
    void* handle = nullptr;
    ASSERT_EQ(tavo_osal_dlopen(kFixture, RTLD_NOW | RTLD_LOCAL, &handle), TAVO_SUCCESS);
    EXPECT_NE(handle, nullptr);
    EXPECT_GT(count_mappings(0, kFixture), 0U);
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, "OSAL_DL", std::string("Successfully opened ") + kFixture + "\n"}}));

    log.clear();
    void* address = nullptr;
    ASSERT_EQ(tavo_osal_dlsym(handle, "tavo_fixture_answer", &address), TAVO_SUCCESS);
    EXPECT_EQ(reinterpret_cast<int (*)()>(address)(), 42);
    EXPECT_TRUE(log.lines().empty());

    EXPECT_EQ(tavo_osal_dlclose(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_mappings(0, kFixture), 0U);
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, "OSAL_DL", "Successfully closed " + text_of(handle) + "\n"}}));
}

TEST(DynamicLoading, GivesThePlatformTheFlagsUnchanged) {
    static int flags = 0;
    const PlatformHook hook(
        "libtavoosal.so", "dlopen", +[](const char*, int given) -> void* {
            flags = given;
            return &flags;
        });
    void* handle = nullptr;
    EXPECT_EQ(tavo_osal_dlopen("any", RTLD_LAZY | RTLD_GLOBAL, &handle), TAVO_SUCCESS);
    EXPECT_EQ(flags, RTLD_LAZY | RTLD_GLOBAL);
    EXPECT_EQ(handle, &flags);
}

TEST(DynamicLoading, ReportsAnObjectThatCannotBeOpened) {
    ASSERT_EQ(dlopen(kMissing, RTLD_NOW), nullptr);
    const std::string words = dlerror();

    const LogCapture log;
    int before = 0;
    void* handle = &before;
    EXPECT_EQ(tavo_osal_dlopen(kMissing, RTLD_NOW, &handle), TAVO_DL_OPEN_FAILED);
    EXPECT_EQ(handle, &before);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, "OSAL_DL", std::string("Failed to open ") + kMissing + "\n"}, {1, "OSAL_DL", words + "\n"}}));
}

TEST(DynamicLoading, ReportsNothingThatTheFilterDrops) {
    const LogCapture log(0);
    void* handle = nullptr;
    EXPECT_EQ(tavo_osal_dlopen(kMissing, RTLD_NOW, &handle), TAVO_DL_OPEN_FAILED);
    EXPECT_TRUE(log.lines().empty());
}

TEST(DynamicLoading, ReportsAnObjectThatCannotBeOpenedWhenThePlatformHasNoWords) {
    const PlatformHook open_hook(
        "libtavoosal.so", "dlopen", +[](const char*, int) -> void* { return nullptr; });
    const PlatformHook error_hook(
        "libtavoosal.so", "dlerror", +[]() -> char* { return nullptr; });
    const LogCapture log;
    void* handle = nullptr;
    EXPECT_EQ(tavo_osal_dlopen("any", RTLD_NOW, &handle), TAVO_DL_OPEN_FAILED);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_DL", "Failed to open any\n"}}));
}

TEST(DynamicLoading, KeepsThePlatformsWordsWhenTheLogLooksSymbolsUpItself) {
    ASSERT_EQ(dlopen(kMissing, RTLD_NOW), nullptr);
    const std::string words = dlerror();
    static std::vector<std::string> lines;
    lines.clear();
    const PlatformHook hook(
        "libtavoosal.so", "__android_log_vprint", +[](int, const char*, const char* format, va_list values) {
            char text[512];
            vsnprintf(text, sizeof text, format, values);
            lines.push_back(text);
            dlsym(RTLD_DEFAULT, "tavo_no_such_symbol");
            return 0;
        });
    void* handle = nullptr;
    EXPECT_EQ(tavo_osal_dlopen(kMissing, RTLD_NOW, &handle), TAVO_DL_OPEN_FAILED);
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_NE(lines[1].find("::" + words + "\n"), std::string::npos) << lines[1];
}

TEST(DynamicLoading, RefusesNullArguments) {
    LogCapture log;
    int any = 0;
    void* handle = &any;
    EXPECT_EQ(tavo_osal_dlopen(nullptr, RTLD_NOW, &handle), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_dlopen(kFixture, RTLD_NOW, nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_dlsym(nullptr, "name", &handle), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_dlsym(&any, nullptr, &handle), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_dlsym(&any, "name", nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(handle, &any);
    EXPECT_TRUE(logged_exactly(log.lines(), std::vector<ExpectedLine>(5, {1, "OSAL_DL", "NULL arguments passed \n"})));

    log.clear();
    EXPECT_EQ(tavo_osal_dlclose(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_DL", "NULL argument passed \n"}}));
    EXPECT_EQ(count_mappings(0, kFixture), 0U);
}

TEST_F(LoadedFixture, ReportsASymbolThatIsMissingAndStoresNull) {
    ASSERT_EQ(dlsym(handle, "tavo_fixture_missing"), nullptr);
    const std::string words = dlerror();

    const LogCapture log;
    void* address = handle;
    EXPECT_EQ(tavo_osal_dlsym(handle, "tavo_fixture_missing", &address), TAVO_DL_SYMBOL_FAILED);
    EXPECT_EQ(address, nullptr);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, "OSAL_DL", "Failed to find symbol  tavo_fixture_missing\n"}, {1, "OSAL_DL", words + "\n"}}));
}

TEST_F(LoadedFixture, FindsASymbolWhoseValueIsNull) {
    const LogCapture log;
    void* address = handle;
    EXPECT_EQ(tavo_osal_dlsym(handle, "tavo_fixture_null", &address), TAVO_SUCCESS);
    EXPECT_EQ(address, nullptr);
    EXPECT_TRUE(log.lines().empty());
}

// A platform whose errors stay until they are read.
const char* g_pending = nullptr;

char* take_pending() {
    const char* words = g_pending;
    g_pending = nullptr;
    return const_cast<char*>(words);
}

TEST_F(LoadedFixture, DoesNotTakeAnEarlierErrorForItsOwn) {
    const PlatformHook hook("libtavoosal.so", "dlerror", take_pending);
    g_pending = "left by an earlier call";
    void* address = nullptr;
    EXPECT_EQ(tavo_osal_dlsym(handle, "tavo_fixture_answer", &address), TAVO_SUCCESS);
    EXPECT_NE(address, nullptr);
}

TEST_F(LoadedFixture, TakesAnErrorForAFailureEvenWithAnAddress) {
    const PlatformHook error_hook("libtavoosal.so", "dlerror", take_pending);
    const PlatformHook symbol_hook(
        "libtavoosal.so", "dlsym", +[](void*, const char*) -> void* {
            g_pending = "words";
            return &g_pending;
        });
    const LogCapture log;
    void* address = nullptr;
    EXPECT_EQ(tavo_osal_dlsym(handle, "name", &address), TAVO_DL_SYMBOL_FAILED);
    EXPECT_EQ(address, &g_pending);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, "OSAL_DL", "Failed to find symbol  name\n"}, {1, "OSAL_DL", "words\n"}}));
}

TEST_F(LoadedFixture, ReportsAnObjectThatCannotBeClosed) {
    const PlatformHook hook(
        "libtavoosal.so", "dlclose", +[](void*) { return -1; });
    const LogCapture log;
    EXPECT_EQ(tavo_osal_dlclose(handle), TAVO_DL_CLOSE_FAILED);
    char number[16];
    snprintf(number, sizeof number, "%x", static_cast<unsigned int>(reinterpret_cast<uintptr_t>(handle)));
    EXPECT_TRUE(logged_exactly(
        log.lines(),
        {{1, "OSAL_DL", std::string("Failed to unload the shared object with handle : ") + number + "\n"}}));
}

}  // namespace
