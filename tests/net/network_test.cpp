// Bringing interfaces up and down.
#include "tavo_osal/network.h"

#include <gtest/gtest.h>
#include <net/if.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "net/private_network.h"
#include "net/sockets.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/socket.h"

namespace {

using std::to_string;
using tavo::test::closed_descriptor;
using tavo::test::Descriptor;
using tavo::test::interface_flags;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::make_socket;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_SOCKET";

// " -> " and what follows the name in the messages about failed requests.
std::string error_text(int error) { return to_string(error) + " -> " + strerror(error) + ")\n"; }

TEST(InterfaceState, BringsAnInterfaceUpAndDown) {
    TAVO_ENTER_PRIVATE_NETWORK();
    const Descriptor fd = make_socket(AF_INET, SOCK_DGRAM);
    ASSERT_EQ(interface_flags("lo") & IFF_UP, 0);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), "lo", 1), TAVO_SUCCESS);
    EXPECT_NE(interface_flags("lo") & IFF_UP, 0);
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), "lo", 0), TAVO_SUCCESS);
    EXPECT_EQ(interface_flags("lo") & IFF_UP, 0);
    EXPECT_TRUE(log.lines().empty());
}

TEST(InterfaceState, DecidesWhetherTrafficPasses) {
    TAVO_ENTER_PRIVATE_NETWORK();
    const Descriptor fd = make_socket(AF_INET, SOCK_DGRAM);
    EXPECT_EQ(tavo_osal_socket_sendto(fd.get(), "127.0.0.1", 9, "x", 1, 0), -1);
    EXPECT_EQ(errno, ENETUNREACH);
    ASSERT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), "lo", 1), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_socket_sendto(fd.get(), "127.0.0.1", 9, "x", 1, 0), 1);
}

TEST(InterfaceState, TakesAnyStateButZeroForUp) {
    TAVO_ENTER_PRIVATE_NETWORK();
    const Descriptor fd = make_socket(AF_INET, SOCK_DGRAM);
    for (const int state : {-1, 2, INT32_MIN}) {
        ASSERT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), "lo", 0), TAVO_SUCCESS);
        EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), "lo", state), TAVO_SUCCESS);
        EXPECT_NE(interface_flags("lo") & IFF_UP, 0) << state;
    }
}

TEST(InterfaceState, MayBeSetToWhatItIs) {
    TAVO_ENTER_PRIVATE_NETWORK();
    const Descriptor fd = make_socket(AF_INET, SOCK_DGRAM);
    for (const int state : {0, 0, 1, 1}) {
        EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), "lo", state), TAVO_SUCCESS);
        EXPECT_EQ((interface_flags("lo") & IFF_UP) != 0, state != 0);
    }
}

TEST(InterfaceState, RefusesZeroAndNegativeDescriptors) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(0, "lo", 1), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(-1, nullptr, 1), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid socket fd:0\n"}, {1, kTag, "Invalid socket fd:-1\n"}}));
}

TEST(InterfaceState, RefusesANullName) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(7, nullptr, 1), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Null network interface name passed\n"}}));
}

TEST(InterfaceState, ReportsAnInterfaceThatDoesNotExist) {
    const Descriptor fd = make_socket(AF_INET, SOCK_DGRAM);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), "no-such-if", 1), TAVO_FAILURE);
    EXPECT_EQ(errno, ENODEV);
    EXPECT_TRUE(logged_exactly(
        log.lines(),
        {{1, kTag, "Error in bringing getting the n/w interface(no-such-if) flags(" + error_text(ENODEV)}}));
}

TEST(InterfaceState, ReportsADescriptorThatIsNotOpen) {
    const int fd = closed_descriptor();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(fd, "lo", 0), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, kTag, "Error in bringing getting the n/w interface(lo) flags(" + error_text(EBADF)}}));
}

TEST(InterfaceState, ReportsThatTheFlagsMayNotBeWritten) {
    TAVO_ENTER_PRIVATE_NETWORK();
    const Descriptor fd = make_socket(AF_INET, SOCK_DGRAM);
    const LogCapture log;
    std::thread([&] {
        tavo::test::give_up_network_rights();
        EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), "lo", 1), TAVO_FAILURE);
        EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), "lo", 0), TAVO_FAILURE);
    }).join();
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Error in bringing up the n/w interface(lo)(" + error_text(EPERM)},
                                     {1, kTag, "Error in bringing down the n/w interface(lo)(" + error_text(EPERM)}}));
    EXPECT_EQ(interface_flags("lo") & IFF_UP, 0);
}

