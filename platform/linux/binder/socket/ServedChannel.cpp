#include "ServedChannel.h"

#include <sys/socket.h>

#include <cerrno>
#include <utility>

namespace android::socket_driver {

ServedChannel::ServedChannel(TransactionServer& server, Poller& poller, std::shared_ptr<Link> link, Purpose purpose,
                             UniqueFd socket, Driver::Caller caller)
    : server_(server),
      poller_(poller),
      link_(std::move(link)),
      purpose_(purpose),
      socket_(std::move(socket)),
      caller_(caller) {}

void ServedChannel::onReady() {
    if (!baton_.take()) return;
    do {
        if (!readFrames()) return;
        if (muted_) return resume();
    } while (!baton_.giveBack());
}

// False when somebody else holds the channel now, or nobody needs to any more.
bool ServedChannel::readFrames() {
    if (unsent_ != nullptr && !sendUnsent()) return true;
    for (;;) {
        Arrival arrival;
        const FrameReader::Result result = reader_.read(socket_.get(), MSG_DONTWAIT, arrival.frame);
        if (result == FrameReader::Result::kAgain) return true;
        if (result == FrameReader::Result::kClosed) {
            server_.channelClosed(*this);
            return false;
        }
        const bool isTransaction =
            result == FrameReader::Result::kFrame && arrival.frame.header.type == FrameType::kTransaction;
        if (!isTransaction && result != FrameReader::Result::kReceipt) {
            link_->cut();
            return false;
        }
        // Whatever comes behind a reply says that it was taken in.
        sentHandles_.clear();
        if (!isTransaction) continue;
        arrival.channel = std::static_pointer_cast<ServedChannel>(shared_from_this());
        // The peer waits for the reply now. What it sends after that is news to the poller, so there is no need to look
        // for more.
        return server_.transactionArrived(std::move(arrival));
    }
}

int ServedChannel::send(const OutgoingFrame& frame, UsedHandles handles) {
    size_t sent = 0;
    const int error = sendFrame(socket_.get(), frame, sent, MSG_DONTWAIT);
    if (error != 0 && error != EAGAIN) return error;
    if (error == EAGAIN) {
        unsent_ = UnsentFrame::copy(frame, sent);
        if (unsent_ == nullptr && sent == 0) return ENOMEM;
        // Half a reply is worse than none.
        if (unsent_ == nullptr) shutdown(socket_.get(), SHUT_RDWR);
        poller_.change(*this, events());
    }
    sentHandles_ = std::move(handles);
    return 0;
}

bool ServedChannel::sendUnsent() {
    const int error = unsent_->send(socket_.get());
    if (error == EAGAIN) return false;
    // Where the peer is gone, the next read sees it.
    if (error != 0) shutdown(socket_.get(), SHUT_RDWR);
    unsent_ = nullptr;
    poller_.change(*this, events());
    return true;
}

void ServedChannel::mute() {
    if (muted_) return;
    muted_ = true;
    poller_.change(*this, Poller::kEdge);
}

void ServedChannel::resume() {
    muted_ = false;
    const uint32_t wanted = events();
    baton_.drop();
    poller_.change(*this, wanted);
}

}  // namespace android::socket_driver
