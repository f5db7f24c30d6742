// Unix-domain sockets.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <string>
#include <vector>

#include "net/sockets.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/socket.h"

namespace {

using std::to_string;
using tavo::test::Descriptor;
using tavo::test::ExpectedLine;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::make_socket;
using tavo::test::PlatformHook;
using tavo::test::TemporaryDirectory;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_SOCKET";
constexpr size_t kLongestPath = 108;

bool exists(const std::string& path) {
    struct stat status = {};
    return lstat(path.c_str(), &status) == 0;
}

ExpectedLine bind_failed_line(int fd, int error) {
    return {1, kTag,
            "Error while binding to socket. iSocketFd=" + to_string(fd) + ", errno=" + to_string(error) + "\n"};
}

ExpectedLine send_failed_line(int error, int result, int size) {
    return {1, kTag,
            "Error in writing to unix domain socket. errno=" + to_string(error) + ", iRet=" + to_string(result) +
                ",  iSize=" + to_string(size) + "\n"};
}

// What reached the platform's bind() or sendto().
sockaddr_un g_seen;
socklen_t g_seen_length;
int g_seen_flags;

int note_bind(int, const sockaddr* address, socklen_t length) {
    memcpy(&g_seen, address, sizeof g_seen);
    g_seen_length = length;
    return 0;
}

ssize_t note_sendto(int, const void*, size_t size, int flags, const sockaddr* address, socklen_t length) {
    memcpy(&g_seen, address, sizeof g_seen);
    g_seen_length = length;
    g_seen_flags = flags;
    return static_cast<ssize_t>(size);
}

sockaddr_un address_of(const std::string& path) {
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    memcpy(address.sun_path, path.data(), path.size());
    return address;
}

// --- bind

TEST(UnixBind, BindsToAPathThatDoesNotExist) {
    const TemporaryDirectory directory;
    const std::string path = directory.path("socket");
    const Descriptor fd = make_socket(AF_UNIX, SOCK_DGRAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(fd.get(), path.c_str()), TAVO_SUCCESS);
    EXPECT_TRUE(log.lines().empty());
    EXPECT_TRUE(exists(path));
}

TEST(UnixBind, RemovesAStaleFileInAFailingFirstCallAndBindsInASecond) {
    const TemporaryDirectory directory;
    const std::string path = directory.path("socket");
    const Descriptor stale = make_socket(AF_UNIX, SOCK_DGRAM);
    ASSERT_EQ(tavo_osal_unix_domain_socket_bind(stale.get(), path.c_str()), TAVO_SUCCESS);

    const Descriptor fd = make_socket(AF_UNIX, SOCK_DGRAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(fd.get(), path.c_str()), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Unable to unlink pcUnixDomainFilePath.\n"}}));
    EXPECT_FALSE(exists(path));
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(fd.get(), path.c_str()), TAVO_SUCCESS);
    EXPECT_TRUE(exists(path));
    EXPECT_EQ(log.lines().size(), 1U);
}

TEST(UnixBind, RemovesAFileThatIsNoSocket) {
    const TemporaryDirectory directory;
    const std::string path = directory.path("file");
    std::ofstream(path) << "content";
    const Descriptor fd = make_socket(AF_UNIX, SOCK_DGRAM);
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(fd.get(), path.c_str()), TAVO_FAILURE);
    EXPECT_FALSE(exists(path));
}

TEST(UnixBind, ReportsAPathInADirectoryThatDoesNotExist) {
    const TemporaryDirectory directory;
    const Descriptor fd = make_socket(AF_UNIX, SOCK_DGRAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(fd.get(), directory.path("none/socket").c_str()), TAVO_FAILURE);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_TRUE(logged_exactly(log.lines(), {bind_failed_line(fd.get(), ENOENT)}));
}

