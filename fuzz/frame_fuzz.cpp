// Sends any bytes and descriptors, in pieces of any size, to the reader that takes frames off a channel. What it takes
// for a frame must be the bytes that were sent, and must come out the same when it is sent on.
//
// The input is a script: a count of pieces, the plan of each, and the bytes.
#include <fcntl.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <vector>

#include "fuzz/script.h"
#include "platform/linux/binder/socket/Frame.h"

namespace {

using namespace android;
using namespace android::socket_driver;
using tavo::fuzz::require;
using tavo::fuzz::Script;

using ByteString = std::vector<uint8_t>;

struct Connection {
    UniqueFd ends[2];

    explicit Connection(int sendBuffer = 0) {
        int sockets[2];
        require(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, sockets) == 0, "there are sockets");
        ends[0] = UniqueFd(sockets[0]);
        ends[1] = UniqueFd(sockets[1]);
        if (sendBuffer != 0) setsockopt(sockets[0], SOL_SOCKET, SO_SNDBUF, &sendBuffer, sizeof sendBuffer);
    }
    int sender() const { return ends[0].get(); }
    int receiver() const { return ends[1].get(); }
};

size_t payloadSize(const FrameHeader& header) {
    return padded(header.dataSize) + header.objectCount * sizeof(uint64_t);
}

// Through a connection that takes little at a time.
void sendOn(const Frame& frame) {
    const FrameHeader& header = frame.header;
    OutgoingFrame outgoing;
    outgoing.header = header;
    outgoing.data = frame.payload.get();
    outgoing.offsets = header.objectCount != 0 ? frame.offsets() : nullptr;
    for (const UniqueFd& descriptor : frame.descriptors) outgoing.descriptors.push_back(descriptor.get());

    const Connection connection(4096);
    FrameReader reader;
    Frame copy;
    size_t sent = 0;
    int error = sendFrame(connection.sender(), outgoing, sent, MSG_DONTWAIT);
    std::unique_ptr<UnsentFrame> unsent;
    if (error == EAGAIN) {
        unsent = UnsentFrame::copy(outgoing, sent);
        require(unsent != nullptr, "the rest is kept");
    }
    FrameReader::Result result = reader.read(connection.receiver(), MSG_DONTWAIT, copy);
    while (error == EAGAIN) {
        require(result == FrameReader::Result::kAgain, "half a frame is none");
        error = unsent->send(connection.sender());
        result = reader.read(connection.receiver(), MSG_DONTWAIT, copy);
    }
    require(error == 0, "a frame that came in can be sent");
    require(result == FrameReader::Result::kFrame, "a frame that is sent comes in");
    require(memcmp(&header, &copy.header, sizeof header) == 0, "the header is the same");
    require(copy.descriptors.size() == frame.descriptors.size(), "the descriptors are as many");
    if (header.dataSize != 0) {
        require(memcmp(frame.payload.get(), copy.payload.get(), header.dataSize) == 0, "the data are the same");
    }
    if (header.objectCount != 0) {
        require(memcmp(frame.offsets(), copy.offsets(), header.objectCount * sizeof(uint64_t)) == 0,
                "the offsets are the same");
    }
}

// All bytes that were sent, and how far they have been taken for frames.
class Stream {
public:
    void add(const uint8_t* bytes, size_t count) { sent_.insert(sent_.end(), bytes, bytes + count); }

    void takeFrame(const Frame& frame) {
        skipReceipts();
        const FrameHeader& header = frame.header;
        const size_t size = sizeof header + payloadSize(header);
        require(sent_.size() - taken_ >= size, "a frame is no longer than what was sent");
        require(memcmp(&header, sent_.data() + taken_, sizeof header) == 0, "a header is what was sent");
        if (size > sizeof header) {
            require(frame.payload != nullptr, "what was announced is there");
            require(memcmp(frame.payload.get(), sent_.data() + taken_ + sizeof header, payloadSize(header)) == 0,
                    "data are what was sent");
        }
        taken_ += size;
    }

private:
    void skipReceipts() {
        FrameHeader header;
        for (; sent_.size() - taken_ >= sizeof header; taken_ += sizeof header) {
            memcpy(&header, sent_.data() + taken_, sizeof header);
            if (header.type != FrameType::kReceipt) return;
        }
    }

    ByteString sent_;
    size_t taken_ = 0;
};

// False when the peer would be cut off.
bool readAll(FrameReader& reader, int socket, Stream& stream) {
    for (;;) {
        Frame frame;
        const FrameReader::Result result = reader.read(socket, MSG_DONTWAIT, frame);
        if (result == FrameReader::Result::kAgain) return true;
        if (result == FrameReader::Result::kReceipt) continue;
        if (result != FrameReader::Result::kFrame) return false;
        const size_t announced = frame.header.descriptorCount;
        require(frame.descriptors.size() <= announced, "no descriptor that was not announced");
        require(frame.descriptors.size() == announced || frame.descriptorsLost, "missing descriptors are noticed");
        stream.takeFrame(frame);
        sendOn(frame);
    }
}

struct Piece {
    uint16_t length;
    uint8_t kind;  // bit 0: zeros, twice as many; bits 1 and 2: descriptors; bit 3: the reader waits for the next one
};

bool sendPiece(int socket, const ByteString& bytes, size_t descriptorCount, FrameReader& reader, int receiver,
               bool reads, Stream& stream) {
    static const int file = open("/dev/null", O_RDONLY | O_CLOEXEC);
    std::vector<int> descriptors(descriptorCount, file);
    for (size_t sent = 0; sent < bytes.size();) {
        const ssize_t count = sendBytes(socket, bytes.data() + sent, bytes.size() - sent, descriptors, MSG_DONTWAIT);
        if (count > 0) {
            stream.add(bytes.data() + sent, static_cast<size_t>(count));
            sent += static_cast<size_t>(count);
            descriptors.clear();
        }
        if ((reads || count < 0) && !readAll(reader, receiver, stream)) return false;
    }
    return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    Script script(data, size);
    std::vector<Piece> pieces;
    for (int count = script.take<uint8_t>() % 32; count > 0; --count) {
        pieces.push_back({script.take<uint16_t>(), script.take<uint8_t>()});
    }
    const Connection connection;
    FrameReader reader;
    Stream stream;
    for (const Piece& piece : pieces) {
        const bool zeros = (piece.kind & 1) != 0;
        const ByteString bytes =
            zeros ? ByteString(size_t{2} * piece.length, uint8_t{0}) : script.take_bytes(piece.length);
        if (!sendPiece(connection.sender(), bytes, (piece.kind >> 1) % 4U, reader, connection.receiver(),
                       (piece.kind & 8) == 0, stream)) {
            return 0;
        }
    }
    sendPiece(connection.sender(), script.rest(), 0, reader, connection.receiver(), true, stream);
    return 0;
}
