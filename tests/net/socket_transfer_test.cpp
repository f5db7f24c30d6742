// Sending and receiving.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/un.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
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
using tavo::test::ExpectedLine;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::make_socket;
using tavo::test::Pair;
using tavo::test::PlatformHook;
using tavo::test::port_of;
using tavo::test::socket_pair;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_SOCKET";

ExpectedLine sent_line(int count) {
    return {4, kTag, "Socket Send is Success. iSendBytes = " + to_string(count) + "\n"};
}
ExpectedLine received_line(int count) {
    return {4, kTag, "Socket Recieve is Success. iReadBytes = " + to_string(count) + "\n"};
}
ExpectedLine receive_failed_line(int error) {
    return {1, kTag, "Socket Recieve Failed. Errno: " + to_string(error) + ".\n"};
}

// --- send

TEST(SocketSend, AnswersWithTheBytesSent) {
    const Pair pair = tavo::test::tcp_connection();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_send(pair.first.get(), "hello", 5, 0), 5);
    EXPECT_TRUE(logged_exactly(log.lines(), {sent_line(5)}));
    char received[8] = {};
    EXPECT_EQ(recv(pair.second.get(), received, sizeof received, 0), 5);
    EXPECT_STREQ(received, "hello");
}

TEST(SocketSend, AnswersWithFewerBytesWhenThereIsNoRoom) {
    const Pair pair = tavo::test::tcp_connection();
    tavo::test::set_non_blocking(pair.first.get());
    const std::vector<char> much(64U << 20U);
    const LogCapture log;
    const int count = tavo_osal_socket_send(pair.first.get(), much.data(), static_cast<unsigned>(much.size()), 0);
    EXPECT_GT(count, 0);
    EXPECT_LT(count, static_cast<int>(much.size()));
    EXPECT_TRUE(logged_exactly(log.lines(), {sent_line(count)}));
}

TEST(SocketSend, PassesTheFlagsOn) {
    const Pair pair = socket_pair(SOCK_DGRAM);
    tavo::test::set_non_blocking(pair.first.get());
    static int seen;
    const PlatformHook hook(
        kLibrary, "send", +[](int, const void*, size_t length, int flags) {
            seen = flags;
            return static_cast<ssize_t>(length);
        });
    EXPECT_EQ(tavo_osal_socket_send(pair.first.get(), "x", 1, MSG_NOSIGNAL | MSG_OOB), 1);
    EXPECT_EQ(seen, MSG_NOSIGNAL | MSG_OOB);
}

TEST(SocketSend, ReportsAPeerThatIsGone) {
    Pair pair = socket_pair(SOCK_STREAM);
    pair.second.reset();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_send(pair.first.get(), "x", 1, MSG_NOSIGNAL), -1);
    EXPECT_EQ(errno, EPIPE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Socket Send Failed. Errno: " + to_string(EPIPE) + ".\n"}}));
}

TEST(SocketSend, LeavesABadBufferToThePlatform) {
    const Pair pair = socket_pair(SOCK_STREAM);
    EXPECT_EQ(tavo_osal_socket_send(pair.first.get(), nullptr, 1, 0), -1);
    EXPECT_EQ(errno, EFAULT);
    EXPECT_EQ(tavo_osal_socket_recieve_without_retry(-1, nullptr, 1, 0), -1);
    EXPECT_EQ(errno, EBADF);
}

// --- both receives

using Receive = int (*)(int, void*, unsigned int, int);

struct ReceiveOperation {
    const char* name;
    Receive call;
};

class SocketRecieve : public testing::TestWithParam<ReceiveOperation> {};

TEST_P(SocketRecieve, AnswersWithTheBytesReceived) {
    const Pair pair = tavo::test::tcp_connection();
    ASSERT_EQ(send(pair.first.get(), "hello", 5, 0), 5);
    const LogCapture log;
    char received[8] = {};
    EXPECT_EQ(GetParam().call(pair.second.get(), received, sizeof received, 0), 5);
    EXPECT_STREQ(received, "hello");
    EXPECT_TRUE(logged_exactly(log.lines(), {received_line(5)}));
}

TEST_P(SocketRecieve, AnswersWithZeroWhenThePeerHasClosed) {
    Pair pair = tavo::test::tcp_connection();
    pair.first.reset();
    const LogCapture log;
    char received = 'k';
    EXPECT_EQ(GetParam().call(pair.second.get(), &received, 1, 0), 0);
    EXPECT_EQ(received, 'k');
    EXPECT_TRUE(logged_exactly(log.lines(), {received_line(0)}));
}

