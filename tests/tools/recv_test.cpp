// tavo recv: which messages it takes, and how they look.
#include <signal.h>

#include <nlohmann/json.hpp>

#include "tools/program.h"

namespace {

using nlohmann::json;
using tavo::test::failed;
using tavo::test::listed;
using tavo::test::OnTerminal;
using tavo::test::Result;
using tavo::test::Running;
using tavo::test::ServedTest;
using tavo::test::succeeded;
using tavo::test::tavo;

class Recv : public ServedTest {
protected:
    static void send(const std::string& text) { EXPECT_TRUE(succeeded(tavo({"send", "7", "-"}, text))); }
    static json queues() { return listed()["queues"]; }
};

TEST_F(Recv, OneMessageAsItsBytes) {
    const std::string bytes("\0\xff\n\r text", 9);
    send(bytes);
    send("second");
    EXPECT_TRUE(succeeded(tavo({"recv", "7"}), bytes));
    EXPECT_TRUE(succeeded(tavo({"recv", "7"}), "second"));
}

TEST_F(Recv, AsManyAsAskedFor) {
    for (const char* text : {"one", "two", "three"}) send(text);
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "--count", "2"}), "onetwo"));
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "-n", "0"}), ""));
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "-n", "1", "--lines"}), "three\n"));
}

TEST_F(Recv, WaitsForAMessage) {
    Running receiver({"recv", "7"});
    while (queues().empty()) {
    }
    send("late");
    EXPECT_EQ(receiver.wait(), 0);
    EXPECT_EQ(receiver.read_rest(), "late");
}

TEST_F(Recv, GivesUpInTime) {
    EXPECT_TRUE(failed(tavo({"recv", "7", "--timeout", "0.05"}), 1, "no message came in time"));
    // Nothing is left behind by having looked.
    EXPECT_TRUE(queues().empty());
}

TEST_F(Recv, WhatCameBeforeTheTimeWasUpIsThere) {
    send("one");
    const Result result = tavo({"recv", "7", "--count", "2", "--timeout", "0"});
    EXPECT_EQ(result.out, "one");
    EXPECT_TRUE(failed(result, 1, "no message came in time"));
}

TEST_F(Recv, FollowsUntilASignalEndsIt) {
    for (const int signal : {SIGINT, SIGTERM}) {
        Running receiver({"recv", "7", "--follow", "--lines"});
        send("one");
        EXPECT_EQ(receiver.read_until("\n"), "one\n");
        send("two");
        EXPECT_EQ(receiver.read_until("\n"), "two\n");
        receiver.signal(signal);
        EXPECT_EQ(receiver.wait(), 0);
        EXPECT_EQ(receiver.read_rest(), "");
    }
}

TEST_F(Recv, InterruptedBeforeItsMessagesCameSaysSoByItsStatus) {
    Running receiver({"recv", "7"});
    while (queues().empty()) {
    }
    receiver.signal(SIGINT);
    EXPECT_EQ(receiver.wait(), 130);
    EXPECT_TRUE(queues().empty());
}

TEST_F(Recv, KeepsTheQueueForMessagesThatItLeaves) {
    Running receiver({"recv", "7"});
    while (queues().empty()) {
    }
    // While the receiver is attached, the senders leave no use behind.
    receiver.signal(SIGSTOP);
    for (const char* text : {"one", "two"}) send(text);
    EXPECT_EQ(queues()[0]["uses"], 1);
    receiver.signal(SIGCONT);
    EXPECT_EQ(receiver.wait(), 0);
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "--timeout", "0"}), "two"));
}

TEST_F(Recv, JsonForPrograms) {
    send("two \"lines\"\n");
    send(std::string("\xff\0x", 3));
    send(std::string("\xff\0", 2));
    send("\xff");
    const std::string lines = tavo({"recv", "7", "--json", "--count", "4"}).out;
    EXPECT_EQ(lines,
              "{\"key\":7,\"size\":12,\"text\":\"two \\\"lines\\\"\\n\"}\n"
              "{\"base64\":\"/wB4\",\"key\":7,\"size\":3}\n"
              "{\"base64\":\"/wA=\",\"key\":7,\"size\":2}\n"
              "{\"base64\":\"/w==\",\"key\":7,\"size\":1}\n");
}

TEST_F(Recv, CombinationsThatCannotBeMeantAreMisuse) {
    EXPECT_EQ(tavo({"recv", "7", "--json", "--lines"}).status, 2);
    EXPECT_EQ(tavo({"recv", "7", "--follow", "--count", "2"}).status, 2);
    EXPECT_EQ(tavo({"recv", "7", "--count", "some"}).status, 2);
}

TEST_F(Recv, OnATerminalEachMessageHasALine) {
    send("one");
    send("two");
    OnTerminal receiver({"recv", "7", "--count", "2"});
    EXPECT_EQ(receiver.read_until("two\r\n"), "one\r\ntwo\r\n");
    EXPECT_EQ(receiver.wait(), 0);
}

TEST_F(Recv, OnATerminalAKeyInterruptsIt) {
    OnTerminal receiver({"recv", "7", "--follow"});
    send("one");
    receiver.read_until("one\r\n");
    receiver.write("\x03");
    EXPECT_EQ(receiver.wait(), 0);
}

}  // namespace
