#include "References.h"

#include <algorithm>

#include "../Forked.h"

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
        ++gifts_;
    }
    return node.id;
}

sp<BBinder> References::takeBack(Link& link, uint64_t node, uint64_t count) {
    sp<BBinder> dropped;
    bool isOver = false;
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        const auto peer = peers_.find(&link);
        if (peer == peers_.end()) return nullptr;
        const auto gift = peer->second.gifts.find(node);
        if (gift == peer->second.gifts.end()) return nullptr;
        if (gift->second.count > count) {
            gift->second.count -= count;
            return nullptr;
        }
        dropGift(gift->second);
        dropped = gift->second.object;
        peer->second.gifts.erase(gift);
        isOver = forgetPeerIfEmpty(link);
    }
    if (isOver) link.cut();
    return dropped;
}

sp<BBinder> References::find(const Link& link, uint64_t node) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto peer = peers_.find(&link);
    if (peer == peers_.end()) return nullptr;
    const auto gift = peer->second.gifts.find(node);
    return gift != peer->second.gifts.end() ? gift->second.object : nullptr;
}

// A handle whose owner is dead stays dead, even if another process should bear the same marks.
References::Handle* References::findUsable(const std::pair<Identity, uint64_t>& origin, const Link* link,
                                           int32_t& number) {
    const auto known = numbers_.find(origin);
    if (known == numbers_.end()) return nullptr;
    number = known->second;
    Handle& handle = handles_[number];
    const bool isSame = link != nullptr && findReceived(handle, *link) != handle.received.end();
    return isSame || !isDead(handle) ? &handle : nullptr;
}

int32_t References::adopt(const std::shared_ptr<Link>& link, uint64_t node) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const std::pair<Identity, uint64_t> origin(link->identity(), node);
    int32_t number = 0;
    Handle* handle = findUsable(origin, link.get(), number);
    if (handle == nullptr) {
        do {
            lastHandle_ = lastHandle_ == INT32_MAX ? 1 : lastHandle_ + 1;
        } while (handles_.count(lastHandle_) != 0);
        number = numbers_[origin] = lastHandle_;
        handle = &handles_[number];
        handle->origin = origin;
    }
    ++handle->users;
    const auto known = findReceived(*handle, *link);
    if (known != handle->received.end()) {
        ++known->count;
    } else {
        handle->received.push_back({link, 1});
        peers_[link.get()].handles.insert(number);
    }
    return number;
}

int32_t References::share(const Identity& owner, uint64_t node) {
    const std::lock_guard<std::mutex> lock(mutex_);
    int32_t number = 0;
    Handle* handle = findUsable({owner, node}, nullptr, number);
    if (handle == nullptr) return 0;
    ++handle->users;
    return number;
}

void References::acquire(int32_t number) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle != handles_.end()) ++handle->second.users;
}

uint64_t References::acquireFrom(const Link& link, int32_t number) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle == handles_.end() || findReceived(handle->second, link) == handle->second.received.end()) return 0;
    ++handle->second.users;
    return handle->second.origin.second;
}

void References::release(int32_t number) {
    if (isForked()) return;
    Handle dropped;
    std::vector<std::shared_ptr<Link>> over;
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        const auto handle = handles_.find(number);
        if (handle == handles_.end() || --handle->second.users > 0) return;
        dropped = std::move(handle->second);
        handles_.erase(handle);
        const auto known = numbers_.find(dropped.origin);
        if (known != numbers_.end() && known->second == number) numbers_.erase(known);
        for (const Received& received : dropped.received) {
            peers_[received.link.get()].handles.erase(number);
            if (forgetPeerIfEmpty(*received.link)) over.push_back(received.link);
        }
    }
    for (const Received& received : dropped.received) {
        received.link->releaseReferences(dropped.origin.second, received.count);
    }
    for (const std::shared_ptr<Link>& link : over) link->cut();
}

bool References::route(int32_t number, Route& route) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle == handles_.end()) return false;
    const std::vector<Received>& received = handle->second.received;
    const auto alive =
        std::find_if(received.begin(), received.end(), [](const Received& one) { return !one.link->dead(); });
    route = {(alive != received.end() ? *alive : received.front()).link, handle->second.origin.second};
    return true;
}

bool References::isDead(const Handle& handle) {
    return std::all_of(handle.received.begin(), handle.received.end(),
                       [](const Received& received) { return received.link->dead(); });
}

std::vector<References::Received>::iterator References::findReceived(Handle& handle, const Link& link) {
    return std::find_if(handle.received.begin(), handle.received.end(),
                        [&link](const Received& received) { return received.link.get() == &link; });
}

status_t References::mourn(int32_t number, const wp<BpBinder>& proxy) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle == handles_.end()) return BAD_TYPE;
    if (isDead(handle->second)) return DEAD_OBJECT;
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

References::Estate References::end(Link& link) {
    Estate estate;
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto peer = peers_.find(&link);
    if (peer == peers_.end()) return estate;
    for (const auto& [node, gift] : peer->second.gifts) {
        dropGift(gift);
        estate.objects.push_back(gift.object);
    }
    peer->second.gifts.clear();
    for (const int32_t number : peer->second.handles) {
        Handle& handle = handles_[number];
        if (!handle.mourned || !isDead(handle)) continue;
        estate.mourners.push_back(handle.mourner);
        handle.mourned = false;
    }
    forgetPeerIfEmpty(link);
    return estate;
}

void References::dropGift(const Gift& gift) {
    --gifts_;
    const auto node = nodes_.find(gift.object.get());
    if (node != nodes_.end() && --node->second.links == 0) nodes_.erase(node);
}

bool References::forgetPeerIfEmpty(const Link& link) {
    const auto peer = peers_.find(&link);
    if (peer == peers_.end() || !peer->second.gifts.empty() || !peer->second.handles.empty()) return false;
    peers_.erase(peer);
    return link.isTemporary();
}

}  // namespace android::socket_driver
