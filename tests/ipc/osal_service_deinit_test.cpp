// How the service's tables go.
#include <string>
#include <vector>

#include "ipc/descriptors.h"
#include "ipc/osal_service_test.h"
#include "support/process.h"

namespace {

using tavo::test::ExpectedLine;
using tavo::test::is_open;
using tavo::test::kHeapCountTag;
using tavo::test::kServiceTag;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;

using OsalServiceDeInit = tavo::test::OsalServiceTest;

const ExpectedLine kExiting = line(6, "--Exiting\n");

TEST_F(OsalServiceDeInit, IsHarmlessWithoutTables) {
    for (int i = 0; i < 2; ++i) {
        const LogCapture log;
        EXPECT_EQ(service_->TavoOsalServiceDeInit(), 0);
        EXPECT_TRUE(logged_exactly(
            library_lines(log), {line(6, "++Entered\n"), line(3, "Freeing shared memory list info ptr.\n"), kExiting}));
    }
}

TEST_F(OsalServiceDeInit, FreesWhatTheServiceHolds) {
    start();
    const size_t descriptors = tavo::test::count_descriptors();
    const size_t mappings = tavo::test::count_mappings(0, "SharedMemory_");
    for (int key = 1; key <= 3; ++key) ASSERT_EQ(service_->create_message_queue(key), key - 1);
    ASSERT_NE(service_->get_shared_mem(1, 10), nullptr);
    ASSERT_NE(service_->get_shared_mem(2, 10), nullptr);
    const LogCapture log;
    EXPECT_EQ(service_->TavoOsalServiceDeInit(), 0);
    EXPECT_TRUE(logged_exactly(
        library_lines(log, {kServiceTag, kHeapCountTag}),
        {line(6, "++Entered\n"), line(4, "Comparing input memory index with values available in memory list nodes.\n"),
         line(4, "Trying with node PTR.\n"), line(3, "Freeing node ptr=PTR.\n"), line(4, "Trying with node PTR.\n"),
         line(3, "Freeing node ptr=PTR.\n"), line(3, "Freeing shared memory list head node ptr.\n"),
         line(3, "Freeing shared memory list info ptr.\n"), kExiting}));
    // The heaps stay with the process.
    EXPECT_EQ(tavo::test::count_descriptors(), descriptors + 2);
    EXPECT_EQ(tavo::test::count_mappings(0, "SharedMemory_"), mappings + 2);
}

TEST_F(OsalServiceDeInit, ClosesEveryPipe) {
    start();
    std::vector<int> ends;
    for (int key = 1; key <= 3; ++key) {
        service_->create_message_queue(key);
        service_->create_message_queue(key);  // whatever its uses
        ends.push_back(service_->get_fd(key));
        ends.push_back(service_->get_write_fd(key));
    }
    service_->TavoOsalServiceDeInit();
    for (const int end : ends) EXPECT_FALSE(is_open(end));
    for (int key = 1; key <= 3; ++key) EXPECT_EQ(service_->get_fd(key), -1);
}

TEST_F(OsalServiceDeInit, LeavesTheServiceAsBeforeInit) {
    start();
    service_->TavoOsalServiceDeInit();
    const LogCapture log;
    EXPECT_EQ(service_->create_message_queue(7), -1);
    EXPECT_EQ(service_->delete_shared_mem(7), -1);
    EXPECT_TRUE(logged(log.lines(), line(1, "NO LIST\n")));
    EXPECT_TRUE(logged(log.lines(), line(1, "ERROR::Memory list still not initialized. This is fatal.\n")));
    start();
    EXPECT_EQ(service_->create_message_queue(7), 0);
}

TEST_F(OsalServiceDeInit, HappensWhenTheServiceGoes) {
    start();
    service_->create_message_queue(7);
    const int descriptor = service_->get_fd(7);
    const LogCapture log;
    destroy();
    EXPECT_FALSE(is_open(descriptor));
    EXPECT_TRUE(logged_exactly(
        library_lines(log, {kServiceTag}),
        {line(6, "++Entered\n"), line(4, "Comparing input memory index with values available in memory list nodes.\n"),
         line(3, "Freeing shared memory list head node ptr.\n"), line(3, "Freeing shared memory list info ptr.\n"),
         kExiting}));
}

TEST_F(OsalServiceDeInit, LetsHeapsOutliveTheService) {
    start();
    const android::sp<android::IMemoryHeap> heap = service_->get_shared_mem(7, 10);
    *static_cast<char*>(heap->getBase()) = 'x';
    destroy();
    EXPECT_EQ(*static_cast<char*>(heap->getBase()), 'x');
}

}  // namespace
