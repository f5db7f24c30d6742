// Queues of one process, and messages through any handle.
#include <cerrno>
#include <cstdlib>
#include <memory>
#include <thread>

#include "ipc/allocation_fault.h"
#include "ipc/descriptors.h"
#include "ipc/msg_queue_test.h"

namespace {

using android::TAVO_MessageQueue;
using tavo::test::AllocationFault;
using tavo::test::DescriptorLimit;
using tavo::test::drop;
using tavo::test::get;
using tavo::test::is_open;
using tavo::test::kEntered;
using tavo::test::kExiting;
using tavo::test::kLibrary;
using tavo::test::kQueueTag;
using tavo::test::kQueueTrace;
using tavo::test::kServiceTag;
using tavo::test::kUntouched;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::Lines;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;
using tavo::test::put;
using tavo::test::queue_of;

// A queue of this process's own.
class LocalQueue : public tavo::test::MsgQueueTest {
protected:
    LocalQueue() { EXPECT_EQ(tavo_android_msg_queue_init(&handle_), TAVO_SUCCESS); }
    ~LocalQueue() override { tavo::test::drop(handle_); }

    TAVO_INT64 handle_ = kUntouched;
};

// --- making one

class LocalQueueInit : public tavo::test::MsgQueueTest {};

TEST_F(LocalQueueInit, HandsOutAPositiveHandle) {
    TAVO_INT64 handle = kUntouched;
    const LogCapture log;
    EXPECT_EQ(tavo_android_msg_queue_init(&handle), TAVO_SUCCESS);
    EXPECT_GT(handle, 0);
    EXPECT_TRUE(logged_exactly(
        library_lines(log),
        Lines{kEntered} + kQueueTrace +
            Lines{line(4, "Message queue object returned: " + std::to_string(static_cast<int>(handle)) + "\n"),
                  kExiting}));
    EXPECT_STREQ(queue_of(handle).tavo_android_msg_queue_get_service_name(), "");
    drop(handle);
}

TEST_F(LocalQueueInit, RefusesANullPointer) {
    const LogCapture log;
    EXPECT_EQ(tavo_android_msg_queue_init(nullptr), 0x9302);
    EXPECT_TRUE(logged_exactly(library_lines(log), {kEntered, line(1, "Invalid pointer passed piMqId\n"), kExiting}));
}

TEST_F(LocalQueueInit, SetsTheHandleToMinusOneWithoutMemory) {
    const AllocationFault fault(AllocationFault::kNothrowNew, 1);
    TAVO_INT64 handle = kUntouched;
    const LogCapture log;
    EXPECT_EQ(tavo_android_msg_queue_init(&handle), 0x9303);
    EXPECT_EQ(handle, -1);
    EXPECT_TRUE(logged_exactly(library_lines(log), {kEntered, kExiting}));
}

TEST_F(LocalQueueInit, NeedsNoService) {
    TAVO_INT64 handle = kUntouched;
    EXPECT_EQ(tavo_android_msg_queue_init(&handle), TAVO_SUCCESS);
    EXPECT_EQ(put(handle, "message"), TAVO_SUCCESS);
    EXPECT_EQ(get(handle), "message");
    EXPECT_FALSE(std::filesystem::exists(tavo::test::kMarkerDirectory));
    drop(handle);
}

TEST_F(LocalQueueInit, HandsOutAQueueWithoutAPipeThatTakesNothing) {
    TAVO_INT64 handle = kUntouched;
    {
        const DescriptorLimit limit(0);
        EXPECT_EQ(tavo_android_msg_queue_init(&handle), TAVO_SUCCESS);
    }
    EXPECT_EQ(put(handle, "message"), 0x9306);
    EXPECT_EQ(get(handle), "status " + std::to_string(0x9303));
    queue_of(handle).disown_descriptors();
    drop(handle);
    EXPECT_TRUE(is_open(0));
}

// --- put and get

TEST_F(LocalQueue, CarriesMessagesInOrder) {
    for (const char* message : {"first", "", "third"}) EXPECT_EQ(put(handle_, message), TAVO_SUCCESS);
    for (const char* message : {"first", "", "third"}) EXPECT_EQ(get(handle_), message);
}

TEST_F(LocalQueue, CarriesTheLongestMessageToAnotherThread) {
    const std::string longest(TAVO_MSG_QUEUE_MAX_SIZE, 'l');
    std::thread sender([&] { EXPECT_EQ(put(handle_, longest), TAVO_SUCCESS); });
    EXPECT_EQ(get(handle_), longest);
    sender.join();
}

TEST_F(LocalQueue, TakesMessagesFromSeveralThreads) {
    std::vector<std::thread> senders;
    for (char name = 'a'; name < 'd'; ++name) {
        senders.emplace_back([this, name] {
            for (size_t i = 0; i < 500; ++i) EXPECT_EQ(put(handle_, std::string(1 + i % 4092, name)), TAVO_SUCCESS);
        });
    }
    size_t next[3] = {};
    for (int i = 0; i < 1500; ++i) {
        const std::string message = get(handle_);
        const size_t name = static_cast<size_t>(message.at(0) - 'a');
        ASSERT_LT(name, 3U);
        EXPECT_EQ(message, std::string(1 + next[name]++ % 4092, message[0]));
    }
    for (std::thread& sender : senders) sender.join();
}

TEST_F(LocalQueue, SaysNoMoreThanTheTraceOnSuccess) {
    const LogCapture log;
    put(handle_, "message");
    get(handle_);
    EXPECT_TRUE(logged_exactly(library_lines(log, {kServiceTag}), {kEntered, kExiting, kEntered, kExiting}));
}

TEST_F(LocalQueue, PassesCodesOfPutOnWithoutASecondMessage) {
    const LogCapture log;
    EXPECT_EQ(tavo_msg_queue_put(handle_, nullptr, 1), 0x9002);
    EXPECT_EQ(put(handle_, std::string(TAVO_MSG_QUEUE_MAX_SIZE + 1, 'x')), 0x9305);
    {
        const AllocationFault fault(AllocationFault::kMalloc, 1);
        EXPECT_EQ(put(handle_, "x"), 0x9003);
    }
    TAVO_MessageQueue& queue = queue_of(handle_);
    const int write_end = std::exchange(queue.iWriteFd, 0);
    EXPECT_EQ(put(handle_, "x"), 0x9306);
    queue.iWriteFd = write_end;
    Lines expected;
    for (int i = 0; i < 4; ++i) expected = expected + Lines{kEntered, kExiting};
    EXPECT_TRUE(logged_exactly(library_lines(log, {kServiceTag}), expected));
}

TEST_F(LocalQueue, StoresTheSizeThatWasReceived) {
    put(handle_, "twelve bytes");
    unsigned char buffer[64] = {};
    unsigned int size = sizeof buffer;
    EXPECT_EQ(tavo_msg_queue_get(handle_, buffer, &size), TAVO_SUCCESS);
    EXPECT_EQ(size, 12U);
}

// What the platform's write() and read() fail with. A failed put is known to leak its frame.
int g_error;
void* g_frame;

template <typename Buffer>
ssize_t failing(int, Buffer, size_t) {
    errno = g_error;
    return -1;
}
void* remember_frame(size_t size) { return g_frame = malloc(size); }

struct Failure {
    const char* name;
    int error;
    const char* text;
    TAVO_Status of_put, of_get;
};

void PrintTo(const Failure& failure, std::ostream* out) { *out << failure.name; }

class LocalQueueFailing : public LocalQueue, public testing::WithParamInterface<Failure> {
protected:
    LocalQueueFailing() { g_error = GetParam().error; }
    static std::string error_in_hexadecimal() {
        char text[16];
        snprintf(text, sizeof text, "0x%x", static_cast<unsigned>(g_error));
        return text;
    }
};

TEST_P(LocalQueueFailing, PutSaysWhyAndTellsARemovedQueueApart) {
    const PlatformHook memory(kLibrary, "malloc", remember_frame);
    const PlatformHook hook(kLibrary, "write", failing<const void*>);
    const LogCapture log;
    EXPECT_EQ(put(handle_, "x"), GetParam().of_put);
    free(g_frame);
    EXPECT_TRUE(logged_exactly(library_lines(log),
                               Lines{kEntered,
                                     {6, kQueueTag, "++Entered\n"},
                                     {3, kQueueTag, std::string("write() error: ") + GetParam().text + "\n"},
                                     {6, kQueueTag, "--Exiting\n"},
                                     line(1, "Message send on MQ failed. errno is " + error_in_hexadecimal() + ".\n"),
                                     kExiting}));
}

TEST_P(LocalQueueFailing, GetSaysWhyAndTellsARemovedQueueApart) {
    const PlatformHook hook(kLibrary, "read", failing<void*>);
    const LogCapture log;
    unsigned char buffer[64] = {};
    unsigned int size = sizeof buffer;
    EXPECT_EQ(tavo_msg_queue_get(handle_, buffer, &size), GetParam().of_get);
    EXPECT_EQ(size, sizeof buffer);
    EXPECT_TRUE(logged_exactly(
        library_lines(log, {kServiceTag}),
        {kEntered, line(1, "Receive message from MQ failed. errno is " + error_in_hexadecimal() + ".\n"), kExiting}));
}

TEST_P(LocalQueueFailing, SaysTheSameWhenNothingElseIsLogged) {
    const PlatformHook memory(kLibrary, "malloc", remember_frame);
    const PlatformHook write_hook(kLibrary, "write", failing<const void*>);
    const PlatformHook read_hook(kLibrary, "read", failing<void*>);
    const LogCapture log(1);
    EXPECT_EQ(put(handle_, "x"), GetParam().of_put);
    free(g_frame);
    EXPECT_EQ(get(handle_), "status " + std::to_string(GetParam().of_get));
    const auto lines = library_lines(log, {kServiceTag});
    EXPECT_TRUE(
        logged_exactly(lines, {line(1, "Message send on MQ failed. errno is " + error_in_hexadecimal() + ".\n"),
                               line(1, "Receive message from MQ failed. errno is " + error_in_hexadecimal() + ".\n")}));
}

INSTANTIATE_TEST_SUITE_P(Errors, LocalQueueFailing,
                         testing::Values(Failure{"EIDRM", EIDRM, "Identifier removed", 0x9306, 0x9306},
                                         Failure{"EPIPE", EPIPE, "Broken pipe", -1, 0x9303},
                                         Failure{"EBADF", EBADF, "Bad file descriptor", -1, 0x9303}),
                         [](const auto& failure) { return std::string(failure.param.name); });

TEST_F(LocalQueue, RefusesToReceiveIntoNothing) {
    unsigned char buffer[64] = {};
    unsigned int size = sizeof buffer;
    put(handle_, "kept");
    errno = 0;
    const LogCapture log;
    EXPECT_EQ(tavo_msg_queue_get(handle_, nullptr, &size), 0x9303);
    EXPECT_EQ(tavo_msg_queue_get(handle_, buffer, nullptr), 0x9303);
    EXPECT_EQ(times_logged(log, "Receive message from MQ failed. errno is 0x0.\n"), 2U);
    EXPECT_EQ(get(handle_), "kept");
}

}  // namespace
