// tavo ping.
#include <signal.h>

#include <nlohmann/json.hpp>
#include <regex>

#include "tools/program.h"

namespace {

using nlohmann::json;
using tavo::test::failed;
using tavo::test::Result;
using tavo::test::Running;
using tavo::test::ServedTest;
using tavo::test::tavo;

using Ping = ServedTest;

TEST_F(Ping, TellsEachRoundTripAndTheSum) {
    const Result result = tavo({"ping", "--count", "3", "--interval", "0"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.err, "");
    EXPECT_TRUE(std::regex_match(
        result.out, std::regex("answer 1 after [0-9.]+ ms\nanswer 2 after [0-9.]+ ms\nanswer 3 after [0-9.]+ ms\n"
                               "3 sent, 3 answered, min/avg/max [0-9.]+/[0-9.]+/[0-9.]+ ms\n")))
        << result;
}

TEST_F(Ping, TellsProgramsTheSum) {
    const json sum = json::parse(tavo({"ping", "-c", "4", "-i", "0", "--json"}).out);
    EXPECT_EQ(sum["sent"], 4);
    EXPECT_EQ(sum["answered"], 4);
    EXPECT_GT(sum["min_ms"], 0);
    EXPECT_LE(sum["min_ms"], sum["avg_ms"]);
    EXPECT_LE(sum["avg_ms"], sum["max_ms"]);
}

TEST_F(Ping, GoesOnUntilASignalEndsIt) {
    Running ping({"ping", "--interval", "0.001"});
    ping.read_until("answer 3 ");
    ping.signal(SIGINT);
    EXPECT_EQ(ping.wait(), 0);
    EXPECT_NE(ping.read_rest().find(" answered, min/avg/max "), std::string::npos);
}

TEST_F(Ping, ASignalEndsTheWaitBetweenTwo) {
    Running ping({"ping", "--interval", "3600"});
    ping.read_until("answer 1 ");
    ping.signal(SIGTERM);
    EXPECT_EQ(ping.wait(), 0);
}

TEST_F(Ping, OfAServiceThatEndsFails) {
    Running ping({"ping", "--interval", "0.001"});
    ping.read_until("answer 1 ");
    stop_serving();
    const std::string rest = ping.read_rest();  // before the wait: it may have filled its pipe
    EXPECT_EQ(ping.wait(), 1);
    EXPECT_NE(rest.find("tavo: the service has gone: 'tavo serve' starts one\n"), std::string::npos) << rest;
    EXPECT_NE(rest.find(" answered"), std::string::npos) << rest;
}

TEST_F(Ping, OfAServiceThatIsStoppedTimesOut) {
    Running ping({"ping", "--interval", "0.001", "--timeout", "0.2"});
    ping.read_until("answer 1 ");
    server().signal(SIGSTOP);
    const std::string rest = ping.read_rest();
    EXPECT_EQ(ping.wait(), 1);
    EXPECT_NE(rest.find("the service does not answer: it may be stopped, or hang"), std::string::npos) << rest;
    server().signal(SIGCONT);
}

}  // namespace
