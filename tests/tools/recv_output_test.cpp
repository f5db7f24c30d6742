// tavo recv: what becomes of messages that cannot be written.
#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <fstream>
#include <nlohmann/json.hpp>

#include "tools/program.h"

namespace {

using nlohmann::json;
using tavo::test::failed;
using tavo::test::listed;
using tavo::test::Running;
using tavo::test::ServedTest;
using tavo::test::succeeded;
using tavo::test::tavo;
using tavo::test::tavo_with_output_to;

class RecvOutput : public ServedTest {
protected:
    static void send(const std::string& text) { EXPECT_TRUE(succeeded(tavo({"send", "7", "-"}, text))); }
    static json queue() { return listed()["queues"].at(0); }
};

TEST_F(RecvOutput, OnAFullDiskTheMessageIsPutBack) {
    send("one");
    send("two");
    EXPECT_TRUE(failed(tavo_with_output_to("/dev/full", {"recv", "7"}), 1,
                       "standard output cannot be written to (No space left on device): the message was put back, "
                       "behind all others that wait"));
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "--count", "2", "--lines"}), "two\none\n"));
}

TEST_F(RecvOutput, IntoAClosedPipeNoMessageIsTaken) {
    Running receiver({"recv", "7", "--follow"});
    send("one");
    receiver.read_until("one");
    close(receiver.out);
    receiver.out = -1;
    // It notices without being sent anything.
    EXPECT_EQ(receiver.wait(), 1);
    send("two");
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "--timeout", "0"}), "two"));
}

TEST_F(RecvOutput, IntoAPipeThatIsFullNoMessageIsTaken) {
    send(std::string(300000, 'x'));  // more than a pipe holds
    Running receiver({"recv", "7", "--follow"}, {}, "/sdcard/said");
    receiver.read_until("x");
    send("waits");
    EXPECT_EQ(queue()["pending"], 4 + 5);
    // Interrupted inside the long message, the receiver puts that one back.
    receiver.signal(SIGINT);
    EXPECT_EQ(receiver.wait(), 1);
    std::string said;
    std::getline(std::ifstream("/sdcard/said"), said);
    EXPECT_EQ(said,
              "tavo: standard output cannot be written to (Interrupted system call): the message was put back, behind "
              "all others that wait");
    EXPECT_EQ(queue()["pending"], 4 + 5 + 4 + 300000);
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "--timeout", "0"}), "waits"));
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "--timeout", "0"}), std::string(300000, 'x')));
}

TEST_F(RecvOutput, ThatIsClosedFromTheStartIsTold) {
    send("one");
    // A shell is the plain way to start a program without a standard output.
    const std::string command = std::string(TAVO_PROGRAM) + " recv 7 >&- 2>/sdcard/said";
    const int status = system(command.c_str());  // NOLINT: the test's own text
    EXPECT_EQ(WEXITSTATUS(status), 1);
    char said[256] = {};
    const int file = open("/sdcard/said", O_RDONLY | O_CLOEXEC);
    ASSERT_GT(read(file, said, sizeof said - 1), 0);
    close(file);
    EXPECT_STREQ(said, "tavo: standard output is closed: no message was taken for it\n");
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "--timeout", "0"}), "one"));
}

TEST_F(RecvOutput, ThatOnlyTakesAPartPutsTheWholeBack) {
    send(std::string(5000, 'y'));
    // A file size limit lets a part of the message through.
    const std::string command =
        "ulimit -f 2; trap '' XFSZ; exec " + std::string(TAVO_PROGRAM) + " recv 7 >/sdcard/part 2>/sdcard/said";
    const int status = system(command.c_str());  // NOLINT: the test's own text
    EXPECT_EQ(WEXITSTATUS(status), 1);
    EXPECT_TRUE(succeeded(tavo({"recv", "7", "--timeout", "0"}), std::string(5000, 'y')));
}

}  // namespace
