// Calls that nobody waits for.
#include <signal.h>
#include <unistd.h>

#include <thread>

#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;
using std::chrono::steady_clock;

status_t append(const sp<IBinder>& service, int32_t number, int32_t milliseconds = 0) {
    Parcel data;
    data.writeInt32(number);
    data.writeInt32(milliseconds);
    return service->transact(TestService::kAppend, data, nullptr, IBinder::FLAG_ONEWAY);
}

std::vector<int32_t> appended(const sp<IBinder>& service) {
    Parcel reply;
    EXPECT_EQ(service->transact(TestService::kAppended, Parcel(), &reply), OK);
    std::vector<int32_t> numbers(static_cast<size_t>(reply.readInt32()));
    for (int32_t& number : numbers) number = reply.readInt32();
    return numbers;
}

TEST(DriverOneway, ReturnsBeforeTheCallRan) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    const auto start = steady_clock::now();
    ASSERT_EQ(append(service, 1, 1000), OK);
    EXPECT_LT(steady_clock::now() - start, std::chrono::milliseconds(900));
    EXPECT_TRUE(appended(service).empty());
    EXPECT_TRUE(comes_true([&] { return appended(service).size() == 1; }));
}

TEST(DriverOneway, RunsInOrderOneAtATime) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    std::vector<int32_t> expected;
    for (int32_t n = 0; n < 300; ++n) {
        expected.push_back(n);
        // The earlier ones take longer, so that any two at once would change places.
        ASSERT_EQ(append(service, n, n < 50 ? 1 : 0), OK);
    }
    EXPECT_TRUE(comes_true([&] { return appended(service).size() == expected.size(); }));
    EXPECT_EQ(appended(service), expected);
}

TEST(DriverOneway, OfSeveralClientsIsRunOneAtATime) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    std::vector<std::thread> threads;
    for (int32_t i = 0; i < 4; ++i) {
        threads.emplace_back([&, i] {
            for (int32_t n = 0; n < 50; ++n) EXPECT_EQ(append(service, i * 1000 + n), OK);
        });
    }
    for (std::thread& thread : threads) thread.join();
    ASSERT_TRUE(comes_true([&] { return appended(service).size() == 200; }));
    std::vector<int32_t> next(4, 0);
    for (const int32_t number : appended(service)) EXPECT_EQ(number % 1000, next[static_cast<size_t>(number / 1000)]++);
}

TEST(DriverOneway, HoldsUpNobodyElse) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    Gate gate;
    ASSERT_EQ(gate.call(service, IBinder::FLAG_ONEWAY), OK);
    ASSERT_TRUE(gate.wait_for(1));
    ASSERT_EQ(append(service, 1), OK) << "behind the one at the gate";
    EXPECT_EQ(service->pingBinder(), OK) << "calls that somebody waits for do not queue";
    EXPECT_TRUE(appended(service).empty());
    gate.open();
    EXPECT_TRUE(comes_true([&] { return appended(service).size() == 1; }));
}

TEST(DriverOneway, IsAcceptedWhileAllThreadsAreBusy) {
    const Process server = start_server("test.service", 1);
    const sp<IBinder> service = find_service();
    Gate gate;
    std::vector<std::thread> callers;
    for (int i = 0; i < 3; ++i) {
        callers.emplace_back([&] { EXPECT_EQ(gate.call(service), OK); });
    }
    ASSERT_TRUE(gate.wait_for(3));
    for (int32_t n = 0; n < 10; ++n) EXPECT_EQ(append(service, n), OK);
    gate.open();
    for (std::thread& caller : callers) caller.join();
    EXPECT_TRUE(comes_true([&] { return appended(service).size() == 10; }));
}

