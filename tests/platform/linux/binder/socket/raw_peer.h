// One end of a link without a driver behind it, which says whatever a test wants.
#pragma once

#include <linux/android/binder.h>
#include <sys/socket.h>

#include <cstdint>
#include <string>
#include <vector>

#include "platform/linux/binder/UniqueFd.h"
#include "platform/linux/binder/socket/Wire.h"

namespace tavo::test {

namespace wire = android::socket_driver;

using ByteString = std::vector<uint8_t>;

template <typename T>
ByteString bytes_of(const T& value) {
    const auto* start = reinterpret_cast<const uint8_t*>(&value);
    return ByteString(start, start + sizeof value);
}

// One sendmsg; false when it failed.
bool send_raw(int socket, const ByteString& bytes, const std::vector<int>& descriptors = {}, int flags = 0);

struct RawFrame {
    wire::FrameHeader header{};
    ByteString data;
    std::vector<uint64_t> offsets;
    std::vector<int> descriptors;

    // Adds an object at the end of the data, and its offset.
    void add(wire::WireObject type, uint64_t binder, uint64_t cookie = 0);
    void add_descriptor(int descriptor);
    // The header with the sizes of what there is.
    wire::FrameHeader sized() const;
    ByteString bytes() const { return bytes(sized()); }
    ByteString bytes(const wire::FrameHeader& with) const;
};

RawFrame transaction(uint64_t node, uint32_t code, ByteString data = {}, uint32_t flags = 0);
RawFrame reply_frame(int32_t status = 0, ByteString data = {});

// A frame, or none (type 0) when the other side has closed or says nothing for ten seconds.
struct ReceivedFrame {
    wire::FrameHeader header{};
    ByteString data;
    std::vector<android::UniqueFd> descriptors;
    bool is(wire::FrameType type) const { return header.magic == wire::kMagic && header.type == type; }
    int32_t status() const { return static_cast<int32_t>(header.code); }
};
ReceivedFrame receive_frame(int socket);
// What the first object in a frame stands for; 0 when there is none.
uint64_t object_in(const ReceivedFrame& frame);

// The descriptor that comes with the next message.
android::UniqueFd receive_descriptor(int socket);

// Whether the other side closes the socket within ten seconds, whatever comes before.
bool is_closed(int socket);
// Whether it is open and silent now.
bool is_open(int socket);

class RawPeer {
public:
    // Connects to a name, and greets unless told not to.
    explicit RawPeer(const std::string& name, bool greets = true);
    // The other end of a control connection.
    explicit RawPeer(android::UniqueFd control) : control_(std::move(control)) {}

    int control() const { return control_.get(); }
    const wire::Greeting& welcome() const { return welcome_; }
    bool say(const ByteString& bytes, const std::vector<int>& descriptors = {}) const {
        return send_raw(control_.get(), bytes, descriptors);
    }
    bool hello() const;
    // One end of a new channel, of which the other was offered.
    android::UniqueFd open_channel(wire::Purpose purpose = wire::Purpose::kCalls) const;
    // The node behind a name, with a reference; 0 when there is none.
    uint64_t look_up(const std::string& name) const;

private:
    android::UniqueFd control_;
    wire::Greeting welcome_{};
};

// A listening socket under a name, whose owner answers as it likes.
android::UniqueFd listen_raw(const std::string& name);
// The next who connects, greeted unless told not to.
android::UniqueFd accept_raw(int listener, bool greets = true);

}  // namespace tavo::test
