// Cross-process semaphores against bare ones in shared memory. Makes semaphore files, so run it in the tests' sandbox:
//
//     tests/support/sandbox.sh build/release/bench/ipc_semaphore_bench
#include <semaphore.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <vector>

#include "cpus.h"
#include "paired.h"
#include "tavo_osal/ipc_semaphore.h"

namespace {

using tavo::bench::Pair;
using tavo::bench::run_on;
using tavo::bench::Side;

constexpr double kOverhead = 1.10;

[[noreturn]] void fail(const char* what) {
    perror(what);
    exit(1);
}

void check(bool good, const char* what) {
    if (__builtin_expect(!good, 0)) fail(what);
}

class BareSemaphore {
public:
    BareSemaphore() {
        void* memory = mmap(nullptr, sizeof(sem_t), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
        check(memory != MAP_FAILED, "mmap");
        semaphore_ = static_cast<sem_t*>(memory);
        check(sem_init(semaphore_, 1, 1) == 0, "sem_init");
    }
    void acquire() { check(sem_wait(semaphore_) == 0, "sem_wait"); }
    void release() { check(sem_post(semaphore_) == 0, "sem_post"); }

private:
    sem_t* semaphore_;
};

class Semaphore {
public:
    Semaphore() {
        static uint32_t key = 0;
        check(tavo_semaphore_init(++key, &handle_) == TAVO_SUCCESS, "tavo_semaphore_init");
    }
    void acquire() { check(tavo_semaphore_acquire(handle_) == TAVO_SUCCESS, "tavo_semaphore_acquire"); }
    void release() { check(tavo_semaphore_release(handle_) == TAVO_SUCCESS, "tavo_semaphore_release"); }

private:
    TAVO_INT64 handle_ = 0;
};

template <typename Kind>
Side uncontended(int cpu) {
    auto semaphore = std::make_shared<Kind>();
    return [semaphore, cpu](size_t operations) {
        run_on(cpu);
        for (size_t i = 0; i < operations; ++i) {
            semaphore->acquire();
            semaphore->release();
        }
    };
}

// A second process, pinned to a CPU, that answers every ping.
template <typename Kind>
class Partner {
public:
    explicit Partner(int cpu) {
        ping_.acquire();
        pong_.acquire();
        pid_ = fork();
        check(pid_ >= 0, "fork");
        if (pid_ > 0) return;
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        run_on(cpu);
        for (;;) {
            ping_.acquire();
            pong_.release();
        }
    }
    ~Partner() {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    Partner(const Partner&) = delete;
    Partner& operator=(const Partner&) = delete;

    void round_trip() {
        ping_.release();
        pong_.acquire();
    }

private:
    Kind ping_;
    Kind pong_;
    pid_t pid_;
};

template <typename Kind>
Side ping_pong(int own_cpu, int other_cpu) {
    auto partner = std::make_shared<Partner<Kind>>(other_cpu);
    return [partner, own_cpu](size_t operations) {
        run_on(own_cpu);
        for (size_t i = 0; i < operations; ++i) partner->round_trip();
    };
}

}  // namespace

int main(int argc, char** argv) {
    const tavo::bench::Cpus cpus;
    std::vector<Pair> pairs = {
        {"acquire and release", uncontended<BareSemaphore>(cpus.first), uncontended<Semaphore>(cpus.first), kOverhead},
        {"ping-pong, one CPU", ping_pong<BareSemaphore>(cpus.first, cpus.first),
         ping_pong<Semaphore>(cpus.first, cpus.first), kOverhead}};
    if (cpus.first == cpus.last) {
        puts("Only one CPU may be used: the pair on two CPUs is left out.");
    } else {
        pairs.push_back({"ping-pong, two CPUs", ping_pong<BareSemaphore>(cpus.first, cpus.last),
                         ping_pong<Semaphore>(cpus.first, cpus.last), kOverhead});
    }
    return tavo::bench::run_pairs(argc, argv, pairs);
}
