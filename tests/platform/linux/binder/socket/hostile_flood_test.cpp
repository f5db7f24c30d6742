// Clients that send too much, too little or at random, and do not listen.
#include <linux/android/binder.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <random>

#include "hostile_fixture.h"

namespace {

using namespace android;
using namespace tavo::test;
using wire::FrameType;
using wire::WireObject;

constexpr size_t kParcelLimit = 1024 * 1024;

class SocketHostileFlood : public HostileClientTest {
protected:
    // How much the server has grown, by parcels at most and what it takes to handle them.
    void expect_growth_below(size_t parcels) {
        if (kSanitized) return;  // with its own account of the memory, the sanitizer multiplies it
        EXPECT_LT(resident_memory(server_.pid()), memory_ + (parcels + 40) * kParcelLimit);
    }

private:
    const size_t memory_ = resident_memory(server_.pid());
};

ByteString sized(uint32_t size) { return bytes_of(static_cast<int32_t>(size)); }

// So many for this process, if it may.
bool may_open(rlim_t descriptors) {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_max < descriptors) return false;
    limit.rlim_cur = std::max(limit.rlim_cur, descriptors);
    return setrlimit(RLIMIT_NOFILE, &limit) == 0;
}

TEST_F(SocketHostileFlood, OpensThousandsOfChannels) {
    if (!may_open(6000)) GTEST_SKIP() << "this process may not open so many";
    const RawPeer peer("test.service");
    std::atomic<int> refused{0};
    std::thread listener([&] {
        wire::ControlHeader answer{};
        while (recv(peer.control(), &answer, sizeof answer, 0) == sizeof answer) ++refused;
    });
    std::vector<UniqueFd> channels;
    for (int i = 0; i < 3000; ++i) channels.push_back(peer.open_channel());
    EXPECT_TRUE(comes_true([&] { return refused > 1500; })) << refused;
    EXPECT_LT(count_descriptors(server_.pid()), 1200U);
    expect_served();
    shutdown(peer.control(), SHUT_RDWR);
    listener.join();
}

TEST_F(SocketHostileFlood, OpensThousandsOfChannelsAndDoesNotListen) {
    if (!may_open(6000)) GTEST_SKIP() << "this process may not open so many";
    const RawPeer peer("test.service");
    std::vector<UniqueFd> channels;
    for (int i = 0; i < 5000; ++i) channels.push_back(peer.open_channel());
    EXPECT_LT(count_descriptors(server_.pid()), 1200U);
    expect_growth_below(0);
}

TEST_F(SocketHostileFlood, ConnectsOverAndOver) {
    for (int i = 0; i < 500; ++i) const RawPeer peer("test.service", i % 2 == 0);
    std::vector<RawPeer> peers;
    for (int i = 0; i < 200; ++i) peers.emplace_back("test.service");
    expect_served();
}

TEST_F(SocketHostileFlood, LeavesFramesHalfSent) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    std::vector<UniqueFd> channels;
    for (size_t i = 0; i < 100; ++i) {
        const ByteString frame = transaction(node, TestService::kEcho, ByteString(kParcelLimit)).bytes();
        channels.push_back(peer.open_channel());
        // Of some only a part of the header.
        const size_t part = i % 3 == 0 ? 1 + i % 40 : i % 3 == 1 ? sizeof(wire::FrameHeader) : 100000;
        send_raw(channels.back().get(), ByteString(frame.begin(), frame.begin() + static_cast<ptrdiff_t>(part)), {},
                 MSG_DONTWAIT);
    }
    expect_served();
    EXPECT_LT(count_threads_named(server_.pid(), "Binder_"), 15U) << "no thread waits for the rest";
    for (const UniqueFd& channel : channels) EXPECT_TRUE(is_open(channel.get()));
    expect_growth_below(100);
}

TEST_F(SocketHostileFlood, SendsAFrameByteByByte) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd channel = peer.open_channel();
    RawFrame frame = transaction(node, TestService::kEcho, ByteString(72, 9));
    frame.add(WireObject::kNull, 0);
    const ByteString bytes = frame.bytes();
    for (const uint8_t byte : bytes) {
        ASSERT_TRUE(send_raw(channel.get(), ByteString(1, byte)));
        usleep(200);
    }
    EXPECT_EQ(receive_frame(channel.get()).status(), OK);
}

