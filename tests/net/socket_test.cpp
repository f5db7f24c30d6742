// Making, naming and closing sockets.
#include "tavo_osal/socket.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <linux/netlink.h>
#include <netdb.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "net/sockets.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"

namespace {

using std::to_string;
using tavo::test::closed_descriptor;
using tavo::test::count_descriptors;
using tavo::test::Descriptor;
using tavo::test::is_close_on_exec;
using tavo::test::is_open;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::make_socket;
using tavo::test::Pair;
using tavo::test::PlatformHook;
using tavo::test::port_of;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_SOCKET";

// --- create

TEST(SocketCreate, HandsOutADescriptorAndLogsIt) {
    const LogCapture log;
    int fd = -1;
    EXPECT_EQ(tavo_osal_socket_create(AF_INET, SOCK_STREAM, 0, &fd), TAVO_SUCCESS);
    const Descriptor owner(fd);
    EXPECT_TRUE(is_open(fd));
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{3, kTag, "Socket Create is Success. SocketDisc: " + to_string(fd) + "\n"}}));
}

TEST(SocketCreate, PassesDomainTypeAndProtocolOn) {
    int fd = -1;
    ASSERT_EQ(tavo_osal_socket_create(AF_INET, SOCK_DGRAM, IPPROTO_UDP, &fd), TAVO_SUCCESS);
    const Descriptor owner(fd);
    const auto option = [&](int name) {
        int value = -1;
        socklen_t length = sizeof value;
        EXPECT_EQ(getsockopt(fd, SOL_SOCKET, name, &value, &length), 0);
        return value;
    };
    EXPECT_EQ(option(SO_DOMAIN), AF_INET);
    EXPECT_EQ(option(SO_TYPE), SOCK_DGRAM);
    EXPECT_EQ(option(SO_PROTOCOL), IPPROTO_UDP);
}

TEST(SocketCreate, MakesDescriptorsThatProgramsStartedFromHereDoNotInherit) {
    int fd = -1;
    ASSERT_EQ(tavo_osal_socket_create(AF_UNIX, SOCK_STREAM, 0, &fd), TAVO_SUCCESS);
    const Descriptor owner(fd);
    EXPECT_TRUE(is_close_on_exec(fd));
}

TEST(SocketCreate, StoresMinusOneWhenThereIsNoSuchFamily) {
    const LogCapture log;
    int fd = 55;
    const size_t before = count_descriptors();
    EXPECT_EQ(tavo_osal_socket_create(AF_MAX, SOCK_STREAM, 0, &fd), TAVO_SOCKET_CREATE_FAILED);
    EXPECT_EQ(errno, EAFNOSUPPORT);
    EXPECT_EQ(fd, -1);
    EXPECT_EQ(count_descriptors(), before);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Socket Create Failed. Errno: " + to_string(EAFNOSUPPORT) + ".\n"}}));
}

TEST(SocketCreate, StoresMinusOneBeforeTheCall) {
    static int fd;
    static int seen;
    fd = 55;
    const PlatformHook hook(
        kLibrary, "socket", +[](int, int, int) {
            seen = fd;
            return 77;
        });
    EXPECT_EQ(tavo_osal_socket_create(AF_INET, SOCK_STREAM, 0, &fd), TAVO_SUCCESS);
    EXPECT_EQ(seen, -1);
    EXPECT_EQ(fd, 77);
}

