// Queues of another process's service.
#include <signal.h>
#include <unistd.h>

#include <chrono>
#include <fstream>

#include "ipc/descriptors.h"
#include "ipc/msg_queue_test.h"
#include "support/eventually.h"

namespace {

using android::ITavoBinder;
using android::sp;
using std::chrono::seconds;
using std::chrono::steady_clock;
using tavo::test::allocated_bytes;
using tavo::test::attach;
using tavo::test::attached;
using tavo::test::comes_true;
using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::count_pipe_ends;
using tavo::test::DescriptorLimit;
using tavo::test::drop;
using tavo::test::file_of;
using tavo::test::get;
using tavo::test::is_open;
using tavo::test::kAttachName;
using tavo::test::kCallTrace;
using tavo::test::kEntered;
using tavo::test::kExiting;
using tavo::test::kLookup;
using tavo::test::kLookupBegins;
using tavo::test::kLookupName;
using tavo::test::kQueueTrace;
using tavo::test::kUntouched;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::Lines;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::put;
using tavo::test::queue_of;
using tavo::test::Server;

class RemoteQueue : public tavo::test::MsgQueueTest {
protected:
    RemoteQueue() { EXPECT_EQ(server_.status(), TAVO_SUCCESS); }

    // How many ends of this handle's pipe the server has.
    size_t servers_ends(TAVO_INT64 handle) const {
        return count_pipe_ends(file_of(queue_of(handle).iReadFd), server_.pid());
    }