TEST(DriverOneway, IsAcceptedByAProcessWithoutAPool) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    const sp<TestService> own = new TestService;
    ASSERT_EQ(ask(service, TestService::kKeep, own), 0);
    Process other = Process::start("appends_to_kept");
    EXPECT_EQ(other.wait(), 0);
    start_pool();
    EXPECT_TRUE(comes_true([&] {
        Parcel reply;
        return own->transact(TestService::kAppended, Parcel(), &reply) == OK && reply.readInt32() == 1;
    })) << "it runs as soon as there is a pool";
}

TEST_ROLE(appends_to_kept) {
    const sp<IBinder> kept = ask_for_object(find_service(), TestService::kKept);
    return kept != nullptr && append(kept, 5) == OK ? 0 : 1;
}

TEST(DriverOneway, IsRefusedWhenTooMuchWaits) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    Gate gate;
    ASSERT_EQ(gate.call(service, IBinder::FLAG_ONEWAY), OK);
    ASSERT_TRUE(gate.wait_for(1));
    Parcel data;
    data.writeInt32(1);
    data.writeInt32(0);
    data.setDataSize(100000);
    int accepted = 0;
    status_t status = OK;
    while (accepted < 1000 && status == OK) {
        status = service->transact(TestService::kAppend, data, nullptr, IBinder::FLAG_ONEWAY);
        accepted += status == OK;
    }
    EXPECT_EQ(status, FAILED_TRANSACTION);
    EXPECT_EQ(accepted, 5) << "half a parcel's limit may wait";
    EXPECT_EQ(service->pingBinder(), OK);
    Process other = Process::start("appends_once");
    EXPECT_EQ(other.wait(), 0) << "others have room of their own";
    gate.open();
    EXPECT_TRUE(comes_true([&] { return appended(service).size() == 6; }));
    EXPECT_EQ(append(service, 1), OK);
}

TEST_ROLE(appends_once) { return append(find_service(), 1) == OK ? 0 : 1; }

TEST(DriverOneway, ToADeadObjectFails) {
    Process server = start_server();
    const sp<IBinder> service = find_service();
    server.kill(SIGKILL);
    server.wait();
    EXPECT_EQ(append(service, 1), DEAD_OBJECT);
}

TEST(DriverOneway, OfAClientThatDiesIsStillRun) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    Gate gate;
    ASSERT_EQ(gate.call(service, IBinder::FLAG_ONEWAY), OK);
    ASSERT_TRUE(gate.wait_for(1));
    EXPECT_EQ(Process::start("appends_once").wait(), 0);
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    gate.open();
    EXPECT_TRUE(comes_true([&] { return appended(service).size() == 1; }));
}

TEST(DriverOneway, MayEndItsThread) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    Gate gate;
    ASSERT_EQ(gate.call(service, IBinder::FLAG_ONEWAY), OK);
    ASSERT_TRUE(gate.wait_for(1));
    for (int32_t n = 0; n < 5; ++n) {
        ASSERT_EQ(service->transact(TestService::kEndThread, Parcel(), nullptr, IBinder::FLAG_ONEWAY), OK);
        ASSERT_EQ(append(service, n), OK);
    }
    gate.open();
    EXPECT_TRUE(comes_true([&] { return appended(service).size() == 5; })) << "others run those behind it";
}

TEST(DriverOneway, ReturnsWhatItBroughtAlong) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    start_pool();
    EXPECT_EQ(service->pingBinder(), OK);
    const size_t before = count_descriptors(server.pid());
    for (int i = 0; i < 100; ++i) {
        Parcel data;
        data.writeInt32(1);
        data.writeInt32(0);
        data.writeStrongBinder(new TestService);
        data.writeFileDescriptor(STDIN_FILENO);
        ASSERT_EQ(service->transact(TestService::kAppend, data, nullptr, IBinder::FLAG_ONEWAY), OK);
    }
    EXPECT_TRUE(comes_true([] { return TestService::count() == 0; }));
    EXPECT_TRUE(comes_true([&] { return count_descriptors(server.pid()) <= before; }));
}

}  // namespace
