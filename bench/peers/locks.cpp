// Locks, and what is waited for: a mutex alone and fought over, semaphores and events handed to and fro between two
// threads, semaphores between two processes.
#include <fcntl.h>
#include <pthread.h>
#include <semaphore.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <boost/interprocess/sync/interprocess_semaphore.hpp>

#include "helper.h"
#include "peer.h"
#include "tavo_osal/event.h"
#include "tavo_osal/ipc_semaphore.h"
#include "tavo_osal/mutex.h"
#include "tavo_osal/semaphore.h"

namespace tavo::peers {
namespace {

void must(bool good, const char* what) {
    if (!good) fail(what);
}

// --- mutexes

struct BareMutex {
    void lock() { pthread_mutex_lock(&mutex_); }
    void unlock() { pthread_mutex_unlock(&mutex_); }
    pthread_mutex_t mutex_ = PTHREAD_MUTEX_INITIALIZER;
};

struct OurMutex {
    OurMutex() { must(tavo_osal_mutex_create(&mutex_) == TAVO_SUCCESS, "tavo_osal_mutex_create"); }
    ~OurMutex() { tavo_osal_mutex_destroy(&mutex_); }
    void lock() { tavo_osal_mutex_lock(mutex_); }
    void unlock() { tavo_osal_mutex_unlock(mutex_); }
    TAVO_Mutex* mutex_ = nullptr;
};

// Counts under the lock; what two threads count at once without one does not add up.
template <typename Mutex>
class Counting : public Party {
public:
    explicit Counting(int helper_cpu) {
        if (helper_cpu != kNoHelper) helper_.emplace(helper_cpu, [this](size_t operations) { count(operations); });
    }

    void run(size_t operations) override {
        if (helper_) {
            helper_->beside(operations, [this](size_t own) { count(own); });
        } else {
            count(operations);
        }
        counted_ += operations * (helper_ ? 2 : 1);
    }
    Tally tally() override { return {{counted_, 0}, {counter_, 0}}; }

private:
    void count(size_t operations) {
        for (; operations > 0; --operations) {
            mutex_.lock();
            // Not to be moved out of the loop.
            asm volatile("" : "+m"(counter_));
            ++counter_;
            mutex_.unlock();
        }
    }

    Mutex mutex_;
    uint64_t counter_ = 0;
    uint64_t counted_ = 0;
    std::optional<Helper> helper_;
};

// --- what is waited for, by threads

template <bool shared>
struct BareSemaphore {
    BareSemaphore() { must(sem_init(&semaphore_, shared, 0) == 0, "sem_init"); }
    ~BareSemaphore() { sem_destroy(&semaphore_); }
    void post() { sem_post(&semaphore_); }
    void wait() { sem_wait(&semaphore_); }
    sem_t semaphore_;
};

struct OurSemaphore {
    OurSemaphore() {
        must(tavo_osal_semaphore_create(&semaphore_, 0, 0) == TAVO_SUCCESS, "tavo_osal_semaphore_create");
    }
    ~OurSemaphore() { tavo_osal_semaphore_destroy(&semaphore_); }
    void post() { tavo_osal_semaphore_post(&semaphore_); }
    void wait() { tavo_osal_semaphore_wait(&semaphore_); }
    sem_t semaphore_;
};

struct BoostSemaphore {
    void post() { semaphore_.post(); }
    void wait() { semaphore_.wait(); }
    boost::interprocess::interprocess_semaphore semaphore_{0};
};

struct BareCondition {
    void post() {
        pthread_mutex_lock(&mutex_);
        ++count_;
        pthread_cond_signal(&condition_);
        pthread_mutex_unlock(&mutex_);
    }
    void wait() {
        pthread_mutex_lock(&mutex_);
        while (count_ == 0) pthread_cond_wait(&condition_, &mutex_);
        --count_;
        pthread_mutex_unlock(&mutex_);
    }
    pthread_mutex_t mutex_ = PTHREAD_MUTEX_INITIALIZER;
    pthread_cond_t condition_ = PTHREAD_COND_INITIALIZER;
    unsigned count_ = 0;
};

struct StandardCondition {
    void post() {
        const std::lock_guard<std::mutex> lock(mutex_);
        ++count_;
        condition_.notify_one();
    }
    void wait() {
        std::unique_lock<std::mutex> lock(mutex_);
        condition_.wait(lock, [this] { return count_ > 0; });
        --count_;
    }
    std::mutex mutex_;
    std::condition_variable condition_;
    unsigned count_ = 0;
};

struct OurEvent {
    OurEvent() { must(tavo_osal_event_create(&event_) == TAVO_SUCCESS, "tavo_osal_event_create"); }
    ~OurEvent() { tavo_osal_event_destroy(&event_); }
    void post() { tavo_osal_event_set(event_); }
    void wait() { tavo_osal_event_waitset(event_, TAVO_EVENT_FOREVER); }
    TAVO_Event* event_ = nullptr;
};

// What two sides stand on: there and back, and a number that goes along.
template <typename Signal>
struct Table {
    Signal there;
    Signal back;
    std::atomic<uint64_t> number{0};
};

// One side. Waits until the number says that it is its turn: a wait may end without a cause.
template <typename Signal>
class Side {
public:
    Side(Table<Signal>& table, bool begins) : table_(table), begins_(begins) {}

    void run(size_t operations) {
        for (; operations > 0; --operations) {
            if (begins_) hand_over(table_.there);
            take(begins_ ? table_.back : table_.there);
            if (!begins_) hand_over(table_.back);
        }
    }
    const Tally& tally() const { return tally_; }

private:
    void hand_over(Signal& signal) {
        const uint64_t number = table_.number.load(std::memory_order_relaxed) + 1;
        tally_.out.add(number);
        table_.number.store(number, std::memory_order_release);
        signal.post();
    }
    void take(Signal& signal) {
        uint64_t number;
        do {
            signal.wait();
            number = table_.number.load(std::memory_order_acquire);
        } while ((number % 2 == 1) == begins_);
        tally_.in.add(number);
    }

