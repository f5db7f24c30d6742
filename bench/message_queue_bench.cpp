// The message queue against a bare pipe of the default size that carries the same frames: one write from one buffer
// with room for the length in front, two reads. Both sides write each message before they send it, as programs do: a
// buffer that nobody touches between two sends would flatter the side that copies nothing.
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "cpus.h"
#include "ipc/TAVO_MessageQueue.h"
#include "paired.h"

namespace {

using tavo::bench::Cpus;
using tavo::bench::Pair;
using tavo::bench::run_on;

constexpr uint32_t kLargest = 409600;
constexpr double kOverhead = 1.06;         // of the bare time, where both sides share one CPU
constexpr double kThroughput = 1.0 / 2.5;  // of the bare time, for large messages on two CPUs

[[noreturn]] void fail(const char* what) {
    perror(what);
    exit(1);
}

class BarePipe {
public:
    BarePipe() : frame_(kLargest + sizeof(uint32_t)) {
        if (pipe(ends_) != 0) fail("pipe");
    }
    ~BarePipe() {
        close(ends_[0]);
        close(ends_[1]);
    }
    BarePipe(const BarePipe&) = delete;
    BarePipe& operator=(const BarePipe&) = delete;

    void put(uint32_t size) {
        memcpy(frame_.data(), &size, sizeof size);
        memset(frame_.data() + sizeof size, ++value_, size);
        if (write(ends_[1], frame_.data(), size + sizeof size) < 0) fail("write");
    }
    void get() {
        uint32_t size = 0;
        if (read(ends_[0], &size, sizeof size) != sizeof size) fail("read");
        // A message that does not fit the pipe comes in parts.
        for (uint32_t total = 0; total < size;) {
            const ssize_t count = read(ends_[0], received_.data() + total, size - total);
            if (count <= 0) fail("read");
            total += static_cast<uint32_t>(count);
        }
    }

private:
    int ends_[2];
    unsigned char value_ = 0;
    std::vector<unsigned char> frame_;
    std::vector<unsigned char> received_ = std::vector<unsigned char>(kLargest);
};

class Queue {
public:
    void put(uint32_t size) {
        memset(message_.data(), ++value_, size);
        if (queue_.tavo_android_msg_queue_put(message_.data(), size) != 0) fail("put");
    }
    void get() {
        unsigned int size = kLargest;
        if (queue_.tavo_android_msg_queue_get(received_.data(), &size) < 0) fail("get");
    }

private:
    android::TAVO_MessageQueue queue_;
    unsigned char value_ = 0;
    std::vector<unsigned char> message_ = std::vector<unsigned char>(kLargest);
    std::vector<unsigned char> received_ = std::vector<unsigned char>(kLargest);
};

const Cpus& cpus() {
    static const Cpus instance;
    return instance;
}

template <typename Channel>
tavo::bench::Side same_thread(uint32_t size) {
    auto channel = std::make_shared<Channel>();
    return [channel, size](size_t operations) {
        run_on(cpus().first);
        for (size_t i = 0; i < operations; ++i) {
            channel->put(size);
            channel->get();
        }
    };
}

// A second process, pinned to a CPU, that puts messages on demand, after each one received when it is to answer.
template <typename Channel>
class Partner {
public:
    Partner(int cpu, uint32_t size, bool answers) : size_(size) {
        pid_ = fork();
        if (pid_ < 0) fail("fork");
        if (pid_ > 0) return;
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        run_on(cpu);
        serve(answers);
    }
    ~Partner() {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    Partner(const Partner&) = delete;
    Partner& operator=(const Partner&) = delete;

    void demand(size_t messages) {
        if (write(demands_[1], &messages, sizeof messages) != sizeof messages) fail("write");
    }
    void put() { to_.put(size_); }
    void get() { from_.get(); }

private:
    [[noreturn]] void serve(bool answers) {
        size_t messages = 0;
        while (read(demands_[0], &messages, sizeof messages) == sizeof messages) {
            for (size_t i = 0; i < messages; ++i) {
                if (answers) to_.get();
                from_.put(size_);
            }
        }
        _exit(0);
    }

    struct Demands {
        int ends[2];
        Demands() {
            if (pipe(ends) != 0) fail("pipe");
        }
        ~Demands() {
            close(ends[0]);
            close(ends[1]);
        }
        int operator[](int end) const { return ends[end]; }
    };

    Demands demands_;
    Channel to_;
    Channel from_;
    uint32_t size_;
    pid_t pid_;
};

template <typename Channel>
tavo::bench::Side two_processes(int cpu, uint32_t size, bool answers) {
    // Started by the first operation, so that only the pair being measured has processes.
    auto partner = std::make_shared<std::unique_ptr<Partner<Channel>>>();
    return [=](size_t operations) {
        run_on(cpus().first);
        if (*partner == nullptr) *partner = std::make_unique<Partner<Channel>>(cpu, size, answers);
        (*partner)->demand(operations);
        for (size_t i = 0; i < operations; ++i) {
            if (answers) (*partner)->put();
            (*partner)->get();
        }
    };
}

std::string bytes(uint32_t size) {
    return size < 1024 ? std::to_string(size) + " B" : std::to_string(size / 1024) + " KiB";
}

}  // namespace

int main(int argc, char** argv) {
    const int first = cpus().first;
    const int last = cpus().last;
    std::vector<Pair> pairs;
    for (const uint32_t size : {16U, 256U, 1024U, 4096U}) {
        pairs.push_back(
            {"put and get, " + bytes(size), same_thread<BarePipe>(size), same_thread<Queue>(size), kOverhead});
    }
    for (const uint32_t size : {16U, 256U, 1024U, 4096U}) {
        pairs.push_back({"round trip, one CPU, " + bytes(size), two_processes<BarePipe>(first, size, true),
                         two_processes<Queue>(first, size, true), kOverhead});
    }
    for (const uint32_t size : {16U, 256U, 1024U, 4096U}) {
        pairs.push_back({"stream, one CPU, " + bytes(size), two_processes<BarePipe>(first, size, false),
                         two_processes<Queue>(first, size, false), kOverhead});
    }
    if (first == last) {
        puts("Only one CPU may be used: pairs on two CPUs are left out.");
    } else {
        for (const uint32_t size : {65536U, 409600U}) {
            pairs.push_back({"stream, two CPUs, " + bytes(size), two_processes<BarePipe>(last, size, false),
                             two_processes<Queue>(last, size, false), kThroughput});
        }
    }
    return tavo::bench::run_pairs(argc, argv, pairs);
}