TEST_P(SocketRecieve, PassesTheFlagsOn) {
    const Pair pair = socket_pair(SOCK_STREAM);
    ASSERT_EQ(send(pair.first.get(), "p", 1, 0), 1);
    char received[2] = {};
    EXPECT_EQ(GetParam().call(pair.second.get(), &received[0], 1, MSG_PEEK), 1);
    EXPECT_EQ(GetParam().call(pair.second.get(), &received[1], 1, MSG_DONTWAIT), 1);
    EXPECT_EQ(received[0], 'p');
    EXPECT_EQ(received[1], 'p');
}

TEST_P(SocketRecieve, ReportsABadDescriptorOnce) {
    const int fd = closed_descriptor();
    const LogCapture log;
    char received = 0;
    EXPECT_EQ(GetParam().call(fd, &received, 1, 0), -1);
    EXPECT_EQ(errno, EBADF);
    EXPECT_TRUE(logged_exactly(log.lines(), {receive_failed_line(EBADF)}));
}

INSTANTIATE_TEST_SUITE_P(Operations, SocketRecieve,
                         testing::Values(ReceiveOperation{"recieve", tavo_osal_socket_recieve},
                                         ReceiveOperation{"recieve_without_retry",
                                                          tavo_osal_socket_recieve_without_retry}),
                         [](const auto& operation) { return operation.param.name; });

// A recv() that goes through a script: errno values, and a count where the value is negative.
std::vector<int> g_script;
size_t g_calls;

ssize_t scripted_recv(int, void*, size_t, int) {
    const int step = g_script.at(g_calls++);
    if (step < 0) return -step;
    errno = step;
    return -1;
}

TEST(SocketRecieveRetry, TriesThreeTimesOnASocketWithoutData) {
    const Pair pair = socket_pair(SOCK_STREAM);
    tavo::test::set_non_blocking(pair.first.get());
    const LogCapture log;
    char received = 0;
    EXPECT_EQ(tavo_osal_socket_recieve(pair.first.get(), &received, 1, 0), -1);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {receive_failed_line(EAGAIN), receive_failed_line(EAGAIN), receive_failed_line(EAGAIN)}));
}

TEST(SocketRecieveRetry, MakesExactlyThreeCalls) {
    g_script.assign(10, EAGAIN);
    g_calls = 0;
    const PlatformHook hook(kLibrary, "recv", scripted_recv);
    EXPECT_EQ(tavo_osal_socket_recieve(7, nullptr, 0, 0), -1);
    EXPECT_EQ(g_calls, 3U);
}

TEST(SocketRecieveRetry, AnswersWithWhatALaterAttemptReceives) {
    g_script = {EAGAIN, EAGAIN, -9};
    g_calls = 0;
    const PlatformHook hook(kLibrary, "recv", scripted_recv);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_recieve(7, nullptr, 0, 0), 9);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {receive_failed_line(EAGAIN), receive_failed_line(EAGAIN), received_line(9)}));
}

TEST(SocketRecieveRetry, EndsAtTheFirstOtherFailure) {
    g_script = {EAGAIN, ECONNRESET, -9};
    g_calls = 0;
    const PlatformHook hook(kLibrary, "recv", scripted_recv);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_recieve(7, nullptr, 0, 0), -1);
    EXPECT_EQ(errno, ECONNRESET);
    EXPECT_TRUE(logged_exactly(log.lines(), {receive_failed_line(EAGAIN), receive_failed_line(ECONNRESET)}));
}

TEST(SocketRecieveRetry, RetriesWhenItsMessagesAreFilteredOut) {
    g_script = {EAGAIN, -1};
    g_calls = 0;
    const PlatformHook hook(kLibrary, "recv", scripted_recv);
    const LogCapture log(0);
    EXPECT_EQ(tavo_osal_socket_recieve(7, nullptr, 0, 0), 1);
    EXPECT_TRUE(log.lines().empty());
}

TEST(SocketRecieveWithoutRetry, MakesOneCall) {
    g_script = {EAGAIN, -1};
    g_calls = 0;
    const PlatformHook hook(kLibrary, "recv", scripted_recv);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_recieve_without_retry(7, nullptr, 0, 0), -1);
    EXPECT_EQ(g_calls, 1U);
    EXPECT_TRUE(logged_exactly(log.lines(), {receive_failed_line(EAGAIN)}));
}

// --- datagrams

