// Calls that come back, directly or by way of others, and the threads that run them.
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <thread>

#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;

int32_t ping_pong(const sp<IBinder>& service, int32_t depth, status_t* status = nullptr) {
    Parcel data, reply;
    data.writeInt32(depth);
    data.writeStrongBinder(new TestService);
    const status_t result = service->transact(TestService::kPingPong, data, &reply);
    if (status != nullptr) *status = result;
    return result == OK ? reply.readInt32() : -1;
}

// What the last of the objects answers to code when each calls the next.
int32_t relay(uint32_t code, const std::vector<sp<IBinder>>& objects) {
    Parcel data;
    data.writeInt32(static_cast<int32_t>(code));
    data.writeInt32(static_cast<int32_t>(objects.size()) - 1);
    for (size_t i = 1; i < objects.size(); ++i) data.writeStrongBinder(objects[i]);
    return ask(objects[0], TestService::kRelay, data);
}

TEST(DriverNesting, CallsBackOnTheThreadThatWaits) {
    const Process server = start_server();
    EXPECT_EQ(relay(TestService::kThreadId, {find_service(), new TestService}), gettid());
}

TEST(DriverNesting, GoesDeep) {
    const Process server = start_server();
    EXPECT_EQ(ping_pong(find_service(), 100), 100);
}

TEST(DriverNesting, EndsBeforeTheStackDoes) {
    const Process server = start_server();
    status_t status = OK;
    ping_pong(find_service(), 100000, &status);
    EXPECT_EQ(status, FAILED_TRANSACTION);
    EXPECT_EQ(ping_pong(find_service(), 10), 10) << "the server goes on";
}

TEST(DriverNesting, ComesBackByWayOfAnother) {
    const Process b = start_server("b"), c = start_server("c");
    const sp<IBinder> own = new TestService;
    EXPECT_EQ(relay(TestService::kThreadId, {find_service("b"), find_service("c"), own}), gettid())
        << "to the thread that waits, in a process without a pool";
}

TEST(DriverNesting, ComesBackToServersByWayOfOthers) {
    const Process b = start_server("b"), c = start_server("c");
    const sp<IBinder> own = new TestService, first = find_service("b"), second = find_service("c");
    std::vector<sp<IBinder>> objects;
    for (int i = 0; i < 10; ++i) objects.insert(objects.end(), {first, second, own});
    EXPECT_EQ(relay(TestService::kThreadId, objects), gettid());
}

TEST(DriverNesting, FindsAWayWhenEveryThreadIsBusy) {
    const Process b = start_server("b", 1), c = start_server("c", 1);
    const sp<IBinder> own = new TestService, first = find_service("b"), second = find_service("c");
    start_pool(1);
    // Every thread of this process's pool is held up by calls from outside.
    ASSERT_EQ(ask(first, TestService::kKeep, own), 0);
    Process one = Process::start("holds_up_kept", {"b"}), other = Process::start("holds_up_kept", {"b"});
    ASSERT_EQ(one.read_line() + other.read_line(), "heldheld");
    EXPECT_EQ(relay(TestService::kThreadId, {first, second, own}), gettid());
    std::vector<sp<IBinder>> objects;
    for (int i = 0; i < 5; ++i) objects.insert(objects.end(), {first, second, own});
    EXPECT_EQ(relay(TestService::kThreadId, objects), gettid());
    one.write_line("");
    other.write_line("");
    EXPECT_EQ(one.wait() + other.wait(), 0);
}

TEST_ROLE(holds_up_kept) {
    const sp<IBinder> service = find_service(arguments[0]);
    Gate gate;
    std::thread caller([&] {
        if (gate.call_kept(service) != OK) abort();
    });
    puts(gate.wait_for(1) ? "held" : "not held");
    getchar();
    gate.open();
    caller.join();
    return 0;
}

// Chains that all need the same few threads, and come back to servers whose threads are all part of a chain.
TEST(DriverNesting, DoesNotLockUpUnderManyChains) {
    const Process b = start_server("b", 2), c = start_server("c", 2);
    const sp<IBinder> first = find_service("b"), second = find_service("c");
    start_pool(2);
    std::vector<std::thread> threads;
    for (int i = 0; i < 16; ++i) {
        threads.emplace_back([&] {
            const sp<IBinder> own = new TestService;
            for (int n = 0; n < 5; ++n) {
                EXPECT_EQ(relay(TestService::kThreadId, {first, second, own, first, second, own}), gettid());
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
}

TEST(DriverNesting, LeavesUnrelatedCallsToThePool) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    const sp<TestService> own = new TestService;
    ASSERT_EQ(ask(service, TestService::kKeep, own), 0);
    // Somebody else has the server call this process, which has no pool yet, while a thread of it waits.
    Process other = Process::start("asks_for_thread_of_kept");
    ASSERT_EQ(other.read_line(), "asking");
    Gate gate;
    std::atomic<int> waiting_thread{0};
    std::thread waiting([&] {
        waiting_thread = gettid();
        EXPECT_EQ(gate.call(service), OK);
    });
    EXPECT_TRUE(gate.wait_for(1));
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    start_pool();
    const int thread = std::stoi(other.read_line());
    EXPECT_NE(thread, gettid());
    EXPECT_NE(thread, waiting_thread);
    gate.open();
    waiting.join();
    EXPECT_EQ(other.wait(), 0);
}

TEST_ROLE(asks_for_thread_of_kept) {
    Parcel data;
    data.writeInt32(TestService::kThreadId);
    puts("asking");
    printf("%d\n", ask(find_service(), TestService::kCallKept, data));
    return 0;
}

}  // namespace
