// Frames that do not come or go with one call: parts, interruptions, failures, the ends of files, and the pipe's room.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/uio.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "message_queue_test.h"
#include "support/platform_fault.h"

namespace {

using android::TAVO_MessageQueue;
using namespace tavo::test;

constexpr char kLibrary[] = "libtavoosal.so";

// A frame that announces a length of its own.
std::string frame(uint32_t length, const std::string& payload) {
    std::string text(sizeof length, '\0');
    memcpy(text.data(), &length, sizeof length);
    return text + payload;
}

void write_raw(TAVO_MessageQueue& queue, const std::string& text) {
    ASSERT_EQ(write(queue.iWriteFd, text.data(), text.size()), static_cast<ssize_t>(text.size()));
}

// What the library's waits asked for, and how they ended.
struct Wait {
    short events;
    int timeout;
    int result;
};
std::vector<Wait> g_waits;

int remembering_poll(pollfd* slots, nfds_t count, int timeout) {
    const short events = slots[0].events;
    const int result = poll(slots, count, timeout);
    g_waits.push_back({events, timeout, result});
    return result;
}

// The time passes at once.
int expired_poll(pollfd* slots, nfds_t, int timeout) {
    g_waits.push_back({slots[0].events, timeout, 0});
    return 0;
}

// What successive calls do in place of reading or writing: fail with an error (negative), or move at most so
// many bytes. Calls past the list do the real thing.
std::vector<int> g_script;
size_t g_calls;

ssize_t scripted(size_t size, ssize_t (*real)(int, void*, size_t), int fd, void* data) {
    const size_t call = g_calls++;
    if (call >= g_script.size()) return real(fd, data, size);
    if (g_script[call] >= 0) return real(fd, data, std::min(size, static_cast<size_t>(g_script[call])));
    errno = -g_script[call];
    return -1;
}

ssize_t scripted_read(int fd, void* data, size_t size) { return scripted(size, read, fd, data); }

// Reading without waiting, for which there is a call of its own.
ssize_t scripted_preadv2(int fd, const iovec* parts, int, off_t, int flags) {
    static int passed_on;
    passed_on = flags;
    return scripted(
        parts->iov_len,
        [](int from, void* to, size_t count) {
            const iovec part = {to, count};
            return preadv2(from, &part, 1, -1, passed_on);
        },
        fd, parts->iov_base);
}

int g_refusals;

// As older kernels do it.
ssize_t refusing_preadv2(int, const iovec*, int, off_t, int) {
    ++g_refusals;
    errno = EOPNOTSUPP;
    return -1;
}

ssize_t scripted_write(int fd, const void* data, size_t size) {
    return scripted(
        size, [](int to, void* from, size_t count) { return write(to, from, count); }, fd, const_cast<void*>(data));
}

void script(std::vector<int> steps) {
    g_script = std::move(steps);
    g_calls = 0;
    g_waits.clear();
}

TEST(MessageQueueFrames, AWholeFrameCostsTwoReadsAndNoWait) {
    TAVO_MessageQueue queue;
    const PlatformHook read_hook(kLibrary, "read", scripted_read);
    const PlatformHook preadv2_hook(kLibrary, "preadv2", scripted_preadv2);
    const PlatformHook poll_hook(kLibrary, "poll", remembering_poll);
    EXPECT_EQ(put(queue, std::string(4096, 'w')), 0);
    EXPECT_EQ(get(queue), std::string(4096, 'w'));  // here the library learns what the kernel can
    for (const size_t size : {0U, 1U, 4092U, 4096U, 65536U, 409600U}) {
        ASSERT_EQ(put(queue, std::string(size, 'w')), 0);
        script({});
        EXPECT_EQ(get(queue), std::string(size, 'w'));
        EXPECT_EQ(g_calls, 2U) << size;
        EXPECT_TRUE(g_waits.empty());
    }
}

TEST(MessageQueueFrames, AKernelThatCannotReadWithoutWaitingIsAskedOnce) {
    TAVO_MessageQueue queue;
    const PlatformHook preadv2_hook(kLibrary, "preadv2", refusing_preadv2);
    const PlatformHook poll_hook(kLibrary, "poll", expired_poll);
    script({});
    for (const char c : {'a', 'b', 'c'}) {
        ASSERT_EQ(put(queue, std::string(8192, c)), 0);
        EXPECT_EQ(get(queue), std::string(8192, c));
    }
    EXPECT_EQ(g_refusals, 1);
    EXPECT_TRUE(g_waits.empty());

    write_raw(queue, frame(4096, ""));
    EXPECT_EQ(get(queue), "");
    ASSERT_EQ(g_waits.size(), 1U);
    EXPECT_EQ(g_waits[0].timeout, 1000);
}

TEST(MessageQueueFrames, AFrameOfWholePagesThatComesInPartsIsWaitedFor) {
    TAVO_MessageQueue queue;
    const PlatformHook preadv2_hook(kLibrary, "preadv2", scripted_preadv2);
    const PlatformHook poll_hook(kLibrary, "poll", remembering_poll);
    // Nothing yet, twice; an interruption; a part. The rest is there when it is asked for again, and none of these
    // means that the kernel cannot do it.
    for (const int first : {-EAGAIN, -EAGAIN, -EINTR, 100}) {
        ASSERT_EQ(put(queue, std::string(4096, 'p')), 0);
        script({first});
        EXPECT_EQ(get(queue), std::string(4096, 'p')) << first;
        EXPECT_EQ(g_calls, 1U) << first;
    }
}

TEST(MessageQueueFrames, TheEndOfTheWritersBehindALengthOfWholePagesYieldsNothingAtOnce) {
    TAVO_MessageQueue queue;
    write_raw(queue, frame(4096, ""));
    queue.tavo_android_msg_queue_set_write_fd(-1);
    script({});
    const PlatformHook hook(kLibrary, "poll", remembering_poll);
    EXPECT_EQ(get(queue), "");
    for (const Wait& wait : g_waits) EXPECT_EQ(wait.result, 1);  // none of them ran out
}

TEST(MessageQueueFrames, AFrameOfWholePagesOfWhichOnlyTheLengthIsThereYieldsNothingAfterASecond) {
    TAVO_MessageQueue queue;
    write_raw(queue, frame(4096, ""));
    script({});
    const PlatformHook hook(kLibrary, "poll", expired_poll);
    EXPECT_EQ(get(queue), "");
    ASSERT_EQ(g_waits.size(), 1U);
    EXPECT_EQ(g_waits[0].timeout, 1000);
    // What comes after that is a frame of its own.
    write_raw(queue, frame(3, "abc"));
    EXPECT_EQ(get(queue), "abc");
}

TEST(MessageQueueFrames, AHalfWrittenFrameYieldsTheShortCountAfterASecond) {
    TAVO_MessageQueue queue;
    write_raw(queue, frame(10, "abc"));
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(get(queue), "abc");
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::seconds(1));
}

