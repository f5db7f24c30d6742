// The shape the socket wrappers share: arguments are checked, the call is made, a failure is logged with its
// errno, and the result becomes the wrapper's own. What a wrapper spells out is where it differs.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <cerrno>

#include "log/module_log.h"
#include "tavo_osal/status.h"

namespace tavo::net {

constexpr char kTag[] = "OSAL_SOCKET";

// True when a call's result says that it failed; then logs the message, whose one value is errno. Messages
// carry the line of the wrapper, not of this function.
inline bool failed(long result, const char* message, int line = __builtin_LINE()) {
    if (__builtin_expect(result >= 0, 1)) return false;
    TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, message, errno);
    return true;
}

// For the wrappers that answer with a code: success, or the code when the call failed.
inline TAVO_Status status_of(long result, TAVO_Status code, const char* message, int line = __builtin_LINE()) {
    return failed(result, message, line) ? code : TAVO_SUCCESS;
}

// True, and logged, when a pointer is null that must not be.
inline bool missing(const void* pointer, int line = __builtin_LINE()) {
    if (pointer != nullptr) return false;
    TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "Invalid parameter\n");
    return true;
}

// True, and logged, when a descriptor cannot be a socket's: negative, or 0, which callers use for "none".
inline bool invalid_descriptor(int descriptor, int line = __builtin_LINE()) {
    if (descriptor > 0) return false;
    TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "Invalid socket fd:%d\n", descriptor);
    return true;
}

// An IPv4 address that still lacks its host. Ports above 65535 lose their high bits, as they do in a 16-bit field.
inline sockaddr_in ipv4_address(unsigned int port) {
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_port = htons(static_cast<uint16_t>(port));
    return address;
}

// An address of some family, as the calls take it.
template <typename Address>
const sockaddr* generic(const Address& address) {
    return reinterpret_cast<const sockaddr*>(&address);
}

template <typename Address>
sockaddr* generic(Address& address) {
    return reinterpret_cast<sockaddr*>(&address);
}

}  // namespace tavo::net
