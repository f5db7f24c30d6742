// Making, naming and closing sockets.
#include "tavo_osal/socket.h"

#include <linux/netlink.h>
#include <netdb.h>
#include <unistd.h>

#include <cstring>

#include "net/socket_call.h"

using tavo::net::failed;
using tavo::net::generic;
using tavo::net::invalid_descriptor;
using tavo::net::ipv4_address;
using tavo::net::kTag;
using tavo::net::missing;
using tavo::net::status_of;

namespace {

// gethostbyname() keeps one result for the whole process, so calls on two threads share it: callers know and
// serialise them. Between the look-up and the copy is the only place where that result is read.
TAVO_Status resolve(const char* host_name, unsigned int port, sockaddr_in& address) {
    if (missing(host_name)) return TAVO_INVALID_PARAM;
    address = ipv4_address(port);
    const hostent* host = gethostbyname(host_name);
    // A resolver that was told to answer with IPv6 addresses gives ones that do not fit.
    if (host == nullptr || host->h_addr_list[0] == nullptr ||
        static_cast<size_t>(host->h_length) > sizeof address.sin_addr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Get host by name failed. Errno: %d.\n", h_errno);
        return TAVO_INVALID_PARAM;
    }
    memcpy(&address.sin_addr, host->h_addr_list[0], static_cast<size_t>(host->h_length));
    return TAVO_SUCCESS;
}

}  // namespace

TAVO_Status tavo_osal_socket_create(int iDomain, int iType, int iProtocol, int* piSocketFd) {
    if (missing(piSocketFd)) return TAVO_INVALID_PARAM;
    *piSocketFd = -1;
    const int descriptor = socket(iDomain, iType | SOCK_CLOEXEC, iProtocol);
    if (failed(descriptor, "Socket Create Failed. Errno: %d.\n")) return TAVO_SOCKET_CREATE_FAILED;
    *piSocketFd = descriptor;
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Socket Create is Success. SocketDisc: %d\n", descriptor);
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_socket_connect(int iSocketFd, const TAVO_CHAR* pcHostName, unsigned int uiPort) {
    sockaddr_in address;
    const TAVO_Status resolved = resolve(pcHostName, uiPort, address);
    if (resolved != TAVO_SUCCESS) return resolved;
    if (failed(connect(iSocketFd, generic(address), sizeof address), "Socket connect failed. Errno: %d.\n")) {
        return TAVO_SOCKET_CONNECT_FAILED;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "connect() succeeded.\n");
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_socket_bind(int iSocketFd, const TAVO_CHAR* pcHostName, unsigned int uiPort) {
    sockaddr_in address;
    const TAVO_Status resolved = resolve(pcHostName, uiPort, address);
    if (resolved != TAVO_SUCCESS) return resolved;
    // The failure says "connect": callers search their logs for this text.
    if (failed(bind(iSocketFd, generic(address), sizeof address), "Socket connect call failed. Errno: %d.\n")) {
        return TAVO_SOCKET_CONNECT_FAILED;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Socket bind succeeded.\n");
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_nl_socket_bind(int iSocketFd) {
    sockaddr_nl address = {};
    address.nl_family = AF_NETLINK;
    address.nl_pid = static_cast<uint32_t>(getpid());
    address.nl_groups = UINT32_MAX;
    if (failed(bind(iSocketFd, generic(address), sizeof address), "NL Socket bind call failed. Errno: %d.\n")) {
        return TAVO_SOCKET_CONNECT_FAILED;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Socket bind succeeded.\n");
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_socket_listen(int iSocketFd, int iBacklog) {
    return status_of(listen(iSocketFd, iBacklog), TAVO_FAILURE, "Socket listen call failed. errno = %d\n");
}

int tavo_osal_socket_accept(int iSocketFd, struct sockaddr* pAddress, socklen_t* pAddressLength) {
    // Only 0 is refused here; accept() itself refuses negative descriptors, with another code.
    if (iSocketFd == 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Socket fd is zero\n");
        return TAVO_INVALID_PARAM;
    }
    const int descriptor = accept4(iSocketFd, pAddress, pAddressLength, SOCK_CLOEXEC);
    return failed(descriptor, "Error in accepting connection error= %d\n") ? TAVO_SOCKET_CONNECT_FAILED : descriptor;
}

TAVO_Status tavo_osal_socket_shutdown(int iSocketFd) {
    if (invalid_descriptor(iSocketFd)) return TAVO_INVALID_PARAM;
    return status_of(shutdown(iSocketFd, SHUT_RDWR), TAVO_SOCKET_CLOSE_FAILED, "Socket shutdown Failed. Errno: %#X.\n");
}

TAVO_Status tavo_osal_socket_close(int iSocketFd) {
    if (iSocketFd < 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid socket descriptor. iSocketFd = %d\n", iSocketFd);
        return TAVO_INVALID_PARAM;
    }
    // Callers close what they never opened; 0 must survive that.
    if (iSocketFd == 0) return TAVO_SUCCESS;
    if (close(iSocketFd) != 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Socket Close Failed. iSocketFd= %d, Errno: %d.\n", iSocketFd, errno);
        return TAVO_SOCKET_CLOSE_FAILED;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Socket Close is Success. iSocketFd= %d\n", iSocketFd);
    return TAVO_SUCCESS;
}
