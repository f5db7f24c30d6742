// Frames on a channel, and descriptors that travel with a message.
#pragma once

#include <sys/socket.h>
#include <sys/uio.h>

#include <cstdint>
#include <cstdlib>
#include <memory>
#include <vector>

#include "../UniqueFd.h"
#include "Wire.h"

namespace android::socket_driver {

struct FreeDeleter {
    void operator()(void* block) const { free(block); }
};
using Bytes = std::unique_ptr<uint8_t, FreeDeleter>;

// One recvmsg, with every descriptor that came along in `descriptors`, close-on-exec. `lost` is set when the
// kernel could not hand over all of them. `sender`, when given, receives the credentials of a socket that passes them.
ssize_t receive(int fd, iovec* buffers, size_t bufferCount, int flags, std::vector<UniqueFd>& descriptors, bool& lost,
                ucred* sender = nullptr);

// From now on no call on the socket waits for ever: for what drivers say among themselves, which they do at once.
void limitWaits(int fd);

// One sendmsg of these bytes with these descriptors: the bytes sent, or -1.
ssize_t sendBytes(int fd, const void* bytes, size_t size, const std::vector<int>& descriptors, int flags);

// A frame as it came in.
struct Frame {
    FrameHeader header{};
    Bytes payload;  // padded data, then offsets; null when there are none
    std::vector<UniqueFd> descriptors;
    bool descriptorsLost = false;

    uint64_t* offsets() const { return reinterpret_cast<uint64_t*>(payload.get() + padded(header.dataSize)); }
};

// Takes a stream apart into frames, however the bytes arrive.
class FrameReader {
public:
    enum class Result {
        kFrame,      // one whole transaction or reply
        kReceipt,    // a receipt, and no whole frame behind it
        kAgain,      // no more bytes for now
        kClosed,     // the peer is gone
        kViolation,  // the bytes are not a frame, or not one that may be received
        kNoMemory,
    };

    // Reads one frame. With MSG_DONTWAIT in flags a frame that has come in part is kept for the next call. Bytes of
    // a second frame behind the first are a violation: neither side may run ahead of the other.
    Result read(int fd, int flags, Frame& frame);

private:
    bool skipReceipts(const uint8_t*& behind, size_t& count);
    Result takeHeader(const uint8_t* behind, size_t count);
    Result finish(Frame& frame);

    Frame current_;
    size_t headerReceived_ = 0;
    size_t payloadReceived_ = 0;
    size_t payloadSize_ = 0;
};

// A frame on its way out. Everything is borrowed.
struct OutgoingFrame {
    FrameHeader header{};
    const uint8_t* data = nullptr;
    const uint64_t* offsets = nullptr;
    std::vector<int> descriptors;

    size_t size() const { return sizeof header + padded(header.dataSize) + header.objectCount * sizeof(uint64_t); }
    // The byte with which the descriptors go.
    size_t descriptorsAt() const;
};

// Sends the frame from byte `sent` on and advances `sent`. Returns 0 when all is sent, else errno: EAGAIN only with
// MSG_DONTWAIT in flags. Descriptors that turn out not to be passed on when part of the frame is sent
// already are left out, which the receiver takes as lost.
int sendFrame(int fd, const OutgoingFrame& frame, size_t& sent, int flags);

// What a peer has not taken yet of a frame.
class UnsentFrame {
public:
    // Null when there is no memory for a copy, or no descriptor. Of a frame that is on its way already, it rather
    // leaves out the descriptors.
    static std::unique_ptr<UnsentFrame> copy(const OutgoingFrame& frame, size_t sent);

    // 0 when nothing is left, else errno.
    int send(int fd) { return sendFrame(fd, frame_, sent_, MSG_DONTWAIT); }

private:
    OutgoingFrame frame_;
    size_t sent_ = 0;
    Bytes payload_;
    std::vector<UniqueFd> descriptors_;
};

}  // namespace android::socket_driver
