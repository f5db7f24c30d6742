// Bare sockets for the tests of the socket family, so that a test uses the library only for what it is about.
#pragma once

#include <netinet/in.h>

#include <cstdint>
#include <string>
#include <utility>

namespace tavo::test {

// Owns a descriptor.
class Descriptor {
public:
    explicit Descriptor(int fd = -1) : fd_(fd) {}
    Descriptor(Descriptor&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
    Descriptor& operator=(Descriptor&& other) noexcept;
    ~Descriptor() { reset(); }

    int get() const { return fd_; }
    int release() { return std::exchange(fd_, -1); }
    void reset();

private:
    int fd_;
};

struct Pair {
    Descriptor first;
    Descriptor second;
};

// Every one of these ends the test program when the platform refuses, because the test would prove nothing.
Descriptor make_socket(int domain, int type, int protocol = 0);
// Two connected Unix-domain sockets.
Pair socket_pair(int type);
// A TCP connection over loopback: the client's end, then the server's.
Pair tcp_connection();
// A TCP socket that listens on a free loopback port.
Descriptor tcp_listener();
// A UDP socket bound to a free loopback port.
Descriptor udp_receiver();
// A number that was a descriptor and is none now.
int closed_descriptor();

sockaddr_in local_address(int fd);
unsigned int port_of(int fd);
void set_non_blocking(int fd);
bool is_open(int fd);
bool is_close_on_exec(int fd);

// An empty directory that goes, with what is in it, at the end.
class TemporaryDirectory {
public:
    TemporaryDirectory();
    ~TemporaryDirectory();
    TemporaryDirectory(const TemporaryDirectory&) = delete;
    TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

    std::string path(const std::string& name) const { return path_ + "/" + name; }
    // A path in the directory that is exactly so many bytes long.
    std::string path_of_length(size_t length) const;

private:
    std::string path_;
};

}  // namespace tavo::test
