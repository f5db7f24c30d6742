// How many threads serve, and when one more is wanted.
#pragma once

#include <atomic>
#include <cstddef>

namespace android::socket_driver {

// One thread waits for work as long as the budget allows: whoever starts to work and leaves nobody waiting asks
// for another. A thread that waits for a reply of its own does not count against the budget, or a chain of
// calls that comes back to a process whose threads are all waiting would never end.
class ThreadBudget {
public:
    void setMax(size_t max) { max_ = max; }

    // A pool thread is about to wait for work, and has found some.
    void beginWait() { ++idle_; }
    void endWait() { --idle_; }
    // A pool thread is about to wait for a reply, and has it.
    void beginCall() { ++calling_; }
    void endCall() { --calling_; }

    // True when one more thread is to be started: the caller starts it.
    bool wantsThread() {
        if (idle_ > 0 || starting_.exchange(true)) return false;
        if (spawned_ < limit()) {
            ++spawned_;
            return true;
        }
        starting_ = false;
        return false;
    }
    // A thread has joined the pool and waits for work for the first time. Only now may the next be asked for.
    void joined(bool asked) {
        ++joined_;
        if (asked) starting_ = false;
    }
    bool hasThreads() const { return joined_ > 0; }

private:
    // However deep calls are nested, a process keeps to a multiple of its maximum.
    static constexpr size_t kNestingFactor = 4;

    size_t limit() const {
        const size_t raised = max_ + calling_;
        return raised < max_ * kNestingFactor ? raised : max_ * kNestingFactor;
    }

    std::atomic<size_t> max_{15};
    std::atomic<size_t> idle_{0};
    std::atomic<size_t> calling_{0};
    std::atomic<size_t> spawned_{0};
    std::atomic<size_t> joined_{0};
    std::atomic<bool> starting_{false};
};

}  // namespace android::socket_driver
