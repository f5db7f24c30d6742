// Objects that cross processes: who they are, and how long they live.
#include <signal.h>
#include <unistd.h>

#include <cstdio>
#include <thread>

#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;

TEST(DriverObject, IsCalledByWhoKeepsIt) {
    const Process server = start_server();
    const sp<IBinder> service = find_service(), own = new TestService;
    ASSERT_EQ(ask(service, TestService::kKeep, own), 0);
    Parcel data;
    data.writeInt32(TestService::kThreadId);
    EXPECT_EQ(ask(service, TestService::kCallKept, data), gettid());

    start_pool();
    Process other = Process::start("calls_kept");
    EXPECT_EQ(other.read_line(), std::to_string(getpid())) << "by another's doing, later";
}

TEST_ROLE(calls_kept) {
    Parcel data;
    data.writeInt32(TestService::kThreadId);
    const int32_t thread = ask(find_service(), TestService::kCallKept, data);
    // Which process it belongs to.
    char path[64];
    snprintf(path, sizeof path, "/proc/%d/status", thread);
    FILE* status = fopen(path, "r");
    int process = 0;
    char line[256];
    while (status != nullptr && fgets(line, sizeof line, status) != nullptr) sscanf(line, "Tgid: %d", &process);
    printf("%d\n", process);
    return 0;
}

TEST(DriverObject, IsItselfAgainAtHome) {
    const Process server = start_server();
    const sp<IBinder> service = find_service(), own = new TestService;
    ASSERT_EQ(ask(service, TestService::kKeep, own), 0);
    EXPECT_EQ(ask_for_object(service, TestService::kKept), own);
    EXPECT_EQ(ask(service, TestService::kIsKept, own), 1) << "and the same proxy away from home";
    EXPECT_EQ(ask(service, TestService::kIsKept, new TestService), 0);
    EXPECT_EQ(ask(service, TestService::kIsThis, service), 1);
    EXPECT_EQ(find_service(), service);
}

TEST(DriverObject, MayBeNull) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    EXPECT_EQ(ask(service, TestService::kKeep, nullptr), 0);
    EXPECT_EQ(ask_for_object(service, TestService::kKept), nullptr);
    EXPECT_EQ(ask(service, TestService::kIsKept, nullptr), 1);
}

TEST(DriverObject, GoesAwayWhenNobodyKeepsIt) {
    start_pool();
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    ASSERT_EQ(ask(service, TestService::kKeep, new TestService), 0);
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_EQ(TestService::count(), 1);
    ASSERT_EQ(ask(service, TestService::kKeep, nullptr), 0);
    EXPECT_TRUE(comes_true([] { return TestService::count() == 0; }));
}

TEST(DriverObject, GoesAwayWithItsLastHolder) {
    start_pool();
    Process server = start_server();
    ASSERT_EQ(ask(find_service(), TestService::kKeep, new TestService), 0);
    server.kill(SIGKILL);
    EXPECT_TRUE(comes_true([] { return TestService::count() == 0; }));
}

// The reply that gives it back races with the news that it is given up.
TEST(DriverObject, SurvivesBeingGivenBackAndUpAtOnce) {
    start_pool();
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    std::vector<std::thread> threads;
    for (int i = 0; i < 500; ++i) {
        ASSERT_EQ(ask(service, TestService::kKeep, new TestService), 0);
        const sp<IBinder> taken = ask_for_object(service, TestService::kTakeKept);
        ASSERT_NE(taken, nullptr);
        ASSERT_NE(taken->localBinder(), nullptr);
    }
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([&] {
            for (int n = 0; n < 200; ++n) {
                Parcel data, reply;
                const sp<IBinder> own = new TestService;
                data.writeStrongBinder(own);
                ASSERT_EQ(service->transact(TestService::kEcho, data, &reply), OK);
                EXPECT_EQ(reply.readStrongBinder(), own);
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_TRUE(comes_true([] { return TestService::count() == 0; }));
    EXPECT_EQ(service->pingBinder(), OK);
}

TEST(DriverObject, OfAServerIsGivenUpAndFoundAgain) {
    const Process server = start_server();
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([] {
            // Each look-up may be the first, or race with the end of the last proxy.
            for (int n = 0; n < 200; ++n) {
                const sp<IBinder> service = find_service();
                ASSERT_NE(service, nullptr);
                EXPECT_EQ(service->pingBinder(), OK);
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
}

// A parcel full of objects: each is one of its own.
TEST(DriverObject, MayBeOneOfThousands) {
    start_pool();
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    constexpr int kObjects = 20000;
    {
        Parcel data, reply;
        std::vector<sp<IBinder>> objects;
        for (int i = 0; i < kObjects; ++i) {
            objects.push_back(new TestService);
            data.writeStrongBinder(objects.back());
        }
        ASSERT_EQ(service->transact(TestService::kEcho, data, &reply), OK);
        for (const sp<IBinder>& object : objects) ASSERT_EQ(reply.readStrongBinder(), object);
    }
    EXPECT_TRUE(comes_true([] { return TestService::count() == 0; }));
}

TEST(DriverObject, MayBeDeadAlreadyWhenItIsPassedOn) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    sp<IBinder> dead;
    {
        const Process other = start_server("other");
        dead = find_service("other");
    }
    EXPECT_EQ(ask(service, TestService::kKeep, dead), 0);
    EXPECT_EQ(ask(service, TestService::kPingKept), DEAD_OBJECT) << "as it is here";
    EXPECT_EQ(ask(service, TestService::kWatchKept), DEAD_OBJECT);
    EXPECT_EQ(service->pingBinder(), OK) << "who passed it on is not taken for dead";
    const sp<IBinder> back = ask_for_object(service, TestService::kKept);
    ASSERT_NE(back, nullptr);
    EXPECT_EQ(back->pingBinder(), DEAD_OBJECT);
}

}  // namespace
