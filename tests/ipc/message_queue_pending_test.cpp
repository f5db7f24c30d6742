// What tells of pending messages, waits for them or drops them.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/ioctl.h>

#include <cerrno>
#include <chrono>
#include <string>
#include <vector>

#include "message_queue_test.h"
#include "support/platform_fault.h"

namespace {

using android::TAVO_MessageQueue;
using namespace tavo::test;

int fail_poll(pollfd*, nfds_t, int) {
    errno = ENOMEM;
    return -1;
}

int fail_ioctl(int, unsigned long, ...) {
    errno = ENOTTY;
    return -1;
}

TEST(MessageQueueIsEmpty, FollowsWhatIsPending) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    EXPECT_EQ(queue.tavo_android_msg_queue_is_empty(), 1);
    EXPECT_EQ(queue.bMsg, 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, kExiting}));
    EXPECT_EQ(put(queue, "x"), 0);
    EXPECT_EQ(queue.tavo_android_msg_queue_is_empty(), 0);
    EXPECT_EQ(queue.bMsg, 1);
    EXPECT_EQ(get(queue), "x");
    EXPECT_EQ(queue.tavo_android_msg_queue_is_empty(), 1);
    EXPECT_EQ(queue.bMsg, 0);
}

TEST(MessageQueueIsEmpty, Answers237WithoutAReadEnd) {
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_fd(0);
    const LogCapture log;
    EXPECT_EQ(queue.tavo_android_msg_queue_is_empty(), 237);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {kEntered, line(3, "read descriptor not initialized for message queue\n"), kExiting}));
    queue.disown_descriptors();
}

TEST(MessageQueueIsEmpty, TakesAFailedPollAsNotEmptyAndKeepsTheFlag) {
    TAVO_MessageQueue queue;
    queue.bMsg = 1;
    const LogCapture log;
    const PlatformHook hook("libtavoosal.so", "poll", fail_poll);
    EXPECT_EQ(queue.tavo_android_msg_queue_is_empty(), 0);
    EXPECT_EQ(queue.bMsg, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, line(3, "poll() error: Cannot allocate memory\n"), kExiting}));
}

TEST(MessageQueueClear, DropsEveryPendingMessage) {
    TAVO_MessageQueue queue;
    EXPECT_EQ(put(queue, "one"), 0);
    EXPECT_EQ(put(queue, ""), 0);
    LogCapture log;
    queue.tavo_android_msg_queue_clear();
    const auto going = line(4, "Going to Read message...\n ");
    const auto declared = line(4, "Reading message with lenghth 1024 \n");
    EXPECT_TRUE(logged_exactly(
        log.lines(),
        {kEntered, kExiting, kGetEntered, going, declared, line(4, "Reading message with lenghth 3 \n"), kExiting,  //
         kEntered, kExiting, kGetEntered, going, declared, line(4, "Reading message with lenghth 0 \n"), kExiting,  //
         kEntered, kExiting}));
    EXPECT_EQ(queue.tavo_android_msg_queue_is_empty(), 1);
}

TEST(MessageQueueClear, DropsMessagesLongerThanItsScratchBuffer) {
    TAVO_MessageQueue queue;
    EXPECT_EQ(put(queue, std::string(10000, 'a')), 0);
    EXPECT_EQ(put(queue, std::string(4096, 'b')), 0);
    EXPECT_EQ(put(queue, std::string(4097, 'c')), 0);
    EXPECT_EQ(put(queue, std::string(409600, 'd')), 0);
    const LogCapture log;
    queue.tavo_android_msg_queue_clear();
    EXPECT_TRUE(logged(log.lines(), line(4, "Reading message with lenghth 409600 \n")));
    EXPECT_EQ(queue.tavo_android_msg_queue_is_empty(), 1);
    EXPECT_EQ(put(queue, "next"), 0);
    EXPECT_EQ(get(queue), "next");
}

TEST(MessageQueueClear, ReportsAnAbsentReadEnd) {
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_fd(0);
    const LogCapture log;
    queue.tavo_android_msg_queue_clear();
    EXPECT_TRUE(logged_exactly(log.lines(), {line(3, "read descriptor not initialized for message queue\n")}));
    queue.disown_descriptors();
}