    Table<Signal>& table_;
    const bool begins_;
    Tally tally_;
};

template <typename Signal>
class Threads : public Party {
public:
    explicit Threads(int helper_cpu) : helper_(helper_cpu, [this](size_t operations) { other_.run(operations); }) {}

    void run(size_t operations) override {
        helper_.beside(operations, [this](size_t own) { mine_.run(own); });
    }
    // Both sides' as one, so that what one has sent and the other has received must be equal.
    Tally tally() override {
        Tally both = {mine_.tally().out, other_.tally().in};
        both.out.checksum += 3 * other_.tally().out.checksum;
        both.in.checksum += 3 * mine_.tally().in.checksum;
        return both;
    }

private:
    Table<Signal> table_;
    Side<Signal> mine_{table_, true};
    Side<Signal> other_{table_, false};
    Helper helper_;
};

// --- what is waited for, by processes

struct NamedSemaphore {
    NamedSemaphore() {
        const std::string name = "/tavo-bench-" + std::to_string(getpid());
        semaphore_ = sem_open(name.c_str(), O_CREAT | O_EXCL, 0600, 0);
        must(semaphore_ != SEM_FAILED, "sem_open");
        sem_unlink(name.c_str());
    }
    ~NamedSemaphore() { sem_close(semaphore_); }
    void post() { sem_post(semaphore_); }
    void wait() { sem_wait(semaphore_); }
    sem_t* semaphore_;
};

// A file of the storage root, mapped; made with a count of 1.
struct OurNamedSemaphore {
    OurNamedSemaphore() {
        static uint32_t key = 4660;
        must(tavo_semaphore_init(key++, &semaphore_) == TAVO_SUCCESS, "tavo_semaphore_init");
        must(tavo_semaphore_acquire(semaphore_) == TAVO_SUCCESS, "tavo_semaphore_acquire");
    }
    ~OurNamedSemaphore() { tavo_semaphore_delete(semaphore_); }
    void post() { tavo_semaphore_release(semaphore_); }
    void wait() { tavo_semaphore_acquire(semaphore_); }
    TAVO_INT64 semaphore_ = 0;
};

template <typename Signal>
class Process : public Party {
public:
    Process(Table<Signal>& table, bool begins) : side_(table, begins) {}
    void run(size_t operations) override { side_.run(operations); }
    Tally tally() override { return side_.tally(); }

private:
    Side<Signal> side_;
};

// The table lies in memory that both processes have.
template <typename Signal>
class Shared : public Setting {
public:
    Shared()
        : memory_(mmap(nullptr, sizeof(Table<Signal>), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0)) {
        must(memory_ != MAP_FAILED, "mmap");
        table_ = new (memory_) Table<Signal>;
    }
    ~Shared() override {
        table_->~Table<Signal>();
        munmap(memory_, sizeof(Table<Signal>));
    }
    std::unique_ptr<Party> driver() override { return std::make_unique<Process<Signal>>(*table_, true); }
    std::unique_ptr<Party> partner() override { return std::make_unique<Process<Signal>>(*table_, false); }

private:
    void* const memory_;
    Table<Signal>* table_;
};

// --- the contests

template <typename Signal>
Peer processes(const char* name, Role role) {
    return {name, role, [] { return std::make_unique<Shared<Signal>>(); }};
}

Contest mutexes(const char* operation, int cpus, int helper_cpu) {
    return {"locks",
            operation,
            {},
            cpus,
            {alone<Counting<BareMutex>>("pthread mutex", Role::limit, helper_cpu),
             alone<Counting<OurMutex>>("TAVO mutex", Role::ours, helper_cpu),
             alone<Counting<std::mutex>>("std::mutex", Role::peer, helper_cpu)}};
}

}  // namespace

std::vector<Contest> lock_contests() {
    std::vector<Contest> contests = {mutexes("mutex, one thread", 1, kNoHelper)};
    for (const int cpus : {1, 2}) contests.push_back(mutexes("mutex, two threads", cpus, places(cpus).second));
    for (const int cpus : {1, 2}) {
        const int cpu = places(cpus).second;
        contests.push_back({"locks",
                            "semaphore there and back, threads",
                            {},
                            cpus,
                            {alone<Threads<BareSemaphore<false>>>("sem_t", Role::limit, cpu),
                             alone<Threads<OurSemaphore>>("TAVO semaphore", Role::ours, cpu),
                             alone<Threads<BoostSemaphore>>("Boost.Interprocess semaphore", Role::peer, cpu)}});
    }
    for (const int cpus : {1, 2}) {
        const int cpu = places(cpus).second;
        contests.push_back({"locks",
                            "event there and back, threads",
                            {},
                            cpus,
                            {alone<Threads<BareCondition>>("pthread condition", Role::limit, cpu),
                             alone<Threads<OurEvent>>("TAVO event", Role::ours, cpu),
                             alone<Threads<StandardCondition>>("std::condition_variable", Role::peer, cpu)}});
    }
    for (const int cpus : {1, 2}) {
        contests.push_back({"locks",
                            "semaphore there and back, processes",
                            {},
                            cpus,
                            {processes<BareSemaphore<true>>("sem_t in shared memory", Role::limit),
                             processes<OurNamedSemaphore>("TAVO semaphore by key", Role::ours),
                             processes<NamedSemaphore>("sem_open", Role::peer),
                             processes<BoostSemaphore>("Boost.Interprocess semaphore", Role::peer)}});
    }
    return contests;
}

}  // namespace tavo::peers
