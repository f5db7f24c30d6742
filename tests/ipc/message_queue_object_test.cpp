// The queue object: its record and descriptors, and putting and getting whole messages.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <type_traits>
#include <vector>

#include "message_queue_test.h"
#include "support/platform_fault.h"
#include "support/process.h"

namespace {

using android::TAVO_MessageQueue;
using namespace tavo::test;

int refuse_pipe(int*, int) {
    errno = EMFILE;
    return -1;
}

int refuse_duplicate(int, int, ...) {
    errno = EMFILE;
    return -1;
}

bool is_open(int fd) { return fcntl(fd, F_GETFD) != -1; }

// Keeps descriptor 0 across a test that closes it.
class StandardInput {
public:
    StandardInput() : copy_(fcntl(0, F_DUPFD_CLOEXEC, 100)) {}
    ~StandardInput() {
        dup2(copy_, 0);
        close(copy_);
    }

private:
    int copy_;
};

// The record is read by whoever waits on several queues.
static_assert(std::is_standard_layout_v<TAVO_MessageQueue>);
static_assert(offsetof(TAVO_MessageQueue, iReadFd) == 0);
static_assert(offsetof(TAVO_MessageQueue, iWriteFd) == 4);
static_assert(offsetof(TAVO_MessageQueue, bMsg) == 8);
static_assert(offsetof(TAVO_MessageQueue, uiId) == 12);
static_assert(offsetof(TAVO_MessageQueue, acServiceName) == 16);
static_assert(sizeof(TAVO_MessageQueue) == 80);
static_assert(!std::is_polymorphic_v<TAVO_MessageQueue>);

TEST(MessageQueueConstructor, MakesAPipeThatStartedProgramsDoNotInherit) {
    const LogCapture log;
    TAVO_MessageQueue queue;
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, kExiting}));
    EXPECT_TRUE(queue.has_pipe());
    EXPECT_EQ(fcntl(queue.iReadFd, F_GETFD), FD_CLOEXEC);
    EXPECT_EQ(fcntl(queue.iWriteFd, F_GETFD), FD_CLOEXEC);
    EXPECT_EQ(fcntl(queue.iReadFd, F_GETFL) & O_ACCMODE, O_RDONLY);
    EXPECT_EQ(fcntl(queue.iWriteFd, F_GETFL) & O_ACCMODE, O_WRONLY);
    EXPECT_EQ(queue.bMsg, 0);
    EXPECT_EQ(queue.uiId, 0U);
    EXPECT_EQ(std::string(queue.acServiceName, 64), std::string(64, '\0'));
}

TEST(MessageQueueConstructor, PipeFailureLeavesBothDescriptorsZero) {
    const StandardInput kept;
    const LogCapture log;
    {
        const PlatformHook hook("libtavoosal.so", "pipe2", refuse_pipe);
        TAVO_MessageQueue queue;
        EXPECT_TRUE(logged_exactly(log.lines(),
                                   {kEntered, line(3, "Error while openning pipe: Unknown error -1\n"), kExiting}));
        EXPECT_FALSE(queue.has_pipe());
        EXPECT_EQ(queue.iReadFd, 0);
        EXPECT_EQ(queue.iWriteFd, 0);
        EXPECT_EQ(queue.bMsg, 0);
        EXPECT_EQ(queue.uiId, 0U);
    }
}

TEST(MessageQueueConstructor, NeverUsesDescriptorZeroForItsPipe) {
    const StandardInput kept;
    const size_t before = count_descriptors();
    {
        close(0);
        TAVO_MessageQueue queue;
        EXPECT_GT(queue.iReadFd, 0);
        EXPECT_GT(queue.iWriteFd, 0);
        EXPECT_EQ(fcntl(queue.iReadFd, F_GETFD), FD_CLOEXEC);
        EXPECT_FALSE(is_open(0));
        EXPECT_EQ(put(queue, "kept"), 0);
        EXPECT_EQ(get(queue), "kept");
    }
    EXPECT_EQ(count_descriptors(), before - 1);
}

TEST(MessageQueueConstructor, FailsWithoutLeakWhenDescriptorZeroCannotBeAvoided) {
    const StandardInput kept;
    const size_t before = count_descriptors();
    close(0);
    const PlatformHook hook("libtavoosal.so", "fcntl", refuse_duplicate);
    TAVO_MessageQueue queue;
    EXPECT_FALSE(queue.has_pipe());
    EXPECT_EQ(count_descriptors(), before - 1);
}