TEST(SocketCreate, RefusesANullOutput) {
    const LogCapture log;
    const size_t before = count_descriptors();
    EXPECT_EQ(tavo_osal_socket_create(AF_INET, SOCK_STREAM, 0, nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(count_descriptors(), before);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameter\n"}}));
}

// --- connect and bind by host name

// What reached the platform's connect() or bind().
struct SeenAddress {
    int fd = -1;
    sockaddr_in address = {};
    socklen_t length = 0;
};
SeenAddress g_seen;

int note_address(int fd, const sockaddr* address, socklen_t length) {
    g_seen = {fd, {}, length};
    memcpy(&g_seen.address, address, sizeof g_seen.address);
    return 0;
}

void expect_seen(int fd, const char* dotted, uint16_t port) {
    EXPECT_EQ(g_seen.fd, fd);
    EXPECT_EQ(g_seen.length, 16U);
    sockaddr_in expected = {};
    expected.sin_family = AF_INET;
    expected.sin_port = htons(port);
    expected.sin_addr.s_addr = inet_addr(dotted);
    EXPECT_EQ(memcmp(&g_seen.address, &expected, sizeof expected), 0);
}

// A look-up whose answer the test chooses.
hostent* g_host;
hostent* look_up(const char*) {
    if (g_host == nullptr) h_errno = HOST_NOT_FOUND;
    return g_host;
}

using ByName = TAVO_Status (*)(int, const TAVO_CHAR*, unsigned int);

struct NamedOperation {
    const char* name;
    ByName call;
    const char* platform_call;
};

class SocketByName : public testing::TestWithParam<NamedOperation> {};

TEST_P(SocketByName, PassesTheFirstAddressAndThePortInNetworkOrder) {
    const PlatformHook hook(kLibrary, GetParam().platform_call, note_address);
    EXPECT_EQ(GetParam().call(7, "10.1.2.3", 0x1234), TAVO_SUCCESS);
    expect_seen(7, "10.1.2.3", 0x1234);
}

TEST_P(SocketByName, TakesTheFirstOfSeveralAddresses) {
    const PlatformHook hook(kLibrary, GetParam().platform_call, note_address);
    const PlatformHook resolver(kLibrary, "gethostbyname", look_up);
    char first[] = {10, 0, 0, 1};
    char second[] = {10, 0, 0, 2};
    char* addresses[] = {first, second, nullptr};
    hostent host = {nullptr, nullptr, AF_INET, 4, addresses};
    g_host = &host;
    EXPECT_EQ(GetParam().call(7, "two", 1), TAVO_SUCCESS);
    expect_seen(7, "10.0.0.1", 1);
}

TEST_P(SocketByName, CutsThePortToSixteenBits) {
    const PlatformHook hook(kLibrary, GetParam().platform_call, note_address);
    EXPECT_EQ(GetParam().call(7, "127.0.0.1", 0x10050), TAVO_SUCCESS);
    expect_seen(7, "127.0.0.1", 0x50);
}

TEST_P(SocketByName, ReportsANameThatIsNotFound) {
    const LogCapture log;
    const PlatformHook resolver(kLibrary, "gethostbyname", look_up);
    g_host = nullptr;
    EXPECT_EQ(GetParam().call(7, "nobody", 1), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{1, kTag, "Get host by name failed. Errno: " + to_string(HOST_NOT_FOUND) + ".\n"}}));
}

TEST_P(SocketByName, LogsTheResolversOwnErrorNumber) {
    const LogCapture log;
    const std::string name(64, 'n');  // no label is that long, so no name server is asked
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    EXPECT_EQ(GetParam().call(fd.get(), name.c_str(), 1), TAVO_INVALID_PARAM);
    EXPECT_NE(h_errno, 0);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Get host by name failed. Errno: " + to_string(h_errno) + ".\n"}}));
}

TEST_P(SocketByName, RefusesAHostWithoutAnAddress) {
    const LogCapture log;
    const PlatformHook resolver(kLibrary, "gethostbyname", look_up);
    char* addresses[] = {nullptr};
    hostent host = {nullptr, nullptr, AF_INET, 4, addresses};
    g_host = &host;
    h_errno = NO_DATA;
    EXPECT_EQ(GetParam().call(7, "empty", 1), TAVO_INVALID_PARAM);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Get host by name failed. Errno: " + to_string(NO_DATA) + ".\n"}}));
}

TEST_P(SocketByName, NeverCopiesAnAddressThatIsLongerThanAnIpv4One) {
    const LogCapture log;
    const PlatformHook resolver(kLibrary, "gethostbyname", look_up);
    char address[16] = {};
    char* addresses[] = {address, nullptr};
    g_host = nullptr;
    for (const int length : {16, 5, -1}) {
        hostent host = {nullptr, nullptr, AF_INET6, length, addresses};
        g_host = &host;
        EXPECT_EQ(GetParam().call(7, "six", 1), TAVO_INVALID_PARAM) << length;
    }
    EXPECT_EQ(log.lines(kTag).size(), 3U);
}

