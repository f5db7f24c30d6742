#include <signal.h>
#include <unistd.h>

#include <atomic>
#include <fstream>
#include <string>

#include "soak/failure.h"
#include "soak/operations.h"
#include "tavo_osal/clock.h"
#include "tavo_osal/condition.h"
#include "tavo_osal/event.h"
#include "tavo_osal/mutex.h"
#include "tavo_osal/semaphore.h"
#include "tavo_osal/thread.h"

namespace tavo::soak {
namespace {

// Threads that all run one body, with what they share.
class Crew {
public:
    Crew(unsigned count, TAVO_ThreadStart body, void* shared) : count_(count) {
        for (unsigned i = 0; i < count; ++i) {
            const TAVO_Status status = i % 2 == 0
                                           ? tavo_osal_thread_create(&threads_[i], body, shared)
                                           : tavo_osal_thread_create_with_name(&threads_[i], body, shared, "soak");
            if (!succeeds(status, "tavo_osal_thread_create")) count_ = i;
        }
    }
    ~Crew() { join(); }
    Crew(const Crew&) = delete;
    Crew& operator=(const Crew&) = delete;

    unsigned count() const { return count_; }
    pthread_t first() const { return threads_[0]; }
    void join() {
        for (unsigned i = 0; i < count_; ++i) succeeds(tavo_osal_thread_join(threads_[i]), "tavo_osal_thread_join");
        count_ = 0;
    }

private:
    unsigned count_;
    pthread_t threads_[4] = {};
};

struct Counter {
    TAVO_Mutex* mutex = nullptr;
    TAVO_Condition* condition = nullptr;
    unsigned rounds = 0;
    unsigned count = 0;  // guarded by the mutex
};

void* count_up(void* shared) {
    static_cast<std::atomic<unsigned>*>(shared)->fetch_add(1);
    tavo_osal_thread_yield();
    tavo_osal_thread_exit();
}

std::atomic<int> g_signals{0};

void* count_under_mutex(void* shared) {
    auto& counter = *static_cast<Counter*>(shared);
    for (unsigned i = 0; i < counter.rounds; ++i) {
        if (tavo_osal_mutex_lock(counter.mutex) != TAVO_SUCCESS) return nullptr;
        ++counter.count;
        tavo_osal_mutex_unlock(counter.mutex);
    }
    return nullptr;
}

// Takes what the other side gives, one at a time.
void* take_under_condition(void* shared) {
    auto& counter = *static_cast<Counter*>(shared);
    for (unsigned i = 0; i < counter.rounds; ++i) {
        tavo_osal_mutex_lock(counter.mutex);
        while (counter.count == 0) tavo_osal_thread_condition_wait(counter.condition, counter.mutex);
        --counter.count;
        tavo_osal_thread_condition_signal(counter.condition);
        tavo_osal_mutex_unlock(counter.mutex);
    }
    return nullptr;
}

struct Turns {
    TAVO_Event* event = nullptr;
    unsigned rounds = 0;
};

void* set_event(void* shared) {
    const auto& turns = *static_cast<Turns*>(shared);
    for (unsigned i = 0; i < turns.rounds; ++i) tavo_osal_event_set(turns.event);
    return nullptr;
}

struct Sleeper {
    std::atomic<pid_t> thread{0};
    std::atomic<bool> went_on{false};
    sem_t never;
};

// Has nothing to destroy: it may be cancelled at any instruction.
void* sleep_until_cancelled(void* shared) {
    auto* sleeper = static_cast<Sleeper*>(shared);
    sleeper->thread = gettid();
    tavo_osal_semaphore_wait(&sleeper->never);
    sleeper->went_on = true;
    return nullptr;
}

// ThreadSanitizer may hold a signal back for ever that comes before the wait.
void await_sleep([[maybe_unused]] pid_t thread) {
#if defined(__SANITIZE_THREAD__)
    for (int asleep = 0; asleep < 3;) {
        std::ifstream file("/proc/self/task/" + std::to_string(thread) + "/stat");
        std::string number, name, state;
        file >> number >> name >> state;
        asleep = state == "S" ? asleep + 1 : 0;
        tavo_osal_thread_msleep(2);
    }
#endif
}

void* post_semaphore(void* shared) {
    tavo_osal_semaphore_post(static_cast<sem_t*>(shared));
    return nullptr;
}

}  // namespace

void use_threads(Client& client) {
    std::atomic<unsigned> count{0};
    Crew crew(client.random.between(1, 4), count_up, &count);
    const unsigned started = crew.count();
    const pthread_t first = crew.first();
    crew.join();
    expect(count == started, "a thread did not run");
    expect_status(tavo_osal_thread_join(first), TAVO_FAILURE, "joining a thread that is gone");
    expect_status(tavo_osal_thread_set_affinity(first, 1), TAVO_NOT_SUPPORTED, "tavo_osal_thread_set_affinity");
    expect_status(tavo_osal_thread_set_real_time_priority(first, 0, TAVO_THREAD_POLICY_RR), TAVO_INVALID_PARAM,
                  "tavo_osal_thread_set_real_time_priority");
    if (client.random.one_in(2)) {
        succeeds(tavo_osal_thread_msleep(client.random.below(3)), "tavo_osal_thread_msleep");
    } else {
        succeeds(tavo_osal_thread_usleep(client.random.below(2000)), "tavo_osal_thread_usleep");
    }
    const int before = g_signals;
    succeeds(tavo_osal_signal(SIGUSR1, [](int) { g_signals.fetch_add(1); }), "tavo_osal_signal");
    raise(SIGUSR1);
    expect(g_signals == before + 1, "a signal handler did not run");
}

void cancel_thread(Client&) {
    Sleeper sleeper;
    if (!succeeds(tavo_osal_semaphore_create(&sleeper.never, 0, 0), "tavo_osal_semaphore_create")) return;
    {
        Crew crew(1, sleep_until_cancelled, &sleeper);
        if (crew.count() > 0) {
            while (sleeper.thread == 0) tavo_osal_thread_yield();
            await_sleep(sleeper.thread);
            succeeds(tavo_osal_thread_cancel(crew.first()), "tavo_osal_thread_cancel");
        }
    }
    expect(!sleeper.went_on, "a thread that was to be cancelled went on");
    succeeds(tavo_osal_semaphore_destroy(&sleeper.never), "tavo_osal_semaphore_destroy");
}

void use_mutex(Client& client) {
    Counter counter;
    counter.rounds = client.random.between(1, 500);
    if (!succeeds(tavo_osal_mutex_create(&counter.mutex), "tavo_osal_mutex_create")) return;
    Crew crew(client.random.between(1, 4), count_under_mutex, &counter);
    const unsigned started = crew.count();
    crew.join();
    expect(counter.count == started * counter.rounds, "a count under a mutex was lost");
    succeeds(tavo_osal_mutex_try_lock(counter.mutex), "tavo_osal_mutex_try_lock");
    expect_status(tavo_osal_mutex_try_lock(counter.mutex), TAVO_BUSY, "trying a mutex that is held");
    succeeds(tavo_osal_mutex_unlock(counter.mutex), "tavo_osal_mutex_unlock");
    succeeds(tavo_osal_mutex_destroy(&counter.mutex), "tavo_osal_mutex_destroy");
}

void use_condition(Client& client) {
    Counter counter;
    counter.rounds = client.random.between(1, 100);
    if (!succeeds(tavo_osal_mutex_create(&counter.mutex), "tavo_osal_mutex_create")) return;
    if (succeeds(tavo_osal_thread_condition_create(&counter.condition), "tavo_osal_thread_condition_create")) {
        Crew taker(1, take_under_condition, &counter);
        if (taker.count() == 0) counter.rounds = 0;
        for (unsigned i = 0; i < counter.rounds; ++i) {
            tavo_osal_mutex_lock(counter.mutex);
            ++counter.count;
            tavo_osal_thread_condition_broadcast(counter.condition);
            tavo_osal_mutex_unlock(counter.mutex);
        }
        taker.join();
        expect(counter.count == 0, "a count under a condition was lost");
        tavo_osal_mutex_lock(counter.mutex);
        expect_status(tavo_osal_thread_condition_timedwait(counter.condition, counter.mutex, 0), TAVO_CONDITION_TIMEOUT,
                      "waiting for nobody's signal");
        tavo_osal_mutex_unlock(counter.mutex);
        succeeds(tavo_osal_thread_condition_destroy(&counter.condition), "tavo_osal_thread_condition_destroy");
    }
    succeeds(tavo_osal_mutex_destroy(&counter.mutex), "tavo_osal_mutex_destroy");
}

void use_event(Client& client) {
    Turns turns;
    turns.rounds = client.random.between(1, 50);
    if (!succeeds(tavo_osal_event_create(&turns.event), "tavo_osal_event_create")) return;
    {
        // One waiter: no set is lost, and none wakes it for nothing but a set of its own.
        Crew setter(1, set_event, &turns);
        if (setter.count() > 0) succeeds(tavo_osal_event_waitset(turns.event, TAVO_EVENT_FOREVER), "waitset");
    }
    succeeds(tavo_osal_event_clear(turns.event), "tavo_osal_event_clear");
    for (int i = 0; i < 3; ++i) succeeds(tavo_osal_event_set(turns.event), "tavo_osal_event_set");
    for (int i = 0; i < 2; ++i) succeeds(tavo_osal_event_waitset(turns.event, 20000), "waiting for a set event");
    succeeds(tavo_osal_event_set_with_flag(turns.event, 1), "tavo_osal_event_set_with_flag");
    succeeds(tavo_osal_event_waitset_with_flag(turns.event, 20000, 1), "tavo_osal_event_waitset_with_flag");
    expect_status(tavo_osal_event_waitset(turns.event, 999), TAVO_FAILURE, "a wait below a second");
    if (client.random.one_in(1000)) {
        expect_status(tavo_osal_event_waitset(turns.event, 1000), TAVO_TIMEOUT, "waiting for an event nobody sets");
    }
    succeeds(tavo_osal_event_destroy(&turns.event), "tavo_osal_event_destroy");
}

void use_semaphore(Client& client) {
    sem_t semaphore;
    const unsigned count = client.random.below(10);
    if (!succeeds(tavo_osal_semaphore_create(&semaphore, 0, count), "tavo_osal_semaphore_create")) return;
    for (unsigned i = 0; i < count; ++i) {
        succeeds(i % 2 == 0 ? tavo_osal_semaphore_wait(&semaphore) : tavo_osal_semaphore_trywait(&semaphore),
                 "taking a count");
    }
    int value = -1;
    succeeds(tavo_osal_semaphore_get_value(&semaphore, &value), "tavo_osal_semaphore_get_value");
    expect(value == 0, "a semaphore whose counts were all taken has some");
    expect_status(tavo_osal_semaphore_trywait(&semaphore), TAVO_FAILURE, "trying a semaphore at 0");
    expect_status(tavo_osal_semaphore_timedwait(&semaphore, 500), TAVO_SEMAPHORE_TIMEOUT, "a deadline in the past");
    {
        Crew poster(1, post_semaphore, &semaphore);
        if (poster.count() > 0) succeeds(tavo_osal_semaphore_wait(&semaphore), "waiting for a post");
    }
    succeeds(tavo_osal_semaphore_destroy(&semaphore), "tavo_osal_semaphore_destroy");
}

}  // namespace tavo::soak