TEST(MessageQueueDestructor, ClosesBothEnds) {
    const size_t before = count_descriptors();
    LogCapture log;
    {
        const TAVO_MessageQueue queue;
        EXPECT_EQ(count_descriptors(), before + 2);
        log.clear();
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, kExiting}));
    EXPECT_EQ(count_descriptors(), before);
}

TEST(MessageQueueDestructor, ClosesTheReadEndFirstAndNothingNegative) {
    static std::vector<int> closed;
    closed.clear();
    auto whole = std::make_unique<TAVO_MessageQueue>();
    auto half = std::make_unique<TAVO_MessageQueue>();
    half->tavo_android_msg_queue_set_fd(-1);
    auto none = std::make_unique<TAVO_MessageQueue>();
    none->tavo_android_msg_queue_set_fd(0);
    none->tavo_android_msg_queue_set_write_fd(0);
    const std::vector<int> expected = {whole->iReadFd, whole->iWriteFd, half->iWriteFd, 0, 0};
    const PlatformHook hook(
        "libtavoosal.so", "close", +[](int fd) {
            closed.push_back(fd);
            return fd == 0 ? 0 : close(fd);
        });
    whole.reset();
    half.reset();
    none.reset();
    EXPECT_EQ(closed, expected);
}

TEST(MessageQueueDestructor, ClosesDescriptorZeroOfAQueueWithoutPipe) {
    const StandardInput kept;
    {
        const PlatformHook hook("libtavoosal.so", "pipe2", refuse_pipe);
        const TAVO_MessageQueue queue;
        EXPECT_TRUE(is_open(0));
    }
    EXPECT_FALSE(is_open(0));
}

TEST(MessageQueueDestructor, LeavesDisownedDescriptorsOpen) {
    const StandardInput kept;
    {
        const PlatformHook hook("libtavoosal.so", "pipe2", refuse_pipe);
        TAVO_MessageQueue queue;
        queue.disown_descriptors();
    }
    EXPECT_TRUE(is_open(0));
}

TEST(MessageQueuePut, RefusesANullMessage) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    EXPECT_EQ(queue.tavo_android_msg_queue_put(nullptr, 0), 0x9002);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, line(3, "pbMsg is NULL"), kExiting}));
}

TEST(MessageQueuePut, RefusesAnAbsentWriteEnd) {
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_write_fd(0);
    const LogCapture log;
    EXPECT_EQ(put(queue, "x"), 0x9306);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {kEntered, line(3, "write descriptor not initialized for message queue\n"), kExiting}));
    queue.disown_descriptors();
}

TEST(MessageQueuePut, RefusesOneByteTooManyAndWritesNothing) {
    TAVO_MessageQueue queue;
    const std::string message(409601, 'm');
    LogCapture log;
    EXPECT_EQ(put(queue, message), 0x9305);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, line(1, "Size to read is more than max size).\n"), kExiting}));
    EXPECT_EQ(pending(queue), 0);
}

TEST(MessageQueuePut, ChecksItsArgumentsInOrder) {
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_write_fd(0);
    EXPECT_EQ(queue.tavo_android_msg_queue_put(nullptr, 409601), 0x9002);
    EXPECT_EQ(put(queue, std::string(409601, 'm')), 0x9306);
    queue.disown_descriptors();
}

TEST(MessageQueuePut, ReportsAFailedAllocation) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    const PlatformHook hook(
        "libtavoosal.so", "malloc", +[](size_t) -> void* { return nullptr; });
    EXPECT_EQ(put(queue, "1234567890"), 0x9003);
    EXPECT_TRUE(logged_exactly(log.lines("MSGQUEUE"), {kEntered, line(1, "Malloc failed \n"), kExiting}));
    EXPECT_TRUE(tavo::test::logged(log.lines(), {1, "OSAL_MEM", "Memory not allocated. Size Requested: 14.\n"}));
}

void* g_block;
int g_frees;
void* remember_block(size_t size) { return g_block = malloc(size); }
void count_free(void* block) {
    ++g_frees;
    free(block);
}

TEST(MessageQueuePut, FreesItsBufferOnSuccess) {
    TAVO_MessageQueue queue;
    g_frees = 0;
    const PlatformHook free_hook("libtavoosal.so", "free", count_free);
    EXPECT_EQ(put(queue, "x"), 0);
    EXPECT_EQ(g_frees, 1);
}

