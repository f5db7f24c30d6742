// The transactions that this process's threads run at the moment.
#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <thread>

namespace android {

// Static objects go away when a process exits, while the pool's threads are still there. So nothing new may
// begin then, and what has begun is given a moment.
class RunningCalls {
public:
    // A call on this thread, for as long as it lives. Does not return once the process exits.
    class Call {
    public:
        explicit Call(RunningCalls& calls) : calls_(calls) {
            if (depth()++ == 0) calls_.begin();
        }
        ~Call() {
            if (--depth() == 0) calls_.end();
        }
        Call(const Call&) = delete;
        Call& operator=(const Call&) = delete;

    private:
        RunningCalls& calls_;
    };

    // Waits for the calls of other threads, no longer than `limit`. What the calling thread goes on to do, and what
    // comes back to it then, is its own.
    void stop(std::chrono::milliseconds limit) {
        std::unique_lock<std::mutex> lock(mutex_);
        stopped_ = true;
        const size_t own = depth()++ > 0 ? 1 : 0;
        ended_.wait_for(lock, limit, [&] { return running_ <= own; });
    }

private:
    // Calls of this thread, one inside the other.
    static size_t& depth() {
        static thread_local size_t depth = 0;
        return depth;
    }

    void begin() {
        std::unique_lock<std::mutex> lock(mutex_);
        while (stopped_) {
            lock.unlock();
            std::this_thread::sleep_for(std::chrono::hours(1));
            lock.lock();
        }
        ++running_;
    }
    void end() {
        const std::lock_guard<std::mutex> lock(mutex_);
        --running_;
        if (stopped_) ended_.notify_all();
    }

    std::mutex mutex_;
    std::condition_variable ended_;
    size_t running_ = 0;
    bool stopped_ = false;
};

}  // namespace android
