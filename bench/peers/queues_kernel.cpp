// Queues that the kernel has: pipes, POSIX message queues, System V message queues, SEQPACKET sockets.
#include <fcntl.h>
#include <mqueue.h>
#include <sys/ipc.h>
#include <sys/msg.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>

#include "queue.h"

namespace tavo::peers {
namespace {

// What an ordinary user may ask for, also where this program is run as root, who may ask for more.
size_t kernel_limit(const char* name) {
    size_t limit = 0;
    std::ifstream(std::string("/proc/sys/") + name) >> limit;
    return limit;
}

// --- pipes, one for each direction, carrying frames: a length, then the message

class PipeLink : public Link {
public:
    PipeLink(int in, int out, size_t largest)
        : in_(in), out_(out), frame_(sizeof(uint32_t) + largest), received_(largest + 1) {}

    unsigned char* blank(size_t) override { return frame_.data() + sizeof(uint32_t); }
    void send(size_t size) override {
        const auto length = static_cast<uint32_t>(size);
        memcpy(frame_.data(), &length, sizeof length);
        const size_t whole = sizeof length + size;
        if (write(out_, frame_.data(), whole) != static_cast<ssize_t>(whole)) fail("write");
    }
    View receive() override {
        uint32_t length = 0;
        if (read(in_, &length, sizeof length) != sizeof length) fail("read");
        // A message that does not fit the pipe comes in parts.
        for (size_t total = 0; total < length;) {
            const ssize_t count = read(in_, received_.data() + total, length - total);
            if (count <= 0) fail("read");
            total += static_cast<size_t>(count);
        }
        return {received_.data(), length};
    }

private:
    const int in_;
    const int out_;
    std::vector<unsigned char> frame_;
    std::vector<unsigned char> received_;
};

class PipeWire : public Wire {
public:
    PipeWire(size_t largest, int capacity) : largest_(largest) {
        for (auto& ends : pipes_) {
            if (pipe(ends) != 0) fail("pipe");
            if (capacity > 0 && fcntl(ends[1], F_SETPIPE_SZ, capacity) < 0) fail("F_SETPIPE_SZ");
        }
    }
    ~PipeWire() override {
        for (const auto& ends : pipes_) {
            close(ends[0]);
            close(ends[1]);
        }
    }

    std::unique_ptr<Link> open(End end) override {
        const bool driver = end == End::driver;
        return std::make_unique<PipeLink>(pipes_[driver ? 1 : 0][0], pipes_[driver ? 0 : 1][1], largest_);
    }

private:
    int pipes_[2][2];
    const size_t largest_;
};

// --- POSIX message queues

class PosixLink : public Link {
public:
    PosixLink(mqd_t in, mqd_t out, size_t largest) : in_(in), out_(out), message_(largest + 1), received_(largest) {}

    unsigned char* blank(size_t) override { return message_.data(); }
    void send(size_t size) override {
        if (mq_send(out_, reinterpret_cast<const char*>(message_.data()), size, 0) != 0) fail("mq_send");
    }
    View receive() override {
        const ssize_t count = mq_receive(in_, reinterpret_cast<char*>(received_.data()), received_.size(), nullptr);
        if (count < 0) fail("mq_receive");
        return {received_.data(), static_cast<size_t>(count)};
    }

private:
    const mqd_t in_;
    const mqd_t out_;
    std::vector<unsigned char> message_;
    std::vector<unsigned char> received_;
};

class PosixWire : public Wire {
public:
    explicit PosixWire(size_t largest) : largest_(std::max<size_t>(largest, 1)) {
        mq_attr attributes = {};
        attributes.mq_maxmsg = static_cast<long>(std::min<size_t>(kernel_limit("fs/mqueue/msg_max"), 64));
        attributes.mq_msgsize = static_cast<long>(largest_);
        for (size_t i = 0; i < 2; ++i) {
            const std::string name = "/tavo-bench-" + std::to_string(getpid()) + "-" + std::to_string(i);
            queues_[i] = mq_open(name.c_str(), O_RDWR | O_CREAT | O_EXCL, 0600, &attributes);
            if (queues_[i] < 0) fail("mq_open");
            mq_unlink(name.c_str());
        }
    }
    ~PosixWire() override {
        for (const mqd_t queue : queues_) mq_close(queue);
    }

