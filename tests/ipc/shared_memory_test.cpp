#include "tavo_osal/shared_memory.h"

#include <gtest/gtest.h>
#include <sys/mman.h>

#include <array>
#include <cerrno>
#include <cstdlib>

#include "ipc/server.h"
#include "ipc/shared_memory_test.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"

namespace {

using tavo::test::acquire;
using tavo::test::Block;
using tavo::test::count_blocks;
using tavo::test::count_memory_files;
using tavo::test::count_text;
using tavo::test::LogCapture;
using tavo::test::logged;
using tavo::test::logged_exactly;
using tavo::test::make_handle;
using tavo::test::PlatformHook;
using tavo::test::Server;
using tavo::test::shared_memory_lines;

constexpr auto& kTag = tavo::test::kSharedMemoryTag;
constexpr auto& kCountTag = tavo::test::kHeapCountTag;
void* const kUntouched = reinterpret_cast<void*>(0x5A5A);

TEST(SharedMemoryInit, KeepsKeyAndSize) {
    const LogCapture log;
    TavoShmHandle* handle = nullptr;
    EXPECT_EQ(tavo_shm_init(0x80000001U, &handle, 0xFFFFFFFFU), TAVO_SUCCESS);
    ASSERT_NE(handle, nullptr);
    EXPECT_EQ(handle->uiKey, 0x80000001U);
    EXPECT_EQ(handle->uiSize, 0xFFFFFFFFU);
    // The service is not asked, not even looked up.
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"}, {6, kTag, "--Exiting \n"}}));
    free(handle);
}

TEST(SharedMemoryInit, RefusesANullPointerAndNoSize) {
    const LogCapture log;
    auto* handle = static_cast<TavoShmHandle*>(kUntouched);
    EXPECT_EQ(tavo_shm_init(1, nullptr, 1), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_shm_init(1, &handle, 0), TAVO_INVALID_PARAM);
    EXPECT_EQ(handle, kUntouched);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"},
                                             {1, kTag, "Invalid paramters \n"},
                                             {6, kTag, "--Exiting \n"},
                                             {6, kTag, "++Entered\n"},
                                             {1, kTag, "Invalid paramters \n"},
                                             {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryInit, ReportsMissingMemoryWithANullHandle) {
    const PlatformHook hook(
        "libtavoosal.so", "malloc", +[](size_t) -> void* { return nullptr; });
    const LogCapture log;
    auto* handle = static_cast<TavoShmHandle*>(kUntouched);
    EXPECT_EQ(tavo_shm_init(1, &handle, 1), TAVO_NO_MEMORY);
    EXPECT_EQ(handle, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"}, {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryRelease, LeavesTheOtherAcquisitions) {
    const Server server;
    void* const first = acquire(1, 10);
    void* const second = acquire(2, 20);
    ASSERT_NE(first, second);
    LogCapture log;
    EXPECT_EQ(tavo_shm_release(first), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{6, kTag, "++Entered\n"}, {3, kCountTag, count_text("--", 1)}, {6, kTag, "--Exiting \n"}}));
    EXPECT_EQ(count_blocks(1), 0U);
    EXPECT_EQ(count_blocks(2), 1U);
    log.clear();
    EXPECT_EQ(tavo_shm_release(second), TAVO_SUCCESS);
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("--", 0)}));
    EXPECT_EQ(count_blocks(2), 0U);
}

// Whichever goes, the places behind it move up and none is lost.
TEST(SharedMemoryRelease, InAnyOrderFindsEachAcquisitionOnce) {
    const Server server;
    for (const std::array<uint32_t, 4>& order :
         {std::array<uint32_t, 4>{1, 2, 3, 4}, {4, 3, 2, 1}, {2, 4, 1, 3}, {3, 1, 4, 2}}) {
        std::array<void*, 5> blocks = {};
        for (uint32_t key = 1; key <= 4; ++key) blocks[key] = acquire(key, 10);
        for (const uint32_t key : order) {
            EXPECT_EQ(count_blocks(key), 1U);
            EXPECT_EQ(tavo_shm_release(blocks[key]), TAVO_SUCCESS);
            EXPECT_EQ(count_blocks(key), 0U);
        }
    }
}

