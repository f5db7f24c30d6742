#include "ServedChannel.h"

#include <fcntl.h>
#include <sys/socket.h>

#include <cerrno>

namespace android::socket_driver {

void ServedChannel::onReady() {
    if (!baton_.take()) return;
    do {
        if (hasUnsent() && !sendUnsent()) continue;
        Frame frame;
        switch (reader_.read(socket_.get(), MSG_DONTWAIT, frame)) {
            case FrameReader::Result::kFrame:
                if (frame.header.type != FrameType::kTransaction) {
                    server_.peerMisbehaved(*this);
                    return;
                }
                // The peer waits for the reply now. What it sends after that is news to the poller, so there is
                // no need to look for more.
                server_.transactionArrived(*this, frame);
                break;
            case FrameReader::Result::kAgain: break;
            case FrameReader::Result::kClosed: server_.channelClosed(*this); return;
            case FrameReader::Result::kViolation:
            case FrameReader::Result::kNoMemory: server_.peerMisbehaved(*this); return;
        }
    } while (!baton_.giveBack());
}

int ServedChannel::send(const OutgoingFrame& frame) {
    size_t sent = 0;
    const int error = sendFrame(socket_.get(), frame, sent, MSG_DONTWAIT);
    if (error != EAGAIN) return error;

    if (sent == 0) {
        // The descriptors travel with the first byte, so they must be kept as well.
        for (const int descriptor : frame.descriptors) {
            UniqueFd copy(fcntl(descriptor, F_DUPFD_CLOEXEC, 0));
            if (!copy.valid()) {
                unsentDescriptors_.clear();
                return errno;
            }
            unsentDescriptors_.push_back(std::move(copy));
        }
    }
    unsent_ = frame.rest(sent);
    unsentAt_ = 0;
    poller_.wantWritable(*this, true);
    return 0;
}

bool ServedChannel::sendUnsent() {
    while (hasUnsent()) {
        std::vector<int> descriptors;
        for (const UniqueFd& descriptor : unsentDescriptors_) descriptors.push_back(descriptor.get());
        const ssize_t count =
            sendBytes(socket_.get(), unsent_.data() + unsentAt_, unsent_.size() - unsentAt_, descriptors, MSG_DONTWAIT);
        // Any other error is the peer's end, which the next read sees.
        if (count < 0) return errno != EAGAIN && errno != EWOULDBLOCK;
        unsentAt_ += static_cast<size_t>(count);
        unsentDescriptors_.clear();
    }
    unsent_ = {};
    unsentAt_ = 0;
    poller_.wantWritable(*this, false);
    return true;
}

}  // namespace android::socket_driver
