// Becoming the server: what other threads and processes find then.
#include <unistd.h>

#include "ipc/ITavoBinder.h"
#include "ipc/allocation_fault.h"
#include "ipc/descriptors.h"
#include "ipc/init_test.h"
#include "support/eventually.h"
#include "support/log_capture.h"
#include "tavo_osal/init.h"

namespace {

using android::IBinder;
using android::ITavoBinder;
using android::sp;
using tavo::test::AllocationFault;
using tavo::test::comes_true;
using tavo::test::is_open;
using tavo::test::kMarker;
using tavo::test::LogCapture;
using tavo::test::OsalInit;
using tavo::test::Server;

TEST_F(OsalInit, PublishesTheServiceItselfInItsOwnProcess) {
    ASSERT_EQ(tavo_osal_init(3, 4), 0);
    const sp<IBinder> binder = published();
    ASSERT_NE(binder, nullptr);
    const LogCapture log;
    const sp<ITavoBinder> service = ITavoBinder::asInterface(binder);
    EXPECT_EQ(android::IInterface::asBinder(service), binder);
    EXPECT_NE(binder->localBinder(), nullptr);
    EXPECT_TRUE(log.lines().empty());  // no proxy says "Constructor"
    EXPECT_EQ(service->create_message_queue(7), 0);
}

TEST_F(OsalInit, StartsThreadsForOtherProcessesAndReturns) {
    ASSERT_EQ(tavo_osal_init(3, 4), 0);
    for (int i = 0; i < 500 && tavo::test::count_threads() < 2; ++i) usleep(10000);
    EXPECT_GE(tavo::test::count_threads(), 2U);
}

TEST_F(OsalInit, PublishesAServiceThatRefusesEverythingWhenALimitIsZero) {
    const unsigned limits[][2] = {{0, 5}, {5, 0}, {0, 0}};
    for (const auto& [queues, blocks] : limits) {
        ASSERT_EQ(tavo_osal_init(queues, blocks), 0);
        const sp<ITavoBinder> service = ITavoBinder::asInterface(published());
        ASSERT_NE(service, nullptr);
        EXPECT_EQ(service->create_message_queue(7), -1);
        EXPECT_EQ(service->get_fd(7), -1);
        EXPECT_EQ(service->get_write_fd(7), -1);
        EXPECT_EQ(service->delete_message_queue(7), -1);
        EXPECT_EQ(service->get_shared_mem(7, 10), nullptr);
        EXPECT_EQ(service->delete_shared_mem(7), -1);
    }
}

TEST_F(OsalInit, PublishesAnotherServiceWhenCalledAgain) {
    ASSERT_EQ(tavo_osal_init(3, 4), 0);
    const sp<ITavoBinder> first = ITavoBinder::asInterface(published());
    EXPECT_EQ(first->create_message_queue(7), 0);
    EXPECT_NE(first->get_shared_mem(7, 10), nullptr);
    ASSERT_EQ(tavo_osal_init(3, 4), 0);
    const sp<ITavoBinder> second = ITavoBinder::asInterface(published());
    ASSERT_NE(second, nullptr);
    EXPECT_NE(second, first);
    EXPECT_EQ(second->get_fd(7), -1);
    EXPECT_GE(first->get_fd(7), 0);
    EXPECT_NE(second->get_shared_mem(7, 10), first->get_shared_mem(7, 10));
}

TEST_F(OsalInit, FreesTheServiceThatNobodyHoldsAnyMore) {
    ASSERT_EQ(tavo_osal_init(3, 4), 0);
    sp<ITavoBinder> first = ITavoBinder::asInterface(published());
    first->create_message_queue(7);
    const int descriptor = first->get_fd(7);
    first = nullptr;
    EXPECT_TRUE(is_open(descriptor));
    ASSERT_EQ(tavo_osal_init(3, 4), 0);
    // The kernel's driver tells a thread of the pool that the service manager has let go of it.
    EXPECT_TRUE(comes_true([&] { return !is_open(descriptor); }));
}

TEST_F(OsalInit, ReportsMissingMemory) {
    const AllocationFault fault(AllocationFault::kNew, 1);
    EXPECT_EQ(tavo_osal_init(3, 4), 0x9003);
}

// --- in a process of its own

TEST_F(OsalInit, AnswersOtherProcesses) {
    Server server(3, 4);
    EXPECT_EQ(server.status(), 0);
    const sp<ITavoBinder> service = ITavoBinder::asInterface(published());
    ASSERT_NE(service, nullptr);
    EXPECT_EQ(service->create_message_queue(7), 0);
    EXPECT_EQ(service->create_message_queue(8), 1);
    EXPECT_EQ(server.exit(), 0);
    EXPECT_TRUE(std::filesystem::exists(kMarker));  // it stays for good
}

TEST_F(OsalInit, AnswersOtherProcessesWithFailuresWhenALimitIsZero) {
    Server server(0, 5);
    EXPECT_EQ(server.status(), 0);
    const sp<ITavoBinder> service = ITavoBinder::asInterface(published());
    ASSERT_NE(service, nullptr);
    EXPECT_EQ(service->create_message_queue(7), -1);
    EXPECT_EQ(service->get_fd(7), -1);
    EXPECT_EQ(service->get_write_fd(7), -1);
    EXPECT_EQ(service->delete_message_queue(7), -1);
    EXPECT_EQ(service->get_shared_mem(7, 10), nullptr);
    EXPECT_EQ(service->delete_shared_mem(7), -1);
}

}  // namespace
