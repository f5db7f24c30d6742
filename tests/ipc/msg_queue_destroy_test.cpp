// Giving queues back, in the server's own process.
#include "ipc/descriptors.h"
#include "ipc/msg_queue_test.h"

namespace {

using tavo::test::attached;
using tavo::test::get;
using tavo::test::is_open;
using tavo::test::kEntered;
using tavo::test::kExiting;
using tavo::test::kLookup;
using tavo::test::kLookupBegins;
using tavo::test::kQueueTrace;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::Lines;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::put;
using tavo::test::queue_of;

using Destroy = tavo::test::OwnServerTest;

TEST_F(Destroy, DropsOneUseAndClosesTheHandle) {
    const TAVO_INT64 first = attached("7");
    const TAVO_INT64 second = attached("7");
    const int read_end = queue_of(first).iReadFd;
    const int write_end = queue_of(first).iWriteFd;
    EXPECT_EQ(tavo_msg_queue_destroy(first), TAVO_SUCCESS);
    EXPECT_FALSE(is_open(read_end));
    EXPECT_FALSE(is_open(write_end));
    const int kept = service_->get_fd(7);
    EXPECT_TRUE(is_open(kept));
    EXPECT_EQ(tavo_msg_queue_destroy(second), TAVO_SUCCESS);
    EXPECT_FALSE(is_open(kept));
    EXPECT_EQ(service_->get_fd(7), -1);
}

TEST_F(Destroy, LogsEveryStep) {
    const TAVO_INT64 handle = attached("7");
    const LogCapture log;
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_TRUE(
        logged_exactly(library_lines(log), Lines{kEntered} + kLookup + kQueueTrace + kQueueTrace + Lines{kExiting}));
}

TEST_F(Destroy, RefusesHandlesThatAreNotPositive) {
    for (const TAVO_INT64 handle : {TAVO_INT64{0}, TAVO_INT64{-1}, TAVO_INT64{INT64_MIN}}) {
        const LogCapture log;
        EXPECT_EQ(tavo_msg_queue_destroy(handle), 0x9001);
        EXPECT_TRUE(
            logged_exactly(library_lines(log),
                           {kEntered, line(1, "Message queue id can't be less than or equal to zero \n"), kExiting}));
    }
}

TEST_F(Destroy, KeepsTheHandleWhenTheServiceIsNotReachable) {
    const TAVO_INT64 handle = attached("7");
    const std::string hidden = std::string(tavo::test::kMarker) + ".hidden";
    std::filesystem::rename(tavo::test::kMarker, hidden);
    {
        const LogCapture log;
        EXPECT_EQ(tavo_msg_queue_destroy(handle), 0x9001);
        EXPECT_TRUE(logged_exactly(
            library_lines(log),
            Lines{kEntered} + kLookupBegins +
                Lines{line(1, "Service is not available\n"), line(1, "tavo_osal_get_service() failed\n"), kExiting}));
    }
    EXPECT_EQ(put(handle, "message"), TAVO_SUCCESS);
    EXPECT_EQ(get(handle), "message");
    std::filesystem::rename(hidden, tavo::test::kMarker);
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_EQ(uses(7), 0);
}

TEST_F(Destroy, IgnoresThatTheServiceHasForgottenTheKey) {
    const TAVO_INT64 handle = attached("7");
    EXPECT_EQ(uses(7), 1);
    EXPECT_EQ(put(handle, "message"), TAVO_SUCCESS);  // the pipe is still there
    EXPECT_EQ(get(handle), "message");
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
}

}  // namespace
