// Calls between processes: many at once, and more than there are threads.
#include <unistd.h>

#include <thread>

#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;

Parcel& numbered(Parcel& data, int32_t number) {
    data.writeInt32(number);
    data.writeString16(String16("text"));
    return data;
}

bool echoes(const sp<IBinder>& service, int32_t number) {
    Parcel data, reply;
    return service->transact(TestService::kEcho, numbered(data, number), &reply) == OK && reply.readInt32() == number &&
           reply.readString16() == String16("text");
}

// Threads whose calls are held up, for as long as this lives.
class BlockedCallers {
public:
    BlockedCallers(const sp<IBinder>& service, int count) {
        for (int i = 0; i < count; ++i) {
            threads_.emplace_back([this, service] { EXPECT_EQ(gate_.call(service), OK); });
        }
    }
    ~BlockedCallers() {
        gate_.open();
        for (std::thread& thread : threads_) thread.join();
    }
    const Gate& gate() const { return gate_; }

private:
    Gate gate_;
    std::vector<std::thread> threads_;
};

size_t pool_size(pid_t server) {
    return count_threads_named(server, "Binder_") - count_threads_named(server, "Binder_house");
}

TEST(DriverCall, ReachesAnotherProcess) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    ASSERT_NE(service, nullptr);
    EXPECT_EQ(service->localBinder(), nullptr);
    EXPECT_TRUE(echoes(service, 42));
    EXPECT_EQ(service->pingBinder(), OK);
    EXPECT_TRUE(service->isBinderAlive());
}

TEST(DriverCall, ReturnsTheStatusOfTheObject) {
    const Process server = start_server();
    Parcel reply;
    EXPECT_EQ(find_service()->transact(12345, Parcel(), &reply), UNKNOWN_TRANSACTION);
    EXPECT_EQ(reply.dataSize(), 0U);
    EXPECT_EQ(find_service()->transact(TestService::kEcho, Parcel(), nullptr), OK) << "nobody wants the reply";
}

TEST(DriverCall, LeavesAnEmptyReplyEmpty) {
    const Process server = start_server();
    Parcel reply;
    reply.writeInt32(1);
    EXPECT_EQ(find_service()->transact(TestService::kEcho, Parcel(), &reply), OK);
    EXPECT_EQ(reply.dataSize(), 0U) << "of the parcel's earlier contents nothing is left";
}

TEST(DriverCall, WorksFromManyThreadsAtOnce) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    std::vector<std::thread> threads;
    for (int32_t i = 0; i < 32; ++i) {
        threads.emplace_back([&service, i] {
            for (int32_t n = 0; n < 100; ++n) EXPECT_TRUE(echoes(service, i * 1000 + n));
        });
    }
    for (std::thread& thread : threads) thread.join();
}

TEST_ROLE(caller) {
    const sp<IBinder> service = find_service();
    for (int32_t n = 0; n < 50; ++n) {
        if (!echoes(service, n)) return 1;
    }
    return 0;
}

TEST(DriverCall, WorksFromSixtyFourProcessesAtOnce) {
    const Process server = start_server();
    std::vector<Process> callers;
    for (int i = 0; i < 64; ++i) callers.push_back(Process::start("caller"));
    for (Process& caller : callers) EXPECT_EQ(caller.wait(), 0);
}

// Those that were asked for, the first thread of the pool, and the one that joined on its own.
TEST(DriverCall, GetsAThreadOfItsOwnUpToTheMaximum) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    const BlockedCallers callers(service, 40);
    EXPECT_TRUE(callers.gate().wait_for(15 + 2));
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    EXPECT_TRUE(callers.gate().is_quiet()) << "the others wait";
    EXPECT_EQ(pool_size(server.pid()), 15U + 1U) << "the one that joined keeps its name";
}

TEST(DriverCall, KeepsToTheMaximumThatWasSet) {
    const Process server = start_server("test.service", 3);
    const BlockedCallers callers(find_service(), 20);
    EXPECT_TRUE(callers.gate().wait_for(3 + 2));
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    EXPECT_TRUE(callers.gate().is_quiet());
}

TEST(DriverCall, StartsNoThreadForEveryCall) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    for (int32_t n = 0; n < 200; ++n) EXPECT_TRUE(echoes(service, n));
    // The first, one that waits while it works, and one more for each time that a loaded machine held both of them up.
    EXPECT_LT(pool_size(server.pid()), 15U);
}

TEST(DriverCall, IsServedAsSoonAsOneOfManyThreadsIsFree) {
    const Process server = start_server("test.service", 1);
    const sp<IBinder> service = find_service();
    std::thread late;
    {
        const BlockedCallers callers(service, 10);
        EXPECT_TRUE(callers.gate().wait_for(3));
        late = std::thread([&] { EXPECT_TRUE(echoes(service, 1)); });
    }
    late.join();
    for (int32_t n = 0; n < 100; ++n) EXPECT_TRUE(echoes(service, n)) << "all is as before";
}

TEST(DriverCall, NamesAreServedWhileAllThreadsAreBusy) {
    const Process server = start_server("test.service", 1);
    const sp<IBinder> service = find_service();
    const BlockedCallers callers(service, 3);
    EXPECT_TRUE(callers.gate().wait_for(3));
    EXPECT_EQ(find_service(), service);
    EXPECT_EQ(Process::start("finder").wait(), 0) << "by a process that was never here";
}

TEST_ROLE(finder) { return find_service() != nullptr ? 0 : 1; }

TEST(DriverCall, NeedsNoPoolToFindNames) {
    Process silent = Process::start("publisher_without_pool");
    EXPECT_EQ(silent.read_line(), "ready");
    EXPECT_NE(find_service("silent"), nullptr);
}

TEST_ROLE(publisher_without_pool) {
    if (defaultServiceManager()->addService(String16("silent"), new TestService) != OK) return 1;
    puts("ready");
    pause();
    return 0;
}

TEST(DriverCall, MayEndItsThread) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    for (int i = 0; i < 20; ++i) {
        EXPECT_EQ(service->transact(TestService::kEndThread, Parcel(), nullptr), FAILED_TRANSACTION);
    }
    EXPECT_TRUE(echoes(service, 1)) << "the pool has made up for it";
}

}  // namespace
