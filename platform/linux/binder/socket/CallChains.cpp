#include "CallChains.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <utility>

namespace android::socket_driver {

CallChains::Waiting::Waiting(CallChains& chains, uint64_t chain) : chains_(chains), chain_(chain) {
    const std::lock_guard<std::mutex> lock(chains_.mutex_);
    if (!chains_.spare_.empty()) {
        wake_ = std::move(chains_.spare_.back());
        chains_.spare_.pop_back();
    } else {
        wake_.reset(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    }
    if (!wake_.valid()) return;
    chains_.waiting_.push_back(this);
    ++chains_.count_;
}

CallChains::Waiting::~Waiting() {
    if (!wake_.valid()) return;
    {
        const std::lock_guard<std::mutex> lock(chains_.mutex_);
        std::vector<Waiting*>& waiting = chains_.waiting_;
        waiting.erase(std::find(waiting.begin(), waiting.end(), this));
        --chains_.count_;
        // One that has been rung is not used again: it would wake the next for nothing.
        if (arrivals_.empty() && chains_.spare_.size() < kMaxSpare) chains_.spare_.push_back(std::move(wake_));
    }
    for (Arrival& arrival : arrivals_) chains_.late_(std::move(arrival));
}

std::vector<Arrival> CallChains::Waiting::wait(int channel) {
    pollfd polled[] = {{channel, POLLIN, 0}, {wake_.get(), POLLIN, 0}};
    if (poll(polled, wake_.valid() ? 2 : 1, -1) <= 0 || polled[1].revents == 0) return {};
    eventfd_t rings = 0;
    eventfd_read(wake_.get(), &rings);
    const std::lock_guard<std::mutex> lock(chains_.mutex_);
    return std::exchange(arrivals_, {});
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
    eventfd_write((*found)->wake_.get(), 1);
    return true;
}

}  // namespace android::socket_driver
