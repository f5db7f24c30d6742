// What a client that means harm can do to the service, and to the clients beside it, with calls that are well-formed.
#include <binder/IServiceManager.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <filesystem>
#include <iostream>
#include <memory>
#include <vector>

#include "ipc/ITavoBinder.h"
#include "ipc/descriptors.h"
#include "ipc/log_lines.h"
#include "ipc/server.h"
#include "support/eventually.h"
#include "tavo_osal/status.h"

namespace {

using android::IMemoryHeap;
using android::ITavoBinder;
using android::sp;
using android::String16;
using tavo::test::comes_true;
using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::LogCapture;
using tavo::test::Process;
using tavo::test::Server;

constexpr int kKey = 7;
constexpr int kFirstOther = 1000;

sp<ITavoBinder> find_service() {
    return ITavoBinder::asInterface(android::defaultServiceManager()->checkService(String16("android.tavo.osal")));
}

class HostileClient : public testing::Test {
protected:
    HostileClient() {
        std::filesystem::remove_all(tavo::test::kMarkerDirectory);
        server_ = std::make_unique<Server>();
        service_ = find_service();
    }
    void SetUp() override { ASSERT_NE(service_, nullptr); }
    // Whatever happened, the server is there and leaves nothing behind.
    void TearDown() override { EXPECT_EQ(server_->exit(), 0); }

    // The server may have a hundred descriptors from now on.
    void limit_descriptors() {
        // Sanitizers need descriptors of their own when they meet a class for the first time.
        service_->get_shared_mem(kKey, 100);
        service_->delete_shared_mem(kKey);
        server_->take_descriptors();
        server_->give_descriptors();
    }
    size_t mappings_of_blocks() const { return count_mappings(server_->pid(), "SharedMemory_"); }