    Server server_;
};

// Whether it comes true within some seconds.
const Lines kUnreachable = {line(1, " " + kLookupName + " () Failed to get service (android.tavo.osal) \n"),
                            line(1, "tavo_osal_get_service() failed\n")};

TEST_F(RemoteQueue, IsThePipeOfTheServer) {
    const TAVO_INT64 handle = attached("7");
    EXPECT_EQ(servers_ends(handle), 2U);
    EXPECT_EQ(count_pipe_ends(file_of(queue_of(handle).iReadFd)), 2U);
    EXPECT_EQ(put(handle, "message"), TAVO_SUCCESS);
    EXPECT_EQ(get(handle), "message");
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_EQ(server_.exit(), 0);
}

TEST_F(RemoteQueue, LogsEveryStepOfAttaching) {
    TAVO_INT64 handle = kUntouched;
    const LogCapture log;
    EXPECT_EQ(attach("7", &handle), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(
        library_lines(log), Lines{kEntered} + kLookup + kCallTrace + kQueueTrace +
                                Lines{line(1, kAttachName + " () : getting fd for 7 \n")} + kCallTrace +
                                Lines{line(1, kAttachName + " () GOT FD \n")} + kCallTrace +
                                Lines{line(4, kAttachName + "() successfully obtained message queue \n")} +
                                kQueueTrace + kQueueTrace +
                                Lines{line(4, "Message queue object returned: addr PTR  :  service 7\n"), kExiting}));
    size_t constructors = 0;
    for (const auto& logged : log.lines()) constructors += logged.by_print && logged.text == "Constructor";
    EXPECT_EQ(constructors, 1U);
    tavo_msg_queue_destroy(handle);
}

TEST_F(RemoteQueue, LogsEveryStepOfDestroying) {
    const TAVO_INT64 handle = attached("7");
    const LogCapture log;
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_TRUE(
        logged_exactly(library_lines(log), Lines{kEntered} + kLookup + kCallTrace + kQueueTrace + Lines{kExiting}));
}

TEST_F(RemoteQueue, HasNoQueueForATextThatIsNoNumber) {
    TAVO_INT64 handle = kUntouched;
    const LogCapture log;
    EXPECT_EQ(attach("abc", &handle), 0x9306);
    EXPECT_EQ(handle, kUntouched);
    EXPECT_TRUE(logged_exactly(library_lines(log),
                               Lines{kEntered} + kLookup + kCallTrace + kQueueTrace +
                                   Lines{line(1, kAttachName + " () : getting fd for 0 \n")} + kCallTrace +
                                   Lines{line(1, kAttachName + " () GOT FD \n")} + kCallTrace +
                                   Lines{line(1, " Service Exists!!But no queue in that service : fd -1 : -1 \n")} +
                                   kQueueTrace + Lines{kExiting}));
}

TEST_F(RemoteQueue, GoesWithItsLastUse) {
    const TAVO_INT64 first = attached("7");
    const TAVO_INT64 second = attached("7");
    const TAVO_INT64 other = attached("8");
    const ino_t pipe = file_of(queue_of(first).iReadFd);
    EXPECT_EQ(tavo_msg_queue_destroy(first), TAVO_SUCCESS);
    EXPECT_EQ(count_pipe_ends(pipe, server_.pid()), 2U);
    EXPECT_EQ(tavo_msg_queue_destroy(second), TAVO_SUCCESS);
    EXPECT_EQ(count_pipe_ends(pipe, server_.pid()), 0U);
    EXPECT_EQ(servers_ends(other), 2U);
    EXPECT_EQ(tavo_msg_queue_destroy(other), TAVO_SUCCESS);
}

TEST_F(RemoteQueue, LosesNoUseWhenDescriptorsRunOut) {
    const TAVO_INT64 first = attached("7");
    const size_t own = count_descriptors();
    const size_t servers = count_descriptors(server_.pid());
    unsigned more = 2;  // the look-up itself takes as many
    for (; more < 12; ++more) {
        TAVO_INT64 handle = kUntouched;
        TAVO_Status status = TAVO_SUCCESS;
        {
            const DescriptorLimit limit(more);
            status = attach("7", &handle);
        }
        EXPECT_TRUE(is_open(0));
        if (status == TAVO_SUCCESS) {
            EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
            break;
        }
        EXPECT_EQ(status, 0x9306) << more;
        EXPECT_EQ(handle, kUntouched);
        EXPECT_EQ(count_descriptors(), own) << more;
    }
    EXPECT_GT(more, 2U);
    EXPECT_LT(more, 12U);
    EXPECT_TRUE(comes_true([&] { return count_descriptors(server_.pid()) == servers; }));
    EXPECT_EQ(servers_ends(first), 2U);
    const ino_t pipe = file_of(queue_of(first).iReadFd);
    EXPECT_EQ(tavo_msg_queue_destroy(first), TAVO_SUCCESS);  // the only use there is
    EXPECT_EQ(count_pipe_ends(pipe, server_.pid()), 0U);
}

TEST_F(RemoteQueue, IsNotMadeWhenTheServerHasNoDescriptors) {
    const sp<ITavoBinder> service = tavo_osal_get_service(nullptr);
    ASSERT_NE(service, nullptr);
    ASSERT_EQ(service->create_message_queue(1), 0);
    server_.take_descriptors();
    EXPECT_EQ(service->create_message_queue(7), -1);
    EXPECT_EQ(service->get_fd(7), -1);
    EXPECT_EQ(service->create_message_queue(1), 0);
    server_.give_descriptors();
    EXPECT_EQ(service->create_message_queue(7), 1);
    EXPECT_EQ(tavo_msg_queue_destroy(attached("7")), TAVO_SUCCESS);
    EXPECT_EQ(server_.exit(), 0);
}

TEST_F(RemoteQueue, OutlivesTheServer) {
    const TAVO_INT64 sender = attached("7");
    const TAVO_INT64 receiver = attached("7");
    server_.kill();
    EXPECT_EQ(put(sender, "message"), TAVO_SUCCESS);
    EXPECT_EQ(get(receiver), "message");
    {
        const LogCapture log;
        EXPECT_EQ(tavo_msg_queue_destroy(sender), 0x9001);
        EXPECT_TRUE(logged_exactly(library_lines(log), Lines{kEntered} + kLookupBegins +
                                                           Lines{line(1, " got defaultservice android.tavo.osal\n")} +
                                                           kUnreachable + Lines{kExiting}));
    }
    EXPECT_EQ(put(sender, "another"), TAVO_SUCCESS);  // the handle is kept
    EXPECT_EQ(get(receiver), "another");
    TAVO_INT64 handle = kUntouched;
    EXPECT_EQ(attach("7", &handle), 1);
    EXPECT_EQ(handle, kUntouched);
    drop(sender);
    drop(receiver);
}

TEST_F(RemoteQueue, ComesFromTheServerThatTookOver) {
    const TAVO_INT64 old_sender = attached("7");
    const TAVO_INT64 old_receiver = attached("7");
    // Not every driver keeps a service for the sake of a name that is another's now.
    const sp<ITavoBinder> old_service = tavo_osal_get_service(nullptr);
    Server second;
    EXPECT_EQ(second.status(), TAVO_SUCCESS);
    const TAVO_INT64 handle = attached("7");
    const ino_t pipe = file_of(queue_of(handle).iReadFd);
    EXPECT_EQ(count_pipe_ends(pipe, server_.pid()), 0U);
    EXPECT_EQ(count_pipe_ends(pipe, second.pid()), 2U);
    EXPECT_EQ(put(old_sender, "old"), TAVO_SUCCESS);
    EXPECT_EQ(put(handle, "new"), TAVO_SUCCESS);
    EXPECT_EQ(get(old_receiver), "old");
    EXPECT_EQ(get(handle), "new");
    EXPECT_EQ(servers_ends(old_sender), 2U);
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_pipe_ends(pipe, second.pid()), 0U);
    drop(old_sender);
    drop(old_receiver);
}

