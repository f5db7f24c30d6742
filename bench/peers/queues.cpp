// Queues: a message there and one back, and messages in one direction as fast as they go.
#include <unistd.h>

#include "queue.h"

namespace tavo::peers {
namespace {

constexpr size_t kSizes[] = {0, 64, 4096, 65536};

class RoundTrips : public Party {
public:
    RoundTrips(std::unique_ptr<Link> link, size_t size, End end) : link_(std::move(link)), messages_(size), end_(end) {}

    void run(size_t operations) override {
        for (; operations > 0; --operations) {
            if (end_ == End::driver) send();
            messages_.come(link_->receive());
            if (end_ == End::partner) send();
        }
    }
    Tally tally() override { return messages_.tally(); }

private:
    void send() {
        messages_.write(link_->blank(messages_.size()));
        link_->send(messages_.size());
    }

    const std::unique_ptr<Link> link_;
    Messages messages_;
    const End end_;
};

// The time of a stream ends when its last message has come, which a byte in a pipe tells.
class Finish {
public:
    Finish() {
        if (pipe(ends_) != 0) fail("pipe");
    }
    ~Finish() {
        close(ends_[0]);
        close(ends_[1]);
    }
    Finish(const Finish&) = delete;
    Finish& operator=(const Finish&) = delete;

    void reached() const {
        if (::write(ends_[1], "", 1) != 1) fail("write");
    }
    void wait() const {
        char byte;
        if (::read(ends_[0], &byte, 1) != 1) fail("read");
    }

private:
    int ends_[2];
};

class Stream : public Party {
public:
    Stream(std::unique_ptr<Link> link, size_t size, End end, const Finish& finish)
        : link_(std::move(link)), messages_(size), end_(end), finish_(finish) {}

    void run(size_t operations) override {
        if (end_ == End::driver) {
            for (; operations > 0; --operations) {
                messages_.write(link_->blank(messages_.size()));
                link_->send(messages_.size());
            }
            finish_.wait();
        } else {
            for (; operations > 0; --operations) messages_.come(link_->receive());
            finish_.reached();
        }
    }
    Tally tally() override { return messages_.tally(); }

private:
    const std::unique_ptr<Link> link_;
    Messages messages_;
    const End end_;
    const Finish& finish_;
};

class Connection : public Setting {
public:
    Connection(const QueuePeer& peer, size_t size, bool streams)
        : wire_(peer.make(size)), size_(size), streams_(streams) {}

    std::unique_ptr<Party> driver() override { return party(End::driver); }
    std::unique_ptr<Party> partner() override { return party(End::partner); }

private:
    std::unique_ptr<Party> party(End end) {
        auto link = wire_->open(end);
        if (streams_) return std::make_unique<Stream>(std::move(link), size_, end, finish_);
        return std::make_unique<RoundTrips>(std::move(link), size_, end);
    }

    const std::unique_ptr<Wire> wire_;
    const Finish finish_;
    const size_t size_;
    const bool streams_;
};

}  // namespace

std::vector<Contest> queue_contests() {
    std::vector<QueuePeer> queues = kernel_queues();
    queues.insert(queues.begin() + 1, our_queue());
    for (QueuePeer& peer : library_queues()) queues.push_back(std::move(peer));

    std::vector<Contest> contests;
    for (const bool streams : {false, true}) {
        for (const int cpus : {1, 2}) {
            for (const size_t size : kSizes) {
                Contest contest{"queues", streams ? "stream" : "round trip", size, cpus, {}};
                for (const QueuePeer& peer : queues) {
                    contest.peers.push_back(
                        {peer.name, peer.role,
                         [peer, size, streams] { return std::make_unique<Connection>(peer, size, streams); },
                         size > peer.most ? peer.limit : std::string()});
                }
                contests.push_back(std::move(contest));
            }
        }
    }
    return contests;
}

}  // namespace tavo::peers