TEST(MessageQueueClear, StopsWhenReadingFails) {
    TAVO_MessageQueue queue;
    EXPECT_EQ(put(queue, "stays"), 0);
    const PlatformHook hook(
        "libtavoosal.so", "read", +[](int, void*, size_t) -> ssize_t {
            errno = EIO;
            return -1;
        });
    queue.tavo_android_msg_queue_clear();
    EXPECT_EQ(queue.tavo_android_msg_queue_is_empty(), 0);
}

TEST(MessageQueueClear, ReturnsWhenPollFailsAndNothingIsPending) {
    TAVO_MessageQueue queue;
    EXPECT_EQ(put(queue, "x"), 0);
    const PlatformHook hook("libtavoosal.so", "poll", fail_poll);
    queue.tavo_android_msg_queue_clear();
    EXPECT_EQ(pending(queue), 0);
}

TEST(MessageQueueClear, ReturnsAtTheEndOfAFile) {
    TAVO_MessageQueue queue, orphan;
    // Always ready to read, and never anything there.
    queue.tavo_android_msg_queue_set_fd(open("/dev/null", O_RDONLY | O_CLOEXEC));
    queue.tavo_android_msg_queue_clear();
    EXPECT_EQ(queue.tavo_android_msg_queue_is_empty(), 0);
    orphan.tavo_android_msg_queue_set_write_fd(-1);
    orphan.tavo_android_msg_queue_clear();
    EXPECT_EQ(orphan.tavo_android_msg_queue_is_empty(), 1);
}

TEST(MessageQueueWait, RefusesANullFirstQueue) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    EXPECT_EQ(queue.tavo_android_msg_queue_wait_for_msg(nullptr, &queue, &queue, 0), -22);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, line(3, "queue1 poINT32er is NULL\n"), kExiting}));
}

TEST(MessageQueueWait, RefusesAbsentReadEnds) {
    TAVO_MessageQueue queue, absent;
    absent.tavo_android_msg_queue_set_fd(0);
    LogCapture log;
    EXPECT_EQ(queue.tavo_android_msg_queue_wait_for_msg(&absent, nullptr, nullptr, 0), -19);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {kEntered, line(3, "read descriptor not initialized for message queue1\n"), kExiting}));
    log.clear();
    EXPECT_EQ(queue.tavo_android_msg_queue_wait_for_msg(&queue, &absent, &absent, 0), -19);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {kEntered, line(3, "queue2 not-null"),
                                     line(3, "read descriptor not initialized for message queue2\n"), kExiting}));
    log.clear();
    EXPECT_EQ(queue.tavo_android_msg_queue_wait_for_msg(&queue, &queue, &absent, 0), -19);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {kEntered, line(3, "queue2 not-null"), line(3, "queue3 not-null"),
                                     line(3, "read descriptor not initialized for message queue3\n"), kExiting}));
    absent.disown_descriptors();
}

TEST(MessageQueueWait, ReturnsZeroAfterTheTimeWithNothingWritten) {
    TAVO_MessageQueue queue;
    queue.bMsg = 1;
    const LogCapture log;
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(queue.tavo_android_msg_queue_wait_for_msg(&queue, nullptr, nullptr, 50), 0);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(50));
    EXPECT_EQ(queue.bMsg, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, kExiting}));
}

TEST(MessageQueueWait, FlagsEveryQueueThatHasData) {
    TAVO_MessageQueue any, q1, q2, q3;
    EXPECT_EQ(put(q1, "1"), 0);
    EXPECT_EQ(put(q3, "3"), 0);
    const LogCapture log;
    EXPECT_EQ(any.tavo_android_msg_queue_wait_for_msg(&q1, &q2, &q3, -1), 2);
    EXPECT_EQ(q1.bMsg, 1);
    EXPECT_EQ(q2.bMsg, 0);
    EXPECT_EQ(q3.bMsg, 1);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {kEntered, line(3, "queue2 not-null"), line(3, "queue3 not-null"), kExiting}));
    EXPECT_EQ(any.tavo_android_msg_queue_wait_for_msg(&q1, &q3, nullptr, 1000), 2);
}

