// The serving end of a channel.
#pragma once

#include <memory>

#include "Frame.h"
#include "Link.h"
#include "References.h"

namespace android::socket_driver {

class ServedChannel;

// A transaction that has come in and waits for a thread.
struct Arrival {
    std::shared_ptr<ServedChannel> channel;
    Frame frame;
};

class TransactionServer {
public:
    // Called with the channel held. True when the transaction was answered; false when it is left to somebody
    // who will answer and then resume the channel.
    virtual bool transactionArrived(Arrival arrival) = 0;
    // The peer closed the channel.
    virtual void channelClosed(ServedChannel& channel) = 0;

protected:
    ~TransactionServer() = default;
};

// Reads and writes without ever blocking: a peer that sends half a frame, or does not take its reply, costs memory
// for one parcel and no thread.
class ServedChannel : public Endpoint {
public:
    ServedChannel(TransactionServer& server, Poller& poller, std::shared_ptr<Link> link, Purpose purpose,
                  UniqueFd socket, Driver::Caller caller);

    int fd() const override { return socket_.get(); }
    void onReady() override;
    void giveUp() override { link_->cut(); }

    const std::shared_ptr<Link>& link() const { return link_; }
    Purpose purpose() const { return purpose_; }
    const Driver::Caller& caller() const { return caller_; }

    // From now on the peer is listened to.
    bool start() { return poller_.add(shared_from_this(), events()); }

    // What follows is for whoever holds the channel.

    // Sends what the peer will take and keeps the rest for later, with the handles the frame speaks of. 0, or errno
    // when nothing was sent or kept.
    int send(const OutgoingFrame& frame, UsedHandles handles);
    // The channel is read by somebody else for a while: its news need not wake anyone.
    void mute();
    // Lets go of the channel and has the poller look at it again.
    void resume();

private:
    bool readFrames();
    // False when the peer will not take all of it yet.
    bool sendUnsent();
    uint32_t events() const { return Poller::kEdge | (unsent_ != nullptr ? Poller::kWritable : Poller::kReadable); }

    TransactionServer& server_;
    Poller& poller_;
    const std::shared_ptr<Link> link_;
    const Purpose purpose_;
    const UniqueFd socket_;
    const Driver::Caller caller_;
    Baton baton_;
    // Only touched by whoever holds the baton.
    FrameReader reader_;
    std::unique_ptr<UnsentFrame> unsent_;
    UsedHandles sentHandles_;
    bool muted_ = false;
};

}  // namespace android::socket_driver
