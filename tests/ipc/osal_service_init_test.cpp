// How the service's tables come to be.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <string>

#include "ipc/allocation_fault.h"
#include "ipc/descriptors.h"
#include "ipc/osal_service_test.h"
#include "support/process.h"
#include "tavo_osal/status.h"

namespace {

using android::TavoOsalService;
using tavo::test::AllocationFault;
using tavo::test::ExpectedLine;
using tavo::test::g_allocations;
using tavo::test::is_open;
using tavo::test::kKeyIndexFile;
using tavo::test::kLibrary;
using tavo::test::kServiceTag;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

using OsalServiceInit = tavo::test::OsalServiceTest;

// A record of either table as it lies in memory.
struct Record {
    int32_t key, size;
    uint32_t use_count;
    void* object;
    void* links[2];
};

std::vector<ExpectedLine> operator+(std::vector<ExpectedLine> first, const std::vector<ExpectedLine>& second) {
    first.insert(first.end(), second.begin(), second.end());
    return first;
}

std::vector<ExpectedLine> entry_lines(const std::string& queues, const std::string& blocks) {
    return {line(6, "++Entered\n"), line(5, "Param1: uiMaxNumMsgQueues = " + queues + "\n"),
            line(5, "Param2: uiMaxNumSharedMemBlocks = " + blocks + "\n")};
}

const ExpectedLine kHeadDone = line(3, "Shared memory list head node allocation done.\n");
const std::vector<ExpectedLine> kIndexFileDone = {line(3, "Opening file in write mode, fp = PTR.\n"),
                                                  line(3, "After reading, iRet = 0, index = 0.\n"),
                                                  line(3, "After reading, iRet = 0, index = 1.\n")};
const ExpectedLine kExiting = line(6, "--Exiting\n");

std::string contents(const char* path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

const std::string kOne("\1\0\0\0", 4);

TEST_F(OsalServiceInit, BuildsBothTables) {
    const LogCapture log;
    EXPECT_EQ(service_->TavoOsalServiceInit(3, 4), 0);
    EXPECT_TRUE(logged_exactly(library_lines(log),
                               entry_lines("3", "4") + std::vector<ExpectedLine>{kHeadDone} + kIndexFileDone +
                                   std::vector<ExpectedLine>{line(4, "Service class created\n"), kExiting}));
    EXPECT_EQ(service_->create_message_queue(7), 0);
    EXPECT_NE(service_->get_shared_mem(7, 10), nullptr);
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
}

TEST_F(OsalServiceInit, MakesNothingOfAnotherInterface) {
    EXPECT_EQ(service_->queryLocalInterface(android::String16("tavo.mq")).get(), service_.get());
    EXPECT_EQ(service_->queryLocalInterface(android::String16("tavo.m")), nullptr);
}

TEST_F(OsalServiceInit, RefusesZeroAndBuildsNothing) {
    const unsigned arguments[][2] = {{0, 5}, {5, 0}, {0, 0}};
    for (const auto& [queues, blocks] : arguments) {
        const LogCapture log;
        EXPECT_EQ(service_->TavoOsalServiceInit(queues, blocks), TAVO_FAILURE);
        EXPECT_TRUE(logged_exactly(library_lines(log),
                                   entry_lines(std::to_string(queues), std::to_string(blocks)) +
                                       std::vector<ExpectedLine>{line(1, "Invalid input parameters.\n"), kExiting}));
    }
    EXPECT_FALSE(std::ifstream(kKeyIndexFile).good());
    const LogCapture log;
    EXPECT_EQ(service_->create_message_queue(7), -1);
    EXPECT_TRUE(logged_exactly(library_lines(log), {line(1, "NO LIST\n")}));
}

TEST_F(OsalServiceInit, LogsLargeLimitsAsTheyAreWrittenWithASign) {
    const AllocationFault fault(AllocationFault::kMalloc, 1);
    const LogCapture log;
    service_->TavoOsalServiceInit(4294967295U, 2147483648U);
    EXPECT_TRUE(logged(log.lines(), line(5, "Param1: uiMaxNumMsgQueues = -1\n")));
    EXPECT_TRUE(logged(log.lines(), line(5, "Param2: uiMaxNumSharedMemBlocks = -2147483648\n")));
}

TEST_F(OsalServiceInit, ReportsMissingMemoryForTheList) {
    for (const size_t refused : {1U, 2U}) {
        const LogCapture log;
        {
            const AllocationFault fault(AllocationFault::kMalloc, refused);
            EXPECT_EQ(service_->TavoOsalServiceInit(3, 4), TAVO_NO_MEMORY);
            EXPECT_EQ(g_allocations.size(), refused);
        }
        EXPECT_TRUE(logged_exactly(
            library_lines(log, {kServiceTag}),
            entry_lines("3", "4") + std::vector<ExpectedLine>{line(1, "ERROR in malloc::\n"), kExiting}));
        EXPECT_EQ(service_->get_shared_mem(7, 10), nullptr);
        EXPECT_EQ(service_->delete_shared_mem(7), -1);
        EXPECT_EQ(service_->create_message_queue(7), -1);
        service_->TavoOsalServiceDeInit();
    }
}

TEST_F(OsalServiceInit, MakesRoomForOneWholeRecordPerQueue) {
    const AllocationFault fault(AllocationFault::kMalloc, 0);
    start(3, 4);
    ASSERT_EQ(g_allocations.size(), 3U);
    EXPECT_EQ(g_allocations[2], 3 * sizeof(Record));
}

TEST_F(OsalServiceInit, ReportsMissingMemoryForTheQueueTableWithoutItsExit) {
    const LogCapture log;
    {
        const AllocationFault fault(AllocationFault::kMalloc, 3);
        EXPECT_EQ(service_->TavoOsalServiceInit(3, 4), -1);
    }
    EXPECT_TRUE(logged_exactly(library_lines(log),
                               entry_lines("3", "4") + std::vector<ExpectedLine>{kHeadDone} + kIndexFileDone +
                                   std::vector<ExpectedLine>{line(1, "Memory allocation failed !!!\n")}));
    EXPECT_EQ(service_->create_message_queue(7), -1);
    EXPECT_NE(service_->get_shared_mem(7, 10), nullptr);  // the list is there
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
}

TEST_F(OsalServiceInit, AsksForNoMoreThanItCanCount) {
    // Refused: nobody has so much.
    const AllocationFault fault(AllocationFault::kMalloc, 3);
    EXPECT_EQ(service_->TavoOsalServiceInit(UINT32_MAX, 1), -1);
    if (sizeof(size_t) > sizeof(unsigned)) {
        ASSERT_EQ(g_allocations.size(), 3U);
        EXPECT_EQ(g_allocations[2], size_t{UINT32_MAX} * sizeof(Record));
    } else {
        EXPECT_EQ(g_allocations.size(), 2U);
    }
}

TEST_F(OsalServiceInit, HidesThatTheIndexFileCannotBeOpened) {
    const PlatformHook hook(
        kLibrary, "fopen", +[](const char*, const char*) {
            errno = EMFILE;
            return static_cast<FILE*>(nullptr);
        });
    const LogCapture log;
    EXPECT_EQ(service_->TavoOsalServiceInit(3, 4), 0);
    EXPECT_TRUE(logged_exactly(
        library_lines(log),
        entry_lines("3", "4") +
            std::vector<ExpectedLine>{kHeadDone, line(3, "Opening file in write mode, fp = (nil).\n"),
                                      line(1, "Opening file in read write mode failed with errno =24\n"), kExiting}));
}

TEST_F(OsalServiceInit, HasNoQueuesWithoutTheIndexFile) {
    ASSERT_EQ(mkdir(kKeyIndexFile, 0755), 0);
    const LogCapture log;
    EXPECT_EQ(service_->TavoOsalServiceInit(3, 4), 0);
    EXPECT_TRUE(logged(log.lines(), line(1, "Opening file in read write mode failed with errno =21\n")));
    EXPECT_EQ(service_->create_message_queue(7), -1);
    EXPECT_TRUE(logged(log.lines(), line(1, "NO LIST\n")));
    EXPECT_EQ(service_->delete_message_queue(7), -1);
    EXPECT_EQ(service_->get_fd(7), -1);
    EXPECT_EQ(service_->get_write_fd(7), -1);
    EXPECT_NE(service_->get_shared_mem(7, 10), nullptr);
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    rmdir(kKeyIndexFile);
}

TEST_F(OsalServiceInit, SetsTheIndexFileBackToOne) {
    start();
    EXPECT_EQ(contents(kKeyIndexFile), kOne);
    std::ofstream(kKeyIndexFile) << "much more than one number was here";
    start();
    EXPECT_EQ(contents(kKeyIndexFile), kOne);
    std::ofstream(kKeyIndexFile) << "x";
    start();
    EXPECT_EQ(contents(kKeyIndexFile), kOne);
}

TEST_F(OsalServiceInit, DoesNotLeaveTheIndexFileOpen) {
    start();
    const size_t before = tavo::test::count_descriptors();
    start();
    EXPECT_EQ(tavo::test::count_descriptors(), before);
}

TEST_F(OsalServiceInit, KeepsTheIndexFileFromProgramsItStarts) {
    static std::string mode;
    const PlatformHook hook(
        kLibrary, "fopen", +[](const char* path, const char* asked) {
            mode = asked;
            return fopen(path, asked);
        });
    start();
    EXPECT_EQ(mode, "w+e");
}

TEST_F(OsalServiceInit, FreesTheTablesOfAnEarlierInit) {
    start();
    ASSERT_EQ(service_->create_message_queue(7), 0);
    const int descriptor = service_->get_fd(7);
    start();
    EXPECT_FALSE(is_open(descriptor));
    EXPECT_EQ(service_->get_fd(7), -1);
    EXPECT_EQ(service_->create_message_queue(8), 0);
}

}  // namespace
