// A thousand queues and a thousand blocks of fifty processes, and a server that runs out of descriptors.
#include <sys/resource.h>

#include <set>
#include <string>
#include <vector>

#include "reliability/service_uses.h"

namespace {

using tavo::test::attached;
using tavo::test::comes_back_to;
using tavo::test::comes_true;
using tavo::test::count_descriptors;
using tavo::test::count_memory_files;
using tavo::test::drop;
using tavo::test::Holdings;
using tavo::test::kDone;
using tavo::test::kFailure;
using tavo::test::kNoQueue;
using tavo::test::Peer;
using tavo::test::take_queue_uses;

constexpr int kKeys = 1000;
constexpr int kClients = 50;
constexpr int kShare = kKeys / kClients;

std::string share(const std::string& command, int client) {
    return command + " " + std::to_string(client % kClients * kShare + 1) + " " + std::to_string(kShare);
}

void all(std::vector<Peer>& clients, const std::string& command, int shift = 0) {
    for (int i = 0; i < kClients; ++i) clients[static_cast<size_t>(i)].tell(share(command, i + shift));
    for (Peer& client : clients) EXPECT_EQ(client.answer(), kDone) << command;
}

TEST(Scale, AThousandQueuesAndBlocksOfFiftyProcessesAreKeptApart) {
    rlimit limit = {};
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
    // Two descriptors a queue, one a block, and a few for each client.
    if (limit.rlim_max < 4096) GTEST_SKIP() << "this user may not have enough descriptors";
    Peer server("limit 8192");
    ASSERT_EQ(server.ask("serve"), kDone);
    std::vector<Peer> clients(kClients);
    // What a first call leaves is a connection of each client.
    all(clients, "hold");
    all(clients, "drop");
    const Holdings before(server.pid());

    all(clients, "hold");
    EXPECT_EQ(count_memory_files(server.pid()), static_cast<size_t>(kKeys));
    EXPECT_GE(count_descriptors(server.pid()), static_cast<size_t>(3 * kKeys));
    all(clients, "check", 1);  // everybody has somebody else's keys
    all(clients, "check", 17);

    // The table is packed: every key has a place of its own, and no other places.
    const android::sp<android::ITavoBinder> service = tavo_osal_get_service(nullptr);
    std::set<int> places;
    for (int key = 1; key <= kKeys; ++key) {
        places.insert(service->create_message_queue(key));
        EXPECT_EQ(service->delete_message_queue(key), 0);
    }
    EXPECT_EQ(places.size(), static_cast<size_t>(kKeys));
    EXPECT_EQ(*places.begin(), 0);
    EXPECT_EQ(*places.rbegin(), kKeys - 1);
    // And stays so when a key goes.
    const int place = service->create_message_queue(500);
    EXPECT_EQ(service->create_message_queue(kKeys + 1), kKeys);
    service->delete_message_queue(500);
    EXPECT_EQ(service->delete_message_queue(500), 0);
    EXPECT_EQ(service->create_message_queue(kKeys + 1), kKeys - 1);
    EXPECT_EQ(service->create_message_queue(500), kKeys);
    EXPECT_LT(place, kKeys);
    EXPECT_EQ(take_queue_uses(kKeys + 1), 2);

    all(clients, "drop");
    EXPECT_EQ(service->get_fd(1), -1);
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid()) == 0; }));
    // This process came in between.
    EXPECT_TRUE(comes_true([&] { return count_descriptors(server.pid()) <= before.descriptors + 4; }));
}

class ScaleLimits : public tavo::test::CrashTest {};

TEST_F(ScaleLimits, AServerWithoutDescriptorsRefusesAndRecovers) {
    Peer client("attach 7");
    EXPECT_EQ(client.ask("acquire 7 100"), kDone);
    const Holdings before(server_.pid());
    EXPECT_EQ(server_.ask("limit 64"), kDone);
    EXPECT_EQ(client.ask("flood 100"), kNoQueue);
    EXPECT_EQ(client.ask("put 7 1000"), kDone);
    EXPECT_EQ(client.ask("get 7"), "1000 whole");
    EXPECT_EQ(client.ask("set 7 65"), kDone);
    // What there is can be given back, and then there is room again.
    EXPECT_EQ(client.ask("ebb 100"), "all");
    EXPECT_TRUE(comes_back_to(before, server_.pid()));
    expect_service();

    // Blocks may take the last one. Then nobody who comes anew is let in, until a client goes.
    Peer others[4];
    std::set<std::string> refusals;
    for (int i = 0; i < 4; ++i) refusals.insert(others[i].ask("soak " + std::to_string(200 + 25 * i)));
    refusals.erase(kDone);
    EXPECT_EQ(refusals, std::set<std::string>{kFailure});
    EXPECT_EQ(client.ask("see 7"), "65");
    for (Peer& other : others) other.kill();
    for (int key = 200; key < 300; ++key) client.tell("delete " + std::to_string(key) + " 100");
    for (int key = 200; key < 300; ++key) EXPECT_EQ(client.answer(), kDone);
    EXPECT_TRUE(comes_back_to(before, server_.pid()));
    expect_service();
}

}  // namespace