TEST_F(RemoteQueue, CanBeHadAgainFromAServerThatWasStartedAgain) {
    drop(attached("7"));
    server_.kill();
    Server again;
    const TAVO_INT64 handle = attached("7");
    EXPECT_EQ(put(handle, "message"), TAVO_SUCCESS);
    EXPECT_EQ(get(handle), "message");
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_EQ(again.exit(), 0);
}

TEST_F(RemoteQueue, LeavesNothingBehindInEitherProcess) {
    const auto rounds = [](int count) {
        for (int round = 0; round < count; ++round) {
            ASSERT_EQ(tavo_msg_queue_destroy(attached(std::to_string(1 + round % 3))), TAVO_SUCCESS);
        }
    };
    rounds(200);
    const size_t descriptors = count_descriptors();
    const size_t servers_descriptors = count_descriptors(server_.pid());
    const size_t mappings = count_mappings();
    const size_t bytes = allocated_bytes();
    const size_t servers_bytes = server_.allocated_bytes();
    rounds(1000);
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_LE(count_mappings(), mappings + 2);
    // The server notices in its own time that a look-up's connection was closed.
    EXPECT_TRUE(comes_true([&] { return count_descriptors(server_.pid()) <= servers_descriptors; }));
    EXPECT_TRUE(comes_true([&] { return allocated_bytes() < bytes + 16384; }));
    EXPECT_TRUE(comes_true([&] { return server_.allocated_bytes() < servers_bytes + 16384; }));
    EXPECT_EQ(server_.exit(), 0);
}

// --- no service

using RemoteQueueMissing = tavo::test::MsgQueueTest;

TEST_F(RemoteQueueMissing, IsWaitedForWhenThereIsAMarker) {
    std::filesystem::create_directory(tavo::test::kMarkerDirectory);
    std::ofstream(tavo::test::kMarker).flush();
    TAVO_INT64 handle = kUntouched;
    const LogCapture log;
    const auto start = steady_clock::now();
    EXPECT_EQ(attach("7", &handle), 1);
    EXPECT_GE(steady_clock::now() - start, seconds(4));  // as long as the platform waits
    EXPECT_EQ(handle, kUntouched);
    EXPECT_TRUE(logged_exactly(library_lines(log), Lines{kEntered} + kLookupBegins +
                                                       Lines{line(1, " got defaultservice android.tavo.osal\n")} +
                                                       kUnreachable + Lines{kExiting}));
}

TEST_F(RemoteQueueMissing, IsNotWaitedForWithoutAMarker) {
    std::ofstream(tavo::test::kMarkerDirectory) << "a file in place of the directory";
    Server server;
    EXPECT_EQ(server.status(), 0x9001);
    TAVO_INT64 handle = kUntouched;
    const auto start = steady_clock::now();
    EXPECT_EQ(attach("7", &handle), 1);
    EXPECT_LT(steady_clock::now() - start, seconds(4));
    EXPECT_EQ(handle, kUntouched);
}

TEST_F(RemoteQueueMissing, IsRefusedByAServerWithoutTables) {
    Server server(0, 5);
    TAVO_INT64 handle = kUntouched;
    EXPECT_EQ(attach("7", &handle), 0x9306);
    EXPECT_EQ(handle, kUntouched);
}

}  // namespace