TEST(SharedMemoryRelease, OfAnUnknownAddressSucceedsAndChangesNothing) {
    const Server server;
    const Block block(7, 100);
    const LogCapture log;
    int local = 0;
    EXPECT_EQ(tavo_shm_release(&local), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_release(block.bytes() + 1), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_release(MAP_FAILED), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(kCountTag), {{3, kCountTag, count_text("--", 1)},
                                                      {3, kCountTag, count_text("--", 1)},
                                                      {3, kCountTag, count_text("--", 1)}}));
    EXPECT_EQ(count_blocks(7), 1U);
}

TEST(SharedMemoryRelease, RefusesNull) {
    const LogCapture log;
    EXPECT_EQ(tavo_shm_release(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{6, kTag, "++Entered\n"}, {1, kTag, "Invalid parameters \n"}, {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryReleaseBySize, IgnoresTheSize) {
    const Server server;
    void* const address = acquire(7, 100);
    const LogCapture log;
    EXPECT_EQ(tavo_shm_release_by_size(0, address), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"},
                                             {6, kTag, "++Entered\n"},
                                             {3, kCountTag, count_text("--", 0)},
                                             {6, kTag, "--Exiting \n"}}));
    EXPECT_EQ(count_blocks(7), 0U);
    EXPECT_EQ(tavo_shm_release_by_size(100, address), TAVO_SUCCESS);  // no longer acquired
}

TEST(SharedMemoryReleaseBySize, RefusesNull) {
    const LogCapture log;
    EXPECT_EQ(tavo_shm_release_by_size(5, nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"},
                                             {6, kTag, "++Entered\n"},
                                             {1, kTag, "Invalid parameters \n"},
                                             {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryDelete, RefusesNull) {
    const LogCapture log;
    EXPECT_EQ(tavo_shm_delete(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{6, kTag, "++Entered\n"}, {1, kTag, "Invalid parameters \n"}, {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryDelete, KeepsTheHandleWhenTheServiceIsNotReachable) {
    TavoShmHandle* handle = make_handle(7, 100);
    const LogCapture log;
    EXPECT_EQ(tavo_shm_delete(handle), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"},
                                             {1, kTag, "++Entered\n"},
                                             {1, kTag, "Service is not available\n"},
                                             {3, kTag, "The TavoOsalServer is not published\n"},
                                             {6, kTag, "--Exiting \n"}}));
    EXPECT_EQ(handle->uiKey, 7U);
    EXPECT_EQ(handle->uiSize, 100U);

    const Server server;
    EXPECT_EQ(tavo_shm_delete(handle), TAVO_SUCCESS);
}

TEST(SharedMemoryDelete, LogsItsWayToTheService) {
    const Server server;
    TavoShmHandle* handle = make_handle(7, 100);
    const LogCapture log;
    EXPECT_EQ(tavo_shm_delete(handle), TAVO_SUCCESS);  // no such block: the service does not mind
    EXPECT_TRUE(logged_exactly(
        shared_memory_lines(log),
        {{6, kTag, "++Entered\n"}, {1, kTag, "++Entered\n"}, {1, kTag, "--Exiting\n"}, {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryDelete, ReturnsTheServicesResult) {
    const Server server;
    EXPECT_EQ(tavo_shm_delete(make_handle(0, 1)), TAVO_FAILURE);
    // A key that the service takes as negative: it makes the block, and never deletes it.
    const uint32_t negative = static_cast<uint32_t>(-5);
    const Block block(negative, 10);
    EXPECT_EQ(tavo_shm_delete(make_handle(negative, 10)), TAVO_FAILURE);
    EXPECT_EQ(count_memory_files(server.pid(), "SharedMemory_-5"), 1U);
}

TEST(SharedMemory, IsRefusedByAServiceWithoutTables) {
    const Server server(0, 5);
    TavoShmHandle handle = {7, 100};
    void* address = kUntouched;
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_FAILURE);
    EXPECT_EQ(address, kUntouched);
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), -1);
}

}  // namespace
