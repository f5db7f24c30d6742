// The service's queues.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <string>
#include <vector>

#include "ipc/allocation_fault.h"
#include "ipc/descriptors.h"
#include "ipc/osal_service_test.h"
#include "support/process.h"

namespace {

using tavo::test::AllocationFault;
using tavo::test::count_descriptors;
using tavo::test::DescriptorLimit;
using tavo::test::ExpectedLine;
using tavo::test::file_of;
using tavo::test::is_open;
using tavo::test::kLibrary;
using tavo::test::kServiceTag;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::NoInput;
using tavo::test::PlatformHook;

class OsalServiceQueues : public tavo::test::OsalServiceTest {
protected:
    OsalServiceQueues() { start(); }

    // What the service says itself; its queues speak under a tag of their own.
    static testing::AssertionResult said(const LogCapture& log, const std::vector<ExpectedLine>& lines) {
        return logged_exactly(library_lines(log, {kServiceTag}), lines);
    }
};

TEST_F(OsalServiceQueues, CountsTheUsesOfAKey) {
    EXPECT_EQ(service_->create_message_queue(7), 0);
    EXPECT_EQ(service_->create_message_queue(7), 0);
    EXPECT_EQ(service_->create_message_queue(7), 0);
    const int read_end = service_->get_fd(7);
    const int write_end = service_->get_write_fd(7);
    EXPECT_EQ(service_->delete_message_queue(7), 0);
    EXPECT_EQ(service_->delete_message_queue(7), 0);
    EXPECT_EQ(service_->get_fd(7), read_end);
    EXPECT_TRUE(is_open(read_end));
    EXPECT_TRUE(is_open(write_end));
    EXPECT_EQ(service_->delete_message_queue(7), 0);
    EXPECT_FALSE(is_open(read_end));
    EXPECT_FALSE(is_open(write_end));
    EXPECT_EQ(service_->get_fd(7), -1);
    EXPECT_EQ(service_->delete_message_queue(7), -1);
}

TEST_F(OsalServiceQueues, HandsOutTheEndsOfOnePipe) {
    service_->create_message_queue(7);
    const int read_end = service_->get_fd(7);
    const int write_end = service_->get_write_fd(7);
    EXPECT_NE(read_end, write_end);
    EXPECT_EQ(service_->get_fd(7), read_end);  // its own each time, no duplicate
    EXPECT_EQ(service_->get_write_fd(7), write_end);
    EXPECT_EQ(write(write_end, "x", 1), 1);
    char received = 0;
    EXPECT_EQ(read(read_end, &received, 1), 1);
    EXPECT_EQ(received, 'x');
    EXPECT_EQ(fcntl(read_end, F_GETFD), FD_CLOEXEC);
    EXPECT_EQ(fcntl(write_end, F_GETFD), FD_CLOEXEC);
}

TEST_F(OsalServiceQueues, GivesEachKeyAPipeOfItsOwn) {
    EXPECT_EQ(service_->create_message_queue(7), 0);
    EXPECT_EQ(service_->create_message_queue(-7), 1);
    EXPECT_NE(file_of(service_->get_fd(7)), file_of(service_->get_fd(-7)));
    EXPECT_EQ(file_of(service_->get_fd(-7)), file_of(service_->get_write_fd(-7)));
}

TEST_F(OsalServiceQueues, MovesLaterQueuesUpWhenOneGoes) {
    for (int key = 1; key <= 3; ++key) EXPECT_EQ(service_->create_message_queue(key), key - 1);
    const int second = service_->get_fd(2);
    const int third = service_->get_write_fd(3);
    EXPECT_EQ(service_->delete_message_queue(1), 0);
    EXPECT_EQ(service_->get_fd(1), -1);
    EXPECT_EQ(service_->get_fd(2), second);
    EXPECT_EQ(service_->get_write_fd(3), third);
    EXPECT_EQ(service_->create_message_queue(2), 0);
    EXPECT_EQ(service_->create_message_queue(3), 1);
    EXPECT_EQ(service_->create_message_queue(1), 2);
    EXPECT_EQ(service_->delete_message_queue(3), 0);
    EXPECT_EQ(service_->delete_message_queue(3), 0);
    EXPECT_EQ(service_->create_message_queue(1), 1);
}

TEST_F(OsalServiceQueues, TakesAnyKeyButZero) {
    for (const int key : {1, -1, INT_MAX, INT_MIN}) {
        const LogCapture log;
        EXPECT_GE(service_->create_message_queue(key), 0);
        EXPECT_GE(service_->get_fd(key), 0);
        EXPECT_GE(service_->get_write_fd(key), 0);
        EXPECT_EQ(service_->delete_message_queue(key), 0);
        EXPECT_TRUE(said(log, {}));
    }
}

TEST_F(OsalServiceQueues, SaysThatZeroIsNoKeyExceptForTheReadEnd) {
    const ExpectedLine invalid = line(1, "Invalid key!!\n");
    const LogCapture log;
    EXPECT_EQ(service_->get_fd(0), -1);
    EXPECT_TRUE(said(log, {}));
    EXPECT_EQ(service_->get_write_fd(0), -1);
    EXPECT_TRUE(said(log, {invalid}));
    EXPECT_EQ(service_->create_message_queue(0), -1);
    EXPECT_EQ(service_->delete_message_queue(0), -1);
    EXPECT_TRUE(said(log, {invalid, invalid, invalid}));
}

TEST_F(OsalServiceQueues, SaysNothingOfAKeyItDoesNotKnow) {
    const LogCapture log;
    EXPECT_EQ(service_->get_fd(7), -1);
    EXPECT_EQ(service_->get_write_fd(7), -1);
    EXPECT_EQ(service_->delete_message_queue(7), -1);
    EXPECT_TRUE(said(log, {}));
}

TEST_F(OsalServiceQueues, SaysThatThereIsNoListOnlyWhenCreating) {
    service_->TavoOsalServiceDeInit();
    const LogCapture log;
    EXPECT_EQ(service_->create_message_queue(7), -1);
    EXPECT_EQ(service_->get_fd(7), -1);
    EXPECT_EQ(service_->get_write_fd(7), -1);
    EXPECT_EQ(service_->delete_message_queue(7), -1);
    EXPECT_TRUE(said(log, {line(1, "NO LIST\n")}));
}

TEST_F(OsalServiceQueues, LooksAtTheKeyBeforeTheList) {
    service_->TavoOsalServiceDeInit();
    const LogCapture log;
    EXPECT_EQ(service_->create_message_queue(0), -1);
    EXPECT_TRUE(said(log, {line(1, "Invalid key!!\n")}));
}

TEST_F(OsalServiceQueues, GrowsBeyondItsLimit) {
    start(1, 1);
    for (int key = 1; key <= 100; ++key) EXPECT_EQ(service_->create_message_queue(key), key - 1);
    std::vector<ino_t> pipes;
    for (int key = 1; key <= 100; ++key) pipes.push_back(file_of(service_->get_fd(key)));
    for (int key = 100; key >= 1; --key) EXPECT_EQ(service_->create_message_queue(key), key - 1);
    for (int key = 1; key <= 100; ++key) EXPECT_EQ(file_of(service_->get_write_fd(key)), pipes[size_t(key) - 1]);
    for (int key = 1; key <= 100; ++key) {
        EXPECT_EQ(service_->delete_message_queue(key), 0);
        EXPECT_EQ(service_->delete_message_queue(key), 0);
    }
    EXPECT_EQ(service_->create_message_queue(5), 0);
}

TEST_F(OsalServiceQueues, NeverUsesDescriptorZero) {
    const NoInput input;
    EXPECT_EQ(service_->create_message_queue(7), 0);
    EXPECT_GT(service_->get_fd(7), 0);
    EXPECT_GT(service_->get_write_fd(7), 0);
    EXPECT_FALSE(is_open(0));
    EXPECT_EQ(service_->delete_message_queue(7), 0);
}

TEST_F(OsalServiceQueues, GivesItsDescriptorsBack) {
    const size_t before = count_descriptors();
    for (int round = 0; round < 100; ++round) {
        service_->create_message_queue(7);
        service_->create_message_queue(8);
        service_->delete_message_queue(7);
        service_->delete_message_queue(8);
    }
    EXPECT_EQ(count_descriptors(), before);
}

// --- failures: the table stays as it was

class OsalServiceQueuesFailing : public OsalServiceQueues {
protected:
    OsalServiceQueuesFailing() { EXPECT_EQ(service_->create_message_queue(1), 0); }
    ~OsalServiceQueuesFailing() override {
        EXPECT_TRUE(is_open(0));
        EXPECT_EQ(count_descriptors(), descriptors_ + 2);
        EXPECT_EQ(service_->get_fd(7), -1);
        EXPECT_EQ(service_->create_message_queue(7), 1);
        EXPECT_EQ(service_->create_message_queue(1), 0);
    }

private:
    const size_t descriptors_ = count_descriptors();
};

TEST_F(OsalServiceQueuesFailing, RefusesAQueueWithoutAPipe) {
    const PlatformHook hook(
        kLibrary, "pipe2", +[](int*, int) {
            errno = ENFILE;
            return -1;
        });
    const LogCapture log;
    EXPECT_EQ(service_->create_message_queue(7), -1);
    EXPECT_TRUE(said(log, {}));
    EXPECT_EQ(service_->create_message_queue(1), 0);  // what is there can still be used
    EXPECT_EQ(service_->delete_message_queue(1), 0);
}

TEST_F(OsalServiceQueuesFailing, RefusesAQueueWhenThereAreNoDescriptors) {
    for (const unsigned more : {0U, 1U}) {
        const DescriptorLimit limit(more);
        EXPECT_EQ(service_->create_message_queue(7), -1);
    }
}

TEST_F(OsalServiceQueuesFailing, RefusesAQueueWithoutMemoryForIt) {
    const AllocationFault fault(AllocationFault::kNothrowNew, 1);
    EXPECT_EQ(service_->create_message_queue(7), -1);
}

TEST_F(OsalServiceQueuesFailing, RefusesAQueueWithoutMemoryForItsRecord) {
    const AllocationFault fault(AllocationFault::kCalloc, 1);
    EXPECT_EQ(service_->create_message_queue(7), -1);
}

TEST_F(OsalServiceQueuesFailing, RefusesAQueueWithoutMemoryForItsPlaceInTheIndex) {
    for (const size_t refused : {1U, 2U}) {  // of the order of all, and of the keys
        const AllocationFault fault(AllocationFault::kNew, refused);
        EXPECT_EQ(service_->create_message_queue(7), -1);
        EXPECT_EQ(tavo::test::g_allocations.size(), refused);
    }
}

TEST_F(OsalServiceQueues, RefusesAQueueWithoutMemoryForMoreOfThem) {
    start(2, 1);
    EXPECT_EQ(service_->create_message_queue(1), 0);
    EXPECT_EQ(service_->create_message_queue(2), 1);
    const size_t descriptors = count_descriptors();
    {
        const AllocationFault fault(AllocationFault::kRealloc, 1);
        EXPECT_EQ(service_->create_message_queue(3), -1);
    }
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(service_->create_message_queue(2), 1);
    EXPECT_EQ(service_->create_message_queue(3), 2);
}

}  // namespace