    const LogCapture log_;
    std::unique_ptr<Server> server_;
    sp<ITavoBinder> service_;
};

// One message through the queue's pipe, by its ends.
void expect_to_carry(int read_end, int write_end) {
    EXPECT_EQ(write(write_end, "x", 1), 1);
    char received = 0;
    EXPECT_EQ(read(read_end, &received, 1), 1);
    EXPECT_EQ(received, 'x');
}

TEST_F(HostileClient, MakesQueuesWithoutEnd) {
    limit_descriptors();
    ASSERT_EQ(service_->create_message_queue(kKey), 0);
    int made = 0;
    while (made < 200 && service_->create_message_queue(kFirstOther + made) >= 0) ++made;
    EXPECT_GT(made, 10);
    EXPECT_LT(made, 50) << "a queue takes two descriptors";
    EXPECT_EQ(service_->create_message_queue(kKey), 0) << "a queue that is there already is found";
    const int read_end = service_->get_fd(kKey);
    const int write_end = service_->get_write_fd(kKey);
    expect_to_carry(read_end, write_end);
    close(read_end);
    close(write_end);
    for (int i = 0; i < made; ++i) EXPECT_EQ(service_->delete_message_queue(kFirstOther + i), 0);
    EXPECT_GE(service_->create_message_queue(kFirstOther), 0) << "and there is room again";
}

TEST_F(HostileClient, DeletesTheQueuesOfOthers) {
    ASSERT_EQ(service_->create_message_queue(kKey), 0);
    const int read_end = service_->get_fd(kKey);
    const int write_end = service_->get_write_fd(kKey);
    while (service_->delete_message_queue(kKey) == 0) {
    }
    EXPECT_EQ(service_->get_fd(kKey), -1) << "newcomers do not find it";
    expect_to_carry(read_end, write_end);
    close(read_end);
    close(write_end);
}

TEST_ROLE(uses_a_queue) {
    const bool made = find_service()->create_message_queue(kKey) >= 0;
    std::cout << "\n" << (made ? "made" : "failed") << std::endl;
    pause();
    return 0;
}

TEST_F(HostileClient, DiesWithoutGivingItsUsesBack) {
    Process client = Process::start("uses_a_queue");
    std::string line;
    for (int i = 0; i < 10 && line.empty(); ++i) line = client.read_line();
    ASSERT_EQ(line, "made");
    client.kill(SIGKILL);
    client.wait();
    EXPECT_NE(service_->get_fd(kKey), -1) << "nobody else knows whether its key is in use";
    EXPECT_EQ(service_->delete_message_queue(kKey), 0);
    EXPECT_EQ(service_->delete_message_queue(kKey), -1);
}

TEST_F(HostileClient, WantsHugeBlocks) {
    const size_t before = mappings_of_blocks();
    constexpr int kBlocks = 20;
    for (int i = 0; i < kBlocks; ++i) service_->get_shared_mem(kFirstOther + i, INT_MAX);
    // Where so many do not fit in the address space, the others are there all the same.
    const sp<IMemoryHeap> heap = service_->get_shared_mem(kKey, 100);
    ASSERT_NE(heap, nullptr);
    if (sizeof(void*) > 4) {
        ASSERT_NE(heap->getBase(), MAP_FAILED);
        *static_cast<int*>(heap->getBase()) = 4711;
    }
    for (int i = 0; i < kBlocks; ++i) EXPECT_EQ(service_->delete_shared_mem(kFirstOther + i), 0);
    EXPECT_EQ(service_->delete_shared_mem(kKey), 0);
    // The last one goes when this process no longer holds it.
    EXPECT_TRUE(comes_true([&] { return mappings_of_blocks() <= before + 1; })) << mappings_of_blocks();
}

TEST_F(HostileClient, WantsBlocksOfBadSizes) {
    for (const int size : {0, -1, INT_MIN, INT_MIN + 1, -4096}) {
        EXPECT_EQ(service_->get_shared_mem(kKey, size), nullptr) << size;
    }
    EXPECT_EQ(mappings_of_blocks(), 0U);
}

TEST_F(HostileClient, MakesBlocksWithoutEnd) {
    limit_descriptors();
    const sp<IMemoryHeap> heap = service_->get_shared_mem(kKey, 100);
    ASSERT_NE(heap, nullptr);
    ASSERT_NE(heap->getBase(), MAP_FAILED);
    *static_cast<int*>(heap->getBase()) = 4711;
    constexpr int kBlocks = 200;
    int mapped = 0;
    for (int i = 0; i < kBlocks; ++i) {
        const sp<IMemoryHeap> other = service_->get_shared_mem(kFirstOther + i, 100);
        if (other != nullptr && other->getBase() != MAP_FAILED) ++mapped;
    }
    EXPECT_GT(mapped, 10);
    EXPECT_LT(mapped, 100) << "a block takes a descriptor";
    const sp<IMemoryHeap> again = service_->get_shared_mem(kKey, 100);
    ASSERT_NE(again, nullptr);
    EXPECT_EQ(*static_cast<int*>(again->getBase()), 4711) << "the block that was there is there";
    for (int i = 0; i < kBlocks; ++i) EXPECT_EQ(service_->delete_shared_mem(kFirstOther + i), 0);
    const sp<IMemoryHeap> next = service_->get_shared_mem(kFirstOther, 100);
    ASSERT_NE(next, nullptr);
    EXPECT_NE(next->getBase(), MAP_FAILED) << "and there is room again";
}

TEST_F(HostileClient, MakesBlocksThatStayForEver) {
    const size_t before = count_descriptors(server_->pid());
    for (int key = -1; key >= -10; --key) EXPECT_NE(service_->get_shared_mem(key, 100), nullptr);
    for (int key = -1; key >= -10; --key) EXPECT_EQ(service_->delete_shared_mem(key), TAVO_FAILURE);
    EXPECT_GE(count_descriptors(server_->pid()), before + 10);
    EXPECT_EQ(mappings_of_blocks(), 10U);
}

TEST_F(HostileClient, CannotTakeABlocksMemoryAway) {
    const sp<IMemoryHeap> heap = service_->get_shared_mem(kKey, 100);
    ASSERT_NE(heap, nullptr);
    ASSERT_NE(heap->getBase(), MAP_FAILED);
    // Whoever touched memory that is gone would be ended, the service when it deletes the block.
    EXPECT_EQ(ftruncate(heap->getHeapID(), 0), -1);
    EXPECT_EQ(errno, EPERM);
    EXPECT_EQ(fcntl(heap->getHeapID(), F_ADD_SEALS, F_SEAL_WRITE), -1);
    EXPECT_EQ(service_->delete_shared_mem(kKey), 0);
}

}  // namespace
