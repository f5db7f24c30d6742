// What joins this process to one other: the control connection and the channels.
#pragma once

#include <sys/types.h>

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <mutex>
#include <unordered_map>
#include <vector>

#include "../Driver.h"
#include "Poller.h"
#include "Wire.h"

namespace android::socket_driver {

class Link;

// What a link tells the process it belongs to, on the thread that keeps its house.
class LinkEvents {
public:
    // The peer will call on this channel. False when there is no room for it.
    virtual bool channelOffered(const std::shared_ptr<Link>& link, Purpose purpose, UniqueFd channel) = 0;
    // The peer gave up references to a node of this process.
    virtual void referencesReleased(Link& link, uint64_t node, uint64_t count) = 0;
    // The peer is gone, or said what no peer says.
    virtual void linkEnded(const std::shared_ptr<Link>& link) = 0;

protected:
    ~LinkEvents() = default;
};

// Tells processes apart, and knows one again that is met on a second link. Both halves are needed: the process names
// the number itself, the kernel the pid.
struct Identity {
    uint64_t instance;
    pid_t pid;
    bool operator<(const Identity& other) const {
        return instance != other.instance ? instance < other.instance : pid < other.pid;
    }
};

class Link : public Endpoint {
public:
    // A channel to call on, for one call. It can be used again when that ended in order.
    class Channel {
    public:
        Channel() = default;
        Channel(const Channel&) = delete;
        Channel& operator=(const Channel&) = delete;
        ~Channel() {
            if (link_ != nullptr) link_->returnChannel(*this);
        }
        int fd() const { return fd_.get(); }
        // Nothing came along it yet, so that the peer may not have taken it.
        bool isFresh() const { return isFresh_; }
        void endInOrder() { inOrder_ = true; }

    private:
        friend class Link;
        Link* link_ = nullptr;
        UniqueFd fd_;
        Purpose purpose_ = Purpose::kCalls;
        bool isFresh_ = false;
        bool inOrder_ = false;
    };

    Link(LinkEvents& events, Poller& poller, UniqueFd control, Driver::Caller peer);

    int fd() const override { return control_.get(); }
    void onReady() override;
    void giveUp() override { cut(); }

    // Whom this process connected to, or what a newcomer's Hello says. Nothing else is taken before.
    void greet(const Greeting& greeting);
    bool isGreeted() const { return greeted_; }
    // The same on all links with one process. Of an unknown process, nobody's.
    Identity identity() const { return identity_; }
    // What the process says of itself.
    uint64_t instance() const { return instance_; }
    // Who is at the other end, as the kernel says.
    Driver::Caller peer() const { return peer_; }

    // A link that was made by an introduction lasts no longer than what came with it is in use.
    void setTemporary() { temporary_ = true; }
    bool isTemporary() const { return temporary_; }
    // Counts a connection made for a third process to meet this one, as long as it has not. False when there are too
    // many.
    bool addIntroduction(const std::shared_ptr<Link>& introduced);

    bool dead() const { return dead_; }
    // Calls that wait on this link fail, and no new one starts. The end itself is reported by the poller.
    void cut();

    // Waits for its turn while as many as the peer takes are in use; where there turned out to be no room for a fresh
    // one, until one of the others is idle. DEAD_OBJECT when the peer is gone, NO_MEMORY when none can be had.
    status_t takeChannel(Purpose purpose, bool mayBeFresh, Channel& channel);
    // After a fresh channel was closed: waits for the peer's word on it. DEAD_OBJECT when the peer is gone, NO_MEMORY
    // when it has no room.
    status_t heedRefusal();

    // Channels that the peer calls on, by their number at the poller.
    bool addServed(uint64_t channel, Purpose purpose);
    void removeServed(uint64_t channel);
    std::vector<uint64_t> takeServed();

    // Tells the peer that references to its node were given up here. Never blocks: what cannot be said now
    // is said when the peer has listened.
    void releaseReferences(uint64_t node, uint64_t count);

    // How many channels for calls one peer may keep open: a share of the descriptors this process may have.
    static uint32_t maxServedChannels();

private:
    bool readMessage();
    bool handleMessage(const uint8_t* packet, size_t size, std::vector<UniqueFd>& descriptors, bool lost);
    bool handleOffer(const ChannelOffer& offer, std::vector<UniqueFd>& descriptors, bool lost);
    status_t makeChannel(Purpose purpose, Channel& channel);
    void returnChannel(Channel& channel);
    void flushNews();
    bool sendReleases();

    struct Outgoing {
        std::vector<UniqueFd> idle;
        size_t open = 0;                     // idle ones and those in use
        std::deque<const Channel*> waiting;  // in the order of their coming
    };
    // A place in the queue for a channel.
    class Turn;
    Outgoing& outgoing(Purpose purpose) { return outgoing_[static_cast<size_t>(purpose)]; }

    LinkEvents& events_;
    Poller& poller_;
    const UniqueFd control_;
    // Set before anybody else can know the link, or by the thread that reads the control connection before it lets
    // the peer's first channel in.
    Driver::Caller peer_;
    Identity identity_;
    uint64_t instance_ = 0;
    uint32_t maxChannels_ = 1;
    bool greeted_ = false;
    bool temporary_ = false;
    std::vector<std::weak_ptr<Link>> introductions_;  // only touched by the thread that keeps house

    std::atomic<bool> dead_{false};

    std::mutex mutex_;
    std::condition_variable changed_;
    Outgoing outgoing_[kPurposes];
    std::vector<int> calling_;
    size_t refusals_ = 0;
    std::unordered_map<uint64_t, Purpose> served_;
    size_t servedCount_[kPurposes] = {};
    size_t refused_ = 0;  // channels of the peer's, of which it is to be told
    std::deque<ReleasedReference> releases_;
    bool isUnheard_ = false;  // the peer does not take what it is told
};

}  // namespace android::socket_driver
