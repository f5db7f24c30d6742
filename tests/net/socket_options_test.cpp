// Socket options, and the reset that one of them brings about.
#include <gtest/gtest.h>
#include <netinet/tcp.h>
#include <sys/time.h>

#include <cerrno>
#include <chrono>
#include <string>
#include <vector>

#include "net/sockets.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/socket.h"

namespace {

using std::to_string;
using tavo::test::closed_descriptor;
using tavo::test::Descriptor;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::make_socket;
using tavo::test::Pair;
using tavo::test::PlatformHook;
using tavo::test::socket_pair;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_SOCKET";

template <typename Value>
Value option(int fd, int level, int name) {
    Value value = {};
    socklen_t length = sizeof value;
    EXPECT_EQ(getsockopt(fd, level, name, &value, &length), 0);
    return value;
}

// --- what all setters share

struct Setter {
    const char* name;
    TAVO_Status (*set)(int fd);
    TAVO_Status failure;
    std::string message;  // before errno
    std::string end;
};

class SocketOption : public testing::TestWithParam<Setter> {};

TEST_P(SocketOption, SaysNothingWhenItIsSet) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    const LogCapture log;
    EXPECT_EQ(GetParam().set(fd.get()), TAVO_SUCCESS);
    EXPECT_TRUE(log.lines().empty());
}

TEST_P(SocketOption, ReportsADescriptorThatIsNotOpen) {
    const int fd = closed_descriptor();
    const LogCapture log;
    EXPECT_EQ(GetParam().set(fd), GetParam().failure);
    EXPECT_EQ(errno, EBADF);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, GetParam().message + to_string(EBADF) + GetParam().end}}));
}

TEST_P(SocketOption, ReportsWhateverThePlatformRefuses) {
    const PlatformHook hook(
        kLibrary, "setsockopt", +[](int, int, int, const void*, socklen_t) {
            errno = ENOBUFS;
            return -1;
        });
    const LogCapture log;
    EXPECT_EQ(GetParam().set(7), GetParam().failure);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, GetParam().message + to_string(ENOBUFS) + GetParam().end}}));
}

INSTANTIATE_TEST_SUITE_P(
    Setters, SocketOption,
    testing::Values(Setter{"setoption", [](int fd) { return tavo_osal_socket_setoption(fd, SO_REUSEADDR, 1); },
                           TAVO_FAILURE, "Set socket option failed. errno=", "\n"},
                    Setter{"receive_timeout", [](int fd) { return tavo_osal_socket_set_receive_timeout(fd, 10); },
                           TAVO_SOCKET_OPTION_FAILED, "Set socket option failed\n, errno: ", ""},
                    Setter{"send_timeout", [](int fd) { return tavo_osal_socket_set_send_timeout(fd, 10); },
                           TAVO_SOCKET_OPTION_FAILED, "Set socket option failed, Errno:", " \n"},
                    Setter{"tcp_no_delay", [](int fd) { return tavo_osal_socket_set_tcp_no_delay(fd); },
                           TAVO_SOCKET_OPTION_FAILED, "Set socket option failed errno: ", ""},
                    Setter{"recv_buf_len", [](int fd) { return tavo_osal_socket_set_recv_buf_len(fd, 8192); },
                           TAVO_SOCKET_OPTION_FAILED, "Set socket option failed, errno: ", "\n"},
                    Setter{"send_buf_len", [](int fd) { return tavo_osal_socket_set_send_buf_len(fd, 8192); },
                           TAVO_SOCKET_OPTION_FAILED, "Set socket option failed, errno: ", "\n"}),
    [](const auto& setter) { return setter.param.name; });

// --- what each one sets

TEST(SocketSetOption, SetsAnIntAtTheSocketLevel) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    EXPECT_EQ(tavo_osal_socket_setoption(fd.get(), SO_KEEPALIVE, 1), TAVO_SUCCESS);
    EXPECT_NE(option<int>(fd.get(), SOL_SOCKET, SO_KEEPALIVE), 0);
    EXPECT_EQ(tavo_osal_socket_setoption(fd.get(), SO_KEEPALIVE, 0), TAVO_SUCCESS);
    EXPECT_EQ(option<int>(fd.get(), SOL_SOCKET, SO_KEEPALIVE), 0);
}

