#include "tavo_osal/shared_memory.h"

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "ipc/server_process.h"
#include "ipc/shared_memory.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"

namespace {

using tavo::test::acquire;
using tavo::test::Block;
using tavo::test::comes_true;
using tavo::test::count_memory_files;
using tavo::test::LogCapture;
using tavo::test::logged;
using tavo::test::logged_exactly;
using tavo::test::LogLine;
using tavo::test::make_handle;
using tavo::test::PlatformHook;
using tavo::test::ServerProcess;

constexpr char kTag[] = "TAVO_OSAL_SHARED_MEM";
constexpr char kCountTag[] = "OSAL_SHM";
void* const kUntouched = reinterpret_cast<void*>(0x5A5A);

std::string count_text(const char* which, int count) {
    return std::string("uiCnt") + which + " = " + std::to_string(count) + " pid = " + std::to_string(getpid()) + " \n";
}

// What this process's own functions logged: the service may be in the same process.
std::vector<LogLine> lines_of_family(const LogCapture& log) {
    std::vector<LogLine> lines;
    for (const LogLine& line : log.lines()) {
        if (line.tag == kTag || line.tag == kCountTag) lines.push_back(line);
    }
    return lines;
}

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

TEST(SharedMemoryAcquire, RefusesNullPointers) {
    TavoShmHandle handle = {1, 1};
    void* address = kUntouched;
    const LogCapture log;
    EXPECT_EQ(tavo_shm_acquire(nullptr, &address), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_shm_acquire(&handle, nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(address, kUntouched);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"},
                                             {1, kTag, "Invalid parameter \n"},
                                             {6, kTag, "--Exiting \n"},
                                             {6, kTag, "++Entered\n"},
                                             {1, kTag, "Invalid parameter \n"},
                                             {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryAcquire, FailsWithoutAMarkerAndAsksNobody) {
    TavoShmHandle handle = {1, 1};
    void* address = kUntouched;
    const LogCapture log;
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_FAILURE);
    EXPECT_EQ(address, kUntouched);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"},
                                             {4, kTag, "calling get shared memory \n"},
                                             {1, kTag, "++Entered\n"},
                                             {1, kTag, "Service is not available\n"},
                                             {3, kTag, "The TavoOsalServer is not published\n"},
                                             {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryAcquire, FailsWhenTheServiceIsGoneThoughItsMarkerIsThere) {
    ServerProcess().kill();
    TavoShmHandle handle = {1, 1};
    void* address = kUntouched;
    const LogCapture log;
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_FAILURE);
    EXPECT_EQ(address, kUntouched);
    EXPECT_TRUE(logged_exactly(
        log.lines(kTag), {{6, kTag, "++Entered\n"},
                          {4, kTag, "calling get shared memory \n"},
                          {1, kTag, "++Entered\n"},
                          {1, kTag,
                           " android::sp<android::ITavoBinder> tavo_osal_get_service(TAVO_CHAR*) () Failed to get "
                           "service (android.tavo.osal) \n"},
                          {3, kTag, "The TavoOsalServer is not published\n"},
                          {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryAcquire, GivesAZeroedBlockAndCountsIt) {
    const ServerProcess server;
    TavoShmHandle handle = {7, 100};
    void* address = nullptr;
    const LogCapture log;
    ASSERT_EQ(tavo_shm_acquire(&handle, &address), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(lines_of_family(log), {{6, kTag, "++Entered\n"},
                                                      {4, kTag, "calling get shared memory \n"},
                                                      {1, kTag, "++Entered\n"},
                                                      {1, kTag, "--Exiting\n"},
                                                      {3, kCountTag, count_text("++", 1)},
                                                      {6, kTag, "--Exiting \n"}}));
    EXPECT_TRUE(log.lines("MSGQUEUE_BINDER").empty());
    const std::array<char, 100> zeros = {};
    EXPECT_EQ(memcmp(address, zeros.data(), zeros.size()), 0);
    EXPECT_EQ(reinterpret_cast<uintptr_t>(address) % static_cast<uintptr_t>(sysconf(_SC_PAGESIZE)), 0U);
    EXPECT_EQ(tavo_shm_release(address), TAVO_SUCCESS);
}

TEST(SharedMemoryAcquire, OfOneKeyTwiceGivesOneAddressAndTwoEntries) {
    const ServerProcess server;
    const Block first(7, 100);
    LogCapture log;
    void* const second = acquire(7, 5000);  // the size no longer matters
    EXPECT_EQ(second, first.address());
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("++", 2)}));
    EXPECT_EQ(tavo::test::count_blocks(7), 1U);

    log.clear();
    EXPECT_EQ(tavo_shm_release(second), TAVO_SUCCESS);
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("--", 1)}));
    first.bytes()[99] = 'x';  // still mapped
    EXPECT_EQ(tavo::test::count_blocks(7), 1U);
    EXPECT_EQ(tavo_shm_release(second), TAVO_SUCCESS);
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("--", 0)}));
    EXPECT_EQ(tavo::test::count_blocks(7), 0U);
}

