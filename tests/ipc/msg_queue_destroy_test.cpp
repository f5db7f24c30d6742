// Giving queues back, in the server's own process.
#include <sys/mman.h>

#include <cstdint>
#include <new>

#include "ipc/descriptors.h"
#include "ipc/msg_queue_test.h"
#include "support/platform_fault.h"

namespace {

using tavo::test::attached;
using tavo::test::get;
using tavo::test::is_open;
using tavo::test::kEntered;
using tavo::test::kExiting;
using tavo::test::kLibrary;
using tavo::test::kLookup;
using tavo::test::kLookupBegins;
using tavo::test::kOperatorNew;
using tavo::test::kQueueTrace;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::Lines;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;
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

// Where memory is handed out from the top of a 32-bit address space down, queues lie in its upper half.
constexpr size_t kBlockSize = 4096;
int g_high_blocks = 0;
// The allocator's own blocks may lie there as well, but never begin with a page.
bool is_high(uintptr_t address) { return address > INT32_MAX && address % kBlockSize == 0; }
void* allocate_high(size_t size, const std::nothrow_t& tag) {
    if (size != sizeof(android::TAVO_MessageQueue)) return operator new(size, tag);
    void* wish = reinterpret_cast<void*>(uintptr_t{0xA0000000});
    void* block = mmap(wish, kBlockSize, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    EXPECT_TRUE(is_high(reinterpret_cast<uintptr_t>(block)));
    ++g_high_blocks;
    return block;
}
void free_high(void* block, size_t) {
    if (!is_high(reinterpret_cast<uintptr_t>(block))) return operator delete(block);
    EXPECT_EQ(munmap(block, kBlockSize), 0);
    --g_high_blocks;
}

TEST_F(Destroy, TakesBackAQueueInTheUpperHalfOf32BitAddresses) {
    if (sizeof(void*) > 4) GTEST_SKIP() << "there are more addresses here";
    const PlatformHook allocate(kLibrary, (std::string(kOperatorNew) + "RKSt9nothrow_t").c_str(), &allocate_high);
    const PlatformHook release(kLibrary, "_ZdlPvj", &free_high);
    const TAVO_INT64 handle = attached("7");
    EXPECT_EQ(g_high_blocks, 2) << "the handle's, and the service's own";
    EXPECT_EQ(handle, static_cast<TAVO_INT64>(reinterpret_cast<uintptr_t>(&queue_of(handle))));
    EXPECT_GT(handle, INT32_MAX);
    EXPECT_EQ(put(handle, "high"), TAVO_SUCCESS);
    EXPECT_EQ(get(handle), "high");
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_EQ(g_high_blocks, 0) << "the queue is gone";
    EXPECT_EQ(service_->get_fd(7), -1);
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