TEST_P(SocketByName, RefusesANullName) {
    const LogCapture log;
    EXPECT_EQ(GetParam().call(7, nullptr, 1), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameter\n"}}));
}

INSTANTIATE_TEST_SUITE_P(Operations, SocketByName,
                         testing::Values(NamedOperation{"connect", tavo_osal_socket_connect, "connect"},
                                         NamedOperation{"bind", tavo_osal_socket_bind, "bind"}),
                         [](const auto& operation) { return operation.param.name; });

TEST(SocketConnect, ConnectsToAHostByName) {
    const Descriptor listener = tavo::test::tcp_listener();
    const Descriptor client = make_socket(AF_INET, SOCK_STREAM);
    const LogCapture log;
    ASSERT_EQ(tavo_osal_socket_connect(client.get(), "localhost", port_of(listener.get())), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, kTag, "connect() succeeded.\n"}}));
    const Descriptor server(accept(listener.get(), nullptr, nullptr));
    ASSERT_EQ(send(client.get(), "x", 1, 0), 1);
    char received = 0;
    EXPECT_EQ(recv(server.get(), &received, 1, 0), 1);
    EXPECT_EQ(received, 'x');
}

TEST(SocketConnect, ReportsAPortThatNobodyListensOn) {
    const Descriptor silent = make_socket(AF_INET, SOCK_STREAM);
    ASSERT_EQ(tavo_osal_socket_bind(silent.get(), "127.0.0.1", 0), TAVO_SUCCESS);
    const Descriptor client = make_socket(AF_INET, SOCK_STREAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_connect(client.get(), "127.0.0.1", port_of(silent.get())), TAVO_SOCKET_CONNECT_FAILED);
    EXPECT_EQ(errno, ECONNREFUSED);
    EXPECT_TRUE(is_open(client.get()));
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Socket connect failed. Errno: " + to_string(ECONNREFUSED) + ".\n"}}));
}

TEST(SocketBind, BindsToAHostByName) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_bind(fd.get(), "localhost", 0), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, kTag, "Socket bind succeeded.\n"}}));
    EXPECT_EQ(tavo::test::local_address(fd.get()).sin_addr.s_addr, htonl(INADDR_LOOPBACK));
    EXPECT_NE(port_of(fd.get()), 0U);
}

TEST(SocketBind, ReportsAPortInUseWithTheWordConnect) {
    const Descriptor holder = tavo::test::tcp_listener();
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_bind(fd.get(), "127.0.0.1", port_of(holder.get())), TAVO_SOCKET_CONNECT_FAILED);
    EXPECT_EQ(errno, EADDRINUSE);
    EXPECT_TRUE(is_open(fd.get()));
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{1, kTag, "Socket connect call failed. Errno: " + to_string(EADDRINUSE) + ".\n"}}));
}

// --- netlink bind

TEST(NetlinkBind, BindsToTheProcessIdAndAllGroups) {
    const Descriptor fd = make_socket(AF_NETLINK, SOCK_RAW, NETLINK_KOBJECT_UEVENT);
    const LogCapture log;
    ASSERT_EQ(tavo_osal_nl_socket_bind(fd.get()), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {{3, kTag, "Socket bind succeeded.\n"}}));
    sockaddr_nl bound = {};
    socklen_t length = sizeof bound;
    ASSERT_EQ(getsockname(fd.get(), reinterpret_cast<sockaddr*>(&bound), &length), 0);
    EXPECT_EQ(bound.nl_pid, static_cast<uint32_t>(getpid()));
    EXPECT_EQ(bound.nl_groups, 0xFFFFFFFFU);
}

TEST(NetlinkBind, PassesAnAddressOfTwelveBytes) {
    static sockaddr_nl seen;
    static socklen_t seen_length;
    const PlatformHook hook(
        kLibrary, "bind", +[](int, const sockaddr* address, socklen_t length) {
            memcpy(&seen, address, sizeof seen);
            seen_length = length;
            return 0;
        });
    EXPECT_EQ(tavo_osal_nl_socket_bind(7), TAVO_SUCCESS);
    EXPECT_EQ(seen_length, 12U);
    EXPECT_EQ(seen.nl_family, AF_NETLINK);
    EXPECT_EQ(seen.nl_pad, 0);
}

