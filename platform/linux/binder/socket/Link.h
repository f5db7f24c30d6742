// What joins this process to one other: the control connection and the channels.
#pragma once

#include <sys/types.h>

#include <atomic>
#include <cstdint>
#include <map>
#include <mutex>
#include <unordered_set>
#include <vector>

#include "../Driver.h"
#include "Poller.h"
#include "Wire.h"

namespace android::socket_driver {

class Link;

// What a link tells the process it belongs to.
class LinkEvents {
public:
    // The peer will call on this channel.
    virtual void channelOffered(const std::shared_ptr<Link>& link, UniqueFd channel) = 0;
    // The peer gave up references to a node of this process.
    virtual void referencesReleased(Link& link, uint64_t node, uint64_t count) = 0;
    // The peer is gone, or said what no peer says.
    virtual void linkEnded(const std::shared_ptr<Link>& link) = 0;

protected:
    ~LinkEvents() = default;
};

class Link : public Endpoint, public std::enable_shared_from_this<Link> {
public:
    // The most channels one peer may call on. A peer that opens more is cut off.
    static constexpr size_t kMaxServedChannels = 1024;

    Link(LinkEvents& events, UniqueFd control, Driver::Caller peer, uint64_t peerInstance = 0)
        : events_(events), control_(std::move(control)), peer_(packed(peer)), peerInstance_(peerInstance) {}

    int fd() const override { return control_.get(); }
    void onReady() override;

    // Who is at the other end, for transactions that come back along a channel of this process.
    Driver::Caller peer() const {
        const uint64_t both = peer_;
        return {static_cast<pid_t>(both >> 32), static_cast<uid_t>(both)};
    }
    // The peer's own number, 0 where this process was not the one to connect.
    uint64_t peerInstance() const { return peerInstance_; }

    bool dead() const { return dead_; }
    // Ends everything at once: calls that wait on this link fail, and no new one starts.
    void cut();

    // A channel to call on. Invalid when the link is dead (error is DEAD_OBJECT) or the process has no
    // descriptors left. It must come back, with `reusable` false unless its last call ended in order.
    UniqueFd takeChannel(status_t& error);
    void returnChannel(UniqueFd channel, bool reusable);

    // Channels that the peer calls on, by their number at the poller.
    bool addServed(uint64_t channel);
    void removeServed(uint64_t channel);
    std::vector<uint64_t> takeServed();

    // Tells the peer that references to its node were given up here. Never blocks: what cannot be said now
    // is said with a later call.
    void releaseReferences(uint64_t node, uint64_t count);
    void flushReleases();

private:
    static constexpr size_t kMaxIdleChannels = 16;

    static uint64_t packed(const Driver::Caller& peer) {
        return static_cast<uint64_t>(static_cast<uint32_t>(peer.pid)) << 32 | peer.uid;
    }

    bool readMessage(bool& again);
    bool handleMessage(const uint8_t* packet, size_t size, std::vector<UniqueFd>& descriptors);

    LinkEvents& events_;
    const UniqueFd control_;
    std::atomic<uint64_t> peer_;  // pid and uid, changed as one
    const uint64_t peerInstance_;
    std::atomic<bool> dead_{false};
    Baton baton_;

    std::mutex mutex_;
    std::vector<UniqueFd> idle_;
    std::vector<int> calling_;
    std::unordered_set<uint64_t> served_;
    std::map<uint64_t, uint64_t> releases_;  // node -> references to give back
};

}  // namespace android::socket_driver