TEST(SocketSetOption, PassesFourBytesOn) {
    static int seen_level, seen_name, seen_value;
    static socklen_t seen_length;
    const PlatformHook hook(
        kLibrary, "setsockopt", +[](int, int level, int name, const void* value, socklen_t length) {
            seen_level = level;
            seen_name = name;
            seen_value = *static_cast<const int*>(value);
            seen_length = length;
            return 0;
        });
    EXPECT_EQ(tavo_osal_socket_setoption(7, SO_MARK, -123456789), TAVO_SUCCESS);
    EXPECT_EQ(seen_level, SOL_SOCKET);
    EXPECT_EQ(seen_name, SO_MARK);
    EXPECT_EQ(seen_value, -123456789);
    EXPECT_EQ(seen_length, 4U);
}

TEST(SocketSetOption, ReportsAnUnknownOption) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_setoption(fd.get(), 0x7FFF, 1), TAVO_FAILURE);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Set socket option failed. errno=" + to_string(ENOPROTOOPT) + "\n"}}));
}

// The time-out that reached the platform.
timeval g_seen_time;
int g_seen_name;

int note_time(int, int level, int name, const void* value, socklen_t length) {
    EXPECT_EQ(level, SOL_SOCKET);
    EXPECT_EQ(length, sizeof g_seen_time);
    g_seen_time = *static_cast<const timeval*>(value);
    g_seen_name = name;
    return 0;
}

TEST(SocketTimeout, SplitsMillisecondsIntoSecondsAndMicroseconds) {
    const PlatformHook hook(kLibrary, "setsockopt", note_time);
    const struct {
        unsigned milliseconds;
        time_t seconds;
        suseconds_t microseconds;
    } cases[] = {{0, 0, 0},    {1, 0, 1000},      {999, 0, 999000},
                 {1000, 1, 0}, {2345, 2, 345000}, {0xFFFFFFFFU, 4294967, 295000}};
    for (const auto& each : cases) {
        for (const bool receiving : {true, false}) {
            const auto set = receiving ? tavo_osal_socket_set_receive_timeout : tavo_osal_socket_set_send_timeout;
            EXPECT_EQ(set(7, each.milliseconds), TAVO_SUCCESS);
            EXPECT_EQ(g_seen_name, receiving ? SO_RCVTIMEO : SO_SNDTIMEO);
            EXPECT_EQ(g_seen_time.tv_sec, each.seconds) << each.milliseconds;
            EXPECT_EQ(g_seen_time.tv_usec, each.microseconds) << each.milliseconds;
        }
    }
}

TEST(SocketTimeout, EndsABlockedReceive) {
    const Pair pair = socket_pair(SOCK_STREAM);
    ASSERT_EQ(tavo_osal_socket_set_receive_timeout(pair.first.get(), 60), TAVO_SUCCESS);
    char byte = 0;
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(tavo_osal_socket_recieve_without_retry(pair.first.get(), &byte, 1, 0), -1);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(50));
}

TEST(SocketTimeout, EndsABlockedSend) {
    const Pair pair = socket_pair(SOCK_STREAM);
    ASSERT_EQ(tavo_osal_socket_set_send_timeout(pair.first.get(), 60), TAVO_SUCCESS);
    const std::vector<char> much(1U << 16U);
    const auto start = std::chrono::steady_clock::now();
    while (tavo_osal_socket_send(pair.first.get(), much.data(), static_cast<unsigned>(much.size()), 0) > 0) {
    }
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(50));
}

TEST(SocketNoDelay, IsSetOnATcpSocket) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    ASSERT_EQ(option<int>(fd.get(), IPPROTO_TCP, TCP_NODELAY), 0);
    EXPECT_EQ(tavo_osal_socket_set_tcp_no_delay(fd.get()), TAVO_SUCCESS);
    EXPECT_EQ(option<int>(fd.get(), IPPROTO_TCP, TCP_NODELAY), 1);
}

TEST(SocketNoDelay, IsRefusedByOtherSockets) {
    const Pair pair = socket_pair(SOCK_STREAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_set_tcp_no_delay(pair.first.get()), TAVO_SOCKET_OPTION_FAILED);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Set socket option failed errno: " + to_string(EOPNOTSUPP)}}));
}

