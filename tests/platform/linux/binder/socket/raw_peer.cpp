#include "raw_peer.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace tavo::test {

using android::UniqueFd;

namespace {

sockaddr_un address_of(const std::string& name) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    snprintf(address.sun_path, sizeof address.sun_path, "%s/%s", getenv("BINDER_RUNTIME_DIR"), name.c_str());
    return address;
}

ssize_t receive_some(int socket, void* buffer, size_t size, std::vector<UniqueFd>& descriptors) {
    pollfd polled{socket, POLLIN, 0};
    if (poll(&polled, 1, 10000) != 1) return -1;
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * wire::kMaxDescriptors)];
    iovec part{buffer, size};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control;
    message.msg_controllen = sizeof control;
    const ssize_t count = recvmsg(socket, &message, MSG_CMSG_CLOEXEC);
    for (cmsghdr* c = CMSG_FIRSTHDR(&message); count >= 0 && c != nullptr; c = CMSG_NXTHDR(&message, c)) {
        if (c->cmsg_type != SCM_RIGHTS) continue;
        for (size_t i = 0; i < (c->cmsg_len - CMSG_LEN(0)) / sizeof(int); ++i) {
            int descriptor = -1;
            memcpy(&descriptor, CMSG_DATA(c) + i * sizeof(int), sizeof descriptor);
            descriptors.emplace_back(descriptor);
        }
    }
    return count;
}

bool receive_all(int socket, void* buffer, size_t size, std::vector<UniqueFd>& descriptors) {
    for (size_t done = 0; done < size;) {
        const ssize_t count = receive_some(socket, static_cast<uint8_t*>(buffer) + done, size - done, descriptors);
        if (count <= 0) return false;
        done += static_cast<size_t>(count);
    }
    return true;
}

}  // namespace

