// Servers that are killed while they start, or replaced.
#include <dirent.h>
#include <signal.h>

#include <algorithm>
#include <string>
#include <vector>

#include "ipc/descriptors.h"
#include "reliability/crash_point.h"
#include "reliability/service_uses.h"

namespace {

using tavo::test::attach;
using tavo::test::attached;
using tavo::test::count_pipe_ends;
using tavo::test::drop;
using tavo::test::file_of;
using tavo::test::kDone;
using tavo::test::kUnavailable;
using tavo::test::kUntouched;
using tavo::test::Peer;
using tavo::test::queue_of;

// What is in the runtime directory, hidden entries as well.
std::vector<std::string> runtime_entries() {
    std::vector<std::string> names;
    DIR* directory = opendir("/run/binder");
    if (directory == nullptr) return names;
    while (const dirent* entry = readdir(directory)) {
        const std::string name = entry->d_name;
        if (name != "." && name != "..") names.push_back(name);
    }
    closedir(directory);
    return names;
}

class StartCrash : public tavo::test::MsgQueueTest {
protected:
    // A server that comes next serves everybody, and nothing of the dead one is left in its way.
    static void expect_next_server() {
        Peer next("serve");
        Peer client("attach 7");
        EXPECT_EQ(client.ask("put 7 1000"), kDone);
        EXPECT_EQ(client.ask("get 7"), "1000 whole");
        EXPECT_EQ(client.ask("acquire 7 100"), kDone);
        EXPECT_EQ(runtime_entries(), std::vector<std::string>{"android.tavo.osal"});
    }
};

class StartCrashUnmarked : public StartCrash, public testing::WithParamInterface<const char*> {};

TEST_P(StartCrashUnmarked, InFrontOfTheMarkerLeavesNoServiceToWaitFor) {
    Peer server;
    server.crash(GetParam(), "serve");
    TAVO_INT64 handle = kUntouched;
    EXPECT_EQ(attach("7", &handle), 1);
    EXPECT_EQ(handle, kUntouched);
    expect_next_server();
}

INSTANTIATE_TEST_SUITE_P(At, StartCrashUnmarked,
                         testing::Values("libtavoosal.so mkdir before 1", "libtavoosal.so mkdir after 1",
                                         "libtavoosal.so open before 1"),
                         [](const auto& test) { return tavo::test::words(test.param); });

class StartCrashUnnamed : public StartCrash, public testing::WithParamInterface<const char*> {};

TEST_P(StartCrashUnnamed, BetweenMarkerAndNameLeavesAServiceThatIsWaitedForInVain) {
    Peer server;
    server.crash(GetParam(), "serve");
    Peer client;
    EXPECT_EQ(client.ask("attach 7"), kUnavailable);
    expect_next_server();
}

INSTANTIATE_TEST_SUITE_P(At, StartCrashUnnamed,
                         testing::Values("libtavoosal.so chmod before 1", "libtavoosal.so fopen before 1",
                                         "libtavoosal.so fopen after 1", "libbinder.so bind after 1",
                                         "libbinder.so listen after 1", "libbinder.so renameat before 1"),
                         [](const auto& test) { return tavo::test::words(test.param); });

TEST_F(StartCrash, BehindTheNameLeavesClientsThatFindTheNextServer) {
    Peer server;
    server.stop("libbinder.so renameat after 1", "serve");
    Peer client;
    client.tell("attach 7");
    server.kill();
    Peer next("serve");
    EXPECT_EQ(client.answer(), kDone);
    EXPECT_EQ(client.ask("put 7 1000"), kDone);
    EXPECT_EQ(client.ask("get 7"), "1000 whole");
    EXPECT_EQ(runtime_entries(), std::vector<std::string>{"android.tavo.osal"});
}

TEST_F(StartCrash, OneOfTwoThatRaceServesAndOutlivesTheOther) {
    std::vector<Peer> servers(2);
    for (Peer& server : servers) server.stop("libbinder.so renameat before 1", "serve");
    for (Peer& server : servers) server.go_on();
    for (Peer& server : servers) EXPECT_EQ(server.answer(), kDone);
    EXPECT_EQ(runtime_entries(), std::vector<std::string>{"android.tavo.osal"});

    const TAVO_INT64 handle = attached("7");
    const ino_t pipe = file_of(queue_of(handle).iReadFd);
    const bool first_serves = count_pipe_ends(pipe, servers[0].pid()) > 0;
    Peer& winner = servers[first_serves ? 0 : 1];
    Peer& loser = servers[first_serves ? 1 : 0];
    EXPECT_EQ(count_pipe_ends(pipe, winner.pid()), 2U);
    EXPECT_EQ(count_pipe_ends(pipe, loser.pid()), 0U);
    loser.kill();
    Peer client("attach 7");
    EXPECT_EQ(count_pipe_ends(pipe, client.pid()), 2U);

    // The loser could not take over if it lived: the name went with the winner.
    winner.kill();
    TAVO_INT64 late = kUntouched;
    EXPECT_EQ(attach("7", &late), 1);
    drop(handle);
    expect_next_server();
}

TEST_F(StartCrash, AReplacedServerKeepsWhatItGave) {
    Peer first("serve");
    Peer sender("attach 7");
    Peer receiver("attach 7");
    EXPECT_EQ(receiver.ask("acquire 7 100"), kDone);
    Peer second("serve");
    EXPECT_EQ(sender.ask("put 7 1000"), kDone);
    EXPECT_EQ(receiver.ask("get 7"), "1000 whole");
    EXPECT_EQ(receiver.ask("set 7 65"), kDone);
    // What is asked for anew comes from the second, and shares nothing with the first's.
    Peer other("acquire 7 100");
    EXPECT_EQ(other.ask("see 7"), "0");
    first.kill();
    EXPECT_EQ(receiver.ask("see 7"), "65");
    EXPECT_EQ(sender.ask("put 7 2000"), kDone);
    EXPECT_EQ(receiver.ask("get 7"), "2000 whole");
    // Destroying goes to whoever serves now, who does not know the queue.
    EXPECT_EQ(sender.ask("destroy 7"), kDone);
    EXPECT_EQ(receiver.ask("destroy 7"), kDone);
    EXPECT_EQ(receiver.ask("release 7"), kDone);
}

}  // namespace