TEST(MessageQueueFrames, TheWaitForTheRestIsOneSecondForEachPart) {
    TAVO_MessageQueue queue;
    write_raw(queue, frame(10, "abc"));
    script({4, 2});
    const PlatformHook read_hook(kLibrary, "read", scripted_read);
    static int polls;
    polls = 0;
    const PlatformHook poll_hook(
        kLibrary, "poll", +[](pollfd* slots, nfds_t count, int timeout) {
            return ++polls < 2 ? remembering_poll(slots, count, timeout) : expired_poll(slots, count, timeout);
        });
    EXPECT_EQ(get(queue), "abc");
    ASSERT_EQ(g_waits.size(), 2U);
    for (const Wait& wait : g_waits) {
        EXPECT_EQ(wait.events, POLLIN);
        EXPECT_EQ(wait.timeout, 1000);
    }
}

TEST(MessageQueueFrames, SignalsDoNotLengthenTheWait) {
    TAVO_MessageQueue queue;
    write_raw(queue, frame(10, "abc"));
    script({});
    const PlatformHook hook(
        kLibrary, "poll", +[](pollfd* slots, nfds_t, int timeout) {
            std::this_thread::sleep_for(std::chrono::milliseconds(40));
            g_waits.push_back({slots[0].events, timeout, -1});
            if (timeout == 0) return 0;
            errno = EINTR;
            return -1;
        });
    EXPECT_EQ(get(queue), "abc");
    for (size_t i = 1; i < g_waits.size(); ++i) EXPECT_LT(g_waits[i].timeout, g_waits[i - 1].timeout);
    EXPECT_EQ(g_waits.back().timeout, 0);
}

