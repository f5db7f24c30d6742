// The channels of a link: those to call on, and those to serve.
#include <sys/resource.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <new>

#include "Frame.h"
#include "Link.h"

namespace android::socket_driver {
namespace {

// Channels kept for later calls.
constexpr size_t kMaxIdle = 16;
// One is enough for the directory, which answers at once.
constexpr size_t kMaxDirectoryChannels = 1;
// A peer that closes a channel and opens the next may be seen doing so the other way round.
constexpr size_t kServedSlack = 32;

constexpr std::chrono::seconds kVerdictLimit{1};

}  // namespace

class Link::Turn {
public:
    Turn(Link& link, std::deque<const Channel*>& queue, const Channel& channel)
        : link_(link), queue_(queue), channel_(channel) {
        queue_.push_back(&channel_);
    }
    ~Turn() {
        queue_.erase(std::find(queue_.begin(), queue_.end(), &channel_));
        link_.changed_.notify_all();
    }
    Turn(const Turn&) = delete;
    Turn& operator=(const Turn&) = delete;

private:
    Link& link_;
    std::deque<const Channel*>& queue_;
    const Channel& channel_;
};

status_t Link::takeChannel(Purpose purpose, bool mayBeFresh, Channel& channel) {
    {
        std::unique_lock<std::mutex> lock(mutex_);
        Outgoing& channels = outgoing(purpose);
        const size_t most = purpose == Purpose::kDirectory ? kMaxDirectoryChannels : maxChannels_;
        const auto isOver = [&] {
            return !channels.idle.empty() || (mayBeFresh ? channels.open < most : channels.open == 0);
        };
        if (!channels.waiting.empty() || !isOver()) {
            const Turn turn(*this, channels.waiting, channel);
            changed_.wait(lock, [&] { return dead_ || (channels.waiting.front() == &channel && isOver()); });
        }
        if (dead_) return DEAD_OBJECT;
        if (channels.idle.empty() && !mayBeFresh) return NO_MEMORY;
        channel.purpose_ = purpose;
        if (channels.idle.empty()) {
            ++channels.open;
            channel.isFresh_ = true;
        } else {
            calling_.reserve(calling_.size() + 1);  // first: nothing has changed when there is no memory
            channel.fd_ = std::move(channels.idle.back());
            channels.idle.pop_back();
            calling_.push_back(channel.fd());
        }
        channel.link_ = this;
    }
    return channel.isFresh() ? makeChannel(purpose, channel) : OK;
}

status_t Link::makeChannel(Purpose purpose, Channel& channel) {
    // The serving side knows its caller by the credentials of the process that made the pair: this one.
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return NO_MEMORY;
    channel.fd_.reset(ends[0]);
    if (purpose == Purpose::kDirectory) limitWaits(channel.fd());
    const UniqueFd offered(ends[1]);
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        if (dead_) return DEAD_OBJECT;
        calling_.push_back(channel.fd());
    }
    const ChannelOffer offer{{kMagic, ControlType::kChannel}, purpose, 0};
    if (sendBytes(control_.get(), &offer, sizeof offer, {offered.get()}, 0) >= 0) return OK;
    return errno == EPIPE || errno == ECONNRESET ? DEAD_OBJECT : NO_MEMORY;
}

void Link::returnChannel(Channel& channel) {
    const std::lock_guard<std::mutex> lock(mutex_);
    calling_.erase(std::remove(calling_.begin(), calling_.end(), channel.fd()), calling_.end());
    Outgoing& channels = outgoing(channel.purpose_);
    bool isKept = channel.inOrder_ && !dead_ && channels.idle.size() < kMaxIdle;
    try {
        if (isKept) channels.idle.push_back(std::move(channel.fd_));
    } catch (const std::bad_alloc&) {
        isKept = false;
    }
    if (!isKept) --channels.open;
    // Closed under the lock if at all: cut() must not meet another descriptor of the same number.
    channel.fd_.reset();
    changed_.notify_all();
}

status_t Link::heedRefusal() {
    std::unique_lock<std::mutex> lock(mutex_);
    // The word comes at once, unless nobody listens to it any more because this process exits.
    changed_.wait_for(lock, kVerdictLimit, [&] { return dead_ || refusals_ > 0; });
    if (refusals_ == 0) return DEAD_OBJECT;
    --refusals_;
    return NO_MEMORY;
}

// -- Channels to serve

uint32_t Link::maxServedChannels() {
    static const uint32_t most = [] {
        rlimit limit{};
        const rlim_t descriptors = getrlimit(RLIMIT_NOFILE, &limit) == 0 ? limit.rlim_cur : 0;
        return static_cast<uint32_t>(std::clamp<rlim_t>(descriptors / 4, 16, 1024));
    }();
    return most;
}

bool Link::addServed(uint64_t channel, Purpose purpose) {
    const std::lock_guard<std::mutex> lock(mutex_);
    size_t& count = servedCount_[static_cast<size_t>(purpose)];
    const size_t most = purpose == Purpose::kDirectory ? kMaxDirectoryChannels : maxServedChannels();
    if (dead_ || count >= most + kServedSlack) return false;
    served_[channel] = purpose;
    ++count;
    return true;
}

void Link::removeServed(uint64_t channel) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto found = served_.find(channel);
    if (found == served_.end()) return;
    --servedCount_[static_cast<size_t>(found->second)];
    served_.erase(found);
}

std::vector<uint64_t> Link::takeServed() {
    const std::lock_guard<std::mutex> lock(mutex_);
    std::vector<uint64_t> channels;
    for (const auto& [channel, purpose] : served_) channels.push_back(channel);
    served_.clear();
    return channels;
}

}  // namespace android::socket_driver