TEST(InterfaceState, CutsALongNameAtItsFieldAndLogsItWhole) {
    const Descriptor fd = make_socket(AF_INET, SOCK_DGRAM);
    const std::string name(100000, 'n');
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(fd.get(), name.c_str(), 1), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(
        log.lines(),
        {{1, kTag, "Error in bringing getting the n/w interface(" + name + ") flags(" + error_text(ENODEV)}}));
}

// The requests that reached the platform, answered from one set of flags.
struct SeenRequest {
    unsigned long code;
    ifreq request;
};
std::vector<SeenRequest> g_requests;
short g_flags;
unsigned long g_refused;  // the request that fails; 0 for none

int answer_request(int, unsigned long code, ...) {
    va_list rest;
    va_start(rest, code);
    auto* request = va_arg(rest, ifreq*);
    va_end(rest);
    g_requests.push_back({code, *request});
    if (code == SIOCGIFFLAGS) request->ifr_flags = g_flags;
    if (code != g_refused) return 0;
    errno = EIO;
    return -1;
}

TEST(InterfaceState, WritesTheOtherFlagsBackAsRead) {
    const PlatformHook hook(kLibrary, "ioctl", answer_request);
    g_refused = 0;
    const struct {
        short read;
        int state;
        short written;
    } cases[] = {
        {IFF_BROADCAST | IFF_MULTICAST, 1, IFF_UP | IFF_BROADCAST | IFF_MULTICAST},
        {IFF_UP | IFF_PROMISC, 0, IFF_PROMISC},
        {static_cast<short>(0xFFFF), 0, static_cast<short>(0xFFFE)},
        {static_cast<short>(0xFFFF), 7, static_cast<short>(0xFFFF)},
        {0, 0, 0},
    };
    for (const auto& each : cases) {
        g_requests.clear();
        g_flags = each.read;
        EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(7, "eth0", each.state), TAVO_SUCCESS);
        ASSERT_EQ(g_requests.size(), 2U);
        EXPECT_EQ(g_requests[0].code, static_cast<unsigned long>(SIOCGIFFLAGS));
        EXPECT_EQ(g_requests[1].code, static_cast<unsigned long>(SIOCSIFFLAGS));
        EXPECT_STREQ(g_requests[0].request.ifr_name, "eth0");
        EXPECT_STREQ(g_requests[1].request.ifr_name, "eth0");
        EXPECT_EQ(g_requests[1].request.ifr_flags, each.written);
    }
}

std::string bytes_of(const ifreq& request) { return {reinterpret_cast<const char*>(&request), sizeof request}; }

TEST(InterfaceState, ClearsTheRequestAndCopiesSixteenBytesAtMost) {
    const PlatformHook hook(kLibrary, "ioctl", answer_request);
    g_refused = 0;
    g_requests.clear();
    tavo_osal_socket_set_nw_iface_state(7, "0123456789abcdefXYZ", 1);
    tavo_osal_socket_set_nw_iface_state(7, "w", 1);
    ASSERT_EQ(g_requests.size(), 4U);
    ifreq expected = {};
    memcpy(expected.ifr_name, "0123456789abcdef", 16);
    EXPECT_EQ(bytes_of(g_requests[0].request), bytes_of(expected));
    expected = {};
    expected.ifr_name[0] = 'w';
    EXPECT_EQ(bytes_of(g_requests[2].request), bytes_of(expected));
}

TEST(InterfaceState, ReportsWhateverRefusesTheFlags) {
    const PlatformHook hook(kLibrary, "ioctl", answer_request);
    g_refused = SIOCSIFFLAGS;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(7, "eth0", 1), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(7, "eth0", 0), TAVO_FAILURE);
    EXPECT_EQ(errno, EIO);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{1, kTag, "Error in bringing up the n/w interface(eth0)(" + error_text(EIO)},
                                     {1, kTag, "Error in bringing down the n/w interface(eth0)(" + error_text(EIO)}}));
}

TEST(InterfaceState, WritesNothingWhenTheFlagsCannotBeRead) {
    const PlatformHook hook(kLibrary, "ioctl", answer_request);
    g_refused = SIOCGIFFLAGS;
    g_requests.clear();
    EXPECT_EQ(tavo_osal_socket_set_nw_iface_state(7, "eth0", 1), TAVO_FAILURE);
    ASSERT_EQ(g_requests.size(), 1U);
    EXPECT_EQ(g_requests[0].code, static_cast<unsigned long>(SIOCGIFFLAGS));
}

}  // namespace
