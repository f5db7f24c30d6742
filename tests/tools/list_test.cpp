// tavo list.
#include <nlohmann/json.hpp>
#include <regex>

#include "tools/program.h"

namespace {

using nlohmann::json;
using tavo::test::Result;
using tavo::test::ServedTest;
using tavo::test::succeeded;
using tavo::test::tavo;

class List : public ServedTest {
protected:
    std::string first_line() { return "service android.tavo.osal, process " + std::to_string(server().pid()) + "\n"; }
};

TEST_F(List, OfAnEmptyServiceSaysSo) {
    EXPECT_TRUE(succeeded(tavo({"list"}), first_line() + "no queues\nno shared-memory blocks\n"));
}

TEST_F(List, ShowsQueuesAndBlocks) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "hello"})));
    EXPECT_TRUE(succeeded(tavo({"send", "--", "-5", ""})));
    EXPECT_TRUE(succeeded(tavo({"shm", "create", "9", "5000"})));
    const Result result = tavo({"list"});
    EXPECT_EQ(result.status, 0);
    EXPECT_TRUE(std::regex_match(result.out,
                                 std::regex(first_line() + "       QUEUE     USES    PENDING   CAPACITY  DESCRIPTORS\n"
                                                           "           7        1          9 +[0-9]+ +[0-9]+,[0-9]+\n"
                                                           "          -5        1          4 +[0-9]+ +[0-9]+,[0-9]+\n"
                                                           "       BLOCK     USES       SIZE REFERENCES\n"
                                                           "           9        1       5000 +[0-9]+\n")))
        << result;
}

TEST_F(List, GivesProgramsTheServicesOwnFigures) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "hello"})));
    EXPECT_TRUE(succeeded(tavo({"shm", "create", "9", "5000"})));
    const Result result = tavo({"list", "--json"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out.find('\n'), result.out.size() - 1);
    const json figures = json::parse(result.out);
    EXPECT_EQ(figures["service"], "android.tavo.osal");
    EXPECT_EQ(figures["process"], server().pid());
    EXPECT_EQ(figures["queues"][0]["key"], 7);
    EXPECT_EQ(figures["queues"][0]["pending"], 9);
    EXPECT_GT(figures["queues"][0]["capacity"], 9);
    EXPECT_EQ(figures["blocks"][0]["key"], 9);
    EXPECT_EQ(figures["blocks"][0]["size"], 5000);
    EXPECT_GE(figures["blocks"][0]["references"], 2);
    EXPECT_EQ(figures["totals"]["pending"], 9);
}

}  // namespace