TEST(UnixBind, BindsWhenUnlinkFailsForAnotherReason) {
    // A directory cannot be unlinked, so bind() is what refuses it.
    const TemporaryDirectory directory;
    const std::string path = directory.path("sub");
    ASSERT_EQ(mkdir(path.c_str(), 0700), 0);
    const Descriptor fd = make_socket(AF_UNIX, SOCK_DGRAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(fd.get(), path.c_str()), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {bind_failed_line(fd.get(), EADDRINUSE)}));
    EXPECT_TRUE(exists(path));
}

TEST(UnixBind, ReportsABadDescriptor) {
    const TemporaryDirectory directory;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(-4, directory.path("socket").c_str()), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {bind_failed_line(-4, EBADF)}));
}

TEST(UnixBind, PassesAClearedAddressOf110Bytes) {
    const PlatformHook hook(kLibrary, "bind", note_bind);
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(7, "/nowhere/at/all"), TAVO_SUCCESS);
    EXPECT_EQ(g_seen_length, 110U);
    const sockaddr_un expected = address_of("/nowhere/at/all");
    EXPECT_EQ(memcmp(&g_seen, &expected, sizeof expected), 0);
}

TEST(UnixBind, TakesThePathThatFillsTheAddress) {
    const TemporaryDirectory directory;
    for (const size_t length : {kLongestPath - 1, kLongestPath}) {
        const std::string path = directory.path_of_length(length);
        const Descriptor fd = make_socket(AF_UNIX, SOCK_DGRAM);
        EXPECT_EQ(tavo_osal_unix_domain_socket_bind(fd.get(), path.c_str()), TAVO_SUCCESS) << length;
        EXPECT_TRUE(exists(path)) << length;
    }
}

TEST(UnixBind, FailsForAPathThatIsLongerThanTheAddress) {
    const TemporaryDirectory directory;
    static bool called;
    called = false;
    const PlatformHook hook(
        kLibrary, "bind", +[](int, const sockaddr*, socklen_t) {
            called = true;
            return 0;
        });
    for (const size_t length : {kLongestPath + 1, size_t{110}, size_t{111}, size_t{4000}, size_t{1000000}}) {
        const LogCapture log;
        EXPECT_EQ(tavo_osal_unix_domain_socket_bind(7, directory.path_of_length(length).c_str()), TAVO_FAILURE);
        EXPECT_EQ(errno, ENAMETOOLONG);
        EXPECT_TRUE(logged_exactly(log.lines(), {bind_failed_line(7, ENAMETOOLONG)})) << length;
    }
    EXPECT_FALSE(called);
}

TEST(UnixBind, RemovesAFileOfAnyNameInTheFirstCall) {
    const TemporaryDirectory directory;
    const std::string path = directory.path_of_length(kLongestPath + 40);
    std::ofstream(path) << "content";
    const Descriptor fd = make_socket(AF_UNIX, SOCK_DGRAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(fd.get(), path.c_str()), TAVO_FAILURE);
    EXPECT_FALSE(exists(path));
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(fd.get(), path.c_str()), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Unable to unlink pcUnixDomainFilePath.\n"},
                                             bind_failed_line(fd.get(), ENAMETOOLONG)}));
}

TEST(UnixBind, RefusesANullPath) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_bind(7, nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameter\n"}}));
}

// --- send

class UnixSend : public testing::Test {
protected:
    UnixSend() : receiver_(make_socket(AF_UNIX, SOCK_DGRAM)), sender_(make_socket(AF_UNIX, SOCK_DGRAM)) {
        EXPECT_EQ(tavo_osal_unix_domain_socket_bind(receiver_.get(), path().c_str()), TAVO_SUCCESS);
    }

    std::string path() const { return directory_.path("receiver"); }

    TemporaryDirectory directory_;
    Descriptor receiver_;
    Descriptor sender_;
};

TEST_F(UnixSend, AnswersWithTheLengthAndLogsNothing) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_sendto(sender_.get(), path().c_str(), "message", 7), 7);
    EXPECT_TRUE(log.lines().empty());
    char received[16] = {};
    EXPECT_EQ(recv(receiver_.get(), received, sizeof received, 0), 7);
    EXPECT_STREQ(received, "message");
}

