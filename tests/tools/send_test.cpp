// tavo send.
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
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
using tavo::test::Words;

constexpr size_t kMaxSize = 409600;

class Send : public ServedTest {
protected:
    static json queue() { return listed()["queues"].at(0); }
    static std::string received(const char* key = "7", const Words& more = {}) {
        Words words = {"recv", "--timeout", "0"};
        words.insert(words.end(), more.begin(), more.end());
        words.insert(words.end(), {"--", key});
        return tavo(words).out;
    }
    static std::string file_with(const std::string& text) {
        std::ofstream("/sdcard/input") << text;
        return "/sdcard/input";
    }
};

TEST_F(Send, AText) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "hello, world"})));
    EXPECT_EQ(received(), "hello, world");
}

TEST_F(Send, AnEmptyText) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", ""})));
    EXPECT_EQ(queue()["pending"], 4);
    EXPECT_EQ(received("7", {"--json"}), "{\"key\":7,\"size\":0,\"text\":\"\"}\n");
}

TEST_F(Send, ATextThatLooksLikeAnOption) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "--", "--lines"})));
    EXPECT_EQ(received(), "--lines");
}

TEST_F(Send, ToANegativeKeyAndAHexadecimalOne) {
    EXPECT_TRUE(succeeded(tavo({"send", "--", "-5", "below"})));
    EXPECT_EQ(received("-5"), "below");
    EXPECT_TRUE(succeeded(tavo({"send", "0x1f", "hexadecimal"})));
    EXPECT_EQ(received("31"), "hexadecimal");
    EXPECT_TRUE(succeeded(tavo({"send", "4294967295", "highest"})));
    EXPECT_EQ(received("-1"), "highest");
}

TEST_F(Send, KeepsItsMessagesForWhoeverComesNext) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "first"})));
    EXPECT_TRUE(succeeded(tavo({"send", "7", "second"})));
    // However many are sent, only one use is left behind.
    EXPECT_EQ(queue()["uses"], 1);
    EXPECT_EQ(received(), "first");
    EXPECT_EQ(received(), "second");
}

TEST_F(Send, LeavesNoUseWhereSomebodyElseIsAttached) {
    Running receiver({"recv", "7", "--follow", "--lines"});
    do {
    } while (listed()["queues"].empty());
    EXPECT_TRUE(succeeded(tavo({"send", "7", "text"})));
    EXPECT_EQ(receiver.read_until("\n"), "text\n");
    EXPECT_EQ(queue()["uses"], 1);
}

TEST_F(Send, AFileAsOneMessage) {
    const std::string bytes("line\n\0\xff line without an end", 26);
    EXPECT_TRUE(succeeded(tavo({"send", "7", "--file", file_with(bytes)})));
    EXPECT_EQ(queue()["pending"], 4 + bytes.size());
    EXPECT_EQ(received(), bytes);
}

TEST_F(Send, StandardInputAsOneMessage) {
    for (const Words& words : {Words{"send", "7", "-"}, Words{"send", "7", "--file", "-"}}) {
        EXPECT_TRUE(succeeded(tavo(words, "one\ntwo\n")));
        EXPECT_EQ(received(), "one\ntwo\n");
    }
}

TEST_F(Send, EachLineAsAMessage) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "-", "--lines"}, "one\n\nthree\nno end")));
    EXPECT_EQ(received("7", {"--json", "--count", "4"}),
              "{\"key\":7,\"size\":3,\"text\":\"one\"}\n{\"key\":7,\"size\":0,\"text\":\"\"}\n"
              "{\"key\":7,\"size\":5,\"text\":\"three\"}\n{\"key\":7,\"size\":6,\"text\":\"no end\"}\n");
    EXPECT_TRUE(succeeded(tavo({"send", "7", "--lines", "--file", file_with("a\nb\n")})));
    EXPECT_EQ(received("7", {"--lines", "--count", "2"}), "a\nb\n");
}

TEST_F(Send, NothingButAnEmptyInputWhenThereAreNoLines) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "-", "--lines"}, "")));
    EXPECT_TRUE(listed()["queues"].empty());
    EXPECT_TRUE(succeeded(tavo({"send", "7", "-"}, "")));
    EXPECT_EQ(queue()["pending"], 4);
}

TEST_F(Send, TheLongestMessage) {
    const std::string longest(kMaxSize, 'x');
    EXPECT_TRUE(succeeded(tavo({"send", "7", "-"}, longest)));
    EXPECT_EQ(received(), longest);
    EXPECT_TRUE(succeeded(tavo({"send", "7", "-", "--lines"}, longest + "\nshort\n")));
    EXPECT_EQ(received(), longest);
    EXPECT_EQ(received(), "short");
}