TEST(SocketSendTo, SendsADatagramToADottedAddress) {
    const Descriptor receiver = tavo::test::udp_receiver();
    const Descriptor sender = make_socket(AF_INET, SOCK_DGRAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_sendto(sender.get(), "127.0.0.1", port_of(receiver.get()), "datagram", 8, 0), 8);
    EXPECT_TRUE(logged_exactly(log.lines(), {sent_line(8)}));
    char received[16] = {};
    EXPECT_EQ(recv(receiver.get(), received, sizeof received, 0), 8);
    EXPECT_STREQ(received, "datagram");
}

TEST(SocketSendTo, PassesAClearedAddressOfSixteenBytesAndTheFlags) {
    static sockaddr_in seen;
    static socklen_t seen_length;
    static int seen_flags;
    const PlatformHook hook(
        kLibrary, "sendto",
        +[](int, const void*, size_t length, int flags, const sockaddr* address, socklen_t address_length) {
            memcpy(&seen, address, sizeof seen);
            seen_length = address_length;
            seen_flags = flags;
            return static_cast<ssize_t>(length);
        });
    EXPECT_EQ(tavo_osal_socket_sendto(7, "10.1.2.3", 0x11234, "abc", 3, MSG_DONTROUTE), 3);
    sockaddr_in expected = {};
    expected.sin_family = AF_INET;
    expected.sin_port = htons(0x1234);
    expected.sin_addr.s_addr = inet_addr("10.1.2.3");
    EXPECT_EQ(memcmp(&seen, &expected, sizeof seen), 0);
    EXPECT_EQ(seen_length, 16U);
    EXPECT_EQ(seen_flags, MSG_DONTROUTE);
}

TEST(SocketSendTo, ReportsATextThatIsNoAddress) {
    const Descriptor sender = make_socket(AF_INET, SOCK_DGRAM);
    const LogCapture log;
    errno = EDOM;  // the conversion sets none, so what was there is logged
    EXPECT_EQ(tavo_osal_socket_sendto(sender.get(), "127.0.0.256", 1, "x", 1, 0), -1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "inet_aton() failed. Errno: " + to_string(EDOM) + ".\n"}}));
}

TEST(SocketSendTo, SurvivesAVeryLongText) {
    const Descriptor sender = make_socket(AF_INET, SOCK_DGRAM);
    const std::string text(100000, '1');
    EXPECT_EQ(tavo_osal_socket_sendto(sender.get(), text.c_str(), 1, "x", 1, 0), -1);
}

TEST(SocketSendTo, RefusesANullAddress) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_sendto(7, nullptr, 1, "x", 1, 0), -1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameter\n"}}));
}

TEST(SocketSendTo, ReportsAFailureWithoutAFullStop) {
    const Descriptor sender = make_socket(AF_INET, SOCK_DGRAM);
    const std::vector<char> much(70000);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_sendto(sender.get(), "127.0.0.1", 9, much.data(), 70000, 0), -1);
    EXPECT_EQ(errno, EMSGSIZE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Socket Send Failed. Errno: " + to_string(EMSGSIZE) + "\n"}}));
}

// The 16 bytes that callers provide for an address text, between bytes that must stay.
struct AddressBuffer {
    std::array<char, 48> bytes;
    AddressBuffer() { bytes.fill('#'); }
    char* text() { return bytes.data() + 16; }
    bool untouched_around() const {
        const auto kept = [](char byte) { return byte == '#'; };
        return std::all_of(bytes.begin(), bytes.begin() + 16, kept) &&
               std::all_of(bytes.begin() + 32, bytes.end(), kept);
    }
    bool untouched() const {
        return std::all_of(bytes.begin(), bytes.end(), [](char byte) { return byte == '#'; });
    }
};

TEST(SocketReceiveFrom, AnswersWithTheDatagramAndItsSender) {
    const Descriptor receiver = tavo::test::udp_receiver();
    const Descriptor sender = tavo::test::udp_receiver();
    const unsigned port = port_of(sender.get());
    ASSERT_EQ(tavo_osal_socket_sendto(sender.get(), "127.0.0.1", port_of(receiver.get()), "datagram", 8, 0), 8);
    const LogCapture log;
    char received[16] = {};
    AddressBuffer address;
    unsigned from = 0;
    EXPECT_EQ(tavo_osal_socket_receivefrom(receiver.get(), received, sizeof received, 0, address.text(), &from), 8);
    EXPECT_STREQ(received, "datagram");
    EXPECT_STREQ(address.text(), "127.0.0.1");
    EXPECT_TRUE(address.untouched_around());
    EXPECT_EQ(from, port);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{4, kTag, "Received packet from 127.0.0.1:" + to_string(port) + ". iReadBytes = 8\n\n"}}));
}

