#include "tavo_osal/memory.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/log.h"

namespace {

using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

TEST(Memory, AllocatesWritableMemoryOfTheSizeAsked) {
    const LogCapture log;
    auto* block = static_cast<unsigned char*>(tavo_osal_mem_malloc(100));
    ASSERT_NE(block, nullptr);
    std::fill(block, block + 100, static_cast<unsigned char>(0xA5));
    EXPECT_EQ(block[99], 0xA5);
    tavo_osal_mem_free(block);
    EXPECT_TRUE(log.lines().empty());
}

TEST(Memory, GivesMallocTheWholeUnsignedSize) {
    static size_t asked = 0;
    const PlatformHook hook(
        "libtavoosal.so", "malloc", +[](size_t size) -> void* {
            asked = size;
            return nullptr;
        });
    const LogCapture log;
    EXPECT_EQ(tavo_osal_mem_malloc(UINT32_MAX), nullptr);
    EXPECT_EQ(asked, size_t{UINT32_MAX});
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_MEM", "Memory not allocated. Size Requested: -1.\n"}}));
}

TEST(Memory, ReportsNothingThatTheFilterDrops) {
    const PlatformHook malloc_hook(
        "libtavoosal.so", "malloc", +[](size_t) -> void* { return nullptr; });
    const PlatformHook calloc_hook(
        "libtavoosal.so", "calloc", +[](size_t, size_t) -> void* { return nullptr; });
    const PlatformHook realloc_hook(
        "libtavoosal.so", "realloc", +[](void*, size_t) -> void* { return nullptr; });
    const LogCapture log(TAVO_LOG_PERFORMANCE);
    EXPECT_EQ(tavo_osal_mem_malloc(1), nullptr);
    EXPECT_EQ(tavo_osal_mem_calloc(1, 1), nullptr);
    EXPECT_EQ(tavo_osal_mem_realloc(nullptr, 1), nullptr);
    EXPECT_TRUE(log.lines().empty());
}

TEST(Memory, ReportsAFailedMallocWithItsSize) {
    const PlatformHook hook(
        "libtavoosal.so", "malloc", +[](size_t) -> void* {
            errno = ENOMEM;
            return nullptr;
        });
    const LogCapture log;
    errno = 0;
    EXPECT_EQ(tavo_osal_mem_malloc(1234), nullptr);
    EXPECT_EQ(errno, ENOMEM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_MEM", "Memory not allocated. Size Requested: 1234.\n"}}));
}

TEST(Memory, GrowsABlockAndKeepsItsContents) {
    const LogCapture log;
    char* block = static_cast<char*>(tavo_osal_mem_malloc(8));
    ASSERT_NE(block, nullptr);
    strcpy(block, "kept");
    char* grown = static_cast<char*>(tavo_osal_mem_realloc(block, 100000));
    ASSERT_NE(grown, nullptr);
    EXPECT_STREQ(grown, "kept");
    tavo_osal_mem_free(grown);
    EXPECT_TRUE(log.lines().empty());
}

TEST(Memory, ReallocatesFromNull) {
    void* block = tavo_osal_mem_realloc(nullptr, 10);
    EXPECT_NE(block, nullptr);
    tavo_osal_mem_free(block);
}

TEST(Memory, ReportsAFailedReallocAndLeavesTheBlock) {
    char* block = static_cast<char*>(tavo_osal_mem_malloc(8));
    ASSERT_NE(block, nullptr);
    strcpy(block, "kept");
    {
        const PlatformHook hook(
            "libtavoosal.so", "realloc", +[](void*, size_t) -> void* { return nullptr; });
        const LogCapture log;
        EXPECT_EQ(tavo_osal_mem_realloc(block, 100), nullptr);
        EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_MEM", "Memory not allocated\n"}}));
    }
    EXPECT_STREQ(block, "kept");
    tavo_osal_mem_free(block);
}

TEST(Memory, ReportsANullAnswerToSizeZeroAsAFailure) {
    // The C library may answer null or a block; this one stands for those that answer null.
    const PlatformHook hook(
        "libtavoosal.so", "realloc", +[](void* block, size_t size) -> void* {
            EXPECT_EQ(size, 0U);
            free(block);
            return nullptr;
        });
    const LogCapture log;
    EXPECT_EQ(tavo_osal_mem_realloc(tavo_osal_mem_malloc(8), 0), nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_MEM", "Memory not allocated\n"}}));
}

TEST(Memory, AllocatesZeroedArrays) {
    const LogCapture log;
    auto* block = static_cast<unsigned char*>(tavo_osal_mem_calloc(100, 7));
    ASSERT_NE(block, nullptr);
    EXPECT_TRUE(std::all_of(block, block + 700, [](unsigned char byte) { return byte == 0; }));
    tavo_osal_mem_free(block);
    EXPECT_TRUE(log.lines().empty());
}

TEST(Memory, ReportsAFailedCalloc) {
    static size_t asked_count = 0;
    static size_t asked_size = 0;
    const PlatformHook hook(
        "libtavoosal.so", "calloc", +[](size_t count, size_t size) -> void* {
            asked_count = count;
            asked_size = size;
            return nullptr;
        });
    const LogCapture log;
    EXPECT_EQ(tavo_osal_mem_calloc(3, UINT32_MAX), nullptr);
    EXPECT_EQ(asked_count, 3U);
    EXPECT_EQ(asked_size, size_t{UINT32_MAX});
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_MEM", "Memory not allocated\n"}}));
}

TEST(Memory, FreesNull) { tavo_osal_mem_free(nullptr); }

TEST(Memory, FreesWithTheCLibrarysFree) {
    static void* freed = nullptr;
    char* block = strdup("of the C library");
    {
        const PlatformHook hook(
            "libtavoosal.so", "free", +[](void* pointer) { freed = pointer; });
        tavo_osal_mem_free(block);
    }
    EXPECT_EQ(freed, block);
    free(block);
}

TEST(Memory, FillsCopiesAndCompares) {
    char a[] = "0123456789";
    char b[] = "0123456789";
    EXPECT_EQ(tavo_osal_memset(a + 1, 0x100 + 'x', 3), a + 1);
    EXPECT_STREQ(a, "0xxx456789");
    EXPECT_EQ(tavo_osal_memcpy(a, b, 4), a);
    EXPECT_STREQ(a, "0123456789");
    EXPECT_EQ(tavo_osal_memmove(a + 2, a, 8), a + 2);
    EXPECT_STREQ(a, "0101234567");
    EXPECT_EQ(tavo_osal_memmove(a, a + 2, 8), a);
    EXPECT_STREQ(a, "0123456767");
    EXPECT_EQ(tavo_osal_memcmp(a, b, 8), 0);
    EXPECT_LT(tavo_osal_memcmp(a, b, 9), 0);
    EXPECT_GT(tavo_osal_memcmp(b, a, 9), 0);
    EXPECT_GT(tavo_osal_memcmp("\xff", "\x01", 1), 0);
}

TEST(Memory, TouchesNothingForALengthOfZero) {
    char a[] = "same";
    tavo_osal_memset(a, 'x', 0);
    tavo_osal_memcpy(a, "else", 0);
    tavo_osal_memmove(a, a + 1, 0);
    EXPECT_STREQ(a, "same");
    EXPECT_EQ(tavo_osal_memcmp("a", "b", 0), 0);
}

}  // namespace