TEST(NetlinkBind, ReportsAnIdThatIsTaken) {
    const Descriptor first = make_socket(AF_NETLINK, SOCK_RAW, NETLINK_KOBJECT_UEVENT);
    const Descriptor second = make_socket(AF_NETLINK, SOCK_RAW, NETLINK_KOBJECT_UEVENT);
    ASSERT_EQ(tavo_osal_nl_socket_bind(first.get()), TAVO_SUCCESS);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_nl_socket_bind(second.get()), TAVO_SOCKET_CONNECT_FAILED);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{1, kTag, "NL Socket bind call failed. Errno: " + to_string(EADDRINUSE) + ".\n"}}));
}

// --- listen and accept

TEST(SocketListen, TakesConnectionsAndLogsNothing) {
    const Descriptor listener = make_socket(AF_INET, SOCK_STREAM);
    ASSERT_EQ(tavo_osal_socket_bind(listener.get(), "127.0.0.1", 0), TAVO_SUCCESS);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_listen(listener.get(), 1), TAVO_SUCCESS);
    EXPECT_TRUE(log.lines().empty());
    const Descriptor client = make_socket(AF_INET, SOCK_STREAM);
    EXPECT_EQ(tavo_osal_socket_connect(client.get(), "127.0.0.1", port_of(listener.get())), TAVO_SUCCESS);
}

TEST(SocketListen, PassesTheBacklogOn) {
    static int seen;
    const PlatformHook hook(
        kLibrary, "listen", +[](int, int backlog) {
            seen = backlog;
            return 0;
        });
    EXPECT_EQ(tavo_osal_socket_listen(7, 23), TAVO_SUCCESS);
    EXPECT_EQ(seen, 23);
}

TEST(SocketListen, ReportsASocketThatCannotListen) {
    const Descriptor fd = make_socket(AF_INET, SOCK_DGRAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_listen(fd.get(), 1), TAVO_FAILURE);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Socket listen call failed. errno = " + to_string(EOPNOTSUPP) + "\n"}}));
}

TEST(SocketAccept, AnswersWithAConnectedCloseOnExecDescriptorAndThePeersAddress) {
    const Descriptor listener = tavo::test::tcp_listener();
    const Descriptor client = make_socket(AF_INET, SOCK_STREAM);
    ASSERT_EQ(tavo_osal_socket_connect(client.get(), "127.0.0.1", port_of(listener.get())), TAVO_SUCCESS);
    const LogCapture log;
    sockaddr_in peer = {};
    socklen_t length = sizeof peer;
    const Descriptor server(tavo_osal_socket_accept(listener.get(), reinterpret_cast<sockaddr*>(&peer), &length));
    EXPECT_TRUE(log.lines().empty());
    ASSERT_TRUE(is_open(server.get()));
    EXPECT_TRUE(is_close_on_exec(server.get()));
    EXPECT_EQ(length, sizeof peer);
    EXPECT_EQ(ntohs(peer.sin_port), port_of(client.get()));
    ASSERT_EQ(send(server.get(), "y", 1, 0), 1);
    char received = 0;
    EXPECT_EQ(recv(client.get(), &received, 1, 0), 1);
    EXPECT_EQ(received, 'y');
}

TEST(SocketAccept, TakesNoAddress) {
    const Descriptor listener = tavo::test::tcp_listener();
    const Descriptor client = make_socket(AF_INET, SOCK_STREAM);
    ASSERT_EQ(tavo_osal_socket_connect(client.get(), "127.0.0.1", port_of(listener.get())), TAVO_SUCCESS);
    const Descriptor server(tavo_osal_socket_accept(listener.get(), nullptr, nullptr));
    EXPECT_TRUE(is_open(server.get()));
}

TEST(SocketAccept, RefusesDescriptorZero) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_accept(0, nullptr, nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Socket fd is zero\n"}}));
}

TEST(SocketAccept, LeavesNegativeDescriptorsToThePlatform) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_accept(-1, nullptr, nullptr), TAVO_SOCKET_CONNECT_FAILED);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Error in accepting connection error= " + to_string(EBADF) + "\n"}}));
}

