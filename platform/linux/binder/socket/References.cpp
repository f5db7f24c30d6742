#include "References.h"

namespace android::socket_driver {

uint64_t References::give(Link& link, const sp<BBinder>& object) {
    const std::lock_guard<std::mutex> lock(mutex_);
    // A link dies before its references are ended, so what is given to a live one will be taken back.
    if (link.dead()) return 0;
    Node& node = nodes_[object.get()];
    if (node.id == 0) node.id = ++lastNode_;
    Gift& gift = peers_[&link].gifts[node.id];
    if (gift.count++ == 0) {
        gift.object = object;
        ++node.links;
    }
    return node.id;
}

void References::takeBack(Link& link, uint64_t node, uint64_t count) {
    sp<BBinder> dropped;
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto peer = peers_.find(&link);
    if (peer == peers_.end()) return;
    const auto gift = peer->second.gifts.find(node);
    if (gift == peer->second.gifts.end()) return;
    if (gift->second.count > count) {
        gift->second.count -= count;
        return;
    }
    dropGift(gift->second);
    dropped = gift->second.object;
    peer->second.gifts.erase(gift);
    forgetPeerIfEmpty(link);
}

sp<BBinder> References::find(const Link& link, uint64_t node) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto peer = peers_.find(&link);
    if (peer == peers_.end()) return nullptr;
    const auto gift = peer->second.gifts.find(node);
    return gift != peer->second.gifts.end() ? gift->second.object : nullptr;
}

int32_t References::adopt(const std::shared_ptr<Link>& link, uint64_t node) {
    const std::lock_guard<std::mutex> lock(mutex_);
    int32_t& number = peers_[link.get()].handles[node];
    if (number == 0) {
        do {
            lastHandle_ = lastHandle_ == INT32_MAX ? 1 : lastHandle_ + 1;
        } while (handles_.count(lastHandle_) != 0);
        number = lastHandle_;
        handles_[number].route = {link, node};
    }
    Handle& handle = handles_[number];
    ++handle.references;
    ++handle.users;
    return number;
}

void References::acquire(int32_t number) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle != handles_.end()) ++handle->second.users;
}

void References::release(int32_t number) {
    Handle dropped;
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        const auto handle = handles_.find(number);
        if (handle == handles_.end() || --handle->second.users > 0) return;
        dropped = std::move(handle->second);
        handles_.erase(handle);
        peers_[dropped.route.link.get()].handles.erase(dropped.route.node);
        forgetPeerIfEmpty(*dropped.route.link);
    }
    dropped.route.link->releaseReferences(dropped.route.node, dropped.references);
}

bool References::route(int32_t number, Route& route) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle == handles_.end()) return false;
    route = handle->second.route;
    return true;
}

status_t References::mourn(int32_t number, const wp<BpBinder>& proxy) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle == handles_.end()) return BAD_TYPE;
    if (handle->second.route.link->dead()) return DEAD_OBJECT;
    handle->second.mourned = true;
    handle->second.mourner = proxy;
    return OK;
}

status_t References::forget(int32_t number) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle == handles_.end()) return BAD_TYPE;
    handle->second.mourned = false;
    return OK;
}

bool References::anybodyMourns(const Link& link) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto peer = peers_.find(&link);
    if (peer == peers_.end()) return false;
    for (const auto& [node, number] : peer->second.handles) {
        if (handles_[number].mourned) return true;
    }
    return false;
}

std::vector<wp<BpBinder>> References::end(Link& link) {
    std::vector<wp<BpBinder>> mourners;
    std::unordered_map<uint64_t, Gift> dropped;
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto peer = peers_.find(&link);
    if (peer == peers_.end()) return mourners;
    dropped.swap(peer->second.gifts);
    for (const auto& [node, gift] : dropped) dropGift(gift);
    for (const auto& [node, number] : peer->second.handles) {
        Handle& handle = handles_[number];
        if (handle.mourned) mourners.push_back(handle.mourner);
        handle.mourned = false;
    }
    forgetPeerIfEmpty(link);
    return mourners;
}

void References::dropGift(const Gift& gift) {
    const auto node = nodes_.find(gift.object.get());
    if (node != nodes_.end() && --node->second.links == 0) nodes_.erase(node);
}

void References::forgetPeerIfEmpty(const Link& link) {
    const auto peer = peers_.find(&link);
    if (peer != peers_.end() && peer->second.gifts.empty() && peer->second.handles.empty()) peers_.erase(peer);
}

}  // namespace android::socket_driver
