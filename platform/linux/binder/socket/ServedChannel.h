// The serving end of a channel.
#pragma once

#include <memory>
#include <vector>

#include "Frame.h"
#include "Link.h"

namespace android::socket_driver {

class ServedChannel;

class TransactionServer {
public:
    // One transaction has come in. Answers with channel.send.
    virtual void transactionArrived(ServedChannel& channel, Frame& frame) = 0;
    // The peer closed the channel.
    virtual void channelClosed(ServedChannel& channel) = 0;
    // The peer said what no peer says.
    virtual void peerMisbehaved(ServedChannel& channel) = 0;

protected:
    ~TransactionServer() = default;
};

// Reads and writes without ever blocking: a peer that sends half a frame, or does not take its reply, costs memory
// for one parcel and no thread.
class ServedChannel : public Endpoint {
public:
    ServedChannel(TransactionServer& server, Poller& poller, std::shared_ptr<Link> link, UniqueFd socket,
                  Driver::Caller caller)
        : server_(server), poller_(poller), link_(std::move(link)), socket_(std::move(socket)), caller_(caller) {}

    int fd() const override { return socket_.get(); }
    void onReady() override;

    const std::shared_ptr<Link>& link() const { return link_; }
    const Driver::Caller& caller() const { return caller_; }

    // Sends what the peer will take and keeps the rest for later. 0, or errno when nothing was sent or kept.
    int send(const OutgoingFrame& frame);

private:
    bool hasUnsent() const { return unsentAt_ < unsent_.size(); }
    // False when the peer will not take all of it yet.
    bool sendUnsent();

    TransactionServer& server_;
    Poller& poller_;
    const std::shared_ptr<Link> link_;
    const UniqueFd socket_;
    const Driver::Caller caller_;
    Baton baton_;
    // Only touched by whoever holds the baton.
    FrameReader reader_;
    std::vector<uint8_t> unsent_;
    size_t unsentAt_ = 0;
    std::vector<UniqueFd> unsentDescriptors_;
};

}  // namespace android::socket_driver
