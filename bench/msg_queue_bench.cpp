// The queue API beside what it stands on: a handle's messages beside a bare pipe that carries the same frames, and
// attaching beside the least that a server needs to hand a pipe to another process. Wants an empty storage root and
// runtime directory: tests/support/sandbox.sh runs it in such.
#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "paired.h"
#include "tavo_osal/init.h"
#include "tavo_osal/log.h"
#include "tavo_osal/msg_queue.h"

namespace {

using tavo::bench::Pair;

constexpr uint32_t kLargest = 4096;
constexpr double kOverhead = 1.06;  // of the bare time
// Attaching and destroying ask for the service by its name, twice, beside the four calls, each of which takes a parcel
// and a thread of a pool.
constexpr double kAttachment = 8.0;

// On standard output: the log has the other one.
[[noreturn]] void fail(const char* what) {
    printf("%s: %s\n", what, strerror(errno));
    exit(1);
}

// A process that is there for as long as this object is.
class Companion {
public:
    template <typename Work>
    explicit Companion(Work work) : pid_(fork()) {
        if (pid_ < 0) fail("fork");
        if (pid_ > 0) return;
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        work();
        _exit(0);
    }
    ~Companion() {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    Companion(const Companion&) = delete;
    Companion& operator=(const Companion&) = delete;

private:
    pid_t pid_;
};

// --- messages

class BarePipe {
public:
    explicit BarePipe(uint32_t size) : size_(size), frame_(size + sizeof size), received_(size) {
        if (pipe(ends_) != 0) fail("pipe");
    }
    ~BarePipe() {
        close(ends_[0]);
        close(ends_[1]);
    }
    BarePipe(const BarePipe&) = delete;
    BarePipe& operator=(const BarePipe&) = delete;

    void put() {
        memcpy(frame_.data(), &size_, sizeof size_);
        memset(frame_.data() + sizeof size_, ++value_, size_);
        if (write(ends_[1], frame_.data(), frame_.size()) != static_cast<ssize_t>(frame_.size())) fail("write");
    }
    void get() {
        uint32_t size = 0;
        if (read(ends_[0], &size, sizeof size) != sizeof size) fail("read");
        if (read(ends_[0], received_.data(), size) != static_cast<ssize_t>(size)) fail("read");
    }

private:
    const uint32_t size_;
    int ends_[2];
    unsigned char value_ = 0;
    std::vector<unsigned char> frame_;
    std::vector<unsigned char> received_;
};

class Handle {
public:
    explicit Handle(uint32_t size) : message_(size), received_(kLargest) {
        if (tavo_android_msg_queue_init(&handle_) != TAVO_SUCCESS) fail("tavo_android_msg_queue_init");
    }

    void put() {
        memset(message_.data(), ++value_, message_.size());
        if (tavo_msg_queue_put(handle_, message_.data(), static_cast<unsigned>(message_.size())) != 0) fail("put");
    }
    void get() {
        unsigned int size = kLargest;
        if (tavo_msg_queue_get(handle_, received_.data(), &size) != TAVO_SUCCESS) fail("get");
    }

private:
    TAVO_INT64 handle_ = 0;
    unsigned char value_ = 0;
    std::vector<unsigned char> message_;
    std::vector<unsigned char> received_;
};

template <typename Channel>
tavo::bench::Side messages(uint32_t size) {
    auto channel = std::make_shared<Channel>(size);
    return [channel](size_t operations) {
        for (size_t i = 0; i < operations; ++i) {
            channel->put();
            channel->get();
        }
    };
}

// --- attachments

// Four requests and answers, two of them with an end of a pipe, over a connection that is there already.
class BareServer {
public:
    BareServer() {
        if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends_) != 0) fail("socketpair");
        server_ = std::make_unique<Companion>([this] { serve(); });
    }
    ~BareServer() {
        close(ends_[0]);
        close(ends_[1]);
    }
    BareServer(const BareServer&) = delete;
    BareServer& operator=(const BareServer&) = delete;

