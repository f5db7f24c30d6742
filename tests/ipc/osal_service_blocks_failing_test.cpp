// The service's shared-memory blocks when something fails.
#include <sys/mman.h>

#include <cerrno>
#include <string>
#include <utility>

#include "ipc/allocation_fault.h"
#include "ipc/osal_service_blocks_test.h"
#include "support/process.h"

namespace {

using android::IMemoryHeap;
using android::sp;
using tavo::test::AllocationFault;
using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::LogCapture;
using tavo::test::logged_address;
using tavo::test::OsalServiceBlocks;
using tavo::test::PlatformHook;

TEST_F(OsalServiceBlocks, TakesABlockThatCouldNotBeMappedForABlock) {
    {
        const PlatformHook hook(
            "libbinder.so", "mmap", +[](void*, size_t, int, int, int, off_t) {
                errno = ENOMEM;
                return MAP_FAILED;
            });
        const sp<IMemoryHeap> heap = service_->get_shared_mem(7, 10);
        ASSERT_NE(heap, nullptr);
        EXPECT_EQ(heap->getBase(), MAP_FAILED);
    }
    LogCapture log;
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    EXPECT_TRUE(logged(library_lines(log), line(3, "base=PTR Data=0x0\n")));
    EXPECT_EQ(logged_address(log, "Memory value returned = "), MAP_FAILED);
    EXPECT_EQ(count(log), 0);
}

TEST_F(OsalServiceBlocks, LeavesEverythingAsItWasWithoutMemory) {
    LogCapture log;
    start(1, 1);
    ASSERT_NE(service_->get_shared_mem(1, 10), nullptr);
    const size_t descriptors = count_descriptors();
    const size_t mappings = count_mappings(0, "SharedMemory_");
    const auto fails = [this](AllocationFault::Function function, size_t refused) {
        const AllocationFault fault(function, refused);
        return service_->get_shared_mem(7, 10) == nullptr;
    };
    EXPECT_TRUE(fails(AllocationFault::kCalloc, 1));  // the record
    EXPECT_TRUE(fails(AllocationFault::kNew, 1));     // the heap
    EXPECT_TRUE(fails(AllocationFault::kNew, 2));     // its holder
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(count_mappings(0, "SharedMemory_"), mappings);
    EXPECT_EQ(count(log), 1);
    service_->delete_shared_mem(1);
}

TEST_F(OsalServiceBlocks, LeavesEverythingAsItWasWithoutMemoryForMoreHeaps) {
    for (int key = 1; key <= 25; ++key) ASSERT_NE(service_->get_shared_mem(key, 10), nullptr);
    const size_t mappings = count_mappings(0, "SharedMemory_");
    {
        const AllocationFault fault(AllocationFault::kNew, 3);  // behind the heap and its holder
        EXPECT_EQ(service_->get_shared_mem(26, 10), nullptr);
    }
    EXPECT_EQ(count_mappings(0, "SharedMemory_"), mappings);
    EXPECT_NE(service_->get_shared_mem(26, 10), nullptr);
    for (int key = 1; key <= 26; ++key) service_->delete_shared_mem(key);
    EXPECT_EQ(count_mappings(0, "SharedMemory_"), 0U);
}

// A record as it lies in memory, at the address that the log names.
struct Record {
    int32_t key, size;
    uint32_t use_count;
    void* object;
};

TEST_F(OsalServiceBlocks, SaysSoWhenABlockHasLostItsHeap) {
    LogCapture log;
    service_->get_shared_mem(7, 10);
    auto* record = static_cast<Record*>(logged_address(log, "New node added "));
    ASSERT_NE(record, nullptr);
    EXPECT_EQ(record->key, 7);
    EXPECT_EQ(record->size, 10);
    EXPECT_EQ(record->use_count, 1U);
    void* object = std::exchange(record->object, nullptr);

    EXPECT_EQ(service_->get_shared_mem(7, 10), nullptr);
    EXPECT_EQ(library_lines(log).back(), line(1, "Unexpected error!!shared memory allocated is NULL !!\n"));
    EXPECT_EQ(record->use_count, 2U);  // counted all the same
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    EXPECT_EQ(service_->delete_shared_mem(7), -1);
    EXPECT_EQ(library_lines(log).back(), line(1, "Unexpected error !! Failed to free shared memory\n"));
    EXPECT_EQ(record->use_count, 0U);  // and kept in the list

    record->object = object;
    EXPECT_NE(service_->get_shared_mem(7, 10), nullptr);
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    EXPECT_EQ(count(log), 0);
}

}  // namespace
