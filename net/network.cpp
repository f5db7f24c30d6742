#include "tavo_osal/network.h"

#include <net/if.h>
#include <sys/ioctl.h>

#include <array>
#include <cstdio>
#include <cstring>

#include "net/socket_call.h"

using tavo::net::invalid_descriptor;
using tavo::net::kTag;

namespace {

constexpr size_t kShortestIpv4 = 7;  // 1.2.3.4
constexpr size_t kLongestIpv4 = 15;  // 255.255.255.255
constexpr unsigned int kHighest = 255;

using Segments = std::array<unsigned int, 4>;

// Scans the four numbers of a text whose length was checked; false unless they are all there is.
bool scan(const char* text, Segments& segments) {
    char rest[kLongestIpv4 + 1] = "";
    const int items = sscanf(text, "%3u.%3u.%3u.%3u%15s", &segments[0], &segments[1], &segments[2], &segments[3], rest);
    return items == 4 && rest[0] == '\0';
}

// Networks and broadcast addresses are told by this one rule, as if every network part had 8 bits.
bool has_host_octets(const Segments& segments, unsigned int value) {
    return segments[0] > 0 && segments[1] == value && segments[2] == value && segments[3] == value;
}

}  // namespace

TAVO_Status tavo_osal_socket_set_nw_iface_state(int iSocketFd, const TAVO_CHAR* pcInterfaceName, int iState) {
    if (invalid_descriptor(iSocketFd)) return TAVO_INVALID_PARAM;
    if (pcInterfaceName == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Null network interface name passed\n");
        return TAVO_INVALID_PARAM;
    }
    ifreq request = {};
    memcpy(request.ifr_name, pcInterfaceName, strnlen(pcInterfaceName, sizeof request.ifr_name));
    if (ioctl(iSocketFd, SIOCGIFFLAGS, &request) < 0) {
        const int error = errno;
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Error in bringing getting the n/w interface(%s) flags(%d -> %s)\n",
                 pcInterfaceName, error, strerror(error));
        return TAVO_FAILURE;
    }
    const int flags = iState != 0 ? request.ifr_flags | IFF_UP : request.ifr_flags & ~IFF_UP;
    request.ifr_flags = static_cast<short>(flags);
    if (ioctl(iSocketFd, SIOCSIFFLAGS, &request) < 0) {
        const int error = errno;
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Error in bringing %s the n/w interface(%s)(%d -> %s)\n",
                 iState != 0 ? "up" : "down", pcInterfaceName, error, strerror(error));
        return TAVO_FAILURE;
    }
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_validate_ipv4(const TAVO_CHAR* pcIpAddress) {
    if (pcIpAddress == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "NULL IpAddress passed\n");
        return TAVO_INVALID_PARAM;
    }
    if (strcmp(pcIpAddress, "0.0.0.0") == 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "A non-routable meta-address designating invalid target:%s\n", pcIpAddress);
        return TAVO_FAILURE;
    }
    const size_t length = strlen(pcIpAddress);
    if (length < kShortestIpv4 || length > kLongestIpv4) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid length of IP address(Correct range 7-15 including dots):%s\n",
                 pcIpAddress);
        return TAVO_FAILURE;
    }
    Segments segments = {};
    if (!scan(pcIpAddress, segments)) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid IPv4 address, more or less than 4 segments:%s\n", pcIpAddress);
        return TAVO_FAILURE;
    }
    for (const unsigned int segment : segments) {
        if (segment > kHighest) {
            TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid range within IP:%s, error segment:%d\n", pcIpAddress,
                     static_cast<int>(segment));
            return TAVO_FAILURE;
        }
    }
    if (has_host_octets(segments, 0)) {
        TAVO_LOG(kTag, TAVO_LOG_WARNING,
                 "Encountered a Network address(host id  portion bits of an IP address are zero):%s\n", pcIpAddress);
    }
    if (has_host_octets(segments, kHighest)) {
        TAVO_LOG(kTag, TAVO_LOG_WARNING,
                 "Encountered a Broadcast address(host id portion bits of an IP address are one):%s\n", pcIpAddress);
    }
    return TAVO_SUCCESS;
}
