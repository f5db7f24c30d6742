// Which objects of this process others refer to, and which of theirs this process refers to.
#pragma once

#include <binder/Binder.h>
#include <binder/BpBinder.h>

#include <cstdint>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <vector>

#include "Link.h"

namespace android::socket_driver {

// References cross a link one by one: an object's process counts how often it gave a node to a peer, the peer
// counts how often it received it, and gives all of them back at once when its last user is gone. A node that is on
// its way while it is being given back therefore stays alive.
class References {
public:
    // -- Objects of this process

    // Gives the link's peer one more reference. Returns the object's node, or 0 when the link is dead.
    uint64_t give(Link& link, const sp<BBinder>& object);
    // Takes references back. What this drops is dropped without the lock.
    void takeBack(Link& link, uint64_t node, uint64_t count);
    // The object behind a node, if the peer may use it.
    sp<BBinder> find(const Link& link, uint64_t node);

    // -- Objects of other processes

    struct Route {
        std::shared_ptr<Link> link;
        uint64_t node = 0;
    };
    // The handle of a node that has come in with one reference, in use once more.
    int32_t adopt(const std::shared_ptr<Link>& link, uint64_t node);
    void acquire(int32_t handle);
    // The last release gives the references back to their owner.
    void release(int32_t handle);
    bool route(int32_t handle, Route& route);

    status_t mourn(int32_t handle, const wp<BpBinder>& proxy);
    status_t forget(int32_t handle);
    bool anybodyMourns(const Link& link);
    // Drops what the peer referred to and returns who asked to hear of its end, each once.
    std::vector<wp<BpBinder>> end(Link& link);

private:
    struct Gift {
        sp<BBinder> object;
        uint64_t count = 0;
    };
    struct Node {
        uint64_t id = 0;
        size_t links = 0;  // that have it among their gifts
    };
    struct Handle {
        Route route;
        uint64_t references = 0;  // received, to be given back
        size_t users = 0;
        bool mourned = false;
        wp<BpBinder> mourner;
    };
    struct Peer {
        std::unordered_map<uint64_t, Gift> gifts;       // node -> what the peer holds
        std::unordered_map<uint64_t, int32_t> handles;  // peer's node -> this process's handle
    };

    void dropGift(const Gift& gift);
    void forgetPeerIfEmpty(const Link& link);

    std::mutex mutex_;
    std::unordered_map<const BBinder*, Node> nodes_;
    std::unordered_map<const Link*, Peer> peers_;
    std::unordered_map<int32_t, Handle> handles_;
    uint64_t lastNode_ = 0;
    int32_t lastHandle_ = 0;
};

}  // namespace android::socket_driver
