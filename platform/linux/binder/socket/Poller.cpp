#include "Poller.h"

#include <sys/epoll.h>

namespace android::socket_driver {
namespace {

uint32_t eventsFor(bool writable) { return EPOLLIN | EPOLLRDHUP | EPOLLET | (writable ? EPOLLOUT : 0U); }

}  // namespace

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

uint64_t Poller::reserveId() {
    const std::lock_guard<std::mutex> lock(mutex_);
    return ++lastId_;
}

bool Poller::add(const std::shared_ptr<Endpoint>& endpoint, bool writable) {
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        if (endpoint->id == 0) endpoint->id = ++lastId_;
        endpoints_[endpoint->id] = endpoint;
    }
    epoll_event event{};
    event.events = eventsFor(writable);
    event.data.u64 = endpoint->id;
    if (epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, endpoint->fd(), &event) == 0) return true;
    remove(endpoint->id);
    return false;
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

void Poller::wantWritable(const Endpoint& endpoint, bool wanted) {
    epoll_event event{};
    event.events = eventsFor(wanted);
    event.data.u64 = endpoint.id;
    epoll_ctl(epoll_.get(), EPOLL_CTL_MOD, endpoint.fd(), &event);
}

std::shared_ptr<Endpoint> Poller::wait() {
    epoll_event event{};
    if (epoll_wait(epoll_.get(), &event, 1, -1) != 1) return nullptr;
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto found = endpoints_.find(event.data.u64);
    return found != endpoints_.end() ? found->second : nullptr;
}

}  // namespace android::socket_driver
