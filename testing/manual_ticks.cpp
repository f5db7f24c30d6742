// Stands in front of what timer/timer.cpp calls of its own library: sleeping, making the worker, joining it.
#include "tavo_osal/testing/manual_ticks.hpp"

#include <pthread.h>
#include <semaphore.h>

#include <algorithm>
#include <condition_variable>
#include <cstdlib>
#include <mutex>
#include <vector>

#include "tavo_osal/thread.h"

namespace tavo::test {
namespace {

constexpr char kLibrary[] = "libtavoosal.so";

struct Worker {
    pthread_t thread;
    sem_t go;
    bool listed;
    bool asleep;
    bool ending;  // is being joined, and must not sleep any more
};

std::mutex g_mutex;
std::condition_variable g_changed;
bool g_driving = false;
std::vector<Worker*> g_workers;  // those that have slept
uint32_t g_last_sleep = 0;

// Takes a thread off the list when it ends, however it ends: a cancelled one is in a signal handler, so nothing is
// freed here, and no object with a destructor would do.
void forget(void* ended) {
    auto* worker = static_cast<Worker*>(ended);
    {
        const std::lock_guard<std::mutex> lock(g_mutex);
        g_workers.erase(std::find(g_workers.begin(), g_workers.end(), worker));
    }
    g_changed.notify_all();
    sem_destroy(&worker->go);
}

pthread_key_t forgetting_key() {
    static const pthread_key_t key = [] {
        pthread_key_t made = 0;
        if (pthread_key_create(&made, &forget) != 0) abort();
        return made;
    }();
    return key;
}

// The calling thread's entry in the list.
Worker& listed_worker() {
    static thread_local Worker worker;
    if (!worker.listed) {
        sem_init(&worker.go, 0, 0);
        worker.thread = pthread_self();
        worker.listed = true;
        const std::lock_guard<std::mutex> lock(g_mutex);
        g_workers.push_back(&worker);
        pthread_setspecific(forgetting_key(), &worker);
    }
    return worker;
}

enum class Sleep { by_itself, by_hand, not_at_all };

// How the worker is to sleep; by hand, it counts as asleep from here on.
Sleep lie_down(Worker& worker, uint32_t micros) {
    const std::lock_guard<std::mutex> lock(g_mutex);
    if (!g_driving) return Sleep::by_itself;
    g_last_sleep = micros;
    if (worker.ending) return Sleep::not_at_all;
    worker.asleep = true;
    g_changed.notify_all();
    return Sleep::by_hand;
}

TAVO_Status sleep_by_hand(uint32_t micros) {
    Worker& worker = listed_worker();
    const Sleep sleep = lie_down(worker, micros);
    if (sleep == Sleep::by_itself) {
        return function_named_as<TAVO_Status(uint32_t)>("tavo_osal_thread_usleep")(micros);
    }
    if (sleep == Sleep::by_hand) {
        while (sem_wait(&worker.go) != 0) {
        }
    }
    return TAVO_SUCCESS;
}

Worker* worker_of(pthread_t thread) {
    const auto found = std::find_if(g_workers.begin(), g_workers.end(),
                                    [&](const Worker* worker) { return pthread_equal(worker->thread, thread) != 0; });
    return found != g_workers.end() ? *found : nullptr;
}

// Both with the mutex held.
void wake(Worker& worker) {
    if (!worker.asleep) return;
    worker.asleep = false;
    sem_post(&worker.go);
}
bool all_asleep() {
    return std::all_of(g_workers.begin(), g_workers.end(), [](const Worker* worker) { return worker->asleep; });
}

// A framework that was made has its worker asleep, so that the first tick is the same for all.
TAVO_Status create_worker(pthread_t* thread, TAVO_ThreadStart start, void* argument, const TAVO_CHAR* name) {
    const TAVO_Status status = function_named_as<TAVO_Status(pthread_t*, TAVO_ThreadStart, void*, const TAVO_CHAR*)>(
        "tavo_osal_thread_create_with_name")(thread, start, argument, name);
    if (status != TAVO_SUCCESS) return status;
    std::unique_lock<std::mutex> lock(g_mutex);
    g_changed.wait(lock, [&] {
        const Worker* worker = worker_of(*thread);
        return worker != nullptr && worker->asleep;
    });
    return status;
}

// The worker that is waited for does its last round.
TAVO_Status join_worker(pthread_t thread) {
    {
        const std::lock_guard<std::mutex> lock(g_mutex);
        if (Worker* worker = worker_of(thread)) {
            worker->ending = true;
            wake(*worker);
        }
    }
    return function_named_as<TAVO_Status(pthread_t)>("tavo_osal_thread_join")(thread);
}

}  // namespace

ManualTicks::ManualTicks()
    : sleep_(kLibrary, "tavo_osal_thread_usleep", &sleep_by_hand),
      create_(kLibrary, "tavo_osal_thread_create_with_name", &create_worker),
      join_(kLibrary, "tavo_osal_thread_join", &join_worker) {
    const std::lock_guard<std::mutex> lock(g_mutex);
    g_driving = true;
    g_last_sleep = 0;
}

ManualTicks::~ManualTicks() {
    const std::lock_guard<std::mutex> lock(g_mutex);
    g_driving = false;
    for (Worker* worker : g_workers) wake(*worker);
}

void ManualTicks::tick(unsigned times) {
    std::unique_lock<std::mutex> lock(g_mutex);
    for (unsigned i = 0; i < times; ++i) {
        g_changed.wait(lock, all_asleep);
        for (Worker* worker : g_workers) wake(*worker);
        g_changed.wait(lock, all_asleep);
    }
}

void ManualTicks::begin_tick() {
    const std::lock_guard<std::mutex> lock(g_mutex);
    for (Worker* worker : g_workers) wake(*worker);
}

size_t ManualTicks::asleep() const {
    const std::lock_guard<std::mutex> lock(g_mutex);
    return static_cast<size_t>(
        std::count_if(g_workers.begin(), g_workers.end(), [](const Worker* worker) { return worker->asleep; }));
}

uint32_t ManualTicks::last_sleep() const {
    const std::lock_guard<std::mutex> lock(g_mutex);
    return g_last_sleep;
}

}  // namespace tavo::test
