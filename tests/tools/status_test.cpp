// tavo status.
#include "tavo_osal/status.h"

#include <cstdio>
#include <fstream>
#include <nlohmann/json.hpp>
#include <regex>

#include "tools/program.h"

namespace {

using nlohmann::json;
using tavo::test::failed;
using tavo::test::Result;
using tavo::test::succeeded;
using tavo::test::tavo;
using tavo::test::ToolTest;

using Status = ToolTest;

TEST_F(Status, KnowsACodeByEveryNameItHas) {
    constexpr char kLine[] = "0x9305 37637  TAVO_MQ_MSG_TOO_LARGE       the message is larger than a queue carries\n";
    for (const char* name : {"0x9305", "0X9305", "9305", "37637", "TAVO_MQ_MSG_TOO_LARGE", "tavo_mq_msg_too_large",
                             "MQ_MSG_TOO_LARGE", "mq_msg_too_large"}) {
        EXPECT_TRUE(succeeded(tavo({"status", name}), kLine)) << name;
    }
    EXPECT_TRUE(
        succeeded(tavo({"status", "0"}), "     0     0  TAVO_SUCCESS                the operation succeeded\n"));
}

TEST_F(Status, KnowsTheResultsThatAreNoCodes) {
    EXPECT_EQ(tavo({"status", "1"}).out.rfind("     1     1  1 ", 0), 0U);
    for (const char* number : {"-1", "-19", "-22"}) {
        const Result result = tavo({"status", "--", number});
        EXPECT_EQ(result.status, 0) << result;
        EXPECT_NE(result.out.find(number), std::string::npos) << result;
    }
}

TEST_F(Status, TellsProgramsOne) {
    EXPECT_EQ(json::parse(tavo({"status", "0x9101", "--json"}).out),
              (json{{"value", 0x9101}, {"name", "TAVO_TIMEOUT"}, {"meaning", "an event wait expired"}}));
}

TEST_F(Status, UnknownCodesAreTold) {
    for (const char* code : {"0x9304", "0x9400", "nonsense", "2", "0x", "-3", "TAVO_", "99999999999999999999"}) {
        EXPECT_TRUE(failed(tavo({"status", "--", code}), 1,
                           std::string("no status code is called ") + code + ": 'tavo status' lists them all"));
    }
}

// Every code of the public header, with its number and its text.
TEST_F(Status, ListsWhatTheHeaderHas) {
    json expected = json::array();
    std::ifstream header(TAVO_STATUS_HEADER);
    const std::regex code("^    (TAVO_[A-Z_]+) = (0x[0-9a-fA-F]+|0),? +/\\*\\*< (.*) \\*/$");
    for (std::string line; std::getline(header, line);) {
        std::smatch match;
        if (!std::regex_match(line, match, code)) continue;
        expected.push_back(
            {{"name", match[1].str()}, {"value", std::stoi(match[2].str(), nullptr, 0)}, {"meaning", match[3].str()}});
    }
    EXPECT_EQ(expected.size(), 27U);
    EXPECT_EQ(json::parse(tavo({"status", "--json"}).out), expected);

    const Result text = tavo({"status"});
    EXPECT_EQ(text.status, 0);
    for (const json& entry : expected) {
        EXPECT_NE(text.out.find("  " + entry["name"].get<std::string>() + " "), std::string::npos);
    }
}

}  // namespace
