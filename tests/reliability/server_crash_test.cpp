// Servers that are killed under their clients.
#include <signal.h>
#include <sys/syscall.h>

#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "ipc/descriptors.h"
#include "reliability/crash_point.h"
#include "reliability/service_uses.h"

namespace {

using tavo::test::comes_back_to;
using tavo::test::count_memory_files;
using tavo::test::Holdings;
using tavo::test::kDone;
using tavo::test::kFailure;
using tavo::test::kNoQueue;
using tavo::test::kUnavailable;
using tavo::test::Peer;

class ServerCrash : public tavo::test::MsgQueueTest {};

TEST_F(ServerCrash, UnderItsClientsLeavesThemTheirQueuesAndBlocks) {
    Peer server("serve");
    Peer sender("attach 7");
    Peer receiver("attach 7");
    EXPECT_EQ(sender.ask("acquire 8 100"), kDone);
    EXPECT_EQ(receiver.ask("acquire 8 100"), kDone);
    EXPECT_EQ(sender.ask("put 7 1000"), kDone);
    server.kill();

    EXPECT_EQ(receiver.ask("get 7"), "1000 whole");
    EXPECT_EQ(sender.ask("put 7 2000"), kDone);
    EXPECT_EQ(receiver.ask("get 7"), "2000 whole");
    EXPECT_EQ(sender.ask("set 8 65"), kDone);
    EXPECT_EQ(receiver.ask("see 8"), "65");
    // What takes the service waits for one, and then says so.
    EXPECT_EQ(sender.ask("attach 9"), kUnavailable);
    EXPECT_EQ(sender.ask("acquire 9 100"), kFailure);
    EXPECT_EQ(sender.ask("delete 8 100"), kFailure);
    EXPECT_EQ(sender.ask("destroy 7"), kFailure);
    EXPECT_EQ(sender.ask("put 7 3000"), kDone);  // the handle is still good
    EXPECT_EQ(receiver.ask("get 7"), "3000 whole");
    EXPECT_EQ(sender.ask("release 8"), kDone);

    Peer next("serve");
    EXPECT_EQ(sender.ask("put 7 4000"), kDone);  // old handles go on
    EXPECT_EQ(receiver.ask("get 7"), "4000 whole");
    EXPECT_EQ(receiver.ask("see 8"), "65");
    EXPECT_EQ(sender.ask("acquire 8 100"), kDone);  // new ones are new
    EXPECT_EQ(sender.ask("see 8"), "0");
    EXPECT_EQ(sender.ask("destroy 7"), kDone);
    EXPECT_EQ(receiver.ask("destroy 7"), kDone);
    EXPECT_EQ(sender.ask("attach 7"), kDone);
    EXPECT_EQ(receiver.ask("attach 7"), kDone);
    EXPECT_EQ(sender.ask("put 7 5000"), kDone);
    EXPECT_EQ(receiver.ask("get 7"), "5000 whole");
}

// The new service counts what it is told, not by whom: an old handle's destroy drops a use of the new queue.
TEST_F(ServerCrash, LeavesHandlesWhoseDestroyCountsAtTheNextServer) {
    Peer server("serve");
    Peer old("attach 7");
    server.kill();
    Peer next("serve");
    Peer young("attach 7");
    EXPECT_EQ(old.ask("destroy 7"), kDone);
    EXPECT_EQ(tavo::test::take_queue_uses(7), 0);
    EXPECT_EQ(young.ask("put 7 1000"), kDone);  // whoever has it keeps it
    EXPECT_EQ(young.ask("get 7"), "1000 whole");
    EXPECT_EQ(young.ask("destroy 7"), kDone);
}

struct MidCall {
    const char* name;
    const char* point;
    const char* command;
    const char* status;
};
class ServerCrashMidCall : public ServerCrash, public testing::WithParamInterface<MidCall> {};

TEST_P(ServerCrashMidCall, EndsTheCallWithItsStatus) {
    Peer server("serve");
    Peer client("attach 7");
    EXPECT_EQ(client.ask("acquire 7 100"), kDone);
    Peer fresh;
    server.stop(GetParam().point, "");
    const bool needs_handle = std::string(GetParam().command).find(" 7") != std::string::npos;
    Peer& caller = needs_handle ? client : fresh;
    caller.tell(GetParam().command);
    ASSERT_TRUE(tavo::test::has_stopped(server.pid()));
    server.kill();
    EXPECT_EQ(caller.answer(), GetParam().status);
    Peer next("serve");
    EXPECT_EQ(caller.ask("attach 9"), kDone);
    EXPECT_EQ(caller.ask("put 9 1000"), kDone);
    EXPECT_EQ(caller.ask("get 9"), "1000 whole");
    EXPECT_EQ(caller.ask("acquire 9 100"), kDone);
}

INSTANTIATE_TEST_SUITE_P(In, ServerCrashMidCall,
                         testing::Values(MidCall{"Create", "libtavoosal.so pipe2 before 1", "attach 8", kNoQueue},
                                         MidCall{"CreateDone", "libtavoosal.so pipe2 after 1", "attach 8", kNoQueue},
                                         MidCall{"ReadEnd", "libbinder.so passing before 1", "attach 8", kNoQueue},
                                         MidCall{"WriteEnd", "libbinder.so passing before 2", "attach 8", kNoQueue},
                                         MidCall{"Block", "libbinder.so memfd_create before 1", "acquire 8 100",
                                                 kFailure},
                                         MidCall{"BlockMade", "libbinder.so mmap after 1", "acquire 8 100", kFailure},
                                         MidCall{"Mapping", "libbinder.so passing before 1", "acquire 8 100", kFailure},
                                         MidCall{"Destroy", "libbinder.so sendmsg before 3", "destroy 7", kDone},
                                         MidCall{"Delete", "libbinder.so sendmsg before 3", "delete 7 100", kDone}),
                         [](const auto& test) { return test.param.name; });

TEST_F(ServerCrash, UnderManyCallersTellsEachOfThem) {
    Peer server("serve");
    std::vector<Peer> clients(8);
    for (size_t i = 0; i < clients.size(); ++i) clients[i].tell("hammer " + std::to_string(i + 1));
    // A call in the middle of the crowd is the last.
    Peer caller("attach 20");
    server.stop("libbinder.so passing before 50", "");
    ASSERT_TRUE(tavo::test::has_stopped(server.pid()));
    server.kill();
    const std::set<std::string> documented = {kDone, kUnavailable, kNoQueue, kFailure};
    for (Peer& client : clients) {
        std::istringstream statuses(client.answer());
        size_t failures = 0;
        for (std::string status; statuses >> status;) {
            EXPECT_EQ(documented.count(status), 1U) << status;
            failures += status != kDone ? 1 : 0;
        }
        EXPECT_GE(failures, 1U);
    }
    Peer next("serve");
    for (Peer& client : clients) {
        EXPECT_EQ(client.ask("attach 30"), kDone);
        EXPECT_EQ(client.ask("acquire 30 100"), kDone);
    }
}

TEST_F(ServerCrash, AgainAndAgainLeavesNothingInItsClients) {
    Peer client;
    const auto live_and_die = [&client] {
        Peer server("serve");
        for (const char* command : {"attach 7", "put 7 1000", "acquire 7 100", "release 7", "destroy 7"}) {
            EXPECT_EQ(client.ask(command), kDone) << command;
        }
        EXPECT_EQ(client.ask("acquire 7 100"), kDone);
        server.kill();
        EXPECT_EQ(client.ask("release 7"), kDone);
    };
    live_and_die();
    live_and_die();
    const Holdings before(client.pid());
    for (int i = 0; i < 10; ++i) live_and_die();
    EXPECT_TRUE(comes_back_to(before, client.pid()));
    EXPECT_EQ(count_memory_files(client.pid()), 0U);
}

}  // namespace
