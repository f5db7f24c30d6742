#include "CallChains.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <utility>

namespace android::socket_driver {

thread_local CallChains::Waiting* CallChains::innermost_ = nullptr;

CallChains::Waiting::Waiting(CallChains& chains, uint64_t chain)
    : chains_(chains),
      chain_(chain),
      outer_(innermost_),
      own_(outer_ == nullptr ? chains.takeBell() : UniqueFd()),
      bell_(outer_ == nullptr ? own_.get() : outer_->bell_) {
    innermost_ = this;
    const std::lock_guard<std::mutex> lock(chains_.mutex_);
    if (bell_ < 0) return;
    chains_.waiting_.push_back(this);
    ++chains_.count_;
}

CallChains::Waiting::~Waiting() {
    innermost_ = outer_;
    if (bell_ < 0) return;
    {
        const std::lock_guard<std::mutex> lock(chains_.mutex_);
        std::vector<Waiting*>& waiting = chains_.waiting_;
        waiting.erase(std::find(waiting.begin(), waiting.end(), this));
        --chains_.count_;
        // One that has been rung is not used again: it would wake the next for nothing.
        const bool isQuiet = own_.valid() && arrivals_.empty();
        if (isQuiet && chains_.spareBells_.size() < kMaxSpare) chains_.spareBells_.push_back(std::move(own_));
    }
    for (Arrival& arrival : arrivals_) chains_.late_(std::move(arrival));
}

std::vector<Arrival> CallChains::Waiting::wait(int channel) {
    {
        // A nested call may have heard the bell instead.
        const std::lock_guard<std::mutex> lock(chains_.mutex_);
        if (!arrivals_.empty()) return std::exchange(arrivals_, {});
    }
    pollfd polled[] = {{channel, POLLIN, 0}, {bell_, POLLIN, 0}};
    if (poll(polled, 2, -1) <= 0 || polled[1].revents == 0) return {};
    eventfd_t rings = 0;
    eventfd_read(bell_, &rings);
    const std::lock_guard<std::mutex> lock(chains_.mutex_);
    return std::exchange(arrivals_, {});
}

UniqueFd CallChains::takeBell() {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (spareBells_.empty()) return UniqueFd(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    UniqueFd bell = std::move(spareBells_.back());
    spareBells_.pop_back();
    return bell;
}

bool CallChains::handOver(Arrival& arrival) {
    if (count_ == 0) return false;
    const std::lock_guard<std::mutex> lock(mutex_);
    // The latest one first: earlier ones of the same chain wait for it.
    const auto found = std::find_if(waiting_.rbegin(), waiting_.rend(), [&arrival](const Waiting* waiting) {
        return waiting->chain_ == arrival.frame.header.chain;
    });
    if (found == waiting_.rend()) return false;
    (*found)->arrivals_.push_back(std::move(arrival));
    eventfd_write((*found)->bell_, 1);
    return true;
}

}  // namespace android::socket_driver