TEST(MessageQueuePut, FreesItsBufferWhenItsThreadIsCancelled) {
    TAVO_MessageQueue queue;
    queue.uiRoomFor = 32;  // leaves the pipe at its size, so that the next put waits
    const std::string full(static_cast<size_t>(fcntl(queue.iWriteFd, F_GETPIPE_SZ)) - sizeof(uint32_t), 'f');
    ASSERT_EQ(put(queue, full), 0);
    g_frees = 0;
    const PlatformHook free_hook("libtavoosal.so", "free", count_free);
    pthread_t thread;
    const auto waiting_put = [](void* argument) -> void* {
        put(*static_cast<TAVO_MessageQueue*>(argument), "waits");
        return nullptr;
    };
    ASSERT_EQ(pthread_create(&thread, nullptr, waiting_put, &queue), 0);
    ASSERT_EQ(pthread_cancel(thread), 0);
    void* result = nullptr;
    ASSERT_EQ(pthread_join(thread, &result), 0);
    EXPECT_EQ(result, PTHREAD_CANCELED);
    EXPECT_EQ(g_frees, 1);
}

TEST(MessageQueuePut, ReportsAFailedWriteAndKeepsItsBuffer) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    g_frees = 0;
    const PlatformHook malloc_hook("libtavoosal.so", "malloc", remember_block);
    const PlatformHook free_hook("libtavoosal.so", "free", count_free);
    const PlatformHook write_hook(
        "libtavoosal.so", "write", +[](int, const void*, size_t) -> ssize_t {
            errno = EIDRM;
            return -1;
        });
    errno = 0;
    EXPECT_EQ(put(queue, "x"), -1);
    EXPECT_EQ(errno, EIDRM);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, line(3, "write() error: Identifier removed\n"), kExiting}));
    EXPECT_EQ(g_frees, 0);
    free(g_block);  // what this path is known to leak
}

TEST(MessageQueuePut, WritesALengthAndTheMessageAtOnce) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    static int writes;
    writes = 0;
    const PlatformHook hook(
        "libtavoosal.so", "write", +[](int fd, const void* data, size_t size) {
            ++writes;
            return write(fd, data, size);
        });
    EXPECT_EQ(put(queue, "abc"), 0);
    EXPECT_EQ(writes, 1);
    char frame[16] = {};
    ASSERT_EQ(read(queue.iReadFd, frame, sizeof frame), 7);
    uint32_t length = 0;
    memcpy(&length, frame, sizeof length);
    EXPECT_EQ(length, 3U);
    EXPECT_STREQ(frame + 4, "abc");
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, kExiting}));
}

TEST(MessageQueuePut, SendsABarePrefixForAnEmptyMessage) {
    TAVO_MessageQueue queue;
    EXPECT_EQ(put(queue, ""), 0);
    EXPECT_EQ(pending(queue), 4);
    EXPECT_EQ(get(queue), "");
}

TEST(MessageQueueGet, ReturnsMessagesInOrderAndTheirLengths) {
    TAVO_MessageQueue queue;
    EXPECT_EQ(put(queue, "first"), 0);
    EXPECT_EQ(put(queue, "2"), 0);
    queue.bMsg = 1;
    LogCapture log;
    unsigned char buffer[16];
    unsigned int size = 16;
    EXPECT_EQ(queue.tavo_android_msg_queue_get(buffer, &size), 5);
    EXPECT_EQ(size, 5U);
    EXPECT_EQ(memcmp(buffer, "first", 5), 0);
    EXPECT_EQ(queue.bMsg, 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {kGetEntered, line(4, "Going to Read message...\n "),
                                             line(4, "Reading message with lenghth 16 \n"),
                                             line(4, "Reading message with lenghth 5 \n"), kExiting}));
    EXPECT_EQ(get(queue), "2");
}

TEST(MessageQueueGet, RefusesNullArguments) {
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_service_name(bytes("7"));
    LogCapture log;
    unsigned char buffer[4];
    unsigned int size = 4;
    EXPECT_EQ(queue.tavo_android_msg_queue_get(nullptr, &size), -1);
    EXPECT_TRUE(logged_exactly(log.lines(), {kGetEntered, line(4, "msg is NULL for Service(7)"), kExiting}));
    log.clear();
    EXPECT_EQ(queue.tavo_android_msg_queue_get(buffer, nullptr), -1);
    EXPECT_TRUE(logged_exactly(log.lines(), {kGetEntered, line(4, "msg is NULL for Service(7)"), kExiting}));
}

