// Sending and receiving through the library against the bare calls, over a socket pair. One operation is one of each.
#include <sys/socket.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include "paired.h"
#include "tavo_osal/socket.h"

namespace {

using tavo::bench::Pair;

constexpr double kGoal = 1.05;

struct Ends {
    int sender = -1;
    int receiver = -1;
    Ends() {
        int ends[2];
        if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends) != 0) {
            perror("socketpair");
            exit(1);
        }
        sender = ends[0];
        receiver = ends[1];
    }
    ~Ends() {
        close(sender);
        close(receiver);
    }
    Ends(const Ends&) = delete;
    Ends& operator=(const Ends&) = delete;
};

ssize_t bare_send(int fd, const void* bytes, unsigned int size, int flags) { return send(fd, bytes, size, flags); }
ssize_t bare_receive(int fd, void* bytes, unsigned int size, int flags) { return recv(fd, bytes, size, flags); }

// Templates, so that the bare side is two direct calls without one of ours in between.
template <auto send_call, auto receive_call>
tavo::bench::Side send_and_receive(const std::shared_ptr<Ends>& ends, unsigned int size) {
    return [ends, bytes = std::vector<char>(size)](size_t operations) mutable {
        const auto length = static_cast<unsigned int>(bytes.size());
        for (size_t i = 0; i < operations; ++i) {
            const bool sent = send_call(ends->sender, bytes.data(), length, 0) == static_cast<int>(length);
            if (!sent || receive_call(ends->receiver, bytes.data(), length, 0) != static_cast<int>(length)) abort();
        }
    };
}

}  // namespace

int main(int argc, char** argv) {
    std::vector<Pair> pairs;
    for (const unsigned int size : {1U, 64U, 1024U, 16384U}) {
        // Both sides use the same two sockets: different ones differ by more than the goal.
        const auto ends = std::make_shared<Ends>();
        const auto bare = send_and_receive<bare_send, bare_receive>(ends, size);
        const std::string bytes = std::to_string(size) + " B";
        pairs.push_back({"send and recieve, " + bytes, bare,
                         send_and_receive<tavo_osal_socket_send, tavo_osal_socket_recieve>(ends, size), kGoal});
        pairs.push_back({"send and recieve without retry, " + bytes, bare,
                         send_and_receive<tavo_osal_socket_send, tavo_osal_socket_recieve_without_retry>(ends, size),
                         kGoal});
    }
    return tavo::bench::run_pairs(argc, argv, pairs);
}
