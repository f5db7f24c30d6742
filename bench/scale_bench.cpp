// What an operation costs, in processor time of caller and server, while one service holds 1, 10, 100 and 1,000 queues
// and as many blocks, which 200 processes use. Publishes the service, so run it in the tests' sandbox:
//
//     tests/support/sandbox.sh build/release/bench/scale_bench
#include <signal.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <string>
#include <vector>

#include "cpus.h"
#include "ipc/ITavoBinder.h"
#include "ipc/service_lookup.h"
#include "tavo_osal/init.h"
#include "tavo_osal/log.h"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/shared_memory.h"

// The log would be most of what is measured.
extern "C" [[gnu::visibility("default")]] int __android_log_vprint(int, const char*, const char*, va_list) { return 0; }
extern "C" [[gnu::visibility("default")]] int __android_log_print(int, const char*, const char*, ...) { return 0; }

namespace {

constexpr int kClients = 200;
constexpr int kScales[] = {1, 10, 100, 1000};
constexpr int kOperations = 400;
constexpr int kRounds = 5;
constexpr uint32_t kSize = 4096;

void check(bool good, const char* what) {
    if (good) return;
    perror(what);
    exit(1);
}

TAVO_INT64 attach(int key) {
    std::string name = std::to_string(key);
    TAVO_INT64 handle = 0;
    check(tavo_msg_queue_sender_init(name.data(), &handle) == TAVO_SUCCESS, "attach");
    return handle;
}
void detach(TAVO_INT64 handle) { check(tavo_msg_queue_destroy(handle) == TAVO_SUCCESS, "destroy"); }

TavoShmHandle* handle_of(int key) {
    TavoShmHandle* handle = nullptr;
    check(tavo_shm_init(static_cast<uint32_t>(key), &handle, kSize) == TAVO_SUCCESS, "tavo_shm_init");
    return handle;
}
void* acquire(TavoShmHandle* handle) {
    void* address = nullptr;
    check(tavo_shm_acquire(handle, &address) == TAVO_SUCCESS, "acquire");
    return address;
}
void give_back(TavoShmHandle* handle, void* address) {
    check(tavo_shm_release(address) == TAVO_SUCCESS, "release");
    check(tavo_shm_delete(handle) == TAVO_SUCCESS, "delete");
}

class Child {
public:
    template <typename Body>
    explicit Child(Body body) {
        check(pipe(to_) == 0 && pipe(from_) == 0, "pipe");
        pid_ = fork();
        check(pid_ >= 0, "fork");
        if (pid_ > 0) return;
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        body(*this);
        _exit(0);
    }
    Child(Child&& other) noexcept : pid_(other.pid_) {
        std::copy(other.to_, other.to_ + 2, to_);
        std::copy(other.from_, other.from_ + 2, from_);
        other.pid_ = -1;
    }
    ~Child() {
        if (pid_ <= 0) return;
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    pid_t pid() const { return pid_; }
    void tell(int number) { check(write(to_[1], &number, sizeof number) == sizeof number, "write"); }
    int asked() { return number_from(to_[0]); }
    void answer(int number) { check(write(from_[1], &number, sizeof number) == sizeof number, "write"); }
    int answered() { return number_from(from_[0]); }

private:
    static int number_from(int fd) {
        int number = -1;
        if (read(fd, &number, sizeof number) != sizeof number) _exit(1);
        return number;
    }
    pid_t pid_ = -1;
    int to_[2], from_[2];
};

// Holds its share of the keys until it is told the next number.
void hold(Child& self, int which) {
    for (;;) {
        const int keys = self.asked();
        std::vector<TAVO_INT64> queues;
        std::vector<std::pair<TavoShmHandle*, void*>> blocks;
        for (int key = which + 1; key <= keys; key += kClients) {
            queues.push_back(attach(key));
            TavoShmHandle* handle = handle_of(key);
            blocks.emplace_back(handle, acquire(handle));
        }
        self.answer(0);
        self.asked();
        for (const TAVO_INT64 queue : queues) detach(queue);
        for (const auto& [handle, address] : blocks) give_back(handle, address);
        self.answer(0);
    }
}

// Processor time of the caller and of the server, which other programs do not add to.
class Clock {
public:
    explicit Clock(pid_t server) { check(clock_getcpuclockid(server, &server_) == 0, "clock_getcpuclockid"); }
    double microseconds() const { return of(CLOCK_PROCESS_CPUTIME_ID) + of(server_); }

private:
    static double of(clockid_t clock) {
        timespec now = {};
        clock_gettime(clock, &now);
        return static_cast<double>(now.tv_sec) * 1e6 + static_cast<double>(now.tv_nsec) / 1e3;
    }
    clockid_t server_ = 0;
};

double cost(const Clock& clock, const std::function<void(int)>& operation) {
    double best = 1e9;
    for (int round = 0; round < kRounds; ++round) {
        const double start = clock.microseconds();
        for (int i = 0; i < kOperations; ++i) operation(i);
        best = std::min(best, (clock.microseconds() - start) / kOperations);
    }
    return best;
}

struct Row {
    const char* name;
    std::function<void(int key)> operation;  // key is one of those in use
};

}  // namespace

int main() {
    rlimit limit = {};
    getrlimit(RLIMIT_NOFILE, &limit);
    limit.rlim_cur = std::min<rlim_t>(limit.rlim_max, 16384);
    setrlimit(RLIMIT_NOFILE, &limit);

    // All on one, so that nobody's place in the machine makes a difference.
    tavo::bench::run_on(tavo::bench::Cpus().first);
    Child server([](Child& self) {
        // Says on its output what it sets the log to.
        check(freopen("/dev/null", "w", stdout) != nullptr, "freopen");
        self.answer(tavo_osal_init(25, 25));
        g_uiMxEnabledLogLevel = 0;
        self.asked();
    });
    check(server.answered() == TAVO_SUCCESS, "tavo_osal_init");
    g_uiMxEnabledLogLevel = 0;
    std::vector<Child> clients;
    clients.reserve(kClients);
    for (int i = 0; i < kClients; ++i) clients.emplace_back([i](Child& self) { hold(self, i); });

    const Clock clock(server.pid());
    const auto service = tavo_osal_get_service(nullptr);
    constexpr int kNew = 1 << 20;
    const std::vector<Row> rows = {
        {"count a use of a queue, and drop it",
         [&](int key) {
             service->create_message_queue(key);
             service->delete_message_queue(key);
         }},
        {"make a queue, and drop it",
         [&](int key) {
             service->create_message_queue(key + kNew);
             service->delete_message_queue(key + kNew);
         }},
        {"count a use of a block, and drop it",
         [&](int key) {
             service->get_shared_mem(key, kSize);
             service->delete_shared_mem(key);
         }},
        {"make a block, and drop it",
         [&](int key) {
             service->get_shared_mem(key + kNew, kSize);
             service->delete_shared_mem(key + kNew);
         }},
        {"attach, detach", [](int key) { detach(attach(key)); }},
        {"acquire, release, delete",
         [](int key) {
             TavoShmHandle* handle = handle_of(key);
             give_back(handle, acquire(handle));
         }},
        {"both, one inside the other",
         [](int key) {
             const TAVO_INT64 queue = attach(key);
             TavoShmHandle* handle = handle_of(key);
             void* address = acquire(handle);
             detach(queue);
             give_back(handle, address);
         }},
    };

    std::vector<std::vector<double>> costs(rows.size());
    std::vector<double> starts;
    for (const int scale : kScales) {
        const auto start = std::chrono::steady_clock::now();
        for (Child& client : clients) client.tell(scale);
        for (Child& client : clients) client.answered();
        starts.push_back(std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start).count());
        for (size_t row = 0; row < rows.size(); ++row) {
            // Keys from all over the tables, in no order.
            costs[row].push_back(cost(clock, [&](int i) { rows[row].operation(1 + i * 7919 % scale); }));
        }
        for (Child& client : clients) client.tell(0);
        for (Child& client : clients) client.answered();
    }

    printf("%-40s", "us of CPU, with so many keys of each");
    for (const int scale : kScales) printf("%10d", scale);
    printf("%10s\n", "1000/1");
    for (size_t row = 0; row < rows.size(); ++row) {
        printf("%-40s", rows[row].name);
        for (const double cost : costs[row]) printf("%10.1f", cost);
        printf("%10.2f\n", costs[row].back() / costs[row].front());
    }
    printf("%-40s", "200 processes set up together, ms");
    for (const double start : starts) printf("%10.1f", start);
    printf("\n");
    return 0;
}