TEST(MessageQueueFrames, TheEndOfTheWritersEndsTheWaitAtOnce) {
    TAVO_MessageQueue queue;
    write_raw(queue, frame(10, "abc"));
    queue.tavo_android_msg_queue_set_write_fd(-1);
    script({});
    const PlatformHook hook(kLibrary, "poll", remembering_poll);
    EXPECT_EQ(get(queue), "abc");
    ASSERT_EQ(g_waits.size(), 1U);
    EXPECT_EQ(g_waits[0].result, 1);
}

TEST(MessageQueueFrames, ReadingGoesOnWhilePartsArrive) {
    TAVO_MessageQueue queue;
    const std::string text = frame(26, "abcdefghijklmnopqrstuvwxyz");
    std::thread writer([&] {
        for (const char c : text) {
            write_raw(queue, std::string(1, c));
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
    });
    EXPECT_EQ(get(queue), "abcdefghijklmnopqrstuvwxyz");
    writer.join();
    EXPECT_EQ(pending(queue), 0);
}

TEST(MessageQueueFrames, AFailureAfterAPartYieldsThePart) {
    TAVO_MessageQueue queue;
    write_raw(queue, frame(6, "abcdef"));
    script({4, 2, -EIO});
    const PlatformHook hook(kLibrary, "read", scripted_read);
    EXPECT_EQ(get(queue), "ab");
}

TEST(MessageQueueFrames, AFailedReadOfTheLengthIsReportedAndTakesNothing) {
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_service_name(bytes("7"));
    ASSERT_EQ(put(queue, "kept"), 0);
    for (const int error : {EINTR, EAGAIN, EIO}) {
        queue.bMsg = 1;
        script({-error});
        const LogCapture log;
        unsigned char buffer[8] = {9};
        unsigned int size = 8;
        {
            const PlatformHook hook(kLibrary, "read", scripted_read);
            EXPECT_EQ(queue.tavo_android_msg_queue_get(buffer, &size), -1);
            EXPECT_EQ(errno, error);
        }
        EXPECT_EQ(size, 8U);
        EXPECT_EQ(queue.bMsg, 1);
        EXPECT_TRUE(logged_exactly(
            log.lines(),
            {kGetEntered, line(4, "Going to Read message...\n "), line(4, "Reading message with lenghth 8 \n"),
             line(4, "Reading message with lenghth 9 \n"),
             line(1, std::string("read() error: ") + strerror(error) + " :Message queue (7)\n"), kExiting}));
    }
    EXPECT_EQ(get(queue), "kept");
}

TEST(MessageQueueFrames, AFailedReadOfTheMessageIsReported) {
    TAVO_MessageQueue queue;
    ASSERT_EQ(put(queue, "lost"), 0);
    script({4, -EIO});
    const LogCapture log;
    const PlatformHook hook(kLibrary, "read", scripted_read);
    EXPECT_EQ(get(queue), "-1");
    EXPECT_EQ(errno, EIO);
    EXPECT_TRUE(logged(log.lines(), line(1, "read() error: Input/output error :Message queue ()\n")));
}

TEST(MessageQueueFrames, AnInterruptionBehindTheLengthDoesNotLoseTheFrame) {
    TAVO_MessageQueue queue;
    const PlatformHook hook(kLibrary, "read", scripted_read);
    for (const int error : {EINTR, EAGAIN}) {
        ASSERT_EQ(put(queue, "whole"), 0);
        script({4, -error, 2, -error});
        EXPECT_EQ(get(queue), "whole");
        ASSERT_EQ(put(queue, "whole"), 0);
        script({1, -error});
        EXPECT_EQ(get(queue), "whole");
    }
}

TEST(MessageQueueFrames, ANonBlockingQueueReportsThatNothingIsThere) {
    TAVO_MessageQueue queue;
    ASSERT_EQ(fcntl(queue.iReadFd, F_SETFL, O_NONBLOCK), 0);
    script({});
    const PlatformHook hook(kLibrary, "poll", expired_poll);
    EXPECT_EQ(get(queue), "-1");
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_TRUE(g_waits.empty());
    write_raw(queue, frame(3, ""));
    EXPECT_EQ(get(queue), "-1");
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_EQ(g_waits.size(), 1U);
}

TEST(MessageQueueFrames, AtTheEndOfTheFileGetReturnsNothing) {
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_write_fd(-1);
    const LogCapture log;
    unsigned char buffer[4] = {5};
    unsigned int size = 4;
    EXPECT_EQ(queue.tavo_android_msg_queue_get(buffer, &size), 0);
    EXPECT_EQ(size, 0U);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {kGetEntered, line(4, "Going to Read message...\n "), line(4, "Reading message with lenghth 4 \n"),
                      line(4, "Reading message with lenghth 5 \n"), kExiting}));
}

