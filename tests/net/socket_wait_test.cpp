// Waiting: poll() and the two waits on select().
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/select.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <string>
#include <thread>
#include <vector>

#include "net/sockets.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/socket.h"

namespace {

using std::to_string;
using tavo::test::closed_descriptor;
using tavo::test::Descriptor;
using tavo::test::ExpectedLine;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::Pair;
using tavo::test::PlatformHook;
using tavo::test::socket_pair;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_SOCKET";

ExpectedLine seconds_line(int seconds) {
    return {4, kTag, "Calling select for timeout value = " + to_string(seconds) + " seconds.\n"};
}
const ExpectedLine kInfiniteLine = {4, kTag, "Calling select for infinite timeout.\n"};
const ExpectedLine kTimedOutLine = {4, kTag, "Select timedout.\n"};

// --- poll

TEST(SocketPoll, AnswersWithPollsResultAndLogsNothing) {
    const Pair pair = socket_pair(SOCK_STREAM);
    const LogCapture log;
    pollfd both[] = {{pair.first.get(), POLLIN, 0}, {pair.second.get(), POLLIN, 0}};
    EXPECT_EQ(tavo_osal_socket_poll(both, 2, 0), 0);
    ASSERT_EQ(send(pair.first.get(), "x", 1, 0), 1);
    EXPECT_EQ(tavo_osal_socket_poll(both, 2, -1), 1);
    EXPECT_EQ(both[0].revents, 0);
    EXPECT_EQ(both[1].revents, POLLIN);
    EXPECT_EQ(tavo_osal_socket_poll(both, 1, 10), 0);
    EXPECT_EQ(tavo_osal_socket_poll(nullptr, 0, 1), 0);
    EXPECT_TRUE(log.lines().empty());
}

TEST(SocketPoll, AnswersWithMinusOneWhenPollFailsAndLogsNothing) {
    const PlatformHook hook(
        kLibrary, "poll", +[](pollfd*, nfds_t, int) {
            errno = EINTR;
            return -1;
        });
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_poll(nullptr, 1, 0), -1);
    EXPECT_EQ(errno, EINTR);
    EXPECT_TRUE(log.lines().empty());
}

TEST(SocketPoll, PassesCountAndTimeOutOn) {
    static nfds_t seen_count;
    static int seen_timeout;
    const PlatformHook hook(
        kLibrary, "poll", +[](pollfd*, nfds_t count, int timeout) {
            seen_count = count;
            seen_timeout = timeout;
            return 42;
        });
    EXPECT_EQ(tavo_osal_socket_poll(nullptr, 6, 777), 42);
    EXPECT_EQ(seen_count, 6U);
    EXPECT_EQ(seen_timeout, 777);
}

// --- the two waits

struct WaitOperation {
    const char* name;
    TAVO_Status (*call)(int, unsigned int);
    bool reading;
    std::string succeeded;  // before select()'s result
    std::string failed;     // before errno
    std::string failed_end;
};

// What reached the platform's select().
struct SeenSelect {
    int count;
    bool has_limit;
    timeval limit;
    bool in_read, in_write;
    bool has_read, has_write, has_except;
    int members;
};
SeenSelect g_seen;
int g_watched;
int g_result;

int members_of(const fd_set* set) {
    int members = 0;
    for (int fd = 0; set != nullptr && fd < FD_SETSIZE; ++fd) members += FD_ISSET(fd, set) ? 1 : 0;
    return members;
}

int note_select(int count, fd_set* read, fd_set* write, fd_set* except, timeval* limit) {
    g_seen = {};
    g_seen.count = count;
    g_seen.has_limit = limit != nullptr;
    if (limit != nullptr) g_seen.limit = *limit;
    g_seen.has_read = read != nullptr;
    g_seen.has_write = write != nullptr;
    g_seen.has_except = except != nullptr;
    g_seen.in_read = read != nullptr && FD_ISSET(g_watched, read);
    g_seen.in_write = write != nullptr && FD_ISSET(g_watched, write);
    g_seen.members = members_of(read) + members_of(write);
    if (g_result < 0) errno = ENOMEM;
    return g_result;
}

class SocketWait : public testing::TestWithParam<WaitOperation> {
protected:
    SocketWait() : pair_(socket_pair(SOCK_STREAM)) {
        g_watched = pair_.first.get();
        g_result = 0;
    }

