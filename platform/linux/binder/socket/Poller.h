// Waits for many connections with many threads, and hands each thread one that is ready.
#pragma once

#include <sys/epoll.h>

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <unordered_map>

#include "../UniqueFd.h"

namespace android::socket_driver {

// Lets one thread at a time work on a connection whose events are edge-triggered: a thread that finds another at work
// leaves word, and the other goes round once more.
class Baton {
public:
    // True when the caller is the one to work.
    bool take();
    // False when word was left: the caller still holds the baton and must look again.
    bool giveBack();
    // Gives the baton back whether word was left or not: the caller has the poller report once more.
    void drop() { state_.store(kFree); }

private:
    enum State { kFree, kTaken, kWordLeft };
    std::atomic<int> state_{kFree};
};

class Endpoint : public std::enable_shared_from_this<Endpoint> {
public:
    Endpoint() : id(++lastId_) {}
    Endpoint(const Endpoint&) = delete;
    Endpoint& operator=(const Endpoint&) = delete;
    virtual ~Endpoint() = default;
    virtual int fd() const = 0;
    // Called by whoever polls; with several threads, on several at once.
    virtual void onReady() = 0;
    // There is no memory to go on with: whoever is at the other end is to learn of it.
    virtual void giveUp() {}
    // onReady(), which runs out of memory at this connection's cost and nobody else's.
    void tend();

    // Never used again for another.
    const uint64_t id;

private:
    static std::atomic<uint64_t> lastId_;
};

class Poller {
public:
    static constexpr uint32_t kReadable = EPOLLIN | EPOLLRDHUP;
    static constexpr uint32_t kWritable = EPOLLOUT;
    // Reports news only: whoever is told takes everything there is.
    static constexpr uint32_t kEdge = EPOLLET;

    Poller();
    bool valid() const { return epoll_.valid(); }
    // Readable when an endpoint is ready.
    int fd() const { return epoll_.get(); }

    // From now on the poller keeps the endpoint alive.
    bool add(const std::shared_ptr<Endpoint>& endpoint, uint32_t events);
    // Reports at once what is the case already.
    void change(const Endpoint& endpoint, uint32_t events);
    // Null when there is no such endpoint any more.
    std::shared_ptr<Endpoint> remove(uint64_t id);
    std::shared_ptr<Endpoint> find(uint64_t id);
    // The next endpoint that is ready; null when it went away meanwhile, or when none is and `wait` is false.
    std::shared_ptr<Endpoint> next(bool wait = true);

private:
    UniqueFd epoll_;
    std::mutex mutex_;
    std::unordered_map<uint64_t, std::shared_ptr<Endpoint>> endpoints_;
};

}  // namespace android::socket_driver
