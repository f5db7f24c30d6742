// Clients that are killed while the server serves them.
#include <signal.h>

#include <string>

#include "reliability/crash_point.h"
#include "reliability/service_uses.h"

namespace {

using tavo::test::comes_back_to;
using tavo::test::Holdings;
using tavo::test::kDone;
using tavo::test::Peer;
using tavo::test::take_block_uses;
using tavo::test::take_queue_uses;

class ServedCrash : public tavo::test::CrashTest {};

struct Served {
    const char* name;
    const char* point;
    const char* command;
    int queue_uses;
    int block_uses;
};
class ServedClientCrash : public ServedCrash, public testing::WithParamInterface<Served> {};

TEST_P(ServedClientCrash, LeavesItsUseAndNothingElse) {
    expect_service();
    const Holdings before(server_.pid());
    Peer client;
    server_.stop(GetParam().point, "");
    client.tell(GetParam().command);
    ASSERT_TRUE(tavo::test::has_stopped(server_.pid()));
    client.kill();
    server_.go_on();
    expect_service();
    EXPECT_EQ(take_queue_uses(7), GetParam().queue_uses);
    EXPECT_EQ(take_block_uses(7), GetParam().block_uses);
    EXPECT_TRUE(comes_back_to(before, server_.pid()));
}

INSTANTIATE_TEST_SUITE_P(In, ServedClientCrash,
                         testing::Values(Served{"Create", "libtavoosal.so pipe2 before 1", "attach 7", 1, 0},
                                         Served{"ReadEnd", "libbinder.so passing before 1", "attach 7", 1, 0},
                                         Served{"WriteEnd", "libbinder.so passing before 2", "attach 7", 1, 0},
                                         Served{"WriteEndSent", "libbinder.so passing after 2", "attach 7", 1, 0},
                                         Served{"Block", "libbinder.so memfd_create before 1", "acquire 7 100", 0, 1},
                                         Served{"Mapping", "libbinder.so passing before 1", "acquire 7 100", 0, 1}),
                         [](const auto& test) { return test.param.name; });

TEST_F(ServedCrash, ManyClientsLeaveNothingBehindTheirUses) {
    const auto live_and_die = [] {
        Peer client("attach 7");
        EXPECT_EQ(client.ask("acquire 7 100000"), kDone);
        client.kill();
    };
    live_and_die();
    EXPECT_EQ(take_queue_uses(7), 1);
    EXPECT_EQ(take_block_uses(7), 1);
    const Holdings before(server_.pid());
    for (int i = 0; i < 20; ++i) live_and_die();
    EXPECT_EQ(take_queue_uses(7), 20);
    EXPECT_EQ(take_block_uses(7), 20);
    EXPECT_TRUE(comes_back_to(before, server_.pid()));
    expect_service();
}

}  // namespace
