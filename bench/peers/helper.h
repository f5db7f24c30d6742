// For contests within one process: a second thread, on a CPU of its own or on the first one's.
#pragma once

#include <condition_variable>
#include <mutex>
#include <thread>
#include <utility>

#include "bench/cpus.h"
#include "peer.h"

namespace tavo::peers {

class Helper {
public:
    // Does work(operations) each time that it is told to.
    template <typename Work>
    Helper(int cpu, Work work)
        : thread_([this, cpu, work] {
              bench::run_on(cpu);
              while (const size_t operations = next()) {
                  work(operations);
                  finish();
              }
          }) {}
    ~Helper() {
        tell(0);
        thread_.join();
    }
    Helper(const Helper&) = delete;
    Helper& operator=(const Helper&) = delete;

    // Both threads do so many operations; ends when both are done.
    template <typename Work>
    void beside(size_t operations, Work own) {
        tell(operations);
        own(operations);
        std::unique_lock<std::mutex> lock(lock_);
        changed_.wait(lock, [this] { return !told_ && !busy_; });
    }

private:
    void tell(size_t operations) {
        const std::lock_guard<std::mutex> lock(lock_);
        operations_ = operations;
        told_ = true;
        changed_.notify_all();
    }
    size_t next() {
        std::unique_lock<std::mutex> lock(lock_);
        changed_.wait(lock, [this] { return told_; });
        told_ = false;
        busy_ = true;
        return operations_;
    }
    void finish() {
        const std::lock_guard<std::mutex> lock(lock_);
        busy_ = false;
        changed_.notify_all();
    }

    std::mutex lock_;
    std::condition_variable changed_;
    size_t operations_ = 0;
    bool told_ = false;
    bool busy_ = false;
    std::thread thread_;  // last: it uses the others from its start
};

// One process. What it does is told on which CPU a second thread is wanted, or that none is.
constexpr int kNoHelper = -1;

template <typename Work>
class Alone : public Setting {
public:
    explicit Alone(int helper_cpu) : helper_cpu_(helper_cpu) {}
    std::unique_ptr<Party> driver() override { return std::make_unique<Work>(helper_cpu_); }
    bool has_partner() const override { return false; }

private:
    const int helper_cpu_;
};

template <typename Work>
Peer alone(const char* name, Role role, int helper_cpu) {
    return {name, role, [helper_cpu] { return std::make_unique<Alone<Work>>(helper_cpu); }};
}

}  // namespace tavo::peers