    // A socket pair's first end can always be written, and read once the second has sent.
    void make_ready() const {
        if (!GetParam().reading) return;
        ASSERT_EQ(send(pair_.second.get(), "x", 1, 0), 1);
    }
    // Never readable as it is; not writable once its buffer is full.
    void make_busy() const {
        if (GetParam().reading) return;
        const std::vector<char> much(1U << 16U);
        while (send(pair_.first.get(), much.data(), much.size(), MSG_DONTWAIT) > 0) {
        }
    }
    int fd() const { return pair_.first.get(); }
    static TAVO_Status call(int fd, unsigned ms) { return GetParam().call(fd, ms); }

    static ExpectedLine succeeded_line(int result) {
        return {4, kTag, GetParam().succeeded + to_string(result) + "\n"};
    }
    static ExpectedLine failed_line(int error) {
        return {1, kTag, GetParam().failed + to_string(error) + GetParam().failed_end};
    }

    Pair pair_;
};

TEST_P(SocketWait, SucceedsWhenTheSocketIsReady) {
    make_ready();
    const LogCapture log;
    EXPECT_EQ(call(fd(), 2500), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {seconds_line(2), succeeded_line(1)}));
}

TEST_P(SocketWait, LogsTheResultOfSelect) {
    g_result = 3;
    const PlatformHook hook(kLibrary, "select", note_select);
    const LogCapture log;
    EXPECT_EQ(call(fd(), 0), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {kInfiniteLine, succeeded_line(3)}));
}

TEST_P(SocketWait, TimesOutAtOnceBelowOneSecond) {
    make_busy();
    const LogCapture log;
    EXPECT_EQ(call(fd(), 999), TAVO_SOCKET_SELECT_TIMEOUT);
    EXPECT_TRUE(logged_exactly(log.lines(), {seconds_line(0), kTimedOutLine}));
}

TEST_P(SocketWait, TimesOutAfterWholeSeconds) {
    make_busy();
    const LogCapture log;
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(call(fd(), 1999), TAVO_SOCKET_SELECT_TIMEOUT);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(990));
    EXPECT_TRUE(logged_exactly(log.lines(), {seconds_line(1), kTimedOutLine}));
}

TEST_P(SocketWait, WatchesOneDescriptorForOneThing) {
    const PlatformHook hook(kLibrary, "select", note_select);
    call(fd(), 1000);
    EXPECT_EQ(g_seen.count, fd() + 1);
    EXPECT_EQ(g_seen.has_read, GetParam().reading);
    EXPECT_EQ(g_seen.in_read, GetParam().reading);
    EXPECT_EQ(g_seen.has_write, !GetParam().reading);
    EXPECT_EQ(g_seen.in_write, !GetParam().reading);
    EXPECT_FALSE(g_seen.has_except);
    EXPECT_EQ(g_seen.members, 1);
}

TEST_P(SocketWait, DropsTheRemainderBelowOneSecond) {
    const PlatformHook hook(kLibrary, "select", note_select);
    const struct {
        unsigned milliseconds;
        time_t seconds;
    } cases[] = {{1, 0}, {999, 0}, {1000, 1}, {1999, 1}, {60000, 60}, {0xFFFFFFFFU, 4294967}};
    for (const auto& [milliseconds, seconds] : cases) {
        const LogCapture log;
        EXPECT_EQ(call(fd(), milliseconds), TAVO_SOCKET_SELECT_TIMEOUT);
        EXPECT_TRUE(g_seen.has_limit);
        EXPECT_EQ(g_seen.limit.tv_sec, seconds) << milliseconds;
        EXPECT_EQ(g_seen.limit.tv_usec, 0) << milliseconds;
        EXPECT_TRUE(logged_exactly(log.lines(), {seconds_line(static_cast<int>(seconds)), kTimedOutLine}));
    }
}

TEST_P(SocketWait, PassesNoLimitForZero) {
    const PlatformHook hook(kLibrary, "select", note_select);
    call(fd(), 0);
    EXPECT_FALSE(g_seen.has_limit);
}

