// Servers that say what no server says. A client of theirs gets an error, or waits as for one that never answers.
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <functional>
#include <thread>

#include "raw_peer.h"
#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;
using wire::FrameType;
using wire::WireObject;

// The other side of a client's connection: what it does with the channels that the client offers.
class RawServer {
public:
    using Answer = std::function<void(int channel)>;

    // Answers the first look-up with an object, and calls on it as told.
    explicit RawServer(Answer answer, const std::string& name = "raw")
        : listener_(listen_raw(name)), answer_(std::move(answer)), thread_([this] { serve(); }) {}
    ~RawServer() {
        // The client has closed its end, or is about to.
        shutdown(listener_.get(), SHUT_RDWR);
        if (control_ >= 0) shutdown(control_, SHUT_RDWR);
        thread_.join();
    }

private:
    void serve() {
        const UniqueFd control = accept_raw(listener_.get());
        control_ = control.get();
        receive_descriptor(control.get());  // its hello has none
        const UniqueFd directory = receive_descriptor(control.get());
        receive_frame(directory.get());
        RawFrame found = reply_frame();
        found.add(WireObject::kSendersNode, 1);
        send_raw(directory.get(), found.bytes());
        const UniqueFd channel = receive_descriptor(control.get());
        if (channel.valid()) answer_(channel.get());
    }

    const UniqueFd listener_;
    const Answer answer_;
    std::atomic<int> control_{-1};
    std::thread thread_;
};

// What a call to a server ends with that answers like this.
status_t outcome(const RawServer::Answer& answer, Parcel* reply = nullptr) {
    const RawServer server(answer);
    const sp<IBinder> object = find_service("raw");
    EXPECT_NE(object, nullptr);
    if (object == nullptr) return UNKNOWN_ERROR;
    Parcel data, unwanted;
    data.writeInt32(1);
    return object->transact(TestService::kEcho, data, reply != nullptr ? reply : &unwanted);
}

RawServer::Answer answer_with(const ByteString& bytes, const std::vector<int>& descriptors = {}) {
    return [=](int channel) {
        receive_frame(channel);
        send_raw(channel, bytes, descriptors);
        is_closed(channel);
    };
}

TEST(SocketHostileServer, IsServedLikeOthersAsLongAsItBehaves) {
    Parcel reply;
    EXPECT_EQ(outcome(answer_with(reply_frame(0, bytes_of(int32_t{5})).bytes()), &reply), OK);
    EXPECT_EQ(reply.readInt32(), 5);
}

TEST(SocketHostileServer, DoesNotGreet) {
    EXPECT_EQ(find_service("raw"), nullptr);
    const UniqueFd listener = listen_raw("raw");
    for (const ByteString& welcome :
         {ByteString(), ByteString(1), ByteString(100, 7), ByteString(sizeof(wire::Greeting)), ByteString(100000, 1)}) {
        std::thread server([&] {
            const UniqueFd connection = accept_raw(listener.get(), false);
            if (!welcome.empty()) send_raw(connection.get(), welcome, {STDIN_FILENO});
        });
        const size_t before = count_descriptors();
        EXPECT_EQ(find_service("raw"), nullptr);
        server.join();
        EXPECT_LE(count_descriptors(), before);
    }
}

TEST(SocketHostileServer, LeavesAfterItsGreeting) {
    const UniqueFd listener = listen_raw("raw");
    std::thread server([&] { accept_raw(listener.get()); });
    EXPECT_EQ(find_service("raw"), nullptr);
    server.join();
}

TEST(SocketHostileServer, RepliesWithWhatIsNoReply) {
    const auto changed = [](const std::function<void(wire::FrameHeader&)>& change) {
        RawFrame frame = reply_frame(0, ByteString(64));
        wire::FrameHeader header = frame.sized();
        change(header);
        return frame.bytes(header);
    };
    const auto reply_with = [](const std::function<void(RawFrame&)>& change) {
        RawFrame frame = reply_frame();
        change(frame);
        return answer_with(frame.bytes(), frame.descriptors);
    };
    EXPECT_EQ(outcome(answer_with(ByteString(5000, 0xee))), DEAD_OBJECT);
    EXPECT_EQ(outcome(answer_with(changed([](auto& h) { h.magic = 0; }))), DEAD_OBJECT);
    EXPECT_EQ(outcome(answer_with(changed([](auto& h) { h.type = FrameType{9}; }))), DEAD_OBJECT);
    EXPECT_EQ(outcome(answer_with(changed([](auto& h) { h.dataSize = 1024 * 1024 + 1; }))), DEAD_OBJECT);
    EXPECT_EQ(outcome(answer_with(changed([](auto& h) { h.objectCount = UINT32_MAX; }))), DEAD_OBJECT);
    EXPECT_EQ(outcome(answer_with(changed([](auto& h) { h.dataSize = 8; }))), DEAD_OBJECT) << "more than it says";
    EXPECT_EQ(outcome(reply_with([](auto& f) { f.add(WireObject{77}, 0); })), DEAD_OBJECT);
    EXPECT_EQ(outcome(reply_with([](auto& f) { f.add(WireObject::kReceiversNode, 1); })), DEAD_OBJECT);
    EXPECT_EQ(outcome(reply_with([](auto& f) { f.add(WireObject::kDescriptor, 3); })), DEAD_OBJECT);
    EXPECT_EQ(outcome(reply_with([](auto& f) {
                  f.add(WireObject::kNull, 0);
                  f.offsets[0] = 1000;
              })),
              DEAD_OBJECT);
    EXPECT_EQ(outcome(reply_with([](auto& f) { f.descriptors = {STDIN_FILENO}; })), DEAD_OBJECT);
    EXPECT_EQ(outcome(answer_with(reply_frame().bytes(), {STDIN_FILENO})), DEAD_OBJECT);
}