TEST(MessageQueueGet, RefusesAnAbsentReadEnd) {
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_fd(0);
    queue.tavo_android_msg_queue_set_service_name(bytes("7"));
    const LogCapture log;
    unsigned char buffer[4];
    unsigned int size = 4;
    EXPECT_EQ(queue.tavo_android_msg_queue_get(buffer, &size), -1);
    EXPECT_EQ(size, 4U);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {kGetEntered, line(6, "read descriptor not initialized for message queue(7) \n"), kExiting}));
    queue.disown_descriptors();
}

TEST(MessageQueueSetters, CloseWhatTheyReplace) {
    TAVO_MessageQueue queue, other;
    const int old_read = queue.iReadFd;
    const int old_write = queue.iWriteFd;
    const LogCapture log;
    queue.tavo_android_msg_queue_set_fd(fcntl(other.iReadFd, F_DUPFD_CLOEXEC, 100));
    queue.tavo_android_msg_queue_set_write_fd(fcntl(other.iWriteFd, F_DUPFD_CLOEXEC, 100));
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, kExiting, kEntered, kExiting}));
    EXPECT_FALSE(is_open(old_read));
    EXPECT_FALSE(is_open(old_write));
    EXPECT_EQ(queue.tavo_android_msg_queue_get_fd(), queue.iReadFd);
    EXPECT_EQ(queue.tavo_android_msg_queue_get_write_fd(), queue.iWriteFd);
    EXPECT_EQ(put(other, "shared"), 0);
    EXPECT_EQ(get(queue), "shared");
}

TEST(MessageQueueSetters, TakeOnlyMinusOneAsNothingToClose) {
    const StandardInput kept;
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_fd(-1);
    queue.tavo_android_msg_queue_set_write_fd(-1);
    static int closes;
    closes = 0;
    {
        const PlatformHook hook(
            "libtavoosal.so", "close", +[](int fd) {
                ++closes;
                return close(fd);
            });
        queue.tavo_android_msg_queue_set_fd(0);
        queue.tavo_android_msg_queue_set_write_fd(-1);
        EXPECT_EQ(closes, 0);
        queue.tavo_android_msg_queue_set_fd(-1);
        EXPECT_EQ(closes, 1);
    }
    EXPECT_FALSE(is_open(0));
}

TEST(MessageQueueAccessors, StoreAndLogNothing) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    EXPECT_EQ(queue.tavo_android_msg_queue_set_id(7), 0);
    EXPECT_EQ(queue.uiId, 7U);
    queue.tavo_android_msg_queue_set_msg(1);
    EXPECT_EQ(queue.bMsg, 1);
    EXPECT_EQ(queue.tavo_android_msg_queue_set_service_name(bytes("name")), 0);
    EXPECT_STREQ(queue.tavo_android_msg_queue_get_service_name(), "name");
    EXPECT_EQ(queue.tavo_android_msg_queue_get_service_name(), queue.acServiceName);
    EXPECT_EQ(queue.tavo_android_msg_queue_get_fd(), queue.iReadFd);
    EXPECT_EQ(queue.tavo_android_msg_queue_get_write_fd(), queue.iWriteFd);
    EXPECT_TRUE(log.lines().empty());
}

TEST(MessageQueueServiceName, PadsAShorterNameWithZeros) {
    TAVO_MessageQueue queue;
    queue.tavo_android_msg_queue_set_service_name(bytes(std::string(64, 'l').c_str()));
    queue.tavo_android_msg_queue_set_service_name(bytes("s"));
    EXPECT_EQ(std::string(queue.acServiceName, 64), "s" + std::string(63, '\0'));
}

TEST(MessageQueueServiceName, KeepsSixtyFourCharactersWithoutTerminator) {
    TAVO_MessageQueue queue;
    const std::string name(70, 'n');
    EXPECT_EQ(queue.tavo_android_msg_queue_set_service_name(bytes(name.c_str())), 0);
    EXPECT_EQ(std::string(queue.acServiceName, 64), std::string(64, 'n'));
    const LogCapture log;
    EXPECT_EQ(queue.tavo_android_msg_queue_get(nullptr, nullptr), -1);
    EXPECT_TRUE(tavo::test::logged(log.lines(), line(4, "msg is NULL for Service(" + std::string(64, 'n') + ")")));
}

TEST(MessageQueueServiceName, RefusesNull) {
    TAVO_MessageQueue queue;
    const LogCapture log;
    EXPECT_EQ(queue.tavo_android_msg_queue_set_service_name(nullptr), 0x9002);
    EXPECT_TRUE(logged_exactly(log.lines(), {line(1, "Invalid pointer passed pcName\n")}));
}

}  // namespace