TEST(SocketReceiveFrom, FitsTheLongestAddressIntoSixteenBytes) {
    static socklen_t room;
    const PlatformHook hook(
        kLibrary, "recvfrom", +[](int, void*, size_t, int, sockaddr* address, socklen_t* length) -> ssize_t {
            room = *length;
            sockaddr_in sender = {};
            sender.sin_family = AF_INET;
            sender.sin_port = htons(65535);
            sender.sin_addr.s_addr = INADDR_NONE;
            memcpy(address, &sender, sizeof sender);
            return 3;
        });
    const LogCapture log;
    AddressBuffer address;
    unsigned from = 0;
    char received[3];
    EXPECT_EQ(tavo_osal_socket_receivefrom(7, received, 3, 0, address.text(), &from), 3);
    EXPECT_EQ(room, 16U);
    EXPECT_STREQ(address.text(), "255.255.255.255");
    EXPECT_TRUE(address.untouched_around());
    EXPECT_EQ(from, 65535U);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{4, kTag, "Received packet from 255.255.255.255:65535. iReadBytes = 3\n\n"}}));
}

TEST(SocketReceiveFrom, LeavesTheOutputsAloneWhenItFails) {
    const Descriptor receiver = tavo::test::udp_receiver();
    const LogCapture log;
    char received = 0;
    AddressBuffer address;
    unsigned from = 4711;
    EXPECT_EQ(tavo_osal_socket_receivefrom(receiver.get(), &received, 1, MSG_DONTWAIT, address.text(), &from), -1);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_TRUE(address.untouched());
    EXPECT_EQ(from, 4711U);
    EXPECT_TRUE(logged_exactly(log.lines(), {receive_failed_line(EAGAIN)}));
}

TEST(SocketReceiveFrom, RefusesNullOutputsAndLeavesTheDatagramThere) {
    const Descriptor receiver = tavo::test::udp_receiver();
    const Descriptor sender = make_socket(AF_INET, SOCK_DGRAM);
    ASSERT_EQ(tavo_osal_socket_sendto(sender.get(), "127.0.0.1", port_of(receiver.get()), "x", 1, 0), 1);
    const LogCapture log;
    char received = 0;
    AddressBuffer address;
    unsigned from = 4711;
    EXPECT_EQ(tavo_osal_socket_receivefrom(receiver.get(), &received, 1, 0, nullptr, &from), -1);
    EXPECT_EQ(tavo_osal_socket_receivefrom(receiver.get(), &received, 1, 0, address.text(), nullptr), -1);
    EXPECT_TRUE(address.untouched());
    EXPECT_EQ(from, 4711U);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameter\n"}, {1, kTag, "Invalid parameter\n"}}));
    EXPECT_EQ(recv(receiver.get(), &received, 1, MSG_DONTWAIT), 1);
}

TEST(SocketReceiveFrom, GivesNoSenderOnAConnection) {
    const Pair pair = tavo::test::tcp_connection();
    ASSERT_EQ(send(pair.first.get(), "x", 1, 0), 1);
    char received = 0;
    AddressBuffer address;
    unsigned from = 4711;
    EXPECT_EQ(tavo_osal_socket_receivefrom(pair.second.get(), &received, 1, 0, address.text(), &from), 1);
    EXPECT_STREQ(address.text(), "0.0.0.0");
    EXPECT_EQ(from, 0U);
}

TEST(SocketReceiveFrom, KeepsWithinSixteenBytesWhateverFamilyTheSenderHas) {
    const tavo::test::TemporaryDirectory directory;
    const Pair pair = socket_pair(SOCK_DGRAM);
    sockaddr_un long_name = {};
    long_name.sun_family = AF_UNIX;
    const std::string path = directory.path_of_length(sizeof long_name.sun_path);
    memcpy(long_name.sun_path, path.data(), path.size());
    ASSERT_EQ(bind(pair.first.get(), reinterpret_cast<sockaddr*>(&long_name), sizeof long_name), 0);
    ASSERT_EQ(send(pair.first.get(), "x", 1, 0), 1);
    char received = 0;
    AddressBuffer address;
    unsigned from = 0;
    EXPECT_EQ(tavo_osal_socket_receivefrom(pair.second.get(), &received, 1, 0, address.text(), &from), 1);
    EXPECT_TRUE(address.untouched_around());
    EXPECT_LE(strlen(address.text()), 15U);
}

}  // namespace
