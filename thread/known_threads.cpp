#include "thread/known_threads.h"

#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>

#include "log/cancel_shield.h"
#include "thread/cancellation.h"
#include "thread/platform_threads.h"

namespace tavo {
namespace {

enum class State : unsigned char { kUnknown, kJoining, kJoined, kDetached };

struct Entry {
    pthread_t thread;
    State state;
    pid_t id;         // detached: the kernel's id when it was detached, 0 if it had ended, -1 if unknown
    unsigned ticket;  // joining: tells this join from a later one of the same handle's value
};

// The latest handles joined or detached. Bounded, so that a program that makes threads for ever needs no more memory
// for it; as a rule the platform gives out the same few values again, and they are forgotten one by one.
class Ledger {
public:
    Entry* find(pthread_t thread) {
        for (size_t i = 0; i < used_; ++i) {
            if (entries_[i].state != State::kUnknown && pthread_equal(entries_[i].thread, thread)) return &entries_[i];
        }
        return nullptr;
    }

    // Null when threads are being joined in every place there is.
    Entry* remember(pthread_t thread, State state) {
        Entry* entry = find(thread);
        if (entry == nullptr) entry = free_place();
        if (entry != nullptr) *entry = {thread, state, 0, 0};
        return entry;
    }

    void forget(pthread_t thread) {
        Entry* entry = find(thread);
        if (entry != nullptr) entry->state = State::kUnknown;
    }

private:
    static constexpr size_t kPlaces = 1024;

    Entry* free_place() {
        for (size_t i = 0; i < used_; ++i) {
            if (entries_[i].state == State::kUnknown) return &entries_[i];
        }
        if (used_ < kPlaces) return &entries_[used_++];
        for (size_t tried = 0; tried < kPlaces; ++tried) {
            Entry& oldest = entries_[next_out_];
            next_out_ = (next_out_ + 1) % kPlaces;
            if (oldest.state != State::kJoining) return &oldest;
        }
        return nullptr;
    }

    Entry entries_[kPlaces];
    size_t used_;
    size_t next_out_;
};

pthread_mutex_t g_lock = PTHREAD_MUTEX_INITIALIZER;
Ledger g_ledger;
unsigned g_last_ticket = 0;

// The ledger's lock, and no cancellation while it is held.
class Locked {
public:
    Locked() { pthread_mutex_lock(&g_lock); }
    ~Locked() { pthread_mutex_unlock(&g_lock); }
    Locked(const Locked&) = delete;
    Locked& operator=(const Locked&) = delete;

private:
    CancelShield shield_;
};

pid_t running_id(pthread_t thread) { return find_running_thread != nullptr ? find_running_thread(thread) : -1; }

// Whether the entry still speaks of the thread it was made for, and that thread is gone.
bool dead(const Entry& entry, pid_t id) {
    if (entry.state == State::kJoined) return id <= 0;
    return entry.state == State::kDetached && id == 0;
}

// Why a thread with an entry cannot be joined or detached; 0 when the value belongs to another thread by now.
int why_not_joinable(const Entry& entry) {
    if (entry.state == State::kJoining) return EINVAL;
    const pid_t id = running_id(entry.thread);
    if (dead(entry, id)) return ESRCH;
    return entry.state == State::kDetached && (id == -1 || id == entry.id) ? EINVAL : 0;
}

// Handles that need no ledger: nobody's, and the caller's own, which is alive.
bool is_nobody(pthread_t thread) { return pthread_equal(thread, pthread_t{}) != 0; }
bool is_self(pthread_t thread) { return pthread_equal(thread, pthread_self()) != 0; }

int begin_join(pthread_t thread, unsigned& ticket) {
    const Locked locked;
    if (const Entry* entry = g_ledger.find(thread)) {
        const int error = why_not_joinable(*entry);
        if (error != 0) return error;
    }
    ticket = ++g_last_ticket;
    Entry* entry = g_ledger.remember(thread, State::kJoining);
    if (entry != nullptr) entry->ticket = ticket;
    return 0;
}

void end_join(pthread_t thread, unsigned ticket, bool joined) {
    const Locked locked;
    Entry* entry = g_ledger.find(thread);
    // From the moment the thread is joined another may have been given the value.
    if (entry == nullptr || entry->state != State::kJoining || entry->ticket != ticket) return;
    entry->state = joined ? State::kJoined : State::kUnknown;
}

}  // namespace

int create_thread(pthread_t* thread, void* (*start)(void*), void* argument) {
    // Held throughout: nobody is to do anything to the new thread before its handle's past is forgotten and the
    // handler installed.
    const Locked locked;
    const int error = pthread_create(thread, nullptr, start, argument);
    if (error != 0) return error;
    g_ledger.forget(*thread);
    install_cancel_handler();
    return 0;
}

int join_thread(pthread_t thread) {
    if (is_nobody(thread)) return ESRCH;
    if (is_self(thread)) return EDEADLK;  // POSIX leaves it open whether the platform would notice.
    const CancelShield shield;
    unsigned ticket = 0;
    int error = begin_join(thread, ticket);
    if (error != 0) return error;
    error = wait_cancellably([&] { return pthread_join(thread, nullptr); }, [&] { end_join(thread, ticket, false); });
    end_join(thread, ticket, error == 0);
    return error;
}

int detach_thread(pthread_t thread) {
    if (is_nobody(thread)) return ESRCH;
    const Locked locked;
    if (!is_self(thread)) {
        const Entry* entry = g_ledger.find(thread);
        const int error = entry != nullptr ? why_not_joinable(*entry) : 0;
        if (error != 0) return error;
    }
    const pid_t id = running_id(thread);
    const int error = pthread_detach(thread);
    if (error == 0) {
        Entry* entry = g_ledger.remember(thread, State::kDetached);
        if (entry != nullptr) entry->id = id;
    }
    return error;
}

int signal_thread(pthread_t thread, int signal) {
    if (is_nobody(thread)) return ESRCH;
    if (is_self(thread)) {
        { const Locked after_creation; }
        return pthread_kill(thread, signal);
    }
    const Locked locked;
    const Entry* entry = g_ledger.find(thread);
    if (entry == nullptr) return pthread_kill(thread, signal);
    const pid_t id = running_id(thread);
    if (dead(*entry, id)) return ESRCH;
    if (id == -1) return pthread_kill(thread, signal);
    // The thread may end, or be joined, at any moment from here on: the kernel's id stays harmless, unlike the handle.
    if (id == 0) return ESRCH;
    return syscall(SYS_tgkill, getpid(), id, signal) == 0 ? 0 : errno;
}

bool is_dead(pthread_t thread) {
    if (is_nobody(thread)) return true;
    if (is_self(thread)) return false;
    const Locked locked;
    const Entry* entry = g_ledger.find(thread);
    return entry != nullptr && dead(*entry, running_id(thread));
}

}  // namespace tavo