    std::unique_ptr<Link> open(End end) override {
        const size_t in = end == End::driver ? 1 : 0;
        return std::make_unique<PosixLink>(queues_[in], queues_[1 - in], largest_);
    }

private:
    mqd_t queues_[2];
    const size_t largest_;
};

// --- System V: one queue, with a type for each direction

class SystemVLink : public Link {
public:
    SystemVLink(int queue, long in, long out, size_t largest)
        : queue_(queue),
          in_(in),
          out_(out),
          largest_(largest),
          message_(sizeof(long) + largest),
          received_(sizeof(long) + largest) {}

    unsigned char* blank(size_t) override { return message_.data() + sizeof out_; }
    void send(size_t size) override {
        memcpy(message_.data(), &out_, sizeof out_);
        if (msgsnd(queue_, message_.data(), size, 0) != 0) fail("msgsnd");
    }
    View receive() override {
        const ssize_t count = msgrcv(queue_, received_.data(), largest_, in_, 0);
        if (count < 0) fail("msgrcv");
        return {received_.data() + sizeof in_, static_cast<size_t>(count)};
    }

private:
    const int queue_;
    const long in_;
    const long out_;
    const size_t largest_;
    std::vector<unsigned char> message_;
    std::vector<unsigned char> received_;
};

class SystemVWire : public Wire {
public:
    explicit SystemVWire(size_t largest) : queue_(msgget(IPC_PRIVATE, 0600)), largest_(largest) {
        if (queue_ < 0) fail("msgget");
    }
    ~SystemVWire() override { msgctl(queue_, IPC_RMID, nullptr); }

    std::unique_ptr<Link> open(End end) override {
        const long in = end == End::driver ? 2 : 1;
        return std::make_unique<SystemVLink>(queue_, in, 3 - in, largest_);
    }

private:
    const int queue_;
    const size_t largest_;
};

// --- SEQPACKET

class SocketLink : public Link {
public:
    SocketLink(int socket, size_t largest) : socket_(socket), message_(largest + 1), received_(largest + 1) {}

    unsigned char* blank(size_t) override { return message_.data(); }
    void send(size_t size) override {
        if (::send(socket_, message_.data(), size, 0) != static_cast<ssize_t>(size)) fail("send");
    }
    View receive() override {
        const ssize_t count = recv(socket_, received_.data(), received_.size(), 0);
        if (count < 0) fail("recv");
        return {received_.data(), static_cast<size_t>(count)};
    }

private:
    const int socket_;
    std::vector<unsigned char> message_;
    std::vector<unsigned char> received_;
};

class SocketWire : public Wire {
public:
    explicit SocketWire(size_t largest) : largest_(largest) {
        if (socketpair(AF_UNIX, SOCK_SEQPACKET, 0, ends_) != 0) fail("socketpair");
    }
    ~SocketWire() override {
        close(ends_[0]);
        close(ends_[1]);
    }

    std::unique_ptr<Link> open(End end) override {
        return std::make_unique<SocketLink>(ends_[end == End::driver ? 0 : 1], largest_);
    }

private:
    int ends_[2];
    const size_t largest_;
};

template <typename T, typename... More>
auto maker(More... more) {
    return [=](size_t largest) { return std::make_unique<T>(largest, more...); };
}

}  // namespace

std::vector<QueuePeer> kernel_queues() {
    constexpr int kWidest = 1 << 20;
    return {
        {"bare pipe", Role::limit, maker<PipeWire>(0)},
        {"bare pipe of 1 MiB", Role::peer, maker<PipeWire>(kWidest)},
        {"POSIX mq", Role::peer, maker<PosixWire>(), kernel_limit("fs/mqueue/msgsize_max"), "limit msgsize_max"},
        {"System V", Role::peer, maker<SystemVWire>(), kernel_limit("kernel/msgmax"), "limit msgmax"},
        {"SEQPACKET", Role::peer, maker<SocketWire>()},
    };
}

}  // namespace tavo::peers
