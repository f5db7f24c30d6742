// How many threads serve, and when one more is wanted.
#pragma once

#include <atomic>
#include <cstddef>

namespace android::socket_driver {

// One thread waits for work as long as the budget allows: whoever starts to work and leaves nobody waiting asks
// for another.
class ThreadBudget {
public:
    void setMax(size_t max) { max_ = max; }

    // A pool thread is about to wait for work, and has found some.
    void beginWait() { ++idle_; }
    void endWait() { --idle_; }
    size_t idle() const { return idle_; }

    enum class Next {
        kWaits,     // a thread waits for work, or soon will
        kIsWanted,  // the caller starts one more, and tells if it could not
        kIsNot,     // all there may be are busy
    };
    Next next() {
        if (idle_ > 0) return Next::kWaits;
        if (starting_.exchange(true)) return Next::kWaits;
        if (spawned_ < max_) {
            ++spawned_;
            return Next::kIsWanted;
        }
        starting_ = false;
        return Next::kIsNot;
    }
    void notStarted() {
        --spawned_;
        starting_ = false;
    }

    // A thread of the pool, for as long as this lives. Only when it waits for work for the first time may the next
    // be asked for.
    class Member {
    public:
        Member(ThreadBudget& budget, bool spawned) : budget_(budget) {
            budget_.beginWait();
            ++budget_.joined_;
            spawned_ = spawned && budget_.starting_.exchange(false);
        }
        // Only a thread that was ended by the program gets here: while it worked, so it is not idle.
        ~Member() {
            --budget_.joined_;
            if (spawned_) --budget_.spawned_;
        }
        Member(const Member&) = delete;
        Member& operator=(const Member&) = delete;

    private:
        ThreadBudget& budget_;
        bool spawned_;
    };
    bool hasThreads() const { return joined_ > 0; }

private:
    std::atomic<size_t> max_{15};
    std::atomic<size_t> idle_{0};
    std::atomic<size_t> spawned_{0};
    std::atomic<size_t> joined_{0};
    std::atomic<bool> starting_{false};
};

}  // namespace android::socket_driver
