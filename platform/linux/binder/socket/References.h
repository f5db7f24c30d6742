// Which objects of this process others refer to, and which of theirs this process refers to.
#pragma once

#include <binder/Binder.h>
#include <binder/BpBinder.h>

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <unordered_set>
#include <utility>
#include <vector>

#include "Link.h"

namespace android::socket_driver {

// References cross a link one by one: an object's process counts how often it gave a node to a peer, the peer
// counts how often it received it, and gives all of them back at once when its last user is gone. A node that is on
// its way while it is being given back therefore stays alive.
//
// An object has one handle here, on however many links to its process it came in.
class References {
public:
    // -- Objects of this process

    // Gives the link's peer one more reference. Returns the object's node, or 0 when the link is dead.
    uint64_t give(Link& link, const sp<BBinder>& object);
    // Takes references back. What this drops is returned, to be dropped where it does no harm.
    sp<BBinder> takeBack(Link& link, uint64_t node, uint64_t count);
    // The object behind a node, if the peer may use it.
    sp<BBinder> find(const Link& link, uint64_t node);
    // Whether any other process may call this one.
    bool areGiven() const { return gifts_ > 0; }

    // -- Objects of other processes

    struct Route {
        std::shared_ptr<Link> link;
        uint64_t node = 0;
    };
    // The handle of a node that has come in with one reference, in use once more.
    int32_t adopt(const std::shared_ptr<Link>& link, uint64_t node);
    // The handle of a node that this process has from elsewhere already, in use once more; 0 when it has not.
    int32_t share(const Identity& owner, uint64_t node);
    void acquire(int32_t handle);
    // The same, for a node of the link's peer, which is returned; nothing and 0 for one of anybody else's.
    uint64_t acquireFrom(const Link& link, int32_t handle);
    // The last release gives the references back to their owner.
    void release(int32_t handle);
    bool route(int32_t handle, Route& route);

    status_t mourn(int32_t handle, const wp<BpBinder>& proxy);
    status_t forget(int32_t handle);

    // What the end of a link leaves to be done.
    struct Estate {
        std::vector<sp<BBinder>> objects;    // to be dropped
        std::vector<wp<BpBinder>> mourners;  // who asked to hear of it, each once
    };
    Estate end(Link& link);

private:
    struct Gift {
        sp<BBinder> object;
        uint64_t count = 0;
    };
    struct Node {
        uint64_t id = 0;
        size_t links = 0;  // that have it among their gifts
    };
    struct Received {
        std::shared_ptr<Link> link;
        uint64_t count;  // to be given back
    };
    struct Handle {
        std::pair<Identity, uint64_t> origin;
        std::vector<Received> received;  // never empty
        size_t users = 0;
        bool mourned = false;
        wp<BpBinder> mourner;
    };
    struct Peer {
        std::unordered_map<uint64_t, Gift> gifts;  // node -> what the peer holds
        std::unordered_set<int32_t> handles;       // received from the peer
    };

    Handle* findUsable(const std::pair<Identity, uint64_t>& origin, const Link* link, int32_t& number);
    void dropGift(const Gift& gift);
    // True when that was all, and the link was there for nothing else.
    bool forgetPeerIfEmpty(const Link& link);
    static bool isDead(const Handle& handle);
    static std::vector<Received>::iterator findReceived(Handle& handle, const Link& link);

    std::mutex mutex_;
    std::unordered_map<const BBinder*, Node> nodes_;
    std::unordered_map<const Link*, Peer> peers_;
    std::map<std::pair<Identity, uint64_t>, int32_t> numbers_;
    std::unordered_map<int32_t, Handle> handles_;
    uint64_t lastNode_ = 0;
    int32_t lastHandle_ = 0;
    std::atomic<size_t> gifts_{0};
};

// Handles in use, for as long as this lives.
class UsedHandles {
public:
    UsedHandles() = default;
    UsedHandles(UsedHandles&& other) noexcept : references_(other.references_) { handles_.swap(other.handles_); }
    UsedHandles& operator=(UsedHandles&& other) noexcept {
        clear();
        references_ = other.references_;
        handles_.swap(other.handles_);
        return *this;
    }
    ~UsedHandles() { clear(); }

    // Takes over one use of a handle.
    void take(References& references, int32_t handle) {
        references_ = &references;
        handles_.push_back(handle);
    }
    void clear() {
        for (const int32_t handle : std::exchange(handles_, {})) references_->release(handle);
    }

private:
    References* references_ = nullptr;
    std::vector<int32_t> handles_;
};

}  // namespace android::socket_driver