TEST_F(UnixSend, SendsAnEmptyDatagram) {
    EXPECT_EQ(tavo_osal_unix_domain_socket_sendto(sender_.get(), path().c_str(), "", 0), 0);
    char received = 0;
    EXPECT_EQ(recv(receiver_.get(), &received, 1, MSG_DONTWAIT), 0);
}

TEST_F(UnixSend, ReachesAPathThatFillsTheAddress) {
    const std::string longest = directory_.path_of_length(kLongestPath);
    const Descriptor receiver = make_socket(AF_UNIX, SOCK_DGRAM);
    ASSERT_EQ(tavo_osal_unix_domain_socket_bind(receiver.get(), longest.c_str()), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_unix_domain_socket_sendto(sender_.get(), longest.c_str(), "x", 1), 1);
}

TEST_F(UnixSend, PassesAClearedAddressOf110BytesAndNoFlags) {
    const PlatformHook hook(kLibrary, "sendto", note_sendto);
    g_seen_flags = -1;
    EXPECT_EQ(tavo_osal_unix_domain_socket_sendto(7, "/nowhere", "abc", 3), 3);
    EXPECT_EQ(g_seen_length, 110U);
    EXPECT_EQ(g_seen_flags, 0);
    const sockaddr_un expected = address_of("/nowhere");
    EXPECT_EQ(memcmp(&g_seen, &expected, sizeof expected), 0);
}

TEST_F(UnixSend, ReportsThatNobodyReceives) {
    receiver_.reset();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_sendto(sender_.get(), path().c_str(), "message", 7),
              TAVO_SOCKET_SEND_FAILED);
    EXPECT_EQ(errno, ECONNREFUSED);
    EXPECT_TRUE(logged_exactly(log.lines(), {send_failed_line(ECONNREFUSED, -1, 7)}));
}

TEST_F(UnixSend, ReportsFewerBytesThanAsked) {
    const PlatformHook hook(
        kLibrary, "sendto", +[](int, const void*, size_t, int, const sockaddr*, socklen_t) -> ssize_t { return 3; });
    const LogCapture log;
    errno = EDOM;  // a short send sets none, so what was there is logged
    EXPECT_EQ(tavo_osal_unix_domain_socket_sendto(sender_.get(), path().c_str(), "message", 7),
              TAVO_SOCKET_SEND_FAILED);
    EXPECT_TRUE(logged_exactly(log.lines(), {send_failed_line(EDOM, 3, 7)}));
}

TEST_F(UnixSend, FailsForALengthThatNoCountEquals) {
    const PlatformHook hook(
        kLibrary, "sendto", +[](int, const void*, size_t, int, const sockaddr*, socklen_t) -> ssize_t {
            errno = EMSGSIZE;
            return -1;
        });
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_sendto(sender_.get(), path().c_str(), "message", 0xFFFFFFFFU),
              TAVO_SOCKET_SEND_FAILED);
    EXPECT_TRUE(logged_exactly(log.lines(), {send_failed_line(EMSGSIZE, -1, -1)}));
}

TEST_F(UnixSend, FailsForAPathThatIsLongerThanTheAddress) {
    for (const size_t length : {kLongestPath + 1, size_t{110}, size_t{111}, size_t{1000000}}) {
        const LogCapture log;
        EXPECT_EQ(
            tavo_osal_unix_domain_socket_sendto(sender_.get(), directory_.path_of_length(length).c_str(), "abc", 3),
            TAVO_SOCKET_SEND_FAILED);
        EXPECT_TRUE(logged_exactly(log.lines(), {send_failed_line(ENAMETOOLONG, -1, 3)})) << length;
    }
}

TEST_F(UnixSend, RefusesANullPath) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_unix_domain_socket_sendto(sender_.get(), nullptr, "abc", 3), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Parameter passed is null.\n"}}));
}

}  // namespace
