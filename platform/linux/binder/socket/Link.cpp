#include "Link.h"

#include <linux/android/binder.h>
#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "Frame.h"

namespace android::socket_driver {
namespace {

constexpr size_t kMaxIntroductions = kMaxDescriptors;
// A peer that does not listen while more than this is to be told is cut off. One parcel's objects are far fewer.
constexpr size_t kMaxReleases = 4 * Driver::kParcelLimit / sizeof(flat_binder_object);

struct ReleasePacket {
    ControlHeader header{kMagic, ControlType::kRelease};
    ReleasedReference references[kReleaseBatch];
};

// The message in a packet, which is exactly as long; what it holds must be checked.
template <typename Message>
bool parse(const uint8_t* packet, size_t size, Message& message) {
    if (size != sizeof message) return false;
    memcpy(&message, packet, sizeof message);
    return true;
}

}  // namespace

Link::Link(LinkEvents& events, Poller& poller, UniqueFd control, Driver::Caller peer)
    : events_(events), poller_(poller), control_(std::move(control)), peer_(peer), identity_{id, -1} {
    limitWaits(control_.get());
}

void Link::greet(const Greeting& greeting) {
    instance_ = greeting.instance;
    // A process of another pid namespace has no pid here, so nothing vouches for what it says.
    if (peer_.pid > 0) identity_ = {greeting.instance, peer_.pid};
    maxChannels_ = std::max(greeting.maxChannels, 1U);
    greeted_ = true;
}

bool Link::addIntroduction(const std::shared_ptr<Link>& introduced) {
    const auto isOver = [](const std::weak_ptr<Link>& link) {
        const std::shared_ptr<Link> known = link.lock();
        return known == nullptr || known->isGreeted();
    };
    introductions_.erase(std::remove_if(introductions_.begin(), introductions_.end(), isOver), introductions_.end());
    if (introductions_.size() >= kMaxIntroductions) return false;
    introductions_.push_back(introduced);
    return true;
}

// -- Control messages

void Link::onReady() {
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        if (isUnheard_) flushNews();
    }
    if (!readMessage()) events_.linkEnded(std::static_pointer_cast<Link>(shared_from_this()));
}

// Reads one, so that no peer keeps the others waiting.
bool Link::readMessage() {
    alignas(8) uint8_t packet[sizeof(ReleasePacket)];
    iovec buffer{packet, sizeof packet};
    std::vector<UniqueFd> descriptors;
    bool lost = false;
    ucred sender{-1, 0, 0};
    const ssize_t received = receive(control_.get(), &buffer, 1, MSG_DONTWAIT | MSG_TRUNC, descriptors, lost, &sender);
    if (received < 0) return errno == EAGAIN || errno == EWOULDBLOCK;
    const auto size = static_cast<size_t>(received);
    if (size < sizeof(ControlHeader) || size > sizeof packet) return false;
    // Only a link that was made for somebody else learns here who that is, and nobody may take his place.
    if (sender.pid >= 0 && !greeted_) peer_ = {sender.pid, sender.uid};
    if (sender.pid >= 0 && (sender.pid != peer_.pid || sender.uid != peer_.uid)) return false;
    return handleMessage(packet, size, descriptors, lost);
}

bool Link::handleMessage(const uint8_t* packet, size_t size, std::vector<UniqueFd>& descriptors, bool lost) {
    ControlHeader header;
    memcpy(&header, packet, sizeof header);
    if (header.magic != kMagic || greeted_ != (header.type != ControlType::kHello)) return false;
    if (header.type == ControlType::kChannel) {
        ChannelOffer offer;
        return parse(packet, size, offer) && handleOffer(offer, descriptors, lost);
    }
    if (!descriptors.empty() || lost) return false;

    switch (header.type) {
        case ControlType::kHello: {
            Greeting hello;
            if (!parse(packet, size, hello)) return false;
            greet(hello);
            return true;
        }
        case ControlType::kRefusal: {
            const std::lock_guard<std::mutex> lock(mutex_);
            ++refusals_;
            changed_.notify_all();
            return size == sizeof header;
        }
        case ControlType::kRelease: {
            if ((size - sizeof header) % sizeof(ReleasedReference) != 0) return false;
            for (size_t at = sizeof header; at < size; at += sizeof(ReleasedReference)) {
                ReleasedReference released;
                memcpy(&released, packet + at, sizeof released);
                events_.referencesReleased(*this, released.node, released.count);
            }
            return true;
        }
        default: return false;
    }
}

bool Link::handleOffer(const ChannelOffer& offer, std::vector<UniqueFd>& descriptors, bool lost) {
    const bool known = offer.purpose == Purpose::kCalls || offer.purpose == Purpose::kDirectory;
    if (!known || offer.reserved != 0 || descriptors.size() != (lost ? 0 : 1)) return false;
    const auto self = std::static_pointer_cast<Link>(shared_from_this());
    if (!lost && events_.channelOffered(self, offer.purpose, std::move(descriptors.front()))) return true;
    // Without the peer's hearing of it, its call would wait for ever.
    const std::lock_guard<std::mutex> lock(mutex_);
    ++refused_;
    if (!isUnheard_) flushNews();
    return true;
}

void Link::cut() {
    const std::lock_guard<std::mutex> lock(mutex_);
    dead_ = true;
    shutdown(control_.get(), SHUT_RDWR);
    for (const int channel : calling_) shutdown(channel, SHUT_RDWR);
    for (Outgoing& channels : outgoing_) {
        channels.open -= channels.idle.size();
        channels.idle.clear();
    }
    releases_.clear();
    changed_.notify_all();
}

// -- News for the peer

void Link::releaseReferences(uint64_t node, uint64_t count) {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (dead_) return;
    releases_.push_back({node, count});
    if (!isUnheard_) flushNews();
    if (releases_.size() > kMaxReleases) shutdown(control_.get(), SHUT_RDWR);
}

void Link::flushNews() {
    const ControlHeader refusal{kMagic, ControlType::kRefusal};
    while (refused_ > 0 && sendBytes(control_.get(), &refusal, sizeof refusal, {}, MSG_DONTWAIT) >= 0) --refused_;
    while (!releases_.empty() && sendReleases()) {
    }
    const bool isHeard = refused_ == 0 && releases_.empty();
    if (isUnheard_ != isHeard) return;
    isUnheard_ = !isHeard;
    poller_.change(*this, Poller::kReadable | (isUnheard_ ? Poller::kWritable : 0U));
}

bool Link::sendReleases() {
    ReleasePacket packet;
    const size_t count = std::min(releases_.size(), kReleaseBatch);
    std::copy_n(releases_.begin(), count, packet.references);
    const size_t size = sizeof packet.header + count * sizeof(ReleasedReference);
    if (sendBytes(control_.get(), &packet, size, {}, MSG_DONTWAIT) < 0) return false;
    releases_.erase(releases_.begin(), releases_.begin() + static_cast<std::ptrdiff_t>(count));
    return true;
}

}  // namespace android::socket_driver
