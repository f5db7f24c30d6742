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

// One sendmsg of these bytes with these descriptors: the bytes sent, or -1.
ssize_t sendBytes(int fd, const void* bytes, size_t size, const std::vector<int>& descriptors, int flags);

// A frame as it came in.
struct Frame {
    FrameHeader header{};
    Bytes payload;  // padded data, then offsets; null when there are none
    std::vector<UniqueFd> descriptors;
    bool descriptorsLost = false;

    const uint8_t* data() const { return payload.get(); }
    const uint64_t* offsets() const {
        return reinterpret_cast<const uint64_t*>(payload.get() + padded(header.dataSize));
    }
};

// Takes a stream apart into frames, however the bytes arrive.
class FrameReader {
public:
    enum class Result {
        kFrame,      // one whole frame
        kAgain,      // no more bytes for now
        kClosed,     // the peer is gone
        kViolation,  // the bytes are not a frame, or not one that may be received
        kNoMemory,
    };

    // Reads one frame. With MSG_DONTWAIT in flags a frame that has come in part is kept for the next call. Bytes of
    // a second frame behind the first are a violation: neither side may run ahead of the other.
    Result read(int fd, int flags, Frame& frame);

private:
    static constexpr size_t kScratchSize = 4096;

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
    // The bytes from `sent` on, as a copy.
    std::vector<uint8_t> rest(size_t sent) const;
};

// Sends the frame from byte `sent` on and advances `sent`. Returns 0 when all is sent, else errno: EAGAIN only with
// MSG_DONTWAIT in flags.
int sendFrame(int fd, const OutgoingFrame& frame, size_t& sent, int flags);

}  // namespace android::socket_driver