TEST_F(SocketHostileFlood, DoesNotTakeItsReplies) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    constexpr size_t kChannels = 60;
    std::vector<UniqueFd> channels;
    for (size_t i = 0; i < kChannels; ++i) {
        channels.push_back(peer.open_channel());
        send_raw(channels.back().get(), transaction(node, TestService::kBytes, sized(kParcelLimit)).bytes());
    }
    // Each has its answer, of which the most part waits in the server.
    for (const UniqueFd& channel : channels) {
        wire::FrameHeader header{};
        EXPECT_TRUE(
            comes_true([&] { return recv(channel.get(), &header, sizeof header, MSG_PEEK | MSG_DONTWAIT) > 0; }));
    }
    expect_served();
    EXPECT_LE(count_threads_named(server_.pid(), "Binder_"), 18U);
    expect_growth_below(kChannels);
    // Whoever reads late and slowly gets it whole all the same.
    for (size_t i = 0; i < kChannels; i += 10) {
        usleep(10000);
        const ReceivedFrame reply = receive_frame(channels[i].get());
        EXPECT_EQ(reply.header.dataSize, kParcelLimit);
        EXPECT_EQ(reply.data, ByteString(kParcelLimit, 5));
    }
}

TEST_F(SocketHostileFlood, TakesLateRepliesWithTheirDescriptors) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd channel = peer.open_channel();
    ByteString request = bytes_of(int32_t{STDIN_FILENO}), size = sized(900000);
    request.insert(request.end(), size.begin(), size.end());
    send_raw(channel.get(), transaction(node, TestService::kReplyDescriptor, request).bytes());
    usleep(100000);
    const ReceivedFrame reply = receive_frame(channel.get());
    EXPECT_EQ(reply.status(), OK);
    EXPECT_EQ(reply.descriptors.size(), 1U);
}

TEST_F(SocketHostileFlood, SendsTheNextTransactionBeforeItHasTheReply) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd channel = peer.open_channel();
    const ByteString frame = transaction(node, TestService::kEcho, ByteString(8)).bytes();
    ByteString two = frame;
    two.insert(two.end(), frame.begin(), frame.end());
    send_raw(channel.get(), two);
    EXPECT_TRUE(is_closed(channel.get())) << "neither side may run ahead of the other";
}

TEST_F(SocketHostileFlood, SendsNothingButReceipts) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd channel = peer.open_channel();
    wire::FrameHeader receipt{};
    receipt.magic = wire::kMagic;
    receipt.type = FrameType::kReceipt;
    ByteString bytes;
    for (int i = 0; i < 1000; ++i) {
        const ByteString one = bytes_of(receipt);
        bytes.insert(bytes.end(), one.begin(), one.end());
    }
    const ByteString frame = transaction(node, TestService::kEcho, ByteString(8)).bytes();
    bytes.insert(bytes.end(), frame.begin(), frame.end());
    send_raw(channel.get(), bytes);
    EXPECT_EQ(receive_frame(channel.get()).status(), OK) << "which means nothing";
}

// Never reads what it is told of its objects.
TEST_F(SocketHostileFlood, GivesAwayObjectsWithoutEnd) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd channel = peer.open_channel();
    uint64_t next = 1;
    const auto give = [&] {
        RawFrame frame = transaction(node, TestService::kKept);
        for (int i = 0; i < 30000; ++i) frame.add(WireObject::kSendersNode, next++);
        return send_raw(channel.get(), frame.bytes()) && receive_frame(channel.get()).is(FrameType::kReply);
    };
    int rounds = 0;
    while (rounds < 100 && give()) ++rounds;
    EXPECT_GT(rounds, 2) << "a parcel full of them is nothing special";
    EXPECT_LT(rounds, 100) << "but the end of the patience is reached";
    expect_growth_below(64);
}

