// Locks, conditions, events, semaphores and clocks against the platform calls that they wrap, all on one CPU.
//
// The goal is a tenth more than the bare call, or three nanoseconds for each call where a bare call takes less than
// thirty: that much is the price of one more call through the dynamic linker and of looking at what came back.
#include <pthread.h>
#include <semaphore.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <vector>

#include "cpus.h"
#include "paired.h"
#include "tavo_osal/clock.h"
#include "tavo_osal/condition.h"
#include "tavo_osal/event.h"
#include "tavo_osal/mutex.h"
#include "tavo_osal/semaphore.h"
#include "tavo_osal/thread.h"

namespace {

using tavo::bench::keep;
using tavo::bench::Pair;
using tavo::bench::Side;

constexpr double kOverhead = 1.10;
constexpr double kShortCall = 30;     // nanoseconds
constexpr double kShortOverhead = 3;  // nanoseconds a call

void check(TAVO_Status status) {
    if (status == TAVO_SUCCESS) return;
    fprintf(stderr, "the library answers %#x\n", static_cast<unsigned>(status));
    exit(1);
}

// The side that does one thing n times.
template <typename Operation>
Side repeated(Operation operation) {
    return [operation](size_t operations) {
        for (size_t i = 0; i < operations; ++i) operation();
    };
}

// The goal depends on how long the bare call takes on this machine.
double goal_of(const Side& bare, int calls) {
    constexpr size_t kOperations = 100000;
    double best = 1e9;
    for (int i = 0; i < 5; ++i) best = std::min(best, tavo::bench::detail::nanoseconds(bare, kOperations));
    return best / calls < kShortCall ? std::max(kOverhead, 1 + kShortOverhead * calls / best) : kOverhead;
}

template <typename Bare, typename Tavo>
Pair pair(const char* name, int calls, Bare bare, Tavo tavo) {
    const Side side = repeated(bare);
    return {name, side, repeated(tavo), goal_of(side, calls)};
}

// What an event is made of, by hand.
class BareEvent {
public:
    void set() {
        pthread_mutex_lock(&lock_);
        ++count_;
        pthread_cond_signal(&condition_);
        pthread_mutex_unlock(&lock_);
    }
    void wait() {
        pthread_mutex_lock(&lock_);
        if (count_ == 0) pthread_cond_wait(&condition_, &lock_);
        if (count_ != 0) --count_;
        pthread_mutex_unlock(&lock_);
    }

private:
    uint32_t count_ = 0;
    pthread_mutex_t lock_ = PTHREAD_MUTEX_INITIALIZER;
    pthread_cond_t condition_ = PTHREAD_COND_INITIALIZER;
};

class Event {
public:
    Event() { check(tavo_osal_event_create(&event_)); }
    ~Event() { check(tavo_osal_event_destroy(&event_)); }
    Event(const Event&) = delete;
    Event& operator=(const Event&) = delete;

    void set() { check(tavo_osal_event_set(event_)); }
    void wait() { check(tavo_osal_event_waitset(event_, TAVO_EVENT_FOREVER)); }

private:
    TAVO_Event* event_ = nullptr;
};

// Two threads that wake each other in turn, for as long as the program runs.
template <typename AnyEvent>
class PingPong {
public:
    PingPong() {
        pthread_t partner = {};
        check(tavo_osal_thread_create(&partner, answer, this));
        check(tavo_osal_thread_detach(partner));
    }
    void operator()() {
        ping_.set();
        pong_.wait();
    }

private:
    [[noreturn]] static void* answer(void* opaque) {
        auto& self = *static_cast<PingPong*>(opaque);
        for (;;) {
            self.ping_.wait();
            self.pong_.set();
        }
    }

    AnyEvent ping_;
    AnyEvent pong_;
};

struct Objects {
    Objects() {
        check(tavo_osal_mutex_create(&mutex));
        check(tavo_osal_thread_condition_create(&condition));
        check(tavo_osal_semaphore_create(&semaphore, 0, 0));
        sem_init(&bare_semaphore, 0, 0);
    }

    pthread_mutex_t bare_mutex = PTHREAD_MUTEX_INITIALIZER;
    pthread_cond_t bare_condition = PTHREAD_COND_INITIALIZER;
    sem_t bare_semaphore;
    BareEvent bare_event;
    TAVO_Mutex* mutex = nullptr;
    TAVO_Condition* condition = nullptr;
    sem_t semaphore;
    Event event;
};

std::vector<Pair> locks(Objects& o) {
    return {
        pair(
            "mutex lock, unlock", 2,
            [&o] {
                pthread_mutex_lock(&o.bare_mutex);
                pthread_mutex_unlock(&o.bare_mutex);
            },
            [&o] {
                tavo_osal_mutex_lock(o.mutex);
                tavo_osal_mutex_unlock(o.mutex);
            }),
        pair(
            "condition signal, nobody waits", 1, [&o] { pthread_cond_signal(&o.bare_condition); },
            [&o] { tavo_osal_thread_condition_signal(o.condition); }),
        pair(
            "event set, wait", 2,
            [&o] {
                o.bare_event.set();
                o.bare_event.wait();
            },
            [&o] {
                o.event.set();
                o.event.wait();
            }),
        pair(
            "semaphore post, wait", 2,
            [&o] {
                sem_post(&o.bare_semaphore);
                sem_wait(&o.bare_semaphore);
            },
            [&o] {
                tavo_osal_semaphore_post(&o.semaphore);
                tavo_osal_semaphore_wait(&o.semaphore);
            }),
    };
}

std::vector<Pair> clocks() {
    const auto time_of_day = [] {
        timeval now;
        gettimeofday(&now, nullptr);
        keep(now);
    };
    return {
        pair("time of day", 1, time_of_day,
             [] {
                 TAVO_TimeVal now;
                 tavo_osal_get_current_time(&now);
                 keep(now);
             }),
        pair("time of day, microseconds", 1, time_of_day,
             [] {
                 TAVO_INT64 now;
                 tavo_osal_get_current_time_us(&now);
                 keep(now);
             }),
        pair(
            "monotonic clock, nanoseconds", 1,
            [] {
                timespec now;
                clock_gettime(CLOCK_MONOTONIC, &now);
                keep(now);
            },
            [] {
                TAVO_INT64 now;
                tavo_osal_get_current_time_ns(&now);
                keep(now);
            }),
    };
}

}  // namespace

int main(int argc, char** argv) {
    tavo::bench::run_on(tavo::bench::Cpus().first);
    static Objects objects;
    static PingPong<BareEvent> bare_ping_pong;
    static PingPong<Event> ping_pong;

    std::vector<Pair> pairs = locks(objects);
    for (const Pair& clock : clocks()) pairs.push_back(clock);
    pairs.push_back({"event ping-pong of two threads", repeated([] { bare_ping_pong(); }),
                     repeated([] { ping_pong(); }), kOverhead});
    tavo::bench::run_pairs(argc, argv, pairs);
    // The partners still wait for their events, which must not be destroyed under them.
    fflush(stdout);
    _exit(0);
}