TEST(MessageQueueFrames, ALengthThatDoesNotComeWholeAnnouncesNoMessage) {
    TAVO_MessageQueue queue;
    write_raw(queue, std::string("\x01\x02", 2));
    script({});
    const LogCapture log;
    const PlatformHook hook(kLibrary, "poll", expired_poll);
    unsigned char buffer[4] = {9, 9, 0, 0};
    unsigned int size = 4;
    EXPECT_EQ(queue.tavo_android_msg_queue_get(buffer, &size), 0);
    EXPECT_EQ(size, 0U);
    ASSERT_EQ(g_waits.size(), 1U);
    EXPECT_EQ(g_waits[0].timeout, 1000);
    EXPECT_TRUE(logged(log.lines(), line(4, "Reading message with lenghth 513 \n")));
}

TEST(MessageQueueFrames, TheBufferBeginsWithTheLengthThatAShorterMessageDoesNotOverwrite) {
    TAVO_MessageQueue queue;
    ASSERT_EQ(put(queue, "x"), 0);
    unsigned char buffer[4] = {9, 9, 9, 9};
    unsigned int size = 4;
    EXPECT_EQ(queue.tavo_android_msg_queue_get(buffer, &size), 1);
    EXPECT_EQ(std::string(buffer, buffer + 4), std::string("x\0\0\0", 4));
}

TEST(MessageQueueFrames, NeverStoresMoreThanTheLongestMessage) {
    TAVO_MessageQueue queue;
    std::vector<unsigned char> buffer(409600 + 1, '!');
    std::thread writer([&] { write_raw(queue, frame(0xFFFFFFFF, std::string(409600, 'x') + "rest")); });
    auto size = static_cast<unsigned>(buffer.size());
    EXPECT_EQ(queue.tavo_android_msg_queue_get(buffer.data(), &size), 409600);
    writer.join();
    EXPECT_EQ(size, 409600U);
    EXPECT_EQ(buffer[409599], 'x');
    EXPECT_EQ(buffer[409600], '!');
    EXPECT_EQ(pending(queue), 4);
}

TEST(MessageQueueFrames, ClearDropsAHalfWrittenFrameThatEndsAtItsScratchBuffersEnd) {
    TAVO_MessageQueue queue;
    write_raw(queue, frame(8192, std::string(4096, 'x')));
    script({});
    const PlatformHook hook(
        kLibrary, "poll", +[](pollfd* slots, nfds_t count, int timeout) {
            return timeout == 0 ? poll(slots, count, 0) : expired_poll(slots, count, timeout);
        });
    queue.tavo_android_msg_queue_clear();
    EXPECT_EQ(g_waits.size(), 1U);
    EXPECT_EQ(pending(queue), 0);
}

TEST(MessageQueueFrames, APutThatWritesNothingBecauseOfAnInterruptionFails) {
    TAVO_MessageQueue queue;
    for (const int error : {EINTR, EAGAIN}) {
        script({-error});
        static void* block;
        const PlatformHook malloc_hook(
            kLibrary, "malloc", +[](size_t size) { return block = malloc(size); });
        const PlatformHook write_hook(kLibrary, "write", scripted_write);
        EXPECT_EQ(put(queue, "x"), -1);
        EXPECT_EQ(errno, error);
        free(block);  // what a failed put is known to leak
    }
    EXPECT_EQ(pending(queue), 0);
}

