// tavo top, on a terminal and elsewhere.
#include <signal.h>

#include <nlohmann/json.hpp>
#include <sstream>

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

constexpr char kOtherScreen[] = "\033[?1049h\033[?25l";
constexpr char kOwnScreen[] = "\033[?25h\033[?1049l";

class Top : public ServedTest {
protected:
    static void fill(size_t bytes) { EXPECT_TRUE(succeeded(tavo({"send", "7", "-"}, std::string(bytes, 'x')))); }
    static size_t count(const std::string& text, const std::string& piece) {
        size_t found = 0;
        for (size_t at = text.find(piece); at != std::string::npos; at = text.find(piece, at + 1)) ++found;
        return found;
    }
};

TEST_F(Top, ElsewhereIsOneSnapshot) {
    fill(96);
    EXPECT_TRUE(succeeded(tavo({"shm", "create", "9", "3M"})));
    const Result result = tavo({"top"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out.find('\033'), std::string::npos);
    EXPECT_EQ(result.out.rfind("service android.tavo.osal, process " + std::to_string(server().pid()) + "\n", 0), 0U);
    EXPECT_NE(result.out.find("       QUEUE     USES    PENDING   CAPACITY   CHANGE/S  FULL\n"), std::string::npos);
    EXPECT_NE(result.out.find("           7        1        100 "), std::string::npos) << result;
    EXPECT_NE(result.out.find("          -  [#...................]   0%\n"), std::string::npos) << result;
    EXPECT_NE(result.out.find("           9        1         3M          "), std::string::npos) << result;
}

TEST_F(Top, ShowsHowFullAPipeIs) {
    const json empty = json::parse(tavo({"top", "--json"}).out);
    EXPECT_TRUE(empty["queues"].empty());
    fill(4092);
    const size_t capacity = listed()["queues"][0]["capacity"];
    while (listed()["queues"][0]["pending"] < capacity) {
        ASSERT_EQ(tavo({"send", "7", std::string(4092, 'x'), "--timeout", "0"}).status, 0);
    }
    EXPECT_NE(tavo({"top"}).out.find("[####################] 100%\n"), std::string::npos);
    EXPECT_NE(tavo({"top", "--color=always"}).out.find("[\033[31m####################\033[0m] 100%\n"),
              std::string::npos);
    for (size_t half = 0; half < capacity / 8192; ++half) tavo({"recv", "7"});
    EXPECT_NE(tavo({"top", "--color=always"}).out.find("[\033[33m##########\033[0m..........]  50%\n"),
              std::string::npos);
}

TEST_F(Top, ElsewhereTakesAsManySnapshotsAsAskedFor) {
    fill(96);
    const Result result = tavo({"top", "--count", "3", "--interval", "0.1"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(count(result.out, "service android.tavo.osal"), 3U);
    EXPECT_EQ(count(result.out, "          0  [#"), 2U) << result;
}

TEST_F(Top, ShowsTheRateOfChange) {
    fill(96);
    Running top({"top", "--count", "2", "--interval", "2", "--json"});
    const json first = json::parse(top.read_until("\n"));
    EXPECT_TRUE(first["queues"][0]["change"].is_null());
    fill(10000);
    const json second = json::parse(top.read_until("\n"));
    EXPECT_EQ(second["queues"][0]["pending"], 100 + 10004);
    EXPECT_GT(second["queues"][0]["change"], 0);
    EXPECT_LE(second["queues"][0]["change"], 10004 / 2.0 + 1);
    EXPECT_EQ(top.wait(), 0);
}

TEST_F(Top, ElsewhereIsEndedByASignal) {
    Running top({"top", "--count", "1000", "--interval", "3600"});
    top.read_until("no shared-memory blocks\n");
    top.signal(SIGINT);
    EXPECT_EQ(top.wait(), 0);
}

TEST_F(Top, AnIntervalThatWouldKeepTheServiceBusyIsMisuse) {
    for (const char* interval : {"0", "-1", "0.01", "nan"}) {
        EXPECT_TRUE(failed(tavo({"top", "--interval", interval}), 2, "--interval must be 0.1 seconds or more"));
    }
}

TEST_F(Top, OnATerminalAKeyEndsItAndLeavesTheTerminalAsItWas) {
    for (const char* key : {"q", "Q", "\x03"}) {
        OnTerminal top({"top"});
        top.read_until(kOtherScreen);
        EXPECT_TRUE(top.gets_keys());
        top.read_until("no shared-memory blocks");
        top.write("x");  // means nothing
        top.write(key);
        top.read_until(kOwnScreen);
        EXPECT_EQ(top.wait(), 0);
        EXPECT_FALSE(top.gets_keys());
    }
}

TEST_F(Top, OnATerminalASignalEndsItAndLeavesTheTerminalAsItWas) {
    for (const int signal : {SIGINT, SIGTERM, SIGHUP}) {
        OnTerminal top({"top", "--interval", "3600"});
        top.read_until("no shared-memory blocks");
        top.signal(signal);
        top.read_until(kOwnScreen);
        EXPECT_EQ(top.wait(), 0) << signal;
        EXPECT_FALSE(top.gets_keys());
    }
}

TEST_F(Top, OnATerminalItGoesOn) {
    OnTerminal top({"top", "--interval", "0.1"});
    top.read_until("no queues");
    fill(96);
    top.read_until("           7        1        100 ");
    EXPECT_TRUE(succeeded(tavo({"recv", "7"}), std::string(96, 'x')));
    top.read_until("           7        1          0 ");
    top.write("q");
    EXPECT_EQ(top.wait(), 0);
}

TEST_F(Top, OnATerminalItEndsAfterAsManyLooksAsAskedFor) {
    OnTerminal top({"top", "--interval", "0.1", "--count", "2"});
    top.read_until(kOwnScreen);
    EXPECT_EQ(top.wait(), 0);
}

TEST_F(Top, OnATerminalItTakesNoMoreRoomThanThereIs) {
    for (int key = 1; key <= 10; ++key) EXPECT_TRUE(succeeded(tavo({"send", std::to_string(key), "x"})));
    OnTerminal top({"top", "--interval", "3600"}, {{"NO_COLOR", "1"}}, 5, 20);
    const std::string small = top.read_until("\033[J");
    EXPECT_EQ(count(small, "\r\n"), 4U) << small;
    EXPECT_NE(small.find("service android.tavo\033[K"), std::string::npos) << testing::PrintToString(small);

    top.resize(8, 30);
    const std::string larger = top.read_until("\033[J");
    EXPECT_EQ(count(larger, "\r\n"), 7U) << larger;
    EXPECT_NE(larger.find("service android.tavo.osal, pro\033[K"), std::string::npos) << testing::PrintToString(larger);
    top.write("q");
    EXPECT_EQ(top.wait(), 0);
}

TEST_F(Top, OnATerminalASuspensionGivesTheTerminalBackMeanwhile) {
    OnTerminal top({"top", "--interval", "3600"});
    top.read_until("no shared-memory blocks");
    // A terminal's own request is not heeded by a process group without a shell, so it is sent.
    top.signal(SIGTSTP);
    top.read_until(kOwnScreen);
    while (!top.is_suspended()) {
    }
    EXPECT_FALSE(top.gets_keys());
    top.signal(SIGCONT);
    top.read_until(kOtherScreen);
    top.read_until("no shared-memory blocks");
    EXPECT_TRUE(top.gets_keys());
    top.write("q");
    EXPECT_EQ(top.wait(), 0);
}

TEST_F(Top, OnATerminalItWaitsForTheServiceToComeBack) {
    OnTerminal top({"top", "--interval", "0.1"}, {}, 24, 200);
    top.read_until("no shared-memory blocks");
    stop_serving();
    top.read_until("no service answers, although one has been here");
    serve();
    top.read_until("process " + std::to_string(server().pid()));
    top.write("q");
    EXPECT_EQ(top.wait(), 0);
}

}  // namespace