TEST_F(SocketHostileFlood, CallsBackWithoutEnd) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd channel = peer.open_channel();
    RawFrame ping = transaction(node, TestService::kPingPong, sized(1000000));
    ping.add(WireObject::kSendersNode, 1);
    int depth = 0;
    for (;; ++depth) {
        ASSERT_TRUE(send_raw(channel.get(), ping.bytes()));
        const ReceivedFrame frame = receive_frame(channel.get());
        if (!frame.is(FrameType::kTransaction)) {
            EXPECT_EQ(frame.status(), FAILED_TRANSACTION);
            break;
        }
        ASSERT_LT(depth, 100000);
    }
    EXPECT_GT(depth, 100);
    expect_served();
}

TEST_F(SocketHostileFlood, IntroducesNobody) {
    const RawPeer first("test.service");
    const uint64_t node = first.look_up("test.service");
    int pair[2];
    const auto introduce = [node](const RawPeer& peer, int descriptor) {
        RawFrame frame = transaction(node, TestService::kIsKept);
        frame.add(WireObject::kIntroduction, 0, 0);
        frame.descriptors = {descriptor};
        const UniqueFd channel = peer.open_channel();
        send_raw(channel.get(), frame.bytes(), frame.descriptors);
        return receive_frame(channel.get());
    };
    const auto expect_cut = [&](int descriptor, const char* what) {
        const RawPeer peer("test.service");
        peer.look_up("test.service");
        EXPECT_EQ(introduce(peer, descriptor).header.magic, 0U) << what;
        EXPECT_TRUE(is_closed(peer.control())) << what;
    };
    expect_cut(STDIN_FILENO, "a file");
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair), 0);
    expect_cut(pair[0], "a stream");
    close(pair[0]);
    close(pair[1]);
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair), 0);
    expect_cut(pair[0], "a connection on which nobody speaks");
    send_raw(pair[1], ByteString(100, 1));
    expect_cut(pair[0], "one on which somebody speaks nonsense");
    wire::Greeting welcome{};
    welcome.header = {wire::kMagic, wire::ControlType::kWelcome};
    send_raw(pair[1], bytes_of(welcome));
    expect_cut(pair[0], "one that stands for no object");
    // Somebody who claims to be the server itself does not get at its objects.
    welcome.instance = first.welcome().instance;
    welcome.node = node;
    send_raw(pair[1], bytes_of(welcome));
    const ReceivedFrame reply = introduce(first, pair[0]);
    EXPECT_TRUE(reply.is(FrameType::kReply));
    EXPECT_EQ(reply.status(), OK);
    close(pair[0]);
    close(pair[1]);
    EXPECT_TRUE(is_open(first.control()));
}

// To pass its object on takes an answer of its.
TEST_F(SocketHostileFlood, DoesNotAnswerForItsObjects) {
    const RawPeer peer("test.service"), other("test.service");
    const uint64_t node = peer.look_up("test.service");
    RawFrame keep = transaction(node, TestService::kKeep);
    keep.add(WireObject::kSendersNode, 1);
    const UniqueFd channel = peer.open_channel();
    send_raw(channel.get(), keep.bytes());
    EXPECT_TRUE(receive_frame(channel.get()).is(FrameType::kReply));

    ASSERT_EQ(other.look_up("test.service"), node);
    const UniqueFd asking = other.open_channel();
    send_raw(asking.get(), transaction(node, TestService::kKept).bytes());
    expect_served();
    const ReceivedFrame reply = receive_frame(asking.get());
    EXPECT_TRUE(reply.is(FrameType::kReply)) << "nobody waits for it for ever";
    EXPECT_EQ(reply.status(), FAILED_TRANSACTION);
    EXPECT_TRUE(is_open(channel.get())) << "it may be held up by a debugger";
}