TEST_F(Send, NoLongerOne) {
    const std::string too_long(kMaxSize + 1, 'x');
    EXPECT_TRUE(failed(tavo({"send", "7", "-"}, too_long), 1,
                       "standard input is too long: a message has at most 409600 bytes: use --lines to send each line "
                       "as a message, or split it"));
    EXPECT_TRUE(failed(tavo({"send", "7", "-f", file_with(too_long)}), 1,
                       "/sdcard/input is too long: a message has at most 409600 bytes: use --lines to send each line "
                       "as a message, or split it"));
    EXPECT_TRUE(listed()["queues"].empty());
}

TEST_F(Send, LinesUpToTheOneThatIsTooLong) {
    EXPECT_TRUE(failed(tavo({"send", "7", "-", "--lines"}, "one\ntwo\n" + std::string(kMaxSize + 1, 'x') + "\n"), 1,
                       "line 3 of standard input is too long: a message has at most 409600 bytes (the first 2 messages "
                       "were sent)"));
    EXPECT_EQ(received("7", {"--lines", "--count", "2"}), "one\ntwo\n");
}

TEST_F(Send, WithoutAnythingToSendIsMisuse) {
    constexpr char kWhat[] =
        "send what? A TEXT, a file (--file FILE) or standard input (-); 'tavo send --help' tells more";
    EXPECT_TRUE(failed(tavo({"send", "7"}), 2, kWhat));
    EXPECT_TRUE(failed(tavo({"send", "7", "text", "--file", "/sdcard/input"}), 2, kWhat));
    EXPECT_TRUE(failed(tavo({"send", "7", "text", "--lines"}), 2, "--lines is for a file or standard input"));
}

TEST_F(Send, AFileThatCannotBeReadIsTold) {
    EXPECT_TRUE(failed(tavo({"send", "7", "-f", "/sdcard/missing"}), 1,
                       "cannot read /sdcard/missing: No such file or directory"));
    EXPECT_TRUE(failed(tavo({"send", "7", "-f", "/sdcard"}), 1, "cannot read /sdcard: Is a directory"));
}

TEST_F(Send, ToAFullQueueGivesUpInTime) {
    const std::string page(4000, 'x');
    std::string lines;
    for (int i = 0; i < 100; ++i) lines += page + "\n";
    const Result result = tavo({"send", "7", "-", "--lines", "--timeout", "0.05"}, lines);
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.err.rfind("tavo: the queue is full, and nobody has made room in time (the first ", 0), 0U)
        << result;
    const size_t sent = std::stoul(result.err.substr(result.err.find("first ") + 6));
    EXPECT_EQ(queue()["pending"], sent * (4 + page.size()));
    EXPECT_TRUE(failed(tavo({"send", "7", page, "-t", "0"}), 1, "the queue is full, and nobody has made room in time"));
}

TEST_F(Send, ToAFullQueueCanBeInterrupted) {
    while (tavo({"send", "7", std::string(4000, 'x'), "--timeout", "0"}).status == 0) {
    }
    const json pending = queue()["pending"];
    for (const int signal : {SIGINT, SIGTERM}) {
        Running sender({"send", "7", "text"});
        while (queue()["uses"] != 2) {
        }
        sender.signal(signal);
        EXPECT_EQ(sender.wait(), 128 + signal);
        EXPECT_EQ(sender.read_rest(), "tavo: stopped after 0 messages\n");
        EXPECT_EQ(queue()["pending"], pending);
        EXPECT_EQ(queue()["uses"], 1);
    }
}

TEST_F(Send, ToAFullQueueGoesOnWhenThereIsRoom) {
    while (tavo({"send", "7", std::string(4000, 'x'), "--timeout", "0"}).status == 0) {
    }
    Running sender({"send", "7", "the last one"});
    while (queue()["uses"] != 2) {
    }
    std::string all = received("7", {"--follow"});
    EXPECT_EQ(sender.wait(), 0);
    all += received("7", {"--follow"});
    EXPECT_EQ(all.find_first_not_of('x'), all.size() - 12);
    EXPECT_EQ(all.substr(all.size() - 12), "the last one");
}

TEST_F(Send, ShowsItsProgressOnATerminalOnly) {
    OnTerminal sender({"send", "7", "-", "--lines"});
    sender.write("one\n");
    sender.read_until("1 messages sent");
    sender.write("\x04");
    sender.read_until("\r\033[K");
    EXPECT_EQ(sender.wait(), 0);
}

}  // namespace