    void attach_and_detach() {
        int received[2] = {-1, -1};
        for (int request = 0; request < 4; ++request) {
            send_one(ends_[0], request, -1);
            receive_one(ends_[0], request == 1 || request == 2 ? &received[request - 1] : nullptr);
        }
        close(received[0]);
        close(received[1]);
    }

private:
    void serve() {
        int pipe_ends[2];
        if (pipe2(pipe_ends, O_CLOEXEC) != 0) fail("pipe2");
        for (;;) {
            const int request = receive_one(ends_[1], nullptr);
            send_one(ends_[1], 0, request == 1 || request == 2 ? pipe_ends[request - 1] : -1);
        }
    }

    union Control {
        char bytes[CMSG_SPACE(sizeof(int))];
        cmsghdr header;
    };

    static void send_one(int socket, int number, int descriptor) {
        iovec part = {&number, sizeof number};
        Control control = {};
        msghdr message = {};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        if (descriptor >= 0) {
            control.header.cmsg_level = SOL_SOCKET;
            control.header.cmsg_type = SCM_RIGHTS;
            control.header.cmsg_len = CMSG_LEN(sizeof descriptor);
            memcpy(CMSG_DATA(&control.header), &descriptor, sizeof descriptor);
            message.msg_control = &control;
            message.msg_controllen = sizeof control.bytes;
        }
        if (sendmsg(socket, &message, MSG_NOSIGNAL) < 0) fail("sendmsg");
    }

    static int receive_one(int socket, int* descriptor) {
        int number = 0;
        iovec part = {&number, sizeof number};
        Control control = {};
        msghdr message = {};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        message.msg_control = &control;
        message.msg_controllen = sizeof control.bytes;
        if (recvmsg(socket, &message, MSG_CMSG_CLOEXEC) <= 0) fail("recvmsg");
        if (descriptor != nullptr) memcpy(descriptor, CMSG_DATA(&control.header), sizeof *descriptor);
        return number;
    }

    int ends_[2];
    std::unique_ptr<Companion> server_;
};

void attach_and_destroy() {
    char key[] = "7";
    TAVO_INT64 handle = 0;
    if (tavo_msg_queue_sender_init(key, &handle) != TAVO_SUCCESS) fail("tavo_msg_queue_sender_init");
    if (tavo_msg_queue_destroy(handle) != TAVO_SUCCESS) fail("tavo_msg_queue_destroy");
}

// The service in a process of its own, with the queue that is attached to.
std::unique_ptr<Companion> start_service() {
    int ready[2];
    if (pipe2(ready, O_CLOEXEC) != 0) fail("pipe2");
    auto service = std::make_unique<Companion>([&ready] {
        const TAVO_Status status = tavo_osal_init(25, 25);
        if (write(ready[1], &status, sizeof status) != sizeof status) fail("write");
        for (;;) pause();
    });
    close(ready[1]);
    TAVO_Status status = TAVO_FAILURE;
    const bool started = read(ready[0], &status, sizeof status) == sizeof status && status == TAVO_SUCCESS;
    close(ready[0]);
    if (!started) fail("The service was not published: is this run with tests/support/sandbox.sh?");
    char key[] = "7";
    TAVO_INT64 kept = 0;
    if (tavo_msg_queue_sender_init(key, &kept) != TAVO_SUCCESS) fail("tavo_msg_queue_sender_init");
    return service;
}

}  // namespace

int main(int argc, char** argv) {
    // Each step of an attachment is logged as an error, here and in the service.
    if (freopen("/dev/null", "w", stderr) == nullptr) fail("freopen");
    g_uiMxEnabledLogLevel = 0;
    BareServer bare_server;
    const std::unique_ptr<Companion> service = start_service();

    std::vector<Pair> pairs;
    for (const uint32_t size : {16U, 256U, 1024U, 4092U}) {
        pairs.push_back({"put and get, " + std::to_string(size) + " B", messages<BarePipe>(size),
                         messages<Handle>(size), kOverhead});
    }
    const auto bare = [&bare_server](size_t operations) {
        for (size_t i = 0; i < operations; ++i) bare_server.attach_and_detach();
    };
    const auto attach = [](size_t operations) {
        for (size_t i = 0; i < operations; ++i) attach_and_destroy();
    };
    pairs.push_back({"attach and destroy", bare, attach, kAttachment});
    return tavo::bench::run_pairs(argc, argv, pairs);
}
