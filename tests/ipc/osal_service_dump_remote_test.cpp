// The service's figures, asked for by another process as the platform's dumpsys does.
#include <binder/IServiceManager.h>
#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include "ipc/descriptors.h"
#include "ipc/osal_service_dump_test.h"
#include "ipc/server.h"
#include "support/eventually.h"
#include "support/log_capture.h"
#include "tavo_osal.h"

namespace {

using android::IBinder;
using android::sp;
using android::String16;
using nlohmann::json;
using tavo::test::Dump;
using tavo::test::dump_of;
using tavo::test::LogCapture;
using tavo::test::Server;

sp<IBinder> service() { return android::defaultServiceManager()->checkService(String16("android.tavo.osal")); }

TEST(OsalServiceDumpRemote, ComesThroughBinder) {
    Server server(5, 6);
    const LogCapture log;
    TAVO_INT64 queue = 0;
    TAVO_CHAR key[] = "7";
    ASSERT_EQ(tavo_msg_queue_sender_init(key, &queue), TAVO_SUCCESS);
    unsigned char message[] = "hello";
    ASSERT_EQ(tavo_msg_queue_put(queue, message, 5), TAVO_SUCCESS);

    const Dump text = dump_of(service());
    EXPECT_EQ(text.status, 0);
    EXPECT_EQ(text.text.rfind("service android.tavo.osal, process " + std::to_string(server.pid()) + "\n", 0), 0U);

    const json told = json::parse(dump_of(service(), {"--json"}).text);
    EXPECT_EQ(told["process"], server.pid());
    EXPECT_EQ(told["queue_room"], 5);
    EXPECT_EQ(told["block_limit"], 6);
    ASSERT_EQ(told["queues"].size(), 1U);
    EXPECT_EQ(told["queues"][0]["key"], 7);
    EXPECT_EQ(told["queues"][0]["uses"], 1);
    EXPECT_EQ(told["queues"][0]["pending"], 9);
    EXPECT_EQ(tavo_msg_queue_destroy(queue), TAVO_SUCCESS);
    EXPECT_TRUE(json::parse(dump_of(service(), {"--json"}).text)["queues"].empty());
}

TEST(OsalServiceDumpRemote, CountsTheReferencesOfOtherProcesses) {
    Server server;
    const LogCapture log;
    TavoShmHandle* handle = nullptr;
    ASSERT_EQ(tavo_shm_init(9, &handle, 100), TAVO_SUCCESS);
    void* address = nullptr;
    ASSERT_EQ(tavo_shm_acquire(handle, &address), TAVO_SUCCESS);
    const json told = json::parse(dump_of(service(), {"--json"}).text);
    ASSERT_EQ(told["blocks"].size(), 1U);
    EXPECT_EQ(told["blocks"][0]["key"], 9);
    EXPECT_EQ(told["blocks"][0]["size"], 100);
    EXPECT_GE(told["blocks"][0]["references"], 3);
    EXPECT_EQ(tavo_shm_release(address), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_delete(handle), TAVO_SUCCESS);
}

TEST(OsalServiceDumpRemote, ToAPipeWithoutAReaderLeavesTheServiceRunning) {
    Server server;
    const LogCapture log;
    int ends[2];
    ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
    close(ends[0]);
    EXPECT_NE(service()->dump(ends[1], tavo::test::dump_arguments({})), 0);
    close(ends[1]);
    EXPECT_EQ(service()->pingBinder(), 0);
}

TEST(OsalServiceDumpRemote, LeavesNoDescriptorInTheService) {
    Server server;
    const LogCapture log;
    ASSERT_EQ(dump_of(service()).status, 0);
    int ends[2];
    ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
    const ino_t pipe = tavo::test::file_of(ends[0]);
    ASSERT_EQ(service()->dump(ends[1], tavo::test::dump_arguments({})), 0);
    // The service gives it up after it has answered.
    EXPECT_TRUE(tavo::test::comes_true([&] { return tavo::test::count_pipe_ends(pipe, server.pid()) == 0; }));
    close(ends[0]);
    close(ends[1]);
}

}  // namespace
