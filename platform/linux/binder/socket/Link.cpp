#include "Link.h"

#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "Frame.h"

namespace android::socket_driver {
namespace {

struct ReleasePacket {
    ControlHeader header{kMagic, ControlType::kRelease};
    ReleasedReference references[kReleaseBatch];
};

}  // namespace

void Link::onReady() {
    if (!baton_.take()) return;
    do {
        flushReleases();
        for (bool again = true; again;) {
            if (!readMessage(again)) {
                events_.linkEnded(shared_from_this());
                return;  // with the baton: nobody needs to look here again
            }
        }
    } while (!baton_.giveBack());
}

bool Link::readMessage(bool& again) {
    alignas(8) uint8_t packet[sizeof(ReleasePacket)];
    iovec buffer{packet, sizeof packet};
    std::vector<UniqueFd> descriptors;
    bool lost = false;
    ucred sender{};
    const ssize_t size = receive(control_.get(), &buffer, 1, MSG_DONTWAIT | MSG_TRUNC, descriptors, lost, &sender);
    if (size < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
        again = false;
        return true;
    }
    // Only a link that was made for somebody else's use learns here who uses it.
    if (size > 0 && sender.pid != 0) peer_ = packed({sender.pid, sender.uid});
    return size > 0 && static_cast<size_t>(size) <= sizeof packet &&
           handleMessage(packet, static_cast<size_t>(size), descriptors);
}

bool Link::handleMessage(const uint8_t* packet, size_t size, std::vector<UniqueFd>& descriptors) {
    ControlHeader header;
    if (size < sizeof header) return false;
    memcpy(&header, packet, sizeof header);
    if (header.magic != kMagic) return false;

    const size_t rest = size - sizeof header;
    if (header.type == ControlType::kChannel) {
        if (rest != 0 || descriptors.size() != 1) return false;
        events_.channelOffered(shared_from_this(), std::move(descriptors.front()));
        return true;
    }
    if (header.type == ControlType::kRelease) {
        if (!descriptors.empty() || rest % sizeof(ReleasedReference) != 0) return false;
        for (size_t at = sizeof header; at < size; at += sizeof(ReleasedReference)) {
            ReleasedReference released;
            memcpy(&released, packet + at, sizeof released);
            events_.referencesReleased(*this, released.node, released.count);
        }
        return true;
    }
    return false;
}

void Link::cut() {
    const std::lock_guard<std::mutex> lock(mutex_);
    dead_ = true;
    shutdown(control_.get(), SHUT_RDWR);
    for (const int channel : calling_) shutdown(channel, SHUT_RDWR);
    idle_.clear();
    releases_.clear();
}

UniqueFd Link::takeChannel(status_t& error) {
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        if (dead_) {
            error = DEAD_OBJECT;
            return UniqueFd();
        }
        if (!idle_.empty()) {
            UniqueFd channel = std::move(idle_.back());
            idle_.pop_back();
            calling_.push_back(channel.get());
            return channel;
        }
    }
    // The serving side knows its caller by the credentials of the process that made the pair: this one.
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
        error = -errno;
        return UniqueFd();
    }
    UniqueFd channel(ends[0]);
    const UniqueFd offered(ends[1]);
    const ControlHeader offer{kMagic, ControlType::kChannel};
    if (sendBytes(control_.get(), &offer, sizeof offer, {offered.get()}, 0) < 0) {
        error = errno == EPIPE || errno == ECONNRESET ? DEAD_OBJECT : -errno;
        return UniqueFd();
    }
    const std::lock_guard<std::mutex> lock(mutex_);
    if (dead_) {
        error = DEAD_OBJECT;
        return UniqueFd();
    }
    calling_.push_back(channel.get());
    return channel;
}

void Link::returnChannel(UniqueFd channel, bool reusable) {
    const std::lock_guard<std::mutex> lock(mutex_);
    calling_.erase(std::find(calling_.begin(), calling_.end(), channel.get()));
    if (reusable && !dead_ && idle_.size() < kMaxIdleChannels) idle_.push_back(std::move(channel));
}

bool Link::addServed(uint64_t channel) {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (dead_ || served_.size() >= kMaxServedChannels) return false;
    served_.insert(channel);
    return true;
}

void Link::removeServed(uint64_t channel) {
    const std::lock_guard<std::mutex> lock(mutex_);
    served_.erase(channel);
}

std::vector<uint64_t> Link::takeServed() {
    const std::lock_guard<std::mutex> lock(mutex_);
    std::vector<uint64_t> channels(served_.begin(), served_.end());
    served_.clear();
    return channels;
}

void Link::releaseReferences(uint64_t node, uint64_t count) {
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        if (dead_) return;
        releases_[node] += count;
    }
    flushReleases();
}

void Link::flushReleases() {
    const std::lock_guard<std::mutex> lock(mutex_);
    while (!releases_.empty() && !dead_) {
        ReleasePacket packet;
        size_t count = 0;
        auto last = releases_.begin();
        for (; last != releases_.end() && count < kReleaseBatch; ++last) {
            packet.references[count++] = {last->first, last->second};
        }
        const size_t size = sizeof packet.header + count * sizeof(ReleasedReference);
        if (sendBytes(control_.get(), &packet, size, {}, MSG_DONTWAIT) < 0) return;
        releases_.erase(releases_.begin(), last);
    }
}

}  // namespace android::socket_driver
