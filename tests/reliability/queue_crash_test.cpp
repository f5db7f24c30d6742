// Senders and receivers that are killed.
#include <fcntl.h>
#include <sys/syscall.h>

#include <string>

#include "ipc/descriptors.h"
#include "reliability/service_uses.h"

namespace {

using tavo::test::attached;
using tavo::test::bytes_in;
using tavo::test::comes_back_to;
using tavo::test::comes_true;
using tavo::test::count_pipe_ends;
using tavo::test::drop;
using tavo::test::file_of;
using tavo::test::get;
using tavo::test::Holdings;
using tavo::test::is_in;
using tavo::test::kDone;
using tavo::test::kill_everywhere;
using tavo::test::Peer;
using tavo::test::put;
using tavo::test::queue_of;
using tavo::test::take_queue_uses;
using tavo::test::waits_in;

class QueueCrash : public tavo::test::CrashTest {
protected:
    // Has a sender put until it is stuck inside a frame: the pipe has no room, and not all of the frame is in.
    void fill(Peer& sender, int pipe) {
        for (whole_ = 0; whole_ < 100; ++whole_) {
            const int all = (whole_ + 1) * 400004;
            sender.tell("put 7 400000");
            ASSERT_TRUE(comes_true([&] { return bytes_in(pipe) == all || is_in(sender.pid(), SYS_write); }));
            if (bytes_in(pipe) < all) break;
            EXPECT_EQ(sender.answer(), kDone);
        }
        ASSERT_TRUE(waits_in(sender.pid(), SYS_write));
        ASSERT_NE(bytes_in(pipe) % 400004, 0);
    }
    int whole_ = 0;
};

TEST_F(QueueCrash, SenderInsideALargePutLeavesAShortMessageThenWholeOnes) {
    const TAVO_INT64 handle = attached("7");
    const int pipe = queue_of(handle).iReadFd;
    Peer receiver("attach 7");
    {
        Peer sender("attach 7");
        fill(sender, pipe);
        sender.kill();
    }
    const int size = bytes_in(pipe);
    for (int i = 0; i < whole_; ++i) EXPECT_EQ(receiver.ask("get 7"), "400000 whole");
    EXPECT_EQ(receiver.ask("get 7"), std::to_string(size - whole_ * 400004 - 4) + " short");
    Peer next("attach 7");
    EXPECT_EQ(next.ask("put 7 400000"), kDone);
    EXPECT_EQ(receiver.ask("get 7"), "400000 whole");
    EXPECT_EQ(bytes_in(pipe), 0);
    drop(handle);
    EXPECT_EQ(take_queue_uses(7), 4);
}

struct Cut {
    int bytes;
    const char* result;
};
class SenderCrash : public QueueCrash, public testing::WithParamInterface<Cut> {};

TEST_P(SenderCrash, InsideAFrameThatIsWaitedForGivesWhatCame) {
    Peer receiver("attach 7");
    Peer sender("attach 7");
    receiver.tell("get 7");
    ASSERT_TRUE(waits_in(receiver.pid(), SYS_read));
    sender.crash("libtavoosal.so write " + std::to_string(GetParam().bytes) + " 1", "put 7 8192");
    EXPECT_EQ(receiver.answer(), GetParam().result);
    Peer next("attach 7");
    EXPECT_EQ(next.ask("put 7 1000"), kDone);
    EXPECT_EQ(receiver.ask("get 7"), "1000 whole");
}

INSTANTIATE_TEST_SUITE_P(After, SenderCrash,
                         testing::Values(Cut{2, "0 whole"}, Cut{4, "0 whole"}, Cut{104, "100 short"}),
                         [](const auto& test) { return std::to_string(test.param.bytes) + "Bytes"; });

TEST_F(QueueCrash, SenderInFrontOfOrBehindAPutLeavesWholeMessages) {
    Peer receiver("attach 7");
    Peer before("attach 7");
    before.crash("libtavoosal.so write before 1", "put 7 1000");
    Peer after("attach 7");
    after.crash("libtavoosal.so write after 1", "put 7 2000");
    EXPECT_EQ(receiver.ask("get 7"), "2000 whole");
}

TEST_F(QueueCrash, ReceiverThatWaitsLosesNothing) {
    Peer sender("attach 7");
    {
        Peer receiver("attach 7");
        receiver.tell("get 7");
        ASSERT_TRUE(waits_in(receiver.pid(), SYS_read));
        receiver.kill();
    }
    EXPECT_EQ(sender.ask("put 7 1000"), kDone);
    Peer next("attach 7");
    EXPECT_EQ(next.ask("get 7"), "1000 whole");
}

// The length is gone, and what is left cannot be told from a length. Draining is the way back.
TEST_F(QueueCrash, ReceiverBetweenLengthAndMessageLeavesBytesThatMustBeDrained) {
    Peer sender("attach 7");
    EXPECT_EQ(sender.ask("put 7 1000"), kDone);
    {
        Peer receiver("attach 7");
        receiver.crash("libtavoosal.so read after 1", "get 7");
    }
    const TAVO_INT64 handle = attached("7");
    EXPECT_EQ(bytes_in(queue_of(handle).iReadFd), 1000);
    queue_of(handle).tavo_android_msg_queue_clear();
    EXPECT_EQ(bytes_in(queue_of(handle).iReadFd), 0);
    EXPECT_EQ(sender.ask("put 7 2000"), kDone);
    EXPECT_EQ(get(handle).size(), 2000U);
    drop(handle);
}

TEST_F(QueueCrash, ReceiverBehindAWholeMessageTakesOnlyThatOneAway) {
    Peer sender("attach 7");
    EXPECT_EQ(sender.ask("put 7 1000"), kDone);
    EXPECT_EQ(sender.ask("put 7 2000"), kDone);
    {
        Peer receiver("attach 7");
        receiver.crash("libtavoosal.so read after 2", "get 7");
    }
    Peer next("attach 7");
    EXPECT_EQ(next.ask("get 7"), "2000 whole");
}

TEST_F(QueueCrash, SenderOfAFullQueueWaitsForTheNextReceiver) {
    const TAVO_INT64 handle = attached("7");
    const int pipe = queue_of(handle).iReadFd;
    Peer receiver("attach 7");
    Peer sender("attach 7");
    fill(sender, pipe);
    receiver.kill();
    ASSERT_TRUE(waits_in(sender.pid(), SYS_write));
    Peer next("attach 7");
    for (int i = 0; i <= whole_; ++i) EXPECT_EQ(next.ask("get 7"), "400000 whole");
    EXPECT_EQ(sender.answer(), kDone);
    drop(handle);
}

constexpr const char* kCalls[] = {
    "libbinder.so sendmsg before", "libbinder.so sendmsg after",  "libbinder.so recvmsg before",
    "libbinder.so recvmsg after",  "libtavoosal.so fcntl before", "libtavoosal.so fcntl after",
    "libtavoosal.so pipe2 before",
};

class AttachCrash : public QueueCrash, public testing::WithParamInterface<const char*> {};

TEST_P(AttachCrash, AnywhereInAnAttachLeavesAtMostItsUse) {
    expect_at_most_its_use_left(GetParam(), "attach 7", [] { return take_queue_uses(7); });
}

INSTANTIATE_TEST_SUITE_P(At, AttachCrash, testing::ValuesIn(kCalls),
                         [](const auto& test) { return tavo::test::words(test.param); });

class DestroyCrash : public QueueCrash, public testing::WithParamInterface<const char*> {};

TEST_P(DestroyCrash, AnywhereInADestroyGivesTheUseBackAtMostOnce) {
    const Holdings server(server_.pid());
    Peer other("attach 7");
    const Holdings with_other(server_.pid());
    const int points = kill_everywhere(GetParam(), "attach 7", "destroy 7", [&] {
        const int taken = take_queue_uses(7);
        EXPECT_TRUE(taken == 1 || taken == 2) << taken;
        EXPECT_TRUE(comes_back_to(with_other, server_.pid()));
        EXPECT_EQ(other.ask("attach 7"), kDone);
    });
    EXPECT_GE(points, 1);
    other.kill();
    take_queue_uses(7);
    EXPECT_TRUE(comes_back_to(server, server_.pid()));
    expect_service();
}

INSTANTIATE_TEST_SUITE_P(At, DestroyCrash, testing::Values(kCalls[0], kCalls[1], kCalls[2], kCalls[3]),
                         [](const auto& test) { return tavo::test::words(test.param); });

}  // namespace
