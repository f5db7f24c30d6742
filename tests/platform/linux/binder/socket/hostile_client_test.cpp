// Clients that say what no client says. Whatever it is, it ends with them, and nobody else notices.
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <functional>

#include "hostile_fixture.h"

namespace {

using namespace android;
using namespace tavo::test;
using wire::FrameType;
using wire::WireObject;

class SocketHostileClient : public HostileClientTest {
protected:
    // What a peer sends on a channel has the whole link closed.
    void expect_cut(const ByteString& bytes, const std::vector<int>& descriptors = {}, const char* what = "") {
        const RawPeer peer("test.service");
        ASSERT_NE(peer.look_up("test.service"), 0U);
        const UniqueFd channel = peer.open_channel(), other = peer.open_channel();
        send_raw(channel.get(), bytes, descriptors);
        EXPECT_TRUE(is_closed(channel.get())) << what;
        EXPECT_TRUE(is_closed(other.get())) << what;
        EXPECT_TRUE(is_closed(peer.control())) << what;
    }
    void expect_cut(const RawFrame& frame, const char* what) { expect_cut(frame.bytes(), frame.descriptors, what); }

    void expect_cut_on_control(const ByteString& bytes, const std::vector<int>& descriptors, const char* what,
                               bool greets = true) {
        const RawPeer peer("test.service", greets);
        peer.say(bytes, descriptors);
        EXPECT_TRUE(is_closed(peer.control())) << what;
    }
};

RawFrame echo(uint64_t node = 1) { return transaction(node, TestService::kEcho, ByteString(64, 1)); }

TEST_F(SocketHostileClient, IsServedLikeOthersAsLongAsItBehaves) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd channel = peer.open_channel();
    for (int i = 0; i < 3; ++i) {
        ASSERT_TRUE(send_raw(channel.get(), echo(node).bytes()));
        const ReceivedFrame reply = receive_frame(channel.get());
        EXPECT_TRUE(reply.is(FrameType::kReply));
        EXPECT_EQ(reply.status(), OK);
        EXPECT_EQ(reply.data, ByteString(64, 1));
    }
    EXPECT_EQ(peer.look_up("nobody"), 0U);
    EXPECT_TRUE(is_open(peer.control()));
}

TEST_F(SocketHostileClient, AsksTheDirectoryForMoreThanLookUps) {
    const RawPeer peer("test.service");
    const UniqueFd channel = peer.open_channel(wire::Purpose::kDirectory);
    ASSERT_TRUE(send_raw(channel.get(), transaction(wire::kDirectoryNode, 4711).bytes()));
    const ReceivedFrame reply = receive_frame(channel.get());
    EXPECT_TRUE(reply.is(FrameType::kReply));
    EXPECT_EQ(reply.status(), UNKNOWN_TRANSACTION);
    EXPECT_TRUE(is_open(peer.control()));
}

TEST_F(SocketHostileClient, SendsHeadersThatAreNone) {
    const auto header = [](const std::function<void(wire::FrameHeader&)>& change) {
        wire::FrameHeader changed = echo().sized();
        change(changed);
        return echo().bytes(changed);
    };
    expect_cut(header([](auto& h) { h.magic = 0x12345678; }), {}, "magic");
    expect_cut(header([](auto& h) { h.type = FrameType{0}; }), {}, "no type");
    expect_cut(header([](auto& h) { h.type = FrameType{77}; }), {}, "an unknown type");
    expect_cut(header([](auto& h) { h.type = FrameType::kReply; }), {}, "a reply to nothing");
    expect_cut(header([](auto& h) { h.type = FrameType::kReceipt; }), {}, "a receipt with contents");
    expect_cut(header([](auto& h) { h.reserved = 1; }), {}, "reserved");
    expect_cut(header([](auto& h) { h.dataSize = 1024 * 1024 + 1; }), {}, "too much data");
    expect_cut(header([](auto& h) { h.dataSize = UINT32_MAX; }), {}, "far too much data");
    expect_cut(header([](auto& h) { h.objectCount = UINT32_MAX; }), {}, "too many objects");
    expect_cut(header([](auto& h) { h.objectCount = 3; }), {}, "more objects than have room");
    expect_cut(header([](auto& h) { h.descriptorCount = 254; }), {}, "too many descriptors");
    expect_cut(header([](auto& h) { h.dataSize = 8; }), {}, "less data than comes");
    expect_cut(ByteString(100000, 0xaa), {}, "garbage");
    expect_cut(ByteString(4096, 0), {}, "zeros");
}