TEST(SharedMemoryRelease, LeavesTheOtherAcquisitions) {
    const ServerProcess server;
    void* const first = acquire(1, 10);
    void* const second = acquire(2, 20);
    ASSERT_NE(first, second);
    LogCapture log;
    EXPECT_EQ(tavo_shm_release(first), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{6, kTag, "++Entered\n"}, {3, kCountTag, count_text("--", 1)}, {6, kTag, "--Exiting \n"}}));
    EXPECT_EQ(tavo::test::count_blocks(1), 0U);
    EXPECT_EQ(tavo::test::count_blocks(2), 1U);
    log.clear();
    EXPECT_EQ(tavo_shm_release(second), TAVO_SUCCESS);
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("--", 0)}));
    EXPECT_EQ(tavo::test::count_blocks(2), 0U);
}

// Whichever goes, the places behind it move up and none is lost.
TEST(SharedMemoryRelease, InAnyOrderFindsEachAcquisitionOnce) {
    const ServerProcess server;
    for (const std::array<uint32_t, 4>& order :
         {std::array<uint32_t, 4>{1, 2, 3, 4}, {4, 3, 2, 1}, {2, 4, 1, 3}, {3, 1, 4, 2}}) {
        std::array<void*, 5> blocks = {};
        for (uint32_t key = 1; key <= 4; ++key) blocks[key] = acquire(key, 10);
        for (const uint32_t key : order) {
            EXPECT_EQ(tavo::test::count_blocks(key), 1U);
            EXPECT_EQ(tavo_shm_release(blocks[key]), TAVO_SUCCESS);
            EXPECT_EQ(tavo::test::count_blocks(key), 0U);
        }
    }
}

TEST(SharedMemoryRelease, OfAnUnknownAddressSucceedsAndChangesNothing) {
    const ServerProcess server;
    const Block block(7, 100);
    const LogCapture log;
    int local = 0;
    EXPECT_EQ(tavo_shm_release(&local), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_release(block.bytes() + 1), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_release(MAP_FAILED), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(kCountTag), {{3, kCountTag, count_text("--", 1)},
                                                      {3, kCountTag, count_text("--", 1)},
                                                      {3, kCountTag, count_text("--", 1)}}));
    EXPECT_EQ(tavo::test::count_blocks(7), 1U);
}