TEST(MessageQueueFrames, APutThatWroteAPartIsFinished) {
    TAVO_MessageQueue queue;
    const PlatformHook write_hook(kLibrary, "write", scripted_write);
    const PlatformHook poll_hook(kLibrary, "poll", remembering_poll);
    script({2, 3, -EINTR, 1, -EAGAIN});
    EXPECT_EQ(put(queue, "a whole message"), 0);
    EXPECT_EQ(g_calls, 6U);
    ASSERT_EQ(g_waits.size(), 1U);
    EXPECT_EQ(g_waits[0].events, POLLOUT);
    EXPECT_EQ(g_waits[0].timeout, 1000);
    EXPECT_EQ(get(queue), "a whole message");
}

TEST(MessageQueueFrames, ANonBlockingPutFailsWhenNoRoomComesForASecond) {
    TAVO_MessageQueue queue;
    script({2, -EAGAIN, 1, -EAGAIN});
    static void* block;
    static int polls;
    polls = 0;
    const LogCapture log;
    const PlatformHook malloc_hook(
        kLibrary, "malloc", +[](size_t size) { return block = malloc(size); });
    const PlatformHook write_hook(kLibrary, "write", scripted_write);
    const PlatformHook poll_hook(
        kLibrary, "poll", +[](pollfd* slots, nfds_t count, int timeout) {
            return ++polls < 2 ? remembering_poll(slots, count, timeout) : expired_poll(slots, count, timeout);
        });
    EXPECT_EQ(put(queue, "x"), -1);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_EQ(g_calls, 4U);
    ASSERT_EQ(g_waits.size(), 2U);
    for (const Wait& wait : g_waits) {
        EXPECT_EQ(wait.events, POLLOUT);
        EXPECT_EQ(wait.timeout, 1000);
    }
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {kEntered, line(3, "write() error: Resource temporarily unavailable\n"), kExiting}));
    free(block);  // what a failed put is known to leak
}

TEST(MessageQueueFrames, APutWhoseReaderGoesAwayFails) {
    TAVO_MessageQueue queue;
    script({2, -EPIPE});
    static void* block;
    const LogCapture log;
    const PlatformHook malloc_hook(
        kLibrary, "malloc", +[](size_t size) { return block = malloc(size); });
    const PlatformHook write_hook(kLibrary, "write", scripted_write);
    EXPECT_EQ(put(queue, "x"), -1);
    EXPECT_TRUE(logged(log.lines(), line(3, "write() error: Broken pipe\n")));
    free(block);  // what a failed put is known to leak
}

TEST(MessageQueueFrames, ANonBlockingWriterFinishesAFrameThatDoesNotFitThePipe) {
    TAVO_MessageQueue queue;
    ASSERT_EQ(fcntl(queue.iWriteFd, F_SETFL, O_NONBLOCK), 0);
    queue.uiRoomFor = 32;  // leaves the pipe as small as it is
    const std::string message(409600, 'n');
    std::string received;
    std::thread reader([&] {
        pollfd slot = {queue.iReadFd, POLLIN, 0};
        poll(&slot, 1, -1);
        received = get(queue);
    });
    EXPECT_EQ(put(queue, message), 0);
    reader.join();
    EXPECT_EQ(received, message);
}

TEST(MessageQueueRoom, TheLongestMessageFitsAFreshQueueThatNobodyReads) {
    TAVO_MessageQueue queue;
    const std::string message(409600, 'l');
    EXPECT_EQ(put(queue, message), 0);
    EXPECT_EQ(pending(queue), 409604);
    EXPECT_EQ(get(queue), message);
}

// A platform that tells a pipe's size and refuses every other one above a limit.
std::vector<int> g_sizes;
int g_current, g_limit, g_questions;

