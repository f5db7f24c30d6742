#include "Poller.h"

#include <new>

namespace android::socket_driver {

std::atomic<uint64_t> Endpoint::lastId_{0};

void Endpoint::tend() {
    try {
        onReady();
    } catch (const std::bad_alloc&) {
        giveUp();
    }
}

bool Baton::take() {
    int state = kFree;
    while (!state_.compare_exchange_weak(state, state == kFree ? kTaken : kWordLeft)) {
    }
    return state == kFree;
}

bool Baton::giveBack() {
    int state = kTaken;
    if (state_.compare_exchange_strong(state, kFree)) return true;
    state_.store(kTaken);
    return false;
}

Poller::Poller() : epoll_(epoll_create1(EPOLL_CLOEXEC)) {}

bool Poller::add(const std::shared_ptr<Endpoint>& endpoint, uint32_t events) {
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        endpoints_[endpoint->id] = endpoint;
    }
    epoll_event event{};
    event.events = events;
    event.data.u64 = endpoint->id;
    if (epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, endpoint->fd(), &event) == 0) return true;
    remove(endpoint->id);
    return false;
}

void Poller::change(const Endpoint& endpoint, uint32_t events) {
    epoll_event event{};
    event.events = events;
    event.data.u64 = endpoint.id;
    epoll_ctl(epoll_.get(), EPOLL_CTL_MOD, endpoint.fd(), &event);
}

std::shared_ptr<Endpoint> Poller::remove(uint64_t id) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto found = endpoints_.find(id);
    if (found == endpoints_.end()) return nullptr;
    std::shared_ptr<Endpoint> endpoint = std::move(found->second);
    endpoints_.erase(found);
    epoll_ctl(epoll_.get(), EPOLL_CTL_DEL, endpoint->fd(), nullptr);
    return endpoint;
}

std::shared_ptr<Endpoint> Poller::find(uint64_t id) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto found = endpoints_.find(id);
    return found != endpoints_.end() ? found->second : nullptr;
}

std::shared_ptr<Endpoint> Poller::next(bool wait) {
    epoll_event event{};
    if (epoll_wait(epoll_.get(), &event, 1, wait ? -1 : 0) != 1) return nullptr;
    return find(event.data.u64);
}

}  // namespace android::socket_driver
