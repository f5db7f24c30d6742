// Waits for many connections with many threads, and hands each thread one that is ready.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <unordered_map>

#include "../UniqueFd.h"

namespace android::socket_driver {

// Lets one thread at a time work on a connection. Events are edge-triggered: a thread that finds another at work
// leaves word, and the other goes round once more.
class Baton {
public:
    // True when the caller is the one to work.
    bool take();
    // False when word was left: the caller still holds the baton and must look again.
    bool giveBack();

private:
    enum State { kFree, kTaken, kWordLeft };
    std::atomic<int> state_{kFree};
};

class Endpoint {
public:
    virtual ~Endpoint() = default;
    virtual int fd() const = 0;
    // Called on any thread, on several at once. Must take everything there is.
    virtual void onReady() = 0;

    // The poller's number for it; 0 before it has one.
    uint64_t id = 0;
};

class Poller {
public:
    Poller();
    bool valid() const { return epoll_.valid(); }

    // A number for an endpoint that must be known to others before it is added.
    uint64_t reserveId();
    // From now on the poller keeps the endpoint alive. `writable`: see wantWritable.
    bool add(const std::shared_ptr<Endpoint>& endpoint, bool writable = false);
    // Null when there is no such endpoint any more.
    std::shared_ptr<Endpoint> remove(uint64_t id);
    // Also reports when the endpoint can take bytes, or no longer.
    void wantWritable(const Endpoint& endpoint, bool wanted);
    // The next endpoint that is ready; null when it went away meanwhile.
    std::shared_ptr<Endpoint> wait();

private:
    UniqueFd epoll_;
    std::mutex mutex_;
    std::unordered_map<uint64_t, std::shared_ptr<Endpoint>> endpoints_;
    uint64_t lastId_ = 0;
};

}  // namespace android::socket_driver