// With every message a descriptor comes that nobody has sent.
TEST_F(SocketHostileFlood, HasTheKernelSendDescriptorsAlong) {
    constexpr int kPassPidfd = 76;  // SO_PASSPIDFD, which headers may lack
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    int ends[2];
    const int on = 1;
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    const UniqueFd channel(ends[0]), offered(ends[1]);
    if (setsockopt(offered.get(), SOL_SOCKET, kPassPidfd, &on, sizeof on) != 0) {
        GTEST_SKIP() << "this kernel has nothing of the kind";
    }
    setsockopt(offered.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
    peer.say(bytes_of(wire::ChannelOffer{{wire::kMagic, wire::ControlType::kChannel}, wire::Purpose::kCalls, 0}),
             {offered.get()});
    const size_t before = count_descriptors(server_.pid());
    for (int i = 0; i < 50; ++i) {
        send_raw(channel.get(), transaction(node, TestService::kEcho, ByteString(8)).bytes());
        EXPECT_EQ(receive_frame(channel.get()).status(), OK);
    }
    EXPECT_LE(count_descriptors(server_.pid()), before + 4);
}

// Processes that come, leave calls behind and go, while the object they are for is held up.
TEST_F(SocketHostileFlood, LeavesCallsThatNobodyWaitsFor) {
    Gate gate;
    ASSERT_EQ(gate.call(service_, IBinder::FLAG_ONEWAY), OK);
    ASSERT_TRUE(gate.wait_for(1));
    for (int i = 0; i < 100; ++i) {
        const RawPeer peer("test.service");
        const uint64_t node = peer.look_up("test.service");
        const UniqueFd channel = peer.open_channel();
        const RawFrame frame = transaction(node, TestService::kEcho, ByteString(kParcelLimit), IBinder::FLAG_ONEWAY);
        for (int n = 0; n < 3; ++n) {
            send_raw(channel.get(), frame.bytes());
            EXPECT_EQ(receive_frame(channel.get()).status(), n == 0 ? OK : FAILED_TRANSACTION);
        }
    }
    expect_growth_below(8);
    gate.open();
}

TEST_F(SocketHostileFlood, WantsIntroductionsWithoutEnd) {
    const RawPeer peer("test.service");
    const uint64_t node = peer.look_up("test.service");
    const UniqueFd directory = peer.open_channel(wire::Purpose::kDirectory);
    std::vector<ReceivedFrame> introductions;
    int refused = 0;
    for (int i = 0; i < 1000; ++i) {
        send_raw(directory.get(), transaction(wire::kDirectoryNode, wire::kIntroduce, bytes_of(node)).bytes());
        introductions.push_back(receive_frame(directory.get()));
        ASSERT_TRUE(introductions.back().is(FrameType::kReply));
        refused += introductions.back().status() != OK;
    }
    EXPECT_GT(refused, 700);
    EXPECT_LT(count_descriptors(server_.pid()), 400U);
}

// Frames as they should be, but for a few bytes.
TEST_F(SocketHostileFlood, SendsAlmostTheRightThing) {
    std::mt19937 random(20240229);
    const auto pick = [&random](size_t below) { return static_cast<size_t>(random() % below); };
    for (int i = 0; i < (is_slow() ? 150 : 1500); ++i) {
        const RawPeer peer("test.service");
        const uint64_t node = peer.look_up("test.service");
        const uint32_t codes[] = {TestService::kEcho, TestService::kKeep, TestService::kIsKept};
        RawFrame frame = transaction(node, codes[pick(3)], {}, pick(4) == 0 ? uint32_t{IBinder::FLAG_ONEWAY} : 0);
        for (size_t n = pick(4); n > 0; --n) {
            switch (pick(4)) {
                case 0: frame.add(WireObject::kSendersNode, 1 + pick(3)); break;
                case 1: frame.add(WireObject::kReceiversNode, node); break;
                case 2: frame.add_descriptor(STDIN_FILENO); break;
                default: frame.add(WireObject::kNull, 0); break;
            }
        }
        ByteString bytes = frame.bytes();
        for (size_t n = pick(4); n > 0; --n) bytes[pick(bytes.size())] = static_cast<uint8_t>(pick(256));
        if (pick(5) == 0) bytes.resize(pick(bytes.size()));
        const bool directory = pick(5) == 0;
        const UniqueFd channel = peer.open_channel(directory ? wire::Purpose::kDirectory : wire::Purpose::kCalls);
        if (!bytes.empty()) send_raw(channel.get(), bytes, frame.descriptors);
        if (pick(3) == 0) {
            char answer[256];
            usleep(200);
            (void)!recv(channel.get(), answer, sizeof answer, MSG_DONTWAIT);
        }
    }
    expect_growth_below(16);
    ask(service_, TestService::kKeep, nullptr);
}

}  // namespace