TEST(SocketHostileServer, ClosesInsteadOfReplying) {
    EXPECT_EQ(outcome([](int channel) { shutdown(channel, SHUT_RDWR); }), DEAD_OBJECT) << "and gives no reason";
    EXPECT_EQ(outcome([](int channel) {
                  receive_frame(channel);
                  const ByteString half = bytes_of(reply_frame(0, ByteString(1000)).sized());
                  send_raw(channel, half);
                  shutdown(channel, SHUT_RDWR);
              }),
              DEAD_OBJECT);
}

TEST(SocketHostileServer, LeavesNoDescriptorBehind) {
    EXPECT_EQ(outcome(answer_with(reply_frame().bytes())), OK);
    const size_t before = count_descriptors();
    for (int i = 0; i < 5; ++i) {
        RawFrame frame = reply_frame();
        frame.add_descriptor(STDIN_FILENO);
        frame.add(WireObject{77}, 0);
        EXPECT_EQ(outcome(answer_with(frame.bytes(), frame.descriptors)), DEAD_OBJECT);
    }
    EXPECT_TRUE(comes_true([&] { return count_descriptors() <= before; })) << count_descriptors() - before << " more";
}

TEST(SocketHostileServer, CallsWhatItWasNotGiven) {
    std::vector<int32_t> statuses;
    EXPECT_EQ(outcome([&](int channel) {
                  receive_frame(channel);
                  for (const uint64_t node : {uint64_t{0}, uint64_t{1}, UINT64_MAX}) {
                      send_raw(channel, transaction(node, TestService::kEcho).bytes());
                      statuses.push_back(receive_frame(channel).status());
                  }
                  send_raw(channel, reply_frame(7).bytes());
                  is_closed(channel);
              }),
              7);
    EXPECT_EQ(statuses, std::vector<int32_t>(3, FAILED_TRANSACTION));
}

TEST(SocketHostileServer, CallsBackOneway) {
    EXPECT_EQ(outcome(answer_with(transaction(1, TestService::kEcho, {}, IBinder::FLAG_ONEWAY).bytes())), DEAD_OBJECT);
}

TEST(SocketHostileServer, CallsBackWithoutEnd) {
    const RawServer server([](int channel) {
        // Each call back is a call by the client in turn, which is called back before it is answered.
        ReceivedFrame frame = receive_frame(channel);
        const uint64_t node = object_in(frame);
        for (int i = 0; i < 100000 && frame.is(FrameType::kTransaction); ++i) {
            RawFrame ping = transaction(node, TestService::kPingPong, bytes_of(int32_t{1000000}));
            ping.add(WireObject::kSendersNode, 1);
            send_raw(channel, ping.bytes());
            frame = receive_frame(channel);
        }
        is_closed(channel);
    });
    const sp<IBinder> object = find_service("raw");
    ASSERT_NE(object, nullptr);
    Parcel data, reply;
    data.writeInt32(1);
    data.writeStrongBinder(new TestService);
    std::thread([&] { object->transact(TestService::kPingPong, data, &reply); }).join();
}

TEST(SocketHostileServer, NeverAnswersAndIsGivenUpWhenItDies) {
    const RawServer server([](int channel) {
        receive_frame(channel);
        usleep(200000);
    });
    const sp<IBinder> object = find_service("raw");
    ASSERT_NE(object, nullptr);
    Parcel data, reply;
    EXPECT_EQ(object->transact(TestService::kEcho, data, &reply), DEAD_OBJECT);
}

TEST(SocketHostileServer, RefusesChannels) {
    const UniqueFd listener = listen_raw("raw");
    std::thread server([&] {
        const UniqueFd control = accept_raw(listener.get());
        receive_descriptor(control.get());
        receive_descriptor(control.get());
        send_raw(control.get(), bytes_of(wire::ControlHeader{wire::kMagic, wire::ControlType::kRefusal}));
        is_closed(control.get());
    });
    std::thread client([] { EXPECT_EQ(find_service("raw"), nullptr) << "there is no room, and nothing to wait for"; });
    client.join();
    server.detach();
}

}  // namespace
