// Receives messages from a pipe that holds any bytes, in any pieces, and compares them with a model.
//
// The input is a script: the kind of pipe, a count of pieces and their lengths, a count of operations and their codes,
// and the bytes. The pipe's write end is closed before the first operation, so that nobody waits for the rest of a
// message that does not come. In a pipe of packets every piece is read by itself, and what a read leaves of it is lost.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <deque>
#include <vector>

#include "fuzz/script.h"
#include "ipc/TAVO_MessageQueue.h"
#include "tavo_osal/log.h"

namespace {

using android::TAVO_MessageQueue;
using tavo::fuzz::require;
using tavo::fuzz::Script;

using ByteString = std::vector<uint8_t>;

constexpr size_t kPipeSize = 65536;

// The pipe as its readers find it.
class PipeModel {
public:
    explicit PipeModel(bool packets) : packets_(packets) {}

    void add(const ByteString& bytes) {
        if (bytes.empty()) return;
        if (packets_ || pieces_.empty()) return pieces_.push_back(bytes);
        pieces_.back().insert(pieces_.back().end(), bytes.begin(), bytes.end());
    }
    ByteString read(size_t count) {
        if (pieces_.empty() || count == 0) return {};
        ByteString& first = pieces_.front();
        const auto size = static_cast<ptrdiff_t>(std::min(count, first.size()));
        ByteString bytes(first.begin(), first.begin() + size);
        first.erase(first.begin(), packets_ ? first.end() : first.begin() + size);
        if (first.empty()) pieces_.pop_front();
        return bytes;
    }
    // Goes on until there are so many bytes, or no more.
    ByteString read_all(size_t count) {
        ByteString bytes;
        while (bytes.size() < count) {
            const ByteString more = read(count - bytes.size());
            if (more.empty()) break;
            bytes.insert(bytes.end(), more.begin(), more.end());
        }
        return bytes;
    }
    size_t pending() const {
        size_t bytes = 0;
        for (const ByteString& piece : pieces_) bytes += piece.size();
        return bytes;
    }

private:
    const bool packets_;
    std::deque<ByteString> pieces_;
};

void get(TAVO_MessageQueue& queue, PipeModel& pipe) {
    // As large as the longest message, and no larger.
    static ByteString& buffer = *new ByteString(TAVO_MessageQueue::MAX_MESSAGE_SIZE);
    unsigned int size = 1234;
    const int32_t result = queue.tavo_android_msg_queue_get(buffer.data(), &size);

    const ByteString prefix = pipe.read_all(sizeof(uint32_t));
    ByteString message;
    if (prefix.size() == sizeof(uint32_t)) {
        uint32_t length = 0;
        memcpy(&length, prefix.data(), sizeof length);
        message = pipe.read_all(std::min<size_t>(length, TAVO_MessageQueue::MAX_MESSAGE_SIZE));
    }
    require(result == static_cast<int32_t>(message.size()), "get answers the bytes of the message");
    require(size == message.size(), "get stores the bytes of the message");
    require(std::equal(message.begin(), message.end(), buffer.begin()), "a message is what was sent");
}

void operate(TAVO_MessageQueue& queue, PipeModel& pipe, uint8_t code) {
    switch (code % 5) {
        case 0: get(queue, pipe); break;
        case 1: {
            int bytes = -1;
            require(queue.tavo_android_get_num_of_messages(&bytes) == TAVO_SUCCESS, "what waits is counted");
            require(bytes == static_cast<int>(pipe.pending()), "what waits is counted rightly");
            break;
        }
        case 2:
            require(queue.tavo_android_msg_queue_is_empty() == (pipe.pending() == 0 ? 1 : 0), "empty or not");
            break;
        case 3:
            require(queue.tavo_android_msg_queue_wait_for_msg(&queue, nullptr, &queue, 0) >= 0, "a wait ends");
            break;
        case 4:
            queue.tavo_android_msg_queue_clear();
            while (pipe.pending() != 0) pipe.read(kPipeSize);
            require(queue.tavo_android_msg_queue_is_empty() == 1, "nothing is left");
            break;
        default: break;
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    g_uiMxEnabledLogLevel = TAVO_LOG_TRACE;
    Script script(data, size);
    const auto kind = script.take<uint8_t>();
    const bool packets = (kind & 1) != 0;
    std::vector<uint16_t> lengths(script.take<uint8_t>() % 16);
    for (uint16_t& length : lengths) length = script.take<uint16_t>();
    const ByteString operations = script.take_bytes(script.take<uint8_t>() % 32);

    int ends[2];
    require(pipe2(ends, O_CLOEXEC | (packets ? O_DIRECT : 0) | ((kind & 2) != 0 ? O_NONBLOCK : 0)) == 0, "a pipe");
    require(fcntl(ends[1], F_GETPIPE_SZ) >= static_cast<int>(kPipeSize), "the pipe is of the usual size");
    PipeModel pipe(packets);
    size_t total = 0;
    for (size_t i = 0; i <= lengths.size() && total < kPipeSize / 2; ++i) {
        // A packet takes a page of the pipe, however short it is, and a longer one is cut in pages.
        const ByteString bytes = script.take_bytes(i < lengths.size() ? lengths[i] % 4097U : 4096U);
        if (!bytes.empty()) require(write(ends[1], bytes.data(), bytes.size()) > 0, "the pipe has room");
        pipe.add(bytes);
        total += bytes.size();
    }
    close(ends[1]);

    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_fd(ends[0]);
    queue.tavo_android_msg_queue_set_write_fd(-1);
    for (const uint8_t code : operations) operate(queue, pipe, code);
    while (pipe.pending() != 0) get(queue, pipe);
    return 0;
}