TEST(SharedMemoryRelease, RefusesNull) {
    const LogCapture log;
    EXPECT_EQ(tavo_shm_release(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{6, kTag, "++Entered\n"}, {1, kTag, "Invalid parameters \n"}, {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryReleaseBySize, IgnoresTheSize) {
    const ServerProcess server;
    void* const address = acquire(7, 100);
    const LogCapture log;
    EXPECT_EQ(tavo_shm_release_by_size(0, address), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"},
                                             {6, kTag, "++Entered\n"},
                                             {3, kCountTag, count_text("--", 0)},
                                             {6, kTag, "--Exiting \n"}}));
    EXPECT_EQ(tavo::test::count_blocks(7), 0U);
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

    const ServerProcess server;
    EXPECT_EQ(tavo_shm_delete(handle), TAVO_SUCCESS);
}

TEST(SharedMemoryDelete, LogsItsWayToTheService) {
    const ServerProcess server;
    TavoShmHandle* handle = make_handle(7, 100);
    const LogCapture log;
    EXPECT_EQ(tavo_shm_delete(handle), TAVO_SUCCESS);  // no such block: the service does not mind
    EXPECT_TRUE(logged_exactly(
        lines_of_family(log),
        {{6, kTag, "++Entered\n"}, {1, kTag, "++Entered\n"}, {1, kTag, "--Exiting\n"}, {6, kTag, "--Exiting \n"}}));
}

TEST(SharedMemoryDelete, ReturnsTheServicesResult) {
    const ServerProcess server;
    EXPECT_EQ(tavo_shm_delete(make_handle(0, 1)), TAVO_FAILURE);
    // A key that the service takes as negative: it makes the block, and never deletes it.
    const uint32_t negative = static_cast<uint32_t>(-5);
    const Block block(negative, 10);
    EXPECT_EQ(tavo_shm_delete(make_handle(negative, 10)), TAVO_FAILURE);
    EXPECT_EQ(count_memory_files(server.pid(), "SharedMemory_-5"), 1U);
}

TEST(SharedMemory, IsRefusedByAServiceWithoutTables) {
    const ServerProcess server(0, 5);
    TavoShmHandle handle = {7, 100};
    void* address = kUntouched;
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_FAILURE);
    EXPECT_EQ(address, kUntouched);
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), -1);
}

TEST(SharedMemoryAcquire, FailsWhenTheServiceHasNoBlock) {
    const ServerProcess server;
    const LogCapture log;
    for (TavoShmHandle handle : {TavoShmHandle{0, 100}, TavoShmHandle{7, 0x80000000U}, TavoShmHandle{7, UINT32_MAX}}) {
        void* address = kUntouched;
        EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_FAILURE);
        EXPECT_EQ(address, kUntouched);
    }
    EXPECT_TRUE(logged(log.lines(), {1, kTag, "No shared memory for key 0, size 100\n"}));
    EXPECT_TRUE(logged(log.lines(), {1, kTag, "No shared memory for key 7, size 2147483648\n"}));
    EXPECT_TRUE(log.lines(kCountTag).empty());
    // No place in the table was used up.
    for (int i = 0; i < TAVO_SHM_MAX_ACQUIRED; ++i) acquire(7, 100);
}

TEST(SharedMemoryAcquire, FailsWhenTheBlockCannotBeMappedAndLeavesNoUseBehind) {
    const ServerProcess server;
    acquire(1, 1);  // opens the way to the service, which maps memory as well
    {
        const PlatformHook hook(
            "libbinder.so", "mmap", +[](void*, size_t, int, int, int, off_t) {
                errno = ENOMEM;
                return MAP_FAILED;
            });
        TavoShmHandle handle = {7, 100};
        void* address = kUntouched;
        EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_FAILURE);
        EXPECT_EQ(address, kUntouched);
    }
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid(), "SharedMemory_7") == 0; }));

    const Block block(7, 100);
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), TAVO_SUCCESS);
    tavo_shm_release(block.address());
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid(), "SharedMemory_7") == 0; }));
}

TEST(SharedMemoryAcquire, RefusesThe26thAndChangesNothing) {
    const ServerProcess server;
    std::vector<void*> addresses;
    for (uint32_t key = 1; key <= TAVO_SHM_MAX_ACQUIRED; ++key) addresses.push_back(acquire(key, 10));
    TavoShmHandle handle = {99, 10};
    void* address = kUntouched;
    LogCapture log;
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_NO_MEMORY);
    EXPECT_EQ(address, kUntouched);
    EXPECT_TRUE(logged_exactly(lines_of_family(log), {{6, kTag, "++Entered\n"},
                                                      {4, kTag, "calling get shared memory \n"},
                                                      {1, kTag, "++Entered\n"},
                                                      {1, kTag, "--Exiting\n"},
                                                      {1, kTag, "All 25 acquisitions of this process are in use\n"},
                                                      {6, kTag, "--Exiting \n"}}));
    EXPECT_EQ(count_memory_files(server.pid(), "SharedMemory_99"), 0U);

    log.clear();
    EXPECT_EQ(tavo_shm_release(addresses[12]), TAVO_SUCCESS);
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("--", 24)}));
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_SUCCESS);
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("++", 25)}));
    for (uint32_t i = 0; i < TAVO_SHM_MAX_ACQUIRED; ++i) {
        EXPECT_EQ(tavo::test::count_blocks(i + 1), i == 12 ? 0U : 1U);
    }
}

