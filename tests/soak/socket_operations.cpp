#include <arpa/inet.h>
#include <netinet/in.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "soak/failure.h"
#include "soak/message.h"
#include "soak/operations.h"
#include "tavo_osal/network.h"
#include "tavo_osal/socket.h"

namespace tavo::soak {
namespace {

constexpr char kLoopback[] = "127.0.0.1";
constexpr int kPatienceMs = 30000;

class Socket {
public:
    Socket(int domain, int type) {
        if (!succeeds(tavo_osal_socket_create(domain, type, 0, &fd_), "tavo_osal_socket_create")) fd_ = -1;
    }
    explicit Socket(int fd) : fd_(fd) {}
    ~Socket() {
        if (fd_ >= 0) succeeds(tavo_osal_socket_close(fd_), "tavo_osal_socket_close");
    }
    Socket(const Socket&) = delete;
    Socket& operator=(const Socket&) = delete;
    int fd() const { return fd_; }

    // Bound to a free port, which is returned; 0 on failure.
    unsigned bind() const {
        sockaddr_in address = {};
        socklen_t length = sizeof address;
        if (!succeeds(tavo_osal_socket_bind(fd_, kLoopback, 0), "tavo_osal_socket_bind")) return 0;
        getsockname(fd_, reinterpret_cast<sockaddr*>(&address), &length);
        return ntohs(address.sin_port);
    }
    bool becomes_readable() const {
        pollfd slot = {fd_, POLLIN, 0};
        return expect(tavo_osal_socket_poll(&slot, 1, kPatienceMs) == 1, "nothing came in half a minute");
    }

private:
    int fd_ = -1;
};

// Sends in one direction until all has arrived.
void exchange(Client& client, const Socket& from, const Socket& to) {
    const unsigned size = client.random.between(1, 8000);
    const uint64_t seed = client.random.next();
    Bytes bytes(size), back(size);
    fill(seed, bytes.data(), size);
    expect(tavo_osal_socket_send(from.fd(), bytes.data(), size, MSG_NOSIGNAL) == static_cast<int>(size),
           "tavo_osal_socket_send sent less");
    for (unsigned got = 0; got < size;) {
        if (!to.becomes_readable()) return;
        const int count = client.random.one_in(2)
                              ? tavo_osal_socket_recieve(to.fd(), back.data() + got, size - got, 0)
                              : tavo_osal_socket_recieve_without_retry(to.fd(), back.data() + got, size - got, 0);
        if (!expect(count > 0, "receiving failed")) return;
        got += static_cast<unsigned>(count);
    }
    expect(back == bytes, "what came over TCP is damaged");
}

}  // namespace

void use_tcp(Client& client) {
    const Socket listener(AF_INET, SOCK_STREAM), caller(AF_INET, SOCK_STREAM);
    if (listener.fd() < 0 || caller.fd() < 0) return;
    const unsigned port = listener.bind();
    if (port == 0 || !succeeds(tavo_osal_socket_listen(listener.fd(), 1), "tavo_osal_socket_listen")) return;
    if (!succeeds(tavo_osal_socket_connect(caller.fd(), kLoopback, port), "tavo_osal_socket_connect")) return;
    sockaddr_in peer = {};
    socklen_t length = sizeof peer;
    const int fd = tavo_osal_socket_accept(listener.fd(), reinterpret_cast<sockaddr*>(&peer), &length);
    if (!expect(fd > 0 && fd < 0x9000, "tavo_osal_socket_accept failed")) return;
    const Socket accepted(fd);
    succeeds(tavo_osal_socket_set_tcp_no_delay(caller.fd()), "tavo_osal_socket_set_tcp_no_delay");
    succeeds(tavo_osal_socket_set_receive_timeout(accepted.fd(), 30000), "tavo_osal_socket_set_receive_timeout");
    succeeds(tavo_osal_socket_wait_for_sending_data(caller.fd(), 30000), "tavo_osal_socket_wait_for_sending_data");
    exchange(client, caller, accepted);
    exchange(client, accepted, caller);
    expect_status(tavo_osal_socket_wait_for_data(caller.fd(), 1), TAVO_SOCKET_SELECT_TIMEOUT, "waiting for no data");
    // With a reset instead of an orderly end, no port is kept waiting.
    succeeds(tavo_osal_socket_reset(caller.fd()), "tavo_osal_socket_reset");
    succeeds(tavo_osal_socket_reset(accepted.fd()), "tavo_osal_socket_reset");
    if (client.random.one_in(2)) succeeds(tavo_osal_socket_shutdown(caller.fd()), "tavo_osal_socket_shutdown");
}

void use_udp(Client& client) {
    const Socket receiver(AF_INET, SOCK_DGRAM), sender(AF_INET, SOCK_DGRAM);
    if (receiver.fd() < 0 || sender.fd() < 0) return;
    const unsigned port = receiver.bind(), sending_port = sender.bind();
    if (port == 0 || sending_port == 0) return;
    succeeds(tavo_osal_socket_setoption(receiver.fd(), SO_REUSEADDR, 1), "tavo_osal_socket_setoption");
    unsigned room = 0;
    succeeds(tavo_osal_socket_get_buf_len(receiver.fd(), &room), "tavo_osal_socket_get_buf_len");
    expect(room > 0, "a receive buffer without room");
    Bytes bytes(client.random.between(1, 1400)), back(1500);
    fill(client.random.next(), bytes.data(), bytes.size());
    const auto size = static_cast<unsigned>(bytes.size());
    expect(tavo_osal_socket_sendto(sender.fd(), kLoopback, port, bytes.data(), size, 0) == static_cast<int>(size),
           "tavo_osal_socket_sendto sent less");
    if (!receiver.becomes_readable()) return;
    TAVO_CHAR address[16] = "";
    unsigned from = 0;
    const int count = tavo_osal_socket_receivefrom(receiver.fd(), back.data(), 1500, 0, address, &from);
    back.resize(static_cast<size_t>(std::max(count, 0)));
    // Anybody may send to a port.
    if (from != sending_port) return;
    expect(back == bytes && strcmp(address, kLoopback) == 0, "what came over UDP is damaged");
}

void use_unix_socket(Client& client) {
    const std::string path = client.own_path("socket");
    const Socket receiver(AF_UNIX, SOCK_DGRAM), sender(AF_UNIX, SOCK_DGRAM);
    if (receiver.fd() < 0 || sender.fd() < 0) return;
    if (!succeeds(tavo_osal_unix_domain_socket_bind(receiver.fd(), path.c_str()),
                  "tavo_osal_unix_domain_socket_bind")) {
        return;
    }
    Bytes bytes(client.random.between(1, 4000)), back(5000);
    fill(client.random.next(), bytes.data(), bytes.size());
    const auto size = static_cast<unsigned>(bytes.size());
    expect(tavo_osal_unix_domain_socket_sendto(sender.fd(), path.c_str(), bytes.data(), size) == static_cast<int>(size),
           "tavo_osal_unix_domain_socket_sendto sent less");
    const int count = tavo_osal_socket_recieve(receiver.fd(), back.data(), 5000, 0);
    back.resize(static_cast<size_t>(std::max(count, 0)));
    expect(back == bytes, "what came over a Unix-domain socket is damaged");
    unlink(path.c_str());
    expect_status(tavo_osal_unix_domain_socket_sendto(sender.fd(), path.c_str(), bytes.data(), size),
                  TAVO_SOCKET_SEND_FAILED, "sending to a socket that is gone");
}

void validate_addresses(Client& client) {
    unsigned parts[4];
    for (unsigned& part : parts) part = client.random.below(300);
    parts[0] = std::max(parts[0], 1U);
    std::string text;
    for (const unsigned part : parts) text += (text.empty() ? "" : ".") + std::to_string(part);
    const bool is_good = *std::max_element(parts, parts + 4) <= 255;
    expect_status(tavo_osal_validate_ipv4(text.c_str()), is_good ? TAVO_SUCCESS : TAVO_FAILURE, text.c_str());
    expect_status(tavo_osal_validate_ipv4((text + ".1").c_str()), TAVO_FAILURE, "an address of five numbers");
    expect_status(tavo_osal_socket_set_nw_iface_state(-1, "lo", 1), TAVO_INVALID_PARAM,
                  "an interface without a socket");
}

}  // namespace tavo::soak
