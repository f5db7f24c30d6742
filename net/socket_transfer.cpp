// Sending, receiving and waiting.
#include <arpa/inet.h>
#include <sys/select.h>

#include "net/socket_call.h"
#include "tavo_osal/socket.h"

using tavo::net::failed;
using tavo::net::generic;
using tavo::net::ipv4_address;
using tavo::net::kTag;
using tavo::net::missing;

namespace {

constexpr int kReceiveAttempts = 3;
constexpr char kReceiveFailed[] = "Socket Recieve Failed. Errno: %d.\n";

int sent(ssize_t count, const char* failure, int line = __builtin_LINE()) {
    if (failed(count, failure, line)) return -1;
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Socket Send is Success. iSendBytes = %d\n", static_cast<int>(count));
    return static_cast<int>(count);
}

int receive(int descriptor, void* buffer, unsigned int length, int flags) {
    const ssize_t count = recv(descriptor, buffer, length, flags);
    if (failed(count, kReceiveFailed)) return -1;
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Socket Recieve is Success. iReadBytes = %d\n", static_cast<int>(count));
    return static_cast<int>(count);
}

// What waiting to receive and waiting to send differ in.
struct Wait {
    bool reading;
    const char* failed;
    const char* succeeded;  // its one value is select()'s result
};

constexpr Wait kWaitForData = {true, "Select failed with error. Errno: %d.\n",
                               "Select succedded. Receive data on socket. uiRet=%d\n"};
constexpr Wait kWaitForSending = {false, "Select failed with error. Errno:%d \n",
                                  "Select succedded. Send data on socket.uiRet=%d\n"};

// select() on one descriptor. A set has no bit for a descriptor outside it: entering it would write beside the set.
int select_one(int descriptor, bool reading, timeval* limit) {
    if (descriptor < 0 || descriptor >= static_cast<int>(FD_SETSIZE)) {
        errno = descriptor < 0 ? EBADF : EINVAL;
        return -1;
    }
    fd_set set;
    FD_ZERO(&set);
    FD_SET(descriptor, &set);
    return select(descriptor + 1, reading ? &set : nullptr, reading ? nullptr : &set, nullptr, limit);
}

TAVO_Status wait_until_ready(int descriptor, unsigned int timeout_ms, const Wait& wait) {
    timeval limit = {};
    if (timeout_ms == 0) {
        TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Calling select for infinite timeout.\n");
    } else {
        // The remainder below a second is dropped; callers use such time-outs to look without waiting.
        limit.tv_sec = static_cast<time_t>(timeout_ms / 1000);
        TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Calling select for timeout value = %d seconds.\n",
                 static_cast<int>(limit.tv_sec));
    }
    const int ready = select_one(descriptor, wait.reading, timeout_ms == 0 ? nullptr : &limit);
    if (failed(ready, wait.failed)) return TAVO_SOCKET_SELECT_FAILED;
    if (ready == 0) {
        TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Select timedout.\n");
        return TAVO_SOCKET_SELECT_TIMEOUT;
    }
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, wait.succeeded, ready);
    return TAVO_SUCCESS;
}

}  // namespace

int tavo_osal_socket_send(int iSocketFd, const void* pvBuffer, unsigned int uiLength, int iFlags) {
    return sent(send(iSocketFd, pvBuffer, uiLength, iFlags), "Socket Send Failed. Errno: %d.\n");
}

int tavo_osal_socket_recieve(int iSocketFd, void* pvBuffer, unsigned int uiLength, int iFlags) {
    int count = -1;
    for (int attempt = 0; attempt < kReceiveAttempts; ++attempt) {
        count = receive(iSocketFd, pvBuffer, uiLength, iFlags);
        if (count >= 0 || errno != EAGAIN) break;
    }
    return count;
}

int tavo_osal_socket_recieve_without_retry(int iSocketFd, void* pvBuffer, unsigned int uiLength, int iFlags) {
    return receive(iSocketFd, pvBuffer, uiLength, iFlags);
}

int tavo_osal_socket_sendto(int iSocketFd, const TAVO_CHAR* pcIpAddress, unsigned int uiPort, const void* pvBuffer,
                            unsigned int uiLength, int iFlags) {
    if (missing(pcIpAddress)) return -1;
    sockaddr_in address = ipv4_address(uiPort);
    if (inet_aton(pcIpAddress, &address.sin_addr) == 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "inet_aton() failed. Errno: %d.\n", errno);
        return -1;
    }
    // Unlike the message of the plain send, this one ends without a full stop.
    return sent(sendto(iSocketFd, pvBuffer, uiLength, iFlags, generic(address), sizeof address),
                "Socket Send Failed. Errno: %d\n");
}

int tavo_osal_socket_receivefrom(int iSocketFd, void* pvBuffer, unsigned int uiLength, int iFlags,
                                 TAVO_CHAR* pcIpAddress, unsigned int* puiPort) {
    if (missing(pcIpAddress) || missing(puiPort)) return -1;
    sockaddr_in sender = {};
    socklen_t sender_length = sizeof sender;
    const ssize_t count = recvfrom(iSocketFd, pvBuffer, uiLength, iFlags, generic(sender), &sender_length);
    if (failed(count, kReceiveFailed)) return -1;
    // The longest text and its terminator are the 16 bytes that callers provide.
    inet_ntop(AF_INET, &sender.sin_addr, pcIpAddress, INET_ADDRSTRLEN);
    *puiPort = ntohs(sender.sin_port);
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Received packet from %s:%d. iReadBytes = %d\n\n", pcIpAddress,
             static_cast<int>(*puiPort), static_cast<int>(count));
    return static_cast<int>(count);
}

int tavo_osal_socket_poll(struct pollfd* pPollFds, unsigned int uiCount, int iTimeoutMs) {
    return poll(pPollFds, uiCount, iTimeoutMs);
}

TAVO_Status tavo_osal_socket_wait_for_data(int iSocketFd, unsigned int uiTimeoutMs) {
    return wait_until_ready(iSocketFd, uiTimeoutMs, kWaitForData);
}

TAVO_Status tavo_osal_socket_wait_for_sending_data(int iSocketFd, unsigned int uiTimeoutMs) {
    return wait_until_ready(iSocketFd, uiTimeoutMs, kWaitForSending);
}