int sized_fcntl(int, int command, ...) {
    va_list values;
    va_start(values, command);
    const int size = va_arg(values, int);
    va_end(values);
    if (command == F_GETPIPE_SZ) {
        ++g_questions;
        return g_current;
    }
    g_sizes.push_back(size);
    if (size <= g_limit) return g_current = size;
    errno = EPERM;
    return -1;
}

void platform_of(int current, int limit) {
    g_sizes.clear();
    g_questions = 0;
    g_current = current;
    g_limit = limit;
}

TEST(MessageQueueRoom, SmallMessagesNeverAskForAny) {
    TAVO_MessageQueue queue;
    platform_of(65536, 1 << 20);
    const PlatformHook hook(kLibrary, "fcntl", sized_fcntl);
    EXPECT_EQ(put(queue, std::string(4092, 's')), 0);
    EXPECT_EQ(g_questions, 0);
}

TEST(MessageQueueRoom, GrowsToAPowerOfTwoOfAtMostOneMebibyte) {
    TAVO_MessageQueue queue;
    const PlatformHook hook(kLibrary, "fcntl", sized_fcntl);
    platform_of(65536, 1 << 20);
    EXPECT_EQ(put(queue, std::string(4093, 'm')), 0);
    EXPECT_EQ(put(queue, std::string(20000, 'm')), 0);
    EXPECT_EQ(put(queue, std::string(30000, 'm')), 0);
    EXPECT_EQ(g_sizes, (std::vector<int>{131072, 524288}));
    queue.tavo_android_msg_queue_clear();
    TAVO_MessageQueue large;
    fcntl(large.iWriteFd, F_SETPIPE_SZ, 1 << 20);
    platform_of(65536, 1 << 20);
    EXPECT_EQ(put(large, std::string(409600, 'l')), 0);
    EXPECT_EQ(g_sizes, (std::vector<int>{1 << 20}));
}

TEST(MessageQueueRoom, LeavesALargePipeAsItIs) {
    TAVO_MessageQueue queue;
    const PlatformHook hook(kLibrary, "fcntl", sized_fcntl);
    platform_of(1 << 20, 1 << 20);
    EXPECT_EQ(put(queue, std::string(20000, 'm')), 0);
    EXPECT_EQ(g_questions, 1);
    EXPECT_TRUE(g_sizes.empty());
}

TEST(MessageQueueRoom, TakesWhatTheUserIsGranted) {
    TAVO_MessageQueue queue;
    const PlatformHook hook(kLibrary, "fcntl", sized_fcntl);
    platform_of(65536, 131072);
    EXPECT_EQ(put(queue, std::string(20000, 'm')), 0);
    EXPECT_EQ(g_sizes, (std::vector<int>{524288, 262144, 131072}));
}

TEST(MessageQueueRoom, IgnoresThatNoneIsGranted) {
    TAVO_MessageQueue queue;
    const PlatformHook hook(kLibrary, "fcntl", sized_fcntl);
    platform_of(65536, 0);
    EXPECT_EQ(put(queue, std::string(20000, 'm')), 0);
    EXPECT_EQ(g_sizes, (std::vector<int>{524288, 262144, 131072}));
    platform_of(-1, 0);
    EXPECT_EQ(put(queue, std::string(33000, 'm')), 0);
    EXPECT_TRUE(g_sizes.empty());
    EXPECT_EQ(get(queue).size(), 20000U);
    EXPECT_EQ(get(queue).size(), 33000U);
}

TEST(MessageQueueRoom, IsAskedForOnceUntilTheWriteEndIsReplaced) {
    TAVO_MessageQueue queue;
    const int copy = fcntl(queue.iWriteFd, F_DUPFD_CLOEXEC, 0);
    const PlatformHook hook(kLibrary, "fcntl", sized_fcntl);
    platform_of(65536, 1 << 20);
    for (int i = 0; i < 3; ++i) EXPECT_EQ(put(queue, std::string(5000, 'm')), 0);
    EXPECT_EQ(g_questions, 1);
    queue.tavo_android_msg_queue_set_write_fd(copy);
    EXPECT_EQ(put(queue, std::string(5000, 'm')), 0);
    EXPECT_EQ(g_questions, 2);
}

}  // namespace