TEST_F(SocketHostileClient, SendsObjectsThatAreNone) {
    const auto with = [](const std::function<void(RawFrame&)>& change) {
        RawFrame frame = transaction(1, TestService::kEcho);
        change(frame);
        return frame;
    };
    expect_cut(with([](auto& f) { f.add(WireObject{0}, 0); }), "no type");
    expect_cut(with([](auto& f) { f.add(WireObject{99}, 0); }), "an unknown type");
    expect_cut(with([](auto& f) { f.add(WireObject{BINDER_TYPE_BINDER}, 0x1234, 0x5678); }), "a pointer");
    expect_cut(with([](auto& f) { f.add(WireObject{BINDER_TYPE_HANDLE}, 1); }), "a handle");
    expect_cut(with([](auto& f) { f.add(WireObject::kReceiversNode, 4711); }), "a node that was never given");
    expect_cut(with([](auto& f) { f.add(WireObject::kReceiversNode, 0); }), "the directory as an object");
    expect_cut(with([](auto& f) { f.add(WireObject::kDescriptor, 0); }), "a descriptor that is not there");
    expect_cut(with([](auto& f) { f.add(WireObject::kIntroduction, 0, 0); }), "an introduction without a connection");
    expect_cut(with([](auto& f) {
                   f.add(WireObject::kDescriptor, 0);
                   f.add(WireObject::kDescriptor, 0);
                   f.descriptors = {STDIN_FILENO};
               }),
               "a descriptor twice");
    expect_cut(with([](auto& f) {
                   f.add_descriptor(STDIN_FILENO);
                   f.offsets[0] = 8;
               }),
               "an offset behind the data");
    expect_cut(with([](auto& f) {
                   f.add(WireObject::kNull, 0);
                   f.data.resize(100);
                   f.offsets[0] = 1;
               }),
               "an offset that is not aligned");
    expect_cut(with([](auto& f) {
                   f.add(WireObject::kNull, 0);
                   f.offsets[0] = UINT64_MAX - 3;
               }),
               "an offset that wraps");
    expect_cut(with([](auto& f) {
                   f.add(WireObject::kNull, 0);
                   f.add(WireObject::kNull, 0);
                   f.offsets[1] = 4;
               }),
               "objects that overlap");
    expect_cut(with([](auto& f) {
                   f.add(WireObject::kNull, 0);
                   f.add(WireObject::kNull, 0);
                   std::swap(f.offsets[0], f.offsets[1]);
               }),
               "objects out of order");
}

TEST_F(SocketHostileClient, SendsDescriptorsWhereNoneBelong) {
    expect_cut(echo().bytes(), {STDIN_FILENO}, "not announced");
    wire::FrameHeader header = echo().sized();
    header.descriptorCount = 2;
    expect_cut(echo().bytes(header), {STDIN_FILENO, STDIN_FILENO}, "announced, but of no object");
    expect_cut(echo().bytes(header), std::vector<int>(3, STDIN_FILENO), "more than announced");
    const std::vector<int> many(250, STDIN_FILENO);
    expect_cut(bytes_of(echo().sized()), many, "with a frame of which the rest is to come");
    expect_cut(ByteString(1, 'B'), many, "with the first byte");
    expect_cut(bytes_of(reply_frame().sized()), many, "with a reply");
}

TEST_F(SocketHostileClient, AnnouncesDescriptorsThatDoNotCome) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd channel = peer.open_channel();
    RawFrame frame = transaction(node, TestService::kEcho);
    frame.add_descriptor(STDIN_FILENO);
    frame.add_descriptor(STDIN_FILENO);
    send_raw(channel.get(), frame.bytes(), {STDIN_FILENO});
    // As when the server has no descriptor left.
    EXPECT_EQ(receive_frame(channel.get()).status(), FAILED_TRANSACTION);
    EXPECT_TRUE(is_open(channel.get()));
}

TEST_F(SocketHostileClient, CallsObjectsItWasNotGiven) {
    const RawPeer peer("test.service"), stranger("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd channel = peer.open_channel(), strange = stranger.open_channel();
    for (const uint64_t forged : {wire::kDirectoryNode, node + 1, uint64_t{12345}, UINT64_MAX}) {
        send_raw(channel.get(), echo(forged).bytes());
        EXPECT_EQ(receive_frame(channel.get()).status(), FAILED_TRANSACTION);
    }
    send_raw(strange.get(), echo(node).bytes());
    EXPECT_EQ(receive_frame(strange.get()).status(), FAILED_TRANSACTION) << "though another was given it";
    send_raw(strange.get(), transaction(node, TestService::kEcho, {}, IBinder::FLAG_ONEWAY).bytes());
    EXPECT_EQ(receive_frame(strange.get()).status(), FAILED_TRANSACTION);
}

TEST_F(SocketHostileClient, ReleasesWhatItDoesNotHold) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    ByteString release = bytes_of(wire::ControlHeader{wire::kMagic, wire::ControlType::kRelease});
    for (const uint64_t released : {uint64_t{0}, node + 5, node}) {
        const ByteString one = bytes_of(wire::ReleasedReference{released, UINT64_MAX});
        release.insert(release.end(), one.begin(), one.end());
    }
    for (int i = 0; i < 10; ++i) EXPECT_TRUE(peer.say(release));
    EXPECT_NE(peer.look_up("test.service"), 0U);
    EXPECT_TRUE(is_open(peer.control()));
    EXPECT_EQ(service_->pingBinder(), OK) << "others keep theirs";
}

