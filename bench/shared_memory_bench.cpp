// Getting and giving back a block against the least that can do it: a memory file that one process asks another for
// over a Unix-domain socket. Publishes the service, so run it in the tests' sandbox:
//
//     tests/support/sandbox.sh build/release/bench/shared_memory_bench
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "cpus.h"
#include "paired.h"
#include "tavo_osal/init.h"
#include "tavo_osal/shared_memory.h"

namespace {

using tavo::bench::Pair;
using tavo::bench::Side;

// The library does more on the way: it connects to see who publishes the service now, asks who that is (two exchanges),
// asks for the block, asks the block for its memory, and lets go of both with a message each.
constexpr double kGoal = 6.5;

[[noreturn]] void fail(const char* what) {
    perror(what);
    exit(1);
}

void check(bool good, const char* what) {
    if (!good) fail(what);
}

class ChildProcess {
public:
    template <typename Body>
    explicit ChildProcess(Body body) : pid_(fork()) {
        check(pid_ >= 0, "fork");
        if (pid_ > 0) return;
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        body();
        _exit(0);
    }
    ~ChildProcess() {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    ChildProcess(const ChildProcess&) = delete;
    ChildProcess& operator=(const ChildProcess&) = delete;

private:
    pid_t pid_;
};

struct Request {
    uint32_t key;
    uint32_t size;
};

// One message with at most one descriptor in it; the descriptor that came, or -1.
int exchange(int socket, Request* request, int fd, bool sends) {
    iovec part = {request, sizeof *request};
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
    msghdr message = {};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (!sends || fd >= 0) {
        message.msg_control = control;
        message.msg_controllen = sizeof control;
    }
    if (sends) {
        if (fd >= 0) {
            cmsghdr* header = CMSG_FIRSTHDR(&message);
            header->cmsg_level = SOL_SOCKET;
            header->cmsg_type = SCM_RIGHTS;
            header->cmsg_len = CMSG_LEN(sizeof fd);
            memcpy(CMSG_DATA(header), &fd, sizeof fd);
        }
        check(sendmsg(socket, &message, 0) == sizeof *request, "sendmsg");
        return -1;
    }
    if (recvmsg(socket, &message, MSG_CMSG_CLOEXEC) != sizeof *request) _exit(0);
    int received = -1;
    const cmsghdr* header = CMSG_FIRSTHDR(&message);
    if (header != nullptr) memcpy(&received, CMSG_DATA(header), sizeof received);
    return received;
}

class BareServer {
public:
    BareServer() : sockets_(), process_([this] { serve(); }) {}

    void acquire_and_release(uint32_t size) {
        Request request = {7, size};
        exchange(sockets_.ends[0], &request, -1, true);
        const int fd = exchange(sockets_.ends[0], &request, -1, false);
        void* memory = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
        check(memory != MAP_FAILED, "mmap");
        static_cast<char*>(memory)[0] = 'x';
        munmap(memory, size);
        close(fd);
    }

private:
    struct Sockets {
        int ends[2];
        Sockets() { check(socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) == 0, "socketpair"); }
    };

    void serve() {
        const int fd = memfd_create("bare", MFD_CLOEXEC);
        check(fd >= 0 && ftruncate(fd, 1 << 20) == 0, "memfd_create");
        for (;;) {
            Request request = {};
            exchange(sockets_.ends[1], &request, -1, false);
            exchange(sockets_.ends[1], &request, fd, true);
        }
    }

    Sockets sockets_;
    ChildProcess process_;
};

void serve_until_killed(int ready) {
    check(tavo_osal_init(1, 10) == TAVO_SUCCESS, "tavo_osal_init");
    if (write(ready, "", 1) != 1) fail("write");
    for (;;) pause();
}

class Client {
public:
    explicit Client(uint32_t size) { check(tavo_shm_init(size, &handle_, size) == TAVO_SUCCESS, "tavo_shm_init"); }
    void acquire_and_release() {
        void* memory = nullptr;
        check(tavo_shm_acquire(handle_, &memory) == TAVO_SUCCESS, "tavo_shm_acquire");
        static_cast<char*>(memory)[0] = 'x';
        check(tavo_shm_release(memory) == TAVO_SUCCESS, "tavo_shm_release");
    }

private:
    TavoShmHandle* handle_ = nullptr;
};

}  // namespace

// The log's place is taken, so that what is measured is not the terminal.
extern "C" [[gnu::visibility("default")]] int __android_log_vprint(int, const char*, const char*, va_list) { return 1; }
extern "C" [[gnu::visibility("default")]] int __android_log_print(int, const char*, const char*, ...) { return 1; }

int main(int argc, char** argv) {
    // Everything on one CPU: what is compared is the work, and not how long sleeping CPUs take to wake up.
    tavo::bench::run_on(tavo::bench::Cpus().first);
    BareServer bare;
    int ready[2];
    check(pipe(ready) == 0, "pipe");
    const ChildProcess server([&] { serve_until_killed(ready[1]); });
    char byte = 0;
    check(read(ready[0], &byte, 1) == 1, "read");

    std::vector<Pair> pairs;
    for (const uint32_t size : {4096U, 1U << 20}) {
        auto client = std::make_shared<Client>(size);
        pairs.push_back({"acquire and release, " + std::to_string(size / 1024) + " KiB",
                         [&bare, size](size_t operations) {
                             for (size_t i = 0; i < operations; ++i) bare.acquire_and_release(size);
                         },
                         [client](size_t operations) {
                             for (size_t i = 0; i < operations; ++i) client->acquire_and_release();
                         },
                         kGoal});
    }
    return tavo::bench::run_pairs(argc, argv, pairs);
}
