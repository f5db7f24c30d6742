#include "net/sockets.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>

namespace tavo::test {
namespace {

int demand(int result, const char* call) {
    if (result >= 0) return result;
    perror(call);
    abort();
}

sockaddr_in loopback() {
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    return address;
}

Descriptor bound_to_loopback(int type) {
    Descriptor made = make_socket(AF_INET, type);
    const sockaddr_in address = loopback();
    demand(bind(made.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), "bind");
    return made;
}

}  // namespace

Descriptor& Descriptor::operator=(Descriptor&& other) noexcept {
    if (this != &other) {
        reset();
        fd_ = other.release();
    }
    return *this;
}

void Descriptor::reset() {
    if (fd_ >= 0) close(fd_);
    fd_ = -1;
}

Descriptor make_socket(int domain, int type, int protocol) {
    return Descriptor(demand(socket(domain, type | SOCK_CLOEXEC, protocol), "socket"));
}

Pair socket_pair(int type) {
    int ends[2];
    demand(socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, ends), "socketpair");
    return {Descriptor(ends[0]), Descriptor(ends[1])};
}

Pair tcp_connection() {
    const Descriptor listener = tcp_listener();
    Descriptor client = make_socket(AF_INET, SOCK_STREAM);
    const sockaddr_in address = local_address(listener.get());
    demand(connect(client.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), "connect");
    return {std::move(client), Descriptor(demand(accept(listener.get(), nullptr, nullptr), "accept"))};
}

Descriptor tcp_listener() {
    Descriptor listener = bound_to_loopback(SOCK_STREAM);
    demand(listen(listener.get(), 8), "listen");
    return listener;
}

Descriptor udp_receiver() { return bound_to_loopback(SOCK_DGRAM); }

int closed_descriptor() {
    const int fd = demand(dup(STDERR_FILENO), "dup");
    close(fd);
    return fd;
}

sockaddr_in local_address(int fd) {
    sockaddr_in address = {};
    socklen_t length = sizeof address;
    demand(getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length), "getsockname");
    return address;
}

unsigned int port_of(int fd) { return ntohs(local_address(fd).sin_port); }

void set_non_blocking(int fd) { demand(fcntl(fd, F_SETFL, O_NONBLOCK), "fcntl"); }

bool is_open(int fd) { return fcntl(fd, F_GETFD) >= 0; }

bool is_close_on_exec(int fd) { return (demand(fcntl(fd, F_GETFD), "fcntl") & FD_CLOEXEC) != 0; }

TemporaryDirectory::TemporaryDirectory() {
    char path[] = "/tmp/tavo_net_XXXXXX";
    if (mkdtemp(path) == nullptr) demand(-1, "mkdtemp");
    path_ = path;
}

TemporaryDirectory::~TemporaryDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
}

std::string TemporaryDirectory::path_of_length(size_t length) const {
    return path(std::string(length - path_.size() - 1, 'p'));
}

}  // namespace tavo::test
