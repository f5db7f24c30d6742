// The service's shared-memory blocks.
#include "ipc/osal_service_blocks_test.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>
#include <string>
#include <vector>

#include "support/process.h"
#include "tavo_osal/status.h"

namespace {

using android::IMemoryHeap;
using android::sp;
using tavo::test::count_mappings;
using tavo::test::ExpectedLine;
using tavo::test::kHeapCountTag;
using tavo::test::kServiceTag;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::OsalServiceBlocks;
using tavo::test::times_logged;

using Lines = std::vector<ExpectedLine>;

const ExpectedLine kComparing = line(4, "Comparing input memory index with values available in memory list nodes.\n");
const ExpectedLine kTrying = line(4, "Trying with node PTR.\n");
const ExpectedLine kNotInitialized = line(1, "ERROR::Memory list still not initialized. This is fatal.\n");

ExpectedLine count_line(const char* change, int count) {
    return {
        3, kHeapCountTag,
        std::string("uiCnt") + change + " = " + std::to_string(count) + " pid = " + std::to_string(getpid()) + " \n"};
}

TEST_F(OsalServiceBlocks, MakesAZeroedBlockOfAtLeastTheSize) {
    const sp<IMemoryHeap> heap = service_->get_shared_mem(7, 100);
    ASSERT_NE(heap, nullptr);
    ASSERT_NE(heap->getBase(), MAP_FAILED);
    EXPECT_GE(heap->getSize(), 100U);
    EXPECT_EQ(heap->getFlags(), 0U);
    const std::vector<char> zeros(heap->getSize());
    EXPECT_EQ(memcmp(heap->getBase(), zeros.data(), zeros.size()), 0);
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
}

TEST_F(OsalServiceBlocks, NamesTheHeapWithALineEnd) {
    service_->get_shared_mem(-17, 1);
    EXPECT_EQ(count_mappings(0, "memfd:SharedMemory_-17\\012"), 1U);
}

TEST_F(OsalServiceBlocks, LogsANewBlock) {
    const LogCapture log;
    service_->get_shared_mem(7, 100);
    EXPECT_TRUE(
        said(log, {line(5, "Param1: iKey = 7\n"), line(5, "Param2: iSize = 100\n"), kComparing,
                   line(4, "Current num of shared memory blocks = 0\n"),
                   line(4, "Max num of shared memory blocks = 25\n"), line(4, "New node added PTR.\n"),
                   count_line("++", 1), line(4, "Shared Memory name = SharedMemory_7\n\n"), line(4, "Exiting\n")}));
    service_->delete_shared_mem(7);
}

TEST_F(OsalServiceBlocks, ReturnsTheSameBlockWhateverTheSize) {
    const sp<IMemoryHeap> heap = service_->get_shared_mem(7, 100);
    LogCapture log;
    EXPECT_EQ(service_->get_shared_mem(7, 5000), heap);
    EXPECT_TRUE(said(log, {line(5, "Param1: iKey = 7\n"), line(5, "Param2: iSize = 5000\n"), kComparing, kTrying,
                           line(4, "Match found at node PTR.\n"), line(6, "--Exiting\n")}));
    EXPECT_EQ(count(log), 1);
    service_->delete_shared_mem(7);
    service_->delete_shared_mem(7);
}

TEST_F(OsalServiceBlocks, WalksTheListFromTheOldestOn) {
    for (const int key : {11, 12, 13}) service_->get_shared_mem(key, 1);
    for (const int key : {11, 12, 13}) {
        const LogCapture log;
        service_->get_shared_mem(key, 1);
        Lines expected = {line(5, "Param1: iKey = " + std::to_string(key) + "\n"), line(5, "Param2: iSize = 1\n"),
                          kComparing};
        expected.insert(expected.end(), static_cast<size_t>(key - 10), kTrying);
        expected.push_back(line(4, "Match found at node PTR.\n"));
        expected.push_back(line(6, "--Exiting\n"));
        EXPECT_TRUE(said(log, expected));
    }
}

TEST_F(OsalServiceBlocks, RefusesKeyZeroAndSizesBelowOne) {
    LogCapture log;
    const int arguments[][2] = {{0, 10}, {7, 0}, {7, -1}, {7, INT_MIN}, {0, 0}};
    for (const auto& [key, size] : arguments) {
        log.clear();
        EXPECT_EQ(service_->get_shared_mem(key, size), nullptr);
        EXPECT_TRUE(said(
            log, {line(5, "Param1: iKey = " + std::to_string(key) + "\n"),
                  line(5, "Param2: iSize = " + std::to_string(size) + "\n"), line(1, "Invalid input parameters\n")}));
    }
    EXPECT_EQ(count(log), 0);
}

TEST_F(OsalServiceBlocks, MakesBlocksOfNegativeKeysButNeverDeletesThem) {
    ASSERT_NE(service_->get_shared_mem(-5, 10), nullptr);
    for (const int key : {-5, 0, INT_MIN}) {
        const LogCapture log;
        EXPECT_EQ(service_->delete_shared_mem(key), 0x9001);
        EXPECT_TRUE(said(log, {line(6, "++Entered\n"), line(5, "Param1: iKey = " + std::to_string(key) + "\n"),
                               line(1, "Invalid input parameters\n")}));
    }
    const LogCapture log;
    EXPECT_NE(service_->get_shared_mem(-5, 10), nullptr);
    EXPECT_EQ(times_logged(log, "--Exiting\n"), 1U);  // it was there
}

TEST_F(OsalServiceBlocks, FreesABlockWithItsLastUse) {
    service_->get_shared_mem(7, 100);
    service_->get_shared_mem(7, 5000);
    EXPECT_EQ(count_mappings(0, "SharedMemory_7\\012"), 1U);
    {
        LogCapture log;
        EXPECT_EQ(service_->delete_shared_mem(7), 0);
        EXPECT_TRUE(said(
            log, {line(6, "++Entered\n"), line(5, "Param1: iKey = 7\n"), kComparing, kTrying,
                  line(3, "Match found at node PTR.\n"), line(4, "Memory is still using by some other process!!\n")}));
    }
    *static_cast<uint32_t*>(service_->get_shared_mem(7, 1)->getBase()) = 0x12ab;
    service_->delete_shared_mem(7);
    LogCapture log;
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    EXPECT_TRUE(said(log, {line(6, "++Entered\n"), line(5, "Param1: iKey = 7\n"), kComparing, kTrying,
                           line(3, "Match found at node PTR.\n"), line(3, "Memory value returned = PTR.\n"),
                           line(3, "base=PTR Data=0x12ab\n"), count_line("--", 0)}));
    EXPECT_EQ(count_mappings(0, "SharedMemory_7\\012"), 0U);
    EXPECT_EQ(count(log), 0);
}

TEST_F(OsalServiceBlocks, AnswersZeroToADeleteOfAnUnknownKey) {
    const LogCapture log;
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    EXPECT_TRUE(said(log, {line(6, "++Entered\n"), line(5, "Param1: iKey = 7\n"), kComparing,
                           line(3, "Matching node not found\n")}));
}

TEST_F(OsalServiceBlocks, MakesANewHeapForAKeyThatWasDeleted) {
    const sp<IMemoryHeap> old = service_->get_shared_mem(7, 10);
    static_cast<char*>(old->getBase())[0] = 'o';
    service_->delete_shared_mem(7);
    const sp<IMemoryHeap> fresh = service_->get_shared_mem(7, 10);
    EXPECT_NE(fresh, old);
    EXPECT_EQ(static_cast<char*>(fresh->getBase())[0], 0);
    EXPECT_EQ(static_cast<char*>(old->getBase())[0], 'o');
    service_->delete_shared_mem(7);
}

TEST_F(OsalServiceBlocks, OnlySaysThatTheMaximumIsReached) {
    start(1, 2);
    const std::string reached = "Max number of memory blocks allocated already\n";
    for (int key = 1; key <= 4; ++key) {
        const LogCapture log;
        EXPECT_NE(service_->get_shared_mem(key, 10), nullptr);
        // Exactly at the maximum, not beyond it.
        EXPECT_EQ(times_logged(log, reached), key == 3 ? 1U : 0U);
        if (key != 3) continue;
        const auto lines = library_lines(log);
        ASSERT_GT(lines.size(), 7U);
        EXPECT_EQ(lines[5], line(4, "Current num of shared memory blocks = 2\n"));
        EXPECT_EQ(lines[6], line(4, "Max num of shared memory blocks = 2\n"));
        EXPECT_EQ(lines[7], line(3, reached));
    }
    for (int key = 1; key <= 4; ++key) service_->delete_shared_mem(key);
}

TEST_F(OsalServiceBlocks, SaysThatThereIsNoList) {
    service_->TavoOsalServiceDeInit();
    const LogCapture log;
    EXPECT_EQ(service_->get_shared_mem(7, 10), nullptr);
    EXPECT_EQ(service_->delete_shared_mem(7), -1);
    EXPECT_TRUE(said(log, {line(5, "Param1: iKey = 7\n"), line(5, "Param2: iSize = 10\n"), kNotInitialized,
                           line(6, "++Entered\n"), line(5, "Param1: iKey = 7\n"), kNotInitialized}));
}

TEST_F(OsalServiceBlocks, KeepsMoreHeapsThanItsTableIsMadeFor) {
    std::vector<void*> bases;
    for (int key = 1; key <= 60; ++key) {
        const sp<IMemoryHeap> heap = service_->get_shared_mem(key, 10);
        ASSERT_NE(heap, nullptr);
        *static_cast<int*>(heap->getBase()) = key;
        bases.push_back(heap->getBase());
    }
    const LogCapture log;
    for (int key = 1; key <= 60; key += 2) EXPECT_EQ(service_->delete_shared_mem(key), 0);
    for (int key = 2; key <= 60; key += 2) EXPECT_EQ(*static_cast<int*>(bases[static_cast<size_t>(key) - 1]), key);
    for (int key = 2; key <= 60; key += 2) EXPECT_EQ(service_->delete_shared_mem(key), 0);
    EXPECT_EQ(times_logged(log, count_line("--", 59).message), 1U);
    EXPECT_EQ(times_logged(log, count_line("--", 0).message), 1U);
    EXPECT_EQ(count_mappings(0, "SharedMemory_"), 0U);
}

TEST_F(OsalServiceBlocks, CountsTheHeapsOfAllServicesOfTheProcess) {
    const sp<android::TavoOsalService> other = new android::TavoOsalService;
    ASSERT_EQ(other->TavoOsalServiceInit(1, 1), 0);
    const LogCapture log;
    const sp<IMemoryHeap> own = service_->get_shared_mem(7, 10);
    const sp<IMemoryHeap> others = other->get_shared_mem(7, 10);
    EXPECT_NE(own, others);
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    EXPECT_EQ(other->delete_shared_mem(7), 0);
    const auto lines = library_lines(log, {kHeapCountTag});
    EXPECT_TRUE(
        logged_exactly(lines, {count_line("++", 1), count_line("++", 2), count_line("--", 1), count_line("--", 0)}));
}

}  // namespace
