// The messages of queues and calls. Each is written anew before it is sent, as programs do, and looked at when it has
// come: a word of every cache line goes into a checksum, so that nobody wins by losing or forging what it carries.
#pragma once

#include "peer.h"

namespace tavo::peers {

struct View {
    const unsigned char* data;
    size_t size;
};

class Messages {
public:
    explicit Messages(size_t size) : size_(size) {}

    size_t size() const { return size_; }
    const Tally& tally() const { return tally_; }

    void write(unsigned char* at) {
        const auto byte = static_cast<unsigned char>(++sequence_ % 251);
        memset(at, byte, size_);
        // What come() will read, without reading it.
        tally_.out.add(words() * (byte * 0x0101010101010101U));
    }

    void come(const View& message) {
        if (message.size != size_) fail("a message", "is of another size");
        uint64_t sum = 0;
        for (size_t i = 0; i < words(); ++i) {
            uint64_t word;
            memcpy(&word, message.data + i * kLine, sizeof word);
            sum += word;
        }
        tally_.in.add(sum);
    }

private:
    static constexpr size_t kLine = 64;

    size_t words() const { return size_ / kLine; }

    const size_t size_;
    uint64_t sequence_ = 0;
    Tally tally_;
};

}  // namespace tavo::peers