TEST(MessageQueueWait, FlagsTheQueueOfEachSlot) {
    TAVO_MessageQueue any, q1, q2, q3;
    for (TAVO_MessageQueue* ready : {&q1, &q2, &q3}) {
        EXPECT_EQ(put(*ready, "x"), 0);
        EXPECT_EQ(any.tavo_android_msg_queue_wait_for_msg(&q1, &q2, &q3, 0), 1);
        for (TAVO_MessageQueue* queue : {&q1, &q2, &q3}) EXPECT_EQ(queue->bMsg, queue == ready ? 1 : 0);
        EXPECT_EQ(get(*ready), "x");
    }
    EXPECT_EQ(put(q1, "1"), 0);
    EXPECT_EQ(put(q2, "2"), 0);
    EXPECT_EQ(any.tavo_android_msg_queue_wait_for_msg(&q1, &q2, nullptr, 0), 2);
    EXPECT_EQ(q1.bMsg, 1);
    EXPECT_EQ(q2.bMsg, 1);
    EXPECT_EQ(any.bMsg, 0);
}

TEST(MessageQueueWait, LeavesTheFlagsOfQueuesWithoutDataAsTheyWere) {
    TAVO_MessageQueue q1, q2;
    q2.tavo_android_msg_queue_set_msg(1);
    EXPECT_EQ(put(q1, "1"), 0);
    EXPECT_EQ(q1.tavo_android_msg_queue_wait_for_msg(&q1, &q2, nullptr, 0), 1);
    EXPECT_EQ(q1.bMsg, 1);
    EXPECT_EQ(q2.bMsg, 1);
}

TEST(MessageQueueWait, DoesNotLookAtAThirdQueueWithoutASecond) {
    static std::vector<int> polled;
    polled.clear();
    TAVO_MessageQueue q1, q3;
    EXPECT_EQ(put(q3, "3"), 0);
    const PlatformHook hook(
        "libtavoosal.so", "poll", +[](pollfd* slots, nfds_t count, int timeout) {
            for (nfds_t i = 0; i < count; ++i) polled.push_back(slots[i].fd);
            return poll(slots, count, timeout);
        });
    const LogCapture log;
    EXPECT_EQ(q1.tavo_android_msg_queue_wait_for_msg(&q1, nullptr, &q3, 0), 0);
    EXPECT_EQ(q3.bMsg, 0);
    EXPECT_EQ(polled, (std::vector<int>{q1.iReadFd, -1}));
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, line(3, "queue3 not-null"), kExiting}));
}

TEST(MessageQueueWait, ReturnsTheResultOfAFailedPoll) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    const PlatformHook hook("libtavoosal.so", "poll", fail_poll);
    EXPECT_EQ(queue.tavo_android_msg_queue_wait_for_msg(&queue, nullptr, nullptr, -1), -1);
    EXPECT_EQ(errno, ENOMEM);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, line(3, "Message queue returned error -1\n"), kExiting}));
}

TEST(MessageQueueCount, CountsBytesWithTheirPrefixes) {
    TAVO_MessageQueue queue;
    EXPECT_EQ(put(queue, "1234567890"), 0);
    const LogCapture log;
    int count = 0;
    EXPECT_EQ(queue.tavo_android_get_num_of_messages(&count), 0);
    EXPECT_EQ(count, 14);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, line(4, "Number of bytes in queue = 14\n"), kExiting}));
}

TEST(MessageQueueCount, ReportsAFailedQuestion) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    const PlatformHook hook("libtavoosal.so", "ioctl", fail_ioctl);
    int count = 77;
    EXPECT_EQ(queue.tavo_android_get_num_of_messages(&count), 0x9001);
    EXPECT_EQ(count, 77);
    EXPECT_EQ(errno, ENOTTY);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {kEntered, line(1, "failed to get no of msgs. errno is 0x19\n"), kExiting}));
}

TEST(MessageQueueCount, RefusesANullResult) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    EXPECT_EQ(queue.tavo_android_get_num_of_messages(nullptr), 0x9002);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, line(1, "Invalid pointer passed piCount\n"), kExiting}));
}

}  // namespace