TEST_P(SocketWait, WaitsWithoutLimitForZero) {
    make_busy();
    const LogCapture log;
    std::thread peer([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        std::vector<char> bytes(1U << 16U);
        if (GetParam().reading) {
            EXPECT_EQ(send(pair_.second.get(), "x", 1, 0), 1);
        } else {
            while (recv(pair_.second.get(), bytes.data(), bytes.size(), MSG_DONTWAIT) > 0) {
            }
        }
    });
    EXPECT_EQ(call(fd(), 0), TAVO_SUCCESS);
    peer.join();
    EXPECT_TRUE(logged_exactly(log.lines(), {kInfiniteLine, succeeded_line(1)}));
}

TEST_P(SocketWait, ReportsADescriptorThatIsNotOpen) {
    const int closed = closed_descriptor();
    const LogCapture log;
    EXPECT_EQ(call(closed, 1000), TAVO_SOCKET_SELECT_FAILED);
    EXPECT_EQ(errno, EBADF);
    EXPECT_TRUE(logged_exactly(log.lines(), {seconds_line(1), failed_line(EBADF)}));
}

TEST_P(SocketWait, ReportsAnyFailureOfSelect) {
    g_result = -1;
    const PlatformHook hook(kLibrary, "select", note_select);
    const LogCapture log;
    EXPECT_EQ(call(fd(), 0), TAVO_SOCKET_SELECT_FAILED);
    EXPECT_EQ(errno, ENOMEM);
    EXPECT_TRUE(logged_exactly(log.lines(), {kInfiniteLine, failed_line(ENOMEM)}));
}

TEST_P(SocketWait, AnswersAsAFailedSelectForDescriptorsThatNoSetHolds) {
    const struct {
        int fd;
        int error;
    } cases[] = {{-1, EBADF}, {INT32_MIN, EBADF}, {FD_SETSIZE, EINVAL}, {1 << 20, EINVAL}, {INT32_MAX, EINVAL}};
    for (const auto& [descriptor, error] : cases) {
        const LogCapture log;
        EXPECT_EQ(call(descriptor, 1000), TAVO_SOCKET_SELECT_FAILED) << descriptor;
        EXPECT_EQ(errno, error) << descriptor;
        EXPECT_TRUE(logged_exactly(log.lines(), {seconds_line(1), failed_line(error)}));
    }
}

TEST_P(SocketWait, TakesTheHighestDescriptorThatASetHolds) {
    make_ready();
    const Descriptor highest(dup2(fd(), FD_SETSIZE - 1));
    if (highest.get() < 0) GTEST_SKIP() << "descriptors end below " << FD_SETSIZE;
    EXPECT_EQ(call(highest.get(), 1000), TAVO_SUCCESS);
}

TEST_P(SocketWait, SurvivesTwoThousandOpenDescriptors) {
    constexpr int kCount = 2000;
    rlimit limit = {};
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
    if (limit.rlim_cur < kCount + 100) {
        limit.rlim_cur = kCount + 100;
        limit.rlim_max = std::max(limit.rlim_max, limit.rlim_cur);
        if (setrlimit(RLIMIT_NOFILE, &limit) != 0) GTEST_SKIP() << "may not open " << kCount << " descriptors";
    }
    make_ready();
    std::vector<Descriptor> open;
    while (open.size() < kCount) {
        open.emplace_back(dup(fd()));
        ASSERT_GE(open.back().get(), 0);
    }
    ASSERT_GE(open.back().get(), FD_SETSIZE);
    for (const Descriptor& each : open) {
        EXPECT_EQ(call(each.get(), 1), each.get() < FD_SETSIZE ? TAVO_SUCCESS : TAVO_SOCKET_SELECT_FAILED)
            << each.get();
    }
}

INSTANTIATE_TEST_SUITE_P(Operations, SocketWait,
                         testing::Values(WaitOperation{"for_data", tavo_osal_socket_wait_for_data, true,
                                                       "Select succedded. Receive data on socket. uiRet=",
                                                       "Select failed with error. Errno: ", ".\n"},
                                         WaitOperation{"for_sending_data", tavo_osal_socket_wait_for_sending_data,
                                                       false, "Select succedded. Send data on socket.uiRet=",
                                                       "Select failed with error. Errno:", " \n"}),
                         [](const auto& operation) { return operation.param.name; });

}  // namespace
