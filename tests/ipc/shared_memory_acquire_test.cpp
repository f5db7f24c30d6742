#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <new>
#include <string>
#include <thread>
#include <vector>

#include "ipc/server.h"
#include "ipc/shared_memory_test.h"
#include "support/eventually.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/init.h"
#include "tavo_osal/shared_memory.h"

namespace {

using tavo::test::acquire;
using tavo::test::Block;
using tavo::test::comes_true;
using tavo::test::count_blocks;
using tavo::test::count_memory_files;
using tavo::test::count_text;
using tavo::test::LogCapture;
using tavo::test::logged;
using tavo::test::logged_exactly;
using tavo::test::make_handle;
using tavo::test::PlatformHook;
using tavo::test::Process;
using tavo::test::Server;
using tavo::test::shared_memory_lines;

constexpr auto& kTag = tavo::test::kSharedMemoryTag;
constexpr auto& kCountTag = tavo::test::kHeapCountTag;
void* const kUntouched = reinterpret_cast<void*>(0x5A5A);

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
    Server().kill();
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
    const Server server;
    TavoShmHandle handle = {7, 100};
    void* address = nullptr;
    const LogCapture log;
    ASSERT_EQ(tavo_shm_acquire(&handle, &address), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(shared_memory_lines(log), {{6, kTag, "++Entered\n"},
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
    const Server server;
    const Block first(7, 100);
    LogCapture log;
    void* const second = acquire(7, 5000);  // the size no longer matters
    EXPECT_EQ(second, first.address());
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("++", 2)}));
    EXPECT_EQ(count_blocks(7), 1U);

    log.clear();
    EXPECT_EQ(tavo_shm_release(second), TAVO_SUCCESS);
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("--", 1)}));
    first.bytes()[99] = 'x';  // still mapped
    EXPECT_EQ(count_blocks(7), 1U);
    EXPECT_EQ(tavo_shm_release(second), TAVO_SUCCESS);
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("--", 0)}));
    EXPECT_EQ(count_blocks(7), 0U);
}

TEST(SharedMemoryAcquire, FailsWhenTheServiceHasNoBlock) {
    const Server server;
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

void* fail_to_map(void*, size_t, int, int, int, off_t) {
    errno = ENOMEM;
    return MAP_FAILED;
}

int fail_to_make_a_memory_file(const char*, unsigned) {
    errno = EMFILE;
    return -1;
}

void expect_no_block(uint32_t key) {
    TavoShmHandle handle = {key, 100};
    void* address = kUntouched;
    const LogCapture log;
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_FAILURE);
    EXPECT_EQ(address, kUntouched);
    EXPECT_TRUE(logged(log.lines(), {1, kTag, "No shared memory for key " + std::to_string(key) + ", size 100\n"}));
    EXPECT_FALSE(logged(log.lines(), {3, kCountTag, count_text("++", 1)}));
}

TEST(SharedMemoryAcquire, FailsWhenTheBlockCannotBeMappedAndLeavesNoUseBehind) {
    const Server server;
    const Block opens_the_way_to_the_service(1, 1);  // which maps memory as well
    {
        const PlatformHook hook("libbinder.so", "mmap", fail_to_map);
        expect_no_block(7);
    }
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid(), "SharedMemory_7") == 0; }));

    const Block block(7, 100);
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), TAVO_SUCCESS);
    tavo_shm_release(block.address());
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid(), "SharedMemory_7") == 0; }));
}

TEST_ROLE(server_without_memory) {
    const PlatformHook hook("libbinder.so", "memfd_create", fail_to_make_a_memory_file);
    tavo_osal_init(5, 5);
    puts("\nready");
    getchar();
    return 0;
}

TEST(SharedMemoryAcquire, FailsWhenTheServiceHasNoMemory) {
    Process server = Process::start("server_without_memory");
    while (server.read_line() != "ready") continue;
    expect_no_block(7);
    expect_no_block(7);
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), TAVO_SUCCESS);
}

TEST(SharedMemoryAcquire, FailsWhenTheServiceInTheSameProcessHasNoMemoryAndTriesAnewTheNextTime) {
    ASSERT_EQ(tavo_osal_init(5, 5), TAVO_SUCCESS);
    {
        const PlatformHook hook("libbinder.so", "memfd_create", fail_to_make_a_memory_file);
        const LogCapture log;
        TavoShmHandle handle = {7, 100};
        void* address = kUntouched;
        EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_FAILURE);
        EXPECT_EQ(address, kUntouched);
    }
    const Block block(7, 100);
    EXPECT_EQ(block.bytes()[99], 0);
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), TAVO_SUCCESS);
}

int g_allocations_left;

void* allocate_or_throw(size_t size) {
    if (--g_allocations_left < 0) throw std::bad_alloc();
    return operator new(size);
}

TEST(SharedMemoryAcquire, FailsWhicheverAllocationOfTheLibraryFails) {
    const Server server;
    int failures = 0;
    TAVO_Status status = TAVO_FAILURE;
    for (int allocations = 0; status != TAVO_SUCCESS && allocations < 10; ++allocations) {
        TavoShmHandle handle = {7, 100};
        void* address = kUntouched;
        g_allocations_left = allocations;
        const PlatformHook hook("libtavoosal.so", tavo::test::kOperatorNew, allocate_or_throw);
        status = tavo_shm_acquire(&handle, &address);
        if (status == TAVO_SUCCESS) continue;
        ++failures;
        EXPECT_EQ(status, TAVO_FAILURE);
        EXPECT_EQ(address, kUntouched);
    }
    EXPECT_EQ(status, TAVO_SUCCESS);
    EXPECT_GT(failures, 0);
}

TEST(SharedMemoryAcquire, RefusesThe26thAndChangesNothing) {
    const Server server;
    std::vector<void*> addresses;
    for (uint32_t key = 1; key <= TAVO_SHM_MAX_ACQUIRED; ++key) addresses.push_back(acquire(key, 10));
    TavoShmHandle handle = {99, 10};
    void* address = kUntouched;
    LogCapture log;
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_NO_MEMORY);
    EXPECT_EQ(address, kUntouched);
    EXPECT_TRUE(logged_exactly(shared_memory_lines(log), {{6, kTag, "++Entered\n"},
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
        EXPECT_EQ(count_blocks(i + 1), i == 12 ? 0U : 1U);
    }
}

TEST(SharedMemoryAcquire, OfManyThreadsAtOnceFillsTheTableExactly) {
    const Server server;
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
    const Server server;
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
    EXPECT_TRUE(logged_exactly(shared_memory_lines(log), {{6, kTag, "++Entered\n"},
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
    EXPECT_EQ(count_blocks(7), 1U);  // the service still has it
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_delete(make_handle(7, 100)), TAVO_SUCCESS);
    EXPECT_EQ(count_blocks(7), 0U);
    EXPECT_EQ(count_memory_files(), 0U);
}

}  // namespace