TEST(SocketBufferLength, SetsTheReceiveBuffer) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    const int send_before = option<int>(fd.get(), SOL_SOCKET, SO_SNDBUF);
    EXPECT_EQ(tavo_osal_socket_set_recv_buf_len(fd.get(), 20000), TAVO_SUCCESS);
    EXPECT_EQ(option<int>(fd.get(), SOL_SOCKET, SO_RCVBUF), 40000);
    EXPECT_EQ(option<int>(fd.get(), SOL_SOCKET, SO_SNDBUF), send_before);
}

TEST(SocketBufferLength, SetsTheSendBuffer) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    const int receive_before = option<int>(fd.get(), SOL_SOCKET, SO_RCVBUF);
    EXPECT_EQ(tavo_osal_socket_set_send_buf_len(fd.get(), 20000), TAVO_SUCCESS);
    EXPECT_EQ(option<int>(fd.get(), SOL_SOCKET, SO_SNDBUF), 40000);
    EXPECT_EQ(option<int>(fd.get(), SOL_SOCKET, SO_RCVBUF), receive_before);
}

TEST(SocketBufferLength, ReadsTheReceiveBuffer) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    ASSERT_EQ(tavo_osal_socket_set_recv_buf_len(fd.get(), 20000), TAVO_SUCCESS);
    ASSERT_EQ(tavo_osal_socket_set_send_buf_len(fd.get(), 30000), TAVO_SUCCESS);
    const LogCapture log;
    unsigned length = 0;
    EXPECT_EQ(tavo_osal_socket_get_buf_len(fd.get(), &length), TAVO_SUCCESS);
    EXPECT_EQ(length, 40000U);
    EXPECT_TRUE(log.lines().empty());
}

TEST(SocketBufferLength, ReadsZeroWhenItCannotBeRead) {
    const int fd = closed_descriptor();
    const LogCapture log;
    unsigned length = 4711;
    EXPECT_EQ(tavo_osal_socket_get_buf_len(fd, &length), TAVO_SOCKET_OPTION_FAILED);
    EXPECT_EQ(length, 0U);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Get socket option failed, errno: " + to_string(EBADF) + "\n"}}));
}

TEST(SocketBufferLength, RefusesANullOutput) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_get_buf_len(7, nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameter\n"}}));
}

// --- reset

TEST(SocketReset, MakesALaterCloseSendAReset) {
    Pair pair = tavo::test::tcp_connection();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_reset(pair.first.get()), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {{4, kTag, "Successfully lingered the socket to send RESET!!!!!\n"}}));

    // Nothing has been closed yet: the connection still carries bytes.
    char byte = 0;
    ASSERT_EQ(send(pair.first.get(), "x", 1, 0), 1);
    EXPECT_EQ(recv(pair.second.get(), &byte, 1, 0), 1);

    EXPECT_EQ(tavo_osal_socket_close(pair.first.release()), TAVO_SUCCESS);
    EXPECT_EQ(recv(pair.second.get(), &byte, 1, 0), -1);
    EXPECT_EQ(errno, ECONNRESET);
}

TEST(SocketReset, SetsLingeringWithATimeOfZero) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    ASSERT_EQ(tavo_osal_socket_reset(fd.get()), TAVO_SUCCESS);
    const auto value = option<linger>(fd.get(), SOL_SOCKET, SO_LINGER);
    EXPECT_EQ(value.l_onoff, 1);
    EXPECT_EQ(value.l_linger, 0);
}

TEST(SocketReset, RefusesZeroAndNegativeDescriptors) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_reset(0), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_socket_reset(-3), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid socket fd:0\n"}, {1, kTag, "Invalid socket fd:-3\n"}}));
}

TEST(SocketReset, ReportsADescriptorThatIsNotOpen) {
    const int fd = closed_descriptor();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_reset(fd), TAVO_SOCKET_CLOSE_FAILED);
    EXPECT_EQ(errno, EBADF);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "setsockopt(SO_LINGER) failed:" + to_string(EBADF) + "\n"}}));
}

}  // namespace
