// tavo drop.
#include <signal.h>

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

class Drop : public ServedTest {
protected:
    static json queues() { return listed()["queues"]; }
};

TEST_F(Drop, GivesBackTheUseThatASenderLeft) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "text"})));
    EXPECT_TRUE(succeeded(tavo({"recv", "7"}), "text"));
    EXPECT_EQ(queues().size(), 1U);
    EXPECT_TRUE(succeeded(tavo({"drop", "7"})));
    EXPECT_TRUE(queues().empty());
}

TEST_F(Drop, OfAnUnknownQueueIsTold) {
    EXPECT_TRUE(failed(tavo({"drop", "7"}), 1, "the service has no queue 7: 'tavo list' shows what it has"));
}

TEST_F(Drop, SparesMessagesUnlessForced) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "text"})));
    EXPECT_TRUE(failed(tavo({"drop", "7"}), 1,
                       "8 bytes wait in queue 7 and would be lost: receive them first, or use --force"));
    EXPECT_TRUE(succeeded(tavo({"drop", "7", "--force"})));
    EXPECT_TRUE(queues().empty());
}

TEST_F(Drop, SparesUsersUnlessForced) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "text"})));
    Running receiver({"recv", "7", "--follow"});
    receiver.read_until("text");
    EXPECT_TRUE(failed(tavo({"drop", "7"}), 1,
                       "queue 7 has 2 uses, so others are attached to it: end them first, or use --force to count one "
                       "less"));
    EXPECT_TRUE(succeeded(tavo({"drop", "7", "--force"})));
    EXPECT_EQ(queues()[0]["uses"], 1);
}

}  // namespace