bool send_raw(int socket, const ByteString& bytes, const std::vector<int>& descriptors, int flags) {
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * 512)] = {};
    iovec part{const_cast<uint8_t*>(bytes.data()), bytes.size()};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (!descriptors.empty()) {
        message.msg_control = control;
        message.msg_controllen = CMSG_SPACE(sizeof(int) * descriptors.size());
        cmsghdr* c = CMSG_FIRSTHDR(&message);
        c->cmsg_level = SOL_SOCKET;
        c->cmsg_type = SCM_RIGHTS;
        c->cmsg_len = CMSG_LEN(sizeof(int) * descriptors.size());
        memcpy(CMSG_DATA(c), descriptors.data(), sizeof(int) * descriptors.size());
    }
    return sendmsg(socket, &message, flags | MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

void RawFrame::add(wire::WireObject type, uint64_t binder, uint64_t cookie) {
    flat_binder_object object{};
    object.hdr.type = static_cast<uint32_t>(type);
    object.binder = binder;
    object.cookie = cookie;
    offsets.push_back(data.size());
    const ByteString bytes = bytes_of(object);
    data.insert(data.end(), bytes.begin(), bytes.end());
}

void RawFrame::add_descriptor(int descriptor) {
    add(wire::WireObject::kDescriptor, descriptors.size());
    descriptors.push_back(descriptor);
}

wire::FrameHeader RawFrame::sized() const {
    wire::FrameHeader with = header;
    with.magic = wire::kMagic;
    with.dataSize = static_cast<uint32_t>(data.size());
    with.objectCount = static_cast<uint32_t>(offsets.size());
    with.descriptorCount = static_cast<uint32_t>(descriptors.size());
    return with;
}

ByteString RawFrame::bytes(const wire::FrameHeader& with) const {
    ByteString all = bytes_of(with);
    all.insert(all.end(), data.begin(), data.end());
    all.resize(sizeof with + wire::padded(data.size()));
    for (const uint64_t offset : offsets) {
        const ByteString bytes = bytes_of(offset);
        all.insert(all.end(), bytes.begin(), bytes.end());
    }
    return all;
}

RawFrame transaction(uint64_t node, uint32_t code, ByteString data, uint32_t flags) {
    RawFrame frame;
    frame.header.type = wire::FrameType::kTransaction;
    frame.header.target = node;
    frame.header.code = code;
    frame.header.flags = flags;
    frame.data = std::move(data);
    return frame;
}

RawFrame reply_frame(int32_t status, ByteString data) {
    RawFrame frame;
    frame.header.type = wire::FrameType::kReply;
    frame.header.code = static_cast<uint32_t>(status);
    frame.data = std::move(data);
    return frame;
}

ReceivedFrame receive_frame(int socket) {
    ReceivedFrame frame;
    if (!receive_all(socket, &frame.header, sizeof frame.header, frame.descriptors)) return {};
    frame.data.resize(wire::padded(frame.header.dataSize) + frame.header.objectCount * sizeof(uint64_t));
    if (!receive_all(socket, frame.data.data(), frame.data.size(), frame.descriptors)) return {};
    return frame;
}

uint64_t object_in(const ReceivedFrame& frame) {
    if (frame.header.objectCount == 0) return 0;
    uint64_t offset = 0;
    memcpy(&offset, frame.data.data() + wire::padded(frame.header.dataSize), sizeof offset);
    flat_binder_object object;
    memcpy(&object, frame.data.data() + offset, sizeof object);
    return object.binder;
}

UniqueFd receive_descriptor(int socket) {
    char buffer[256];
    std::vector<UniqueFd> descriptors;
    const ssize_t count = receive_some(socket, buffer, sizeof buffer, descriptors);
    return count > 0 && descriptors.size() == 1 ? std::move(descriptors[0]) : UniqueFd();
}

bool is_closed(int socket) {
    char buffer[65536];
    std::vector<UniqueFd> descriptors;
    for (;;) {
        errno = 0;
        const ssize_t count = receive_some(socket, buffer, sizeof buffer, descriptors);
        if (count <= 0) return count == 0 || errno == ECONNRESET;
    }
}

bool is_open(int socket) {
    pollfd polled{socket, POLLIN | POLLRDHUP, 0};
    return poll(&polled, 1, 0) == 0;
}

RawPeer::RawPeer(const std::string& name, bool greets) : control_(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0)) {
    const sockaddr_un address = address_of(name);
    std::vector<UniqueFd> descriptors;
    if (connect(control(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) perror("connect");
    if (receive_some(control(), &welcome_, sizeof welcome_, descriptors) != sizeof welcome_) perror("no welcome");
    if (greets) hello();
}

bool RawPeer::hello() const {
    wire::Greeting hello{};
    hello.header = {wire::kMagic, wire::ControlType::kHello};
    hello.instance = 1;
    hello.maxChannels = 16;
    return say(bytes_of(hello));
}

UniqueFd RawPeer::open_channel(wire::Purpose purpose) const {
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) abort();
    UniqueFd own(ends[0]);
    const UniqueFd offered(ends[1]);
    say(bytes_of(wire::ChannelOffer{{wire::kMagic, wire::ControlType::kChannel}, purpose, 0}), {offered.get()});
    return own;
}

uint64_t RawPeer::look_up(const std::string& name) const {
    const UniqueFd channel = open_channel(wire::Purpose::kDirectory);
    ByteString data = bytes_of(static_cast<int32_t>(name.size()));
    for (const char c : name) {
        data.push_back(static_cast<uint8_t>(c));
        data.push_back(0);
    }
    data.resize((data.size() + 2 + 3) & ~size_t{3});
    send_raw(channel.get(), transaction(wire::kDirectoryNode, wire::kLookUp, data).bytes());
    const ReceivedFrame reply = receive_frame(channel.get());
    return reply.is(wire::FrameType::kReply) ? object_in(reply) : 0;
}

UniqueFd listen_raw(const std::string& name) {
    UniqueFd listener(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const sockaddr_un address = address_of(name);
    unlink(address.sun_path);
    if (bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) perror("bind");
    if (listen(listener.get(), 16) != 0) perror("listen");
    return listener;
}

UniqueFd accept_raw(int listener, bool greets) {
    UniqueFd connection(accept4(listener, nullptr, nullptr, SOCK_CLOEXEC));
    wire::Greeting welcome{};
    welcome.header = {wire::kMagic, wire::ControlType::kWelcome};
    // Each stands for another process.
    static std::atomic<uint64_t> instance{2};
    welcome.instance = ++instance;
    welcome.maxChannels = 16;
    if (greets) send_raw(connection.get(), bytes_of(welcome));
    return connection;
}

}  // namespace tavo::test