TEST_F(SocketHostileClient, SaysGarbageOnTheControlConnection) {
    using wire::ControlType;
    const auto header = [](ControlType type) { return bytes_of(wire::ControlHeader{wire::kMagic, type}); };
    const auto offer = bytes_of(wire::ChannelOffer{{wire::kMagic, ControlType::kChannel}, wire::Purpose::kCalls, 0});
    wire::Greeting hello{};
    hello.header = {wire::kMagic, ControlType::kHello};
    ByteString odd = header(ControlType::kRelease);
    odd.resize(odd.size() + 7);

    expect_cut_on_control(ByteString(5, 1), {}, "too short");
    expect_cut_on_control(ByteString(1000, 1), {}, "no magic");
    expect_cut_on_control(ByteString(100000, 1), {}, "too long");
    expect_cut_on_control(header(ControlType{0}), {}, "no type");
    expect_cut_on_control(header(ControlType{99}), {}, "an unknown type");
    expect_cut_on_control(header(ControlType::kWelcome), {}, "a welcome");
    expect_cut_on_control(odd, {}, "half a release");
    expect_cut_on_control(header(ControlType::kRelease), {STDIN_FILENO}, "a release with a descriptor");
    expect_cut_on_control(bytes_of(hello), {}, "a second hello");
    expect_cut_on_control(offer, {}, "a channel without an end");
    expect_cut_on_control(offer, {STDIN_FILENO, STDOUT_FILENO}, "two ends");
    expect_cut_on_control(header(ControlType::kChannel), {STDIN_FILENO}, "half an offer");
    expect_cut_on_control(bytes_of(wire::ChannelOffer{{wire::kMagic, ControlType::kChannel}, wire::Purpose{7}, 0}),
                          {STDIN_FILENO}, "a channel for nothing known");
    expect_cut_on_control(offer, {STDIN_FILENO}, "a channel before a hello", false);
    expect_cut_on_control(header(ControlType::kRelease), {}, "a release before a hello", false);
    expect_cut_on_control(header(ControlType::kHello), {}, "half a hello", false);
    expect_cut_on_control(bytes_of(hello), {STDIN_FILENO}, "a hello with a descriptor", false);
}

// It hears of it: whoever calls must not wait for ever.
TEST_F(SocketHostileClient, OffersWhatIsNoChannelOfItsOwn) {
    const auto offer =
        bytes_of(wire::ChannelOffer{{wire::kMagic, wire::ControlType::kChannel}, wire::Purpose::kCalls, 0});
    const RawPeer peer("test.service");
    const auto expect_refused = [&](int descriptor, const char* what) {
        EXPECT_TRUE(peer.say(offer, {descriptor}));
        wire::ControlHeader answer{};
        EXPECT_EQ(recv(peer.control(), &answer, sizeof answer, 0), static_cast<ssize_t>(sizeof answer)) << what;
        EXPECT_EQ(answer.type, wire::ControlType::kRefusal) << what;
    };
    expect_refused(STDIN_FILENO, "a file");
    const UniqueFd packets(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    expect_refused(packets.get(), "a socket of another type");
    const UniqueFd network(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    expect_refused(network.get(), "a socket of another family");
    // A socket that another process made would let that process's calls be served as its own.
    Process maker = Process::start("offers_channel");
    ASSERT_EQ(maker.read_line(), "listening");
    const RawPeer other("maker", false);
    const UniqueFd foreign = receive_descriptor(other.control());
    ASSERT_TRUE(foreign.valid());
    expect_refused(foreign.get(), "somebody else's");
}

TEST_ROLE(offers_channel) {
    const UniqueFd listener = listen_raw("maker");
    puts("listening");
    const UniqueFd connection = accept_raw(listener.get());
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return 1;
    send_raw(connection.get(), ByteString(1), {ends[1]});
    pause();
    return 0;
}

}  // namespace
