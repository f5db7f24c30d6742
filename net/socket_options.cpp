// Socket options.
#include <netinet/tcp.h>
#include <sys/time.h>

#include "net/socket_call.h"
#include "tavo_osal/socket.h"

using tavo::net::failed;
using tavo::net::invalid_descriptor;
using tavo::net::kTag;
using tavo::net::missing;
using tavo::net::status_of;

namespace {

template <typename Value>
int set_option(int descriptor, int level, int name, const Value& value) {
    return setsockopt(descriptor, level, name, &value, sizeof value);
}

timeval duration(unsigned int milliseconds) {
    timeval time = {};
    time.tv_sec = static_cast<time_t>(milliseconds / 1000);
    time.tv_usec = static_cast<suseconds_t>(milliseconds % 1000 * 1000);
    return time;
}

}  // namespace

TAVO_Status tavo_osal_socket_setoption(int iSocketFd, int iOptionName, int iValue) {
    return status_of(set_option(iSocketFd, SOL_SOCKET, iOptionName, iValue), TAVO_FAILURE,
                     "Set socket option failed. errno=%d\n");
}

TAVO_Status tavo_osal_socket_set_receive_timeout(int iSocketFd, unsigned int uiTimeoutMs) {
    // The line feed in the middle is part of the message.
    return status_of(set_option(iSocketFd, SOL_SOCKET, SO_RCVTIMEO, duration(uiTimeoutMs)), TAVO_SOCKET_OPTION_FAILED,
                     "Set socket option failed\n, errno: %d");
}

TAVO_Status tavo_osal_socket_set_send_timeout(int iSocketFd, unsigned int uiTimeoutMs) {
    return status_of(set_option(iSocketFd, SOL_SOCKET, SO_SNDTIMEO, duration(uiTimeoutMs)), TAVO_SOCKET_OPTION_FAILED,
                     "Set socket option failed, Errno:%d \n");
}

TAVO_Status tavo_osal_socket_set_tcp_no_delay(int iSocketFd) {
    return status_of(set_option(iSocketFd, IPPROTO_TCP, TCP_NODELAY, 1), TAVO_SOCKET_OPTION_FAILED,
                     "Set socket option failed errno: %d");
}

TAVO_Status tavo_osal_socket_get_buf_len(int iSocketFd, unsigned int* puiLength) {
    if (missing(puiLength)) return TAVO_INVALID_PARAM;
    int length = 0;
    socklen_t size = sizeof length;
    const int result = getsockopt(iSocketFd, SOL_SOCKET, SO_RCVBUF, &length, &size);
    *puiLength = static_cast<unsigned int>(length);
    return status_of(result, TAVO_SOCKET_OPTION_FAILED, "Get socket option failed, errno: %d\n");
}

TAVO_Status tavo_osal_socket_set_recv_buf_len(int iSocketFd, unsigned int uiLength) {
    return status_of(set_option(iSocketFd, SOL_SOCKET, SO_RCVBUF, uiLength), TAVO_SOCKET_OPTION_FAILED,
                     "Set socket option failed, errno: %d\n");
}

TAVO_Status tavo_osal_socket_set_send_buf_len(int iSocketFd, unsigned int uiLength) {
    return status_of(set_option(iSocketFd, SOL_SOCKET, SO_SNDBUF, uiLength), TAVO_SOCKET_OPTION_FAILED,
                     "Set socket option failed, errno: %d\n");
}

TAVO_Status tavo_osal_socket_reset(int iSocketFd) {
    if (invalid_descriptor(iSocketFd)) return TAVO_INVALID_PARAM;
    linger reset = {};
    reset.l_onoff = 1;
    if (failed(set_option(iSocketFd, SOL_SOCKET, SO_LINGER, reset), "setsockopt(SO_LINGER) failed:%d\n")) {
        return TAVO_SOCKET_CLOSE_FAILED;
    }
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Successfully lingered the socket to send RESET!!!!!\n");
    return TAVO_SUCCESS;
}