TEST(SharedMemoryAcquire, OfManyThreadsAtOnceFillsTheTableExactly) {
    const ServerProcess server;
    constexpr int kThreads = 8, kEach = 5;
    std::atomic<int> successes{0}, refusals{0};
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i) {
        threads.emplace_back([&, i] {
            for (int j = 0; j < kEach; ++j) {
                TavoShmHandle handle = {static_cast<uint32_t>(i + 1), 10};
                void* address = nullptr;
                const TAVO_Status status = tavo_shm_acquire(&handle, &address);
                successes += status == TAVO_SUCCESS;
                refusals += status == TAVO_NO_MEMORY;
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(successes, TAVO_SHM_MAX_ACQUIRED);
    EXPECT_EQ(refusals, kThreads * kEach - TAVO_SHM_MAX_ACQUIRED);
}

TEST(SharedMemory, MayBeUsedByManyThreadsAtOnce) {
    const ServerProcess server;
    std::atomic<int> failures{0};
    std::vector<std::thread> threads;
    for (uint32_t i = 0; i < 4; ++i) {
        threads.emplace_back([&, i] {
            for (int round = 0; round < 50; ++round) {
                // One block for all, and one of the thread's own.
                for (const uint32_t key : {1U, 2U + i}) {
                    TavoShmHandle* handle = nullptr;
                    void* address = nullptr;
                    failures += tavo_shm_init(key, &handle, 64) != TAVO_SUCCESS;
                    if (tavo_shm_acquire(handle, &address) == TAVO_SUCCESS) {
                        static_cast<char*>(address)[i] = 'x';
                        failures += tavo_shm_release(address) != TAVO_SUCCESS;
                    } else {
                        ++failures;
                    }
                    failures += tavo_shm_delete(handle) != TAVO_SUCCESS;
                }
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(failures, 0);
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid()) == 0; }));
    EXPECT_EQ(count_memory_files(), 0U);
}

TEST(SharedMemory, OfTheServersOwnProcessIsTheServicesMapping) {
    ASSERT_EQ(tavo_osal_init(2, 2), TAVO_SUCCESS);
    const LogCapture log;
    void* const first = acquire(7, 100);
    EXPECT_EQ(acquire(7, 100), first);
    // The service counts in the same words.
    EXPECT_TRUE(logged_exactly(lines_of_family(log), {{6, kTag, "++Entered\n"},
                                                      {6, kTag, "--Exiting \n"},
                                                      {6, kTag, "++Entered\n"},
                                                      {4, kTag, "calling get shared memory \n"},
                                                      {1, kTag, "++Entered\n"},
                                                      {1, kTag, "--Exiting\n"},
                                                      {3, kCountTag, count_text("++", 1)},
                                                      {3, kCountTag, count_text("++", 1)},
                                                      {6, kTag, "--Exiting \n"},
                                                      {6, kTag, "++Entered\n"},
                                                      {6, kTag, "--Exiting \n"},
                                                      {6, kTag, "++Entered\n"},
                                                      {4, kTag, "calling get shared memory \n"},
                                                      {1, kTag, "++Entered\n"},
                                                      {1, kTag, "--Exiting\n"},
                                                      {3, kCountTag, count_text("++", 2)},
                                                      {6, kTag, "--Exiting \n"}}));
    EXPECT_EQ(tavo_shm_release(first), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_release(first), TAVO_SUCCESS);
    EXPECT_EQ(tavo::test::count_blocks(7), 1U);  // the service still has it
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), TAVO_SUCCESS);
    EXPECT_EQ(tavo::test::count_blocks(7), 0U);
    EXPECT_EQ(count_memory_files(), 0U);
}

}  // namespace