TEST(SocketAccept, ReportsThatNobodyConnects) {
    const Descriptor listener = tavo::test::tcp_listener();
    tavo::test::set_non_blocking(listener.get());
    const size_t before = count_descriptors();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_accept(listener.get(), nullptr, nullptr), TAVO_SOCKET_CONNECT_FAILED);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_EQ(count_descriptors(), before);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Error in accepting connection error= " + to_string(EAGAIN) + "\n"}}));
}

// --- shutdown and close

TEST(SocketShutdown, EndsBothDirectionsAndKeepsTheDescriptor) {
    const Pair pair = tavo::test::tcp_connection();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_shutdown(pair.first.get()), TAVO_SUCCESS);
    EXPECT_TRUE(log.lines().empty());
    char byte = 0;
    EXPECT_EQ(recv(pair.second.get(), &byte, 1, 0), 0);
    EXPECT_EQ(recv(pair.first.get(), &byte, 1, 0), 0);
    EXPECT_EQ(send(pair.first.get(), &byte, 1, MSG_NOSIGNAL), -1);
    EXPECT_EQ(errno, EPIPE);
    EXPECT_TRUE(is_open(pair.first.get()));
}

TEST(SocketShutdown, RefusesZeroAndNegativeDescriptors) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_shutdown(0), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_socket_shutdown(-9), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid socket fd:0\n"}, {1, kTag, "Invalid socket fd:-9\n"}}));
}

TEST(SocketShutdown, ReportsAFailureInHexadecimal) {
    const Descriptor fd = make_socket(AF_INET, SOCK_STREAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_shutdown(fd.get()), TAVO_SOCKET_CLOSE_FAILED);
    EXPECT_EQ(errno, ENOTCONN);
    static_assert(ENOTCONN == 0x6B);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Socket shutdown Failed. Errno: 0X6B.\n"}}));
}

TEST(SocketClose, ClosesTheDescriptorAndLogsIt) {
    const int fd = make_socket(AF_INET, SOCK_STREAM).release();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_close(fd), TAVO_SUCCESS);
    EXPECT_FALSE(is_open(fd));
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{3, kTag, "Socket Close is Success. iSocketFd= " + to_string(fd) + "\n"}}));
}

TEST(SocketClose, LeavesDescriptorZeroOpenAndSaysNothing) {
    ASSERT_TRUE(is_open(0));
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_close(0), TAVO_SUCCESS);
    EXPECT_TRUE(is_open(0));
    EXPECT_TRUE(log.lines().empty());
}

TEST(SocketClose, RefusesANegativeDescriptor) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_close(-1), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid socket descriptor. iSocketFd = -1\n"}}));
}

TEST(SocketClose, ReportsADescriptorThatIsNotOpen) {
    const int fd = closed_descriptor();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_close(fd), TAVO_SOCKET_CLOSE_FAILED);
    EXPECT_EQ(errno, EBADF);
    EXPECT_TRUE(logged_exactly(
        log.lines(),
        {{1, kTag, "Socket Close Failed. iSocketFd= " + to_string(fd) + ", Errno: " + to_string(EBADF) + ".\n"}}));
}

TEST(Socket, ALifeOfASocketLeavesNoDescriptorBehind) {
    const size_t before = count_descriptors();
    for (int round = 0; round < 20; ++round) {
        int listener = -1, client = -1;
        ASSERT_EQ(tavo_osal_socket_create(AF_INET, SOCK_STREAM, 0, &listener), TAVO_SUCCESS);
        ASSERT_EQ(tavo_osal_socket_create(AF_INET, SOCK_STREAM, 0, &client), TAVO_SUCCESS);
        ASSERT_EQ(tavo_osal_socket_bind(listener, "127.0.0.1", 0), TAVO_SUCCESS);
        ASSERT_EQ(tavo_osal_socket_listen(listener, 1), TAVO_SUCCESS);
        ASSERT_EQ(tavo_osal_socket_connect(client, "127.0.0.1", port_of(listener)), TAVO_SUCCESS);
        const int server = tavo_osal_socket_accept(listener, nullptr, nullptr);
        for (const int fd : {server, client, listener}) ASSERT_EQ(tavo_osal_socket_close(fd), TAVO_SUCCESS);
    }
    EXPECT_EQ(count_descriptors(), before);
}

}  // namespace
