// Processes that die, and what others learn and keep of it.
#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <thread>

#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;
using std::chrono::steady_clock;

class Recipient : public IBinder::DeathRecipient {
public:
    void binderDied(const wp<IBinder>& who) override {
        last = who;
        ++deaths;
    }
    std::atomic<int> deaths{0};
    wp<IBinder> last;
};

TEST(DriverDeath, EndsTheCallsOfAKilledServer) {
    Process server = start_server();
    const sp<IBinder> service = find_service();
    Gate gate;
    std::vector<std::thread> callers;
    for (int i = 0; i < 20; ++i) {
        callers.emplace_back([&] { EXPECT_EQ(gate.call(service), DEAD_OBJECT); });
    }
    ASSERT_TRUE(gate.wait_for(17)) << "the others wait for a thread";
    const auto start = steady_clock::now();
    server.kill(SIGKILL);
    for (std::thread& caller : callers) caller.join();
    EXPECT_LT(steady_clock::now() - start, std::chrono::seconds(1));
    EXPECT_FALSE(service->isBinderAlive());
    EXPECT_EQ(service->pingBinder(), DEAD_OBJECT);
}

TEST(DriverDeath, EndsACallThatIsNotReadYet) {
    Process server = start_server();
    const sp<IBinder> service = find_service();
    server.stop();
    std::thread caller([&] { EXPECT_EQ(service->pingBinder(), DEAD_OBJECT); });
    std::thread large([&] {
        Parcel data;
        data.setDataSize(1000000);
        EXPECT_EQ(service->transact(TestService::kEcho, data, nullptr), DEAD_OBJECT) << "half of it is on its way";
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    server.kill(SIGKILL);
    caller.join();
    large.join();
}

TEST(DriverDeath, IsTheAnswerToAnyLaterCall) {
    Process server = start_server();
    const sp<IBinder> service = find_service(), unused = ask_for_object(service, TestService::kKept);
    EXPECT_EQ(ask(service, TestService::kThreadId) > 0, true);
    server.kill(SIGKILL);
    server.wait();
    EXPECT_EQ(service->transact(TestService::kEcho, Parcel(), nullptr, IBinder::FLAG_ONEWAY), DEAD_OBJECT);
    EXPECT_EQ(service->pingBinder(), DEAD_OBJECT);
}

TEST(DriverDeath, IsToldToEveryRecipientOnce) {
    start_pool();
    Process server = start_server();
    const sp<IBinder> service = find_service();
    const sp<Recipient> one = new Recipient, other = new Recipient, gone = new Recipient;
    EXPECT_EQ(service->linkToDeath(one), OK);
    EXPECT_EQ(service->linkToDeath(other), OK);
    EXPECT_EQ(service->linkToDeath(gone), OK);
    EXPECT_EQ(service->unlinkToDeath(gone), OK);
    server.kill(SIGKILL);
    EXPECT_TRUE(comes_true([&] { return one->deaths == 1 && other->deaths == 1; }));
    EXPECT_EQ(one->last, service);
    EXPECT_FALSE(service->isBinderAlive());
    EXPECT_EQ(service->linkToDeath(one), DEAD_OBJECT);
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_EQ(one->deaths, 1);
    EXPECT_EQ(gone->deaths, 0);
}

TEST(DriverDeath, IsToldToNobodyOnceAllHaveLeft) {
    start_pool();
    Process server = start_server(), other = start_server("other");
    const sp<IBinder> service = find_service(), later = find_service("other");
    const sp<Recipient> gone = new Recipient, stays = new Recipient;
    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(service->linkToDeath(gone), OK);
        EXPECT_EQ(service->unlinkToDeath(gone), OK);
    }
    EXPECT_EQ(service->unlinkToDeath(gone), NAME_NOT_FOUND);
    EXPECT_EQ(later->linkToDeath(stays), OK);
    server.kill(SIGKILL);
    server.wait();
    EXPECT_EQ(service->pingBinder(), DEAD_OBJECT);
    other.kill(SIGKILL);
    EXPECT_TRUE(comes_true([&] { return stays->deaths == 1; }));
    EXPECT_EQ(gone->deaths, 0);
}

TEST(DriverDeath, IsToldAgainToWhoComesBack) {
    start_pool();
    Process server = start_server();
    const sp<IBinder> service = find_service();
    const sp<Recipient> recipient = new Recipient;
    EXPECT_EQ(service->linkToDeath(recipient), OK);
    EXPECT_EQ(service->unlinkToDeath(recipient), OK);
    EXPECT_EQ(service->linkToDeath(recipient), OK);
    server.kill(SIGKILL);
    EXPECT_TRUE(comes_true([&] { return recipient->deaths == 1; }));
    EXPECT_EQ(recipient->last, service);
}

TEST(DriverDeath, IsToldWhileCallsAreUnderWay) {
    start_pool();
    for (int i = 0; i < 10; ++i) {
        Process server = start_server();
        const sp<IBinder> service = find_service();
        const sp<Recipient> recipient = new Recipient;
        ASSERT_EQ(service->linkToDeath(recipient), OK);
        std::vector<std::thread> callers;
        for (int n = 0; n < 4; ++n) {
            callers.emplace_back([&] {
                while (service->pingBinder() == OK) {
                }
            });
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
        server.kill(SIGKILL);
        for (std::thread& caller : callers) caller.join();
        EXPECT_TRUE(comes_true([&] { return recipient->deaths == 1; }));
    }
}

TEST(DriverDeath, CannotBeAskedForAfterwards) {
    Process server = start_server();
    const sp<IBinder> service = find_service();
    server.kill(SIGKILL);
    server.wait();
    EXPECT_EQ(service->pingBinder(), DEAD_OBJECT);
    EXPECT_EQ(service->linkToDeath(new Recipient), DEAD_OBJECT);
}

TEST(DriverDeath, LeavesTheNameToWhoComesNext) {
    Process server = start_server();
    const sp<IBinder> service = find_service();
    server.kill(SIGKILL);
    server.wait();
    EXPECT_EQ(find_service(), nullptr);
    EXPECT_EQ(defaultServiceManager()->listServices().size(), 0U) << "nobody listens";

    const Process next = start_server();
    const sp<IBinder> found = find_service();
    ASSERT_NE(found, nullptr);
    EXPECT_NE(found, service);
    EXPECT_EQ(found->pingBinder(), OK);
    EXPECT_EQ(service->pingBinder(), DEAD_OBJECT);
    EXPECT_EQ(defaultServiceManager()->listServices().size(), 1U);
}

TEST(DriverDeath, OfAClientIsToldToTheServer) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    Process client = Process::start("keeps_object");
    ASSERT_EQ(client.read_line(), "kept");
    ASSERT_EQ(ask(service, TestService::kWatchKept), OK);
    EXPECT_EQ(ask(service, TestService::kDeaths), 0);
    client.kill(SIGKILL);
    EXPECT_TRUE(comes_true([&] { return ask(service, TestService::kDeaths) == 1; }));
    EXPECT_EQ(ask(service, TestService::kPingKept), DEAD_OBJECT);
}

TEST_ROLE(keeps_object) {
    if (ask(find_service(), TestService::kKeep, new TestService) != 0) return 1;
    puts("kept");
    getchar();
    return 0;
}

// Clients that die in a call, having passed an object and descriptors along.
TEST(DriverDeath, OfClientsLeavesNothingBehind) {
    const int kClients = is_slow() || is_kernel_driver() ? 96 : 992;
    constexpr int kAtOnce = 16;
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    const auto kill_some = [&] {
        std::vector<Process> clients;
        for (int i = 0; i < kAtOnce; ++i) clients.push_back(Process::start("dies_in_call"));
        for (Process& client : clients) EXPECT_EQ(client.wait(), -SIGKILL);
    };
    const auto settled = [&](size_t descriptors) {
        return comes_true([&] { return count_descriptors(server.pid()) <= descriptors; });
    };
    kill_some();
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
    const size_t descriptors = count_descriptors(server.pid());
    const size_t threads = count_threads(server.pid());
    for (int i = kAtOnce; i < kClients; i += kAtOnce) kill_some();
    EXPECT_TRUE(settled(descriptors)) << count_descriptors(server.pid()) << " descriptors, " << descriptors
                                      << " before";
    EXPECT_LE(count_threads(server.pid()), threads + 15);
    EXPECT_EQ(service->pingBinder(), OK);
}

TEST_ROLE(dies_in_call) {
    const sp<IBinder> service = find_service();
    if (service == nullptr || ask(service, TestService::kKeep, new TestService) != 0) return 1;
    const Gate gate;
    std::thread([&] { gate.call(service); }).detach();
    // It may have to wait for a thread.
    if (gate.wait_for(1)) kill(getpid(), SIGKILL);
    return 2;
}

}  // namespace
