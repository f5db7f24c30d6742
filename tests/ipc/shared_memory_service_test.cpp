// What the C functions ask of the service, and what they make of answers that the real one hardly ever gives.
#include <binder/IMemory.h>
#include <binder/IServiceManager.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <functional>
#include <new>
#include <string>
#include <vector>

#include "ipc/ITavoBinder.h"
#include "ipc/shared_memory_test.h"
#include "support/log_capture.h"
#include "tavo_osal/shared_memory.h"

namespace {

using android::IMemoryHeap;
using android::sp;
using tavo::test::count_text;
using tavo::test::LogCapture;
using tavo::test::logged;
using tavo::test::make_handle;

constexpr auto& kTag = tavo::test::kSharedMemoryTag;
constexpr auto& kCountTag = tavo::test::kHeapCountTag;
void* const kUntouched = reinterpret_cast<void*>(0x5A5A);

using Base = std::function<void*()>;

class FakeHeap : public android::BnMemoryHeap {
public:
    explicit FakeHeap(Base base) : base_(std::move(base)) {}
    int getHeapID() const override { return -1; }
    void* getBase() const override { return base_(); }
    size_t getSize() const override { return 0; }
    uint32_t getFlags() const override { return 0; }
    uint32_t getOffset() const override { return 0; }

private:
    const Base base_;
};

class FakeService : public android::BnTavoBinder {
public:
    sp<IMemoryHeap> get_shared_mem(int key, int size) override {
        calls.push_back("get " + std::to_string(key) + " " + std::to_string(size));
        if (meanwhile) meanwhile();
        return heap;
    }
    int delete_shared_mem(int key) override {
        calls.push_back("delete " + std::to_string(key));
        return result;
    }
    int get_fd(int) override { return -1; }
    int get_write_fd(int) override { return -1; }
    int create_message_queue(int) override { return -1; }
    int delete_message_queue(int) override { return -1; }

    std::vector<std::string> calls;
    std::function<void()> meanwhile;  // what happens in the process while the service is asked for a block
    sp<IMemoryHeap> heap;
    int result = 0;
};

using Calls = std::vector<std::string>;

class SharedMemoryService : public testing::Test {
protected:
    void SetUp() override {
        ASSERT_EQ(mkdir("/sdcard/com.zorla.qirserver", 0777), 0);
        close(open("/sdcard/com.zorla.qirserver/android.tavo.osal", O_RDWR | O_CREAT, 0777));
        const android::String16 name("android.tavo.osal");
        ASSERT_EQ(android::defaultServiceManager()->addService(name, service_), android::NO_ERROR);
    }

    // Acquiring fails, and has changed nothing here.
    void expect_failure(uint32_t key, uint32_t size) {
        TavoShmHandle handle = {key, size};
        void* address = kUntouched;
        const LogCapture log;
        EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_FAILURE);
        EXPECT_EQ(address, kUntouched);
        EXPECT_TRUE(log.lines(kCountTag).empty());
        EXPECT_TRUE(logged(
            log.lines(),
            {1, kTag, "No shared memory for key " + std::to_string(key) + ", size " + std::to_string(size) + "\n"}));
    }

    const sp<FakeService> service_ = new FakeService;
};

TEST_F(SharedMemoryService, IsAskedForTheKeyAndSizeAsSignedNumbers) {
    expect_failure(7, 100);
    expect_failure(UINT32_MAX, 0x80000000U);
    EXPECT_EQ(service_->calls, (Calls{"get 7 100", "get -1 -2147483648"}));
}

TEST_F(SharedMemoryService, ThatHasNoHeapIsLeftAsItIs) {
    expect_failure(7, 100);
    EXPECT_EQ(service_->calls, Calls{"get 7 100"});
}

TEST_F(SharedMemoryService, GetsItsUseBackForAHeapThatIsNotMapped) {
    service_->heap = new FakeHeap([] { return MAP_FAILED; });
    expect_failure(7, 100);
    service_->heap = new FakeHeap([] { return nullptr; });
    expect_failure(8, 100);
    EXPECT_EQ(service_->calls, (Calls{"get 7 100", "delete 7", "get 8 100", "delete 8"}));
}

TEST_F(SharedMemoryService, GetsItsUseBackWhenThereIsNoMemoryToMapTheHeap) {
    service_->heap = new FakeHeap([]() -> void* { throw std::bad_alloc(); });
    expect_failure(7, 100);
    EXPECT_EQ(service_->calls, (Calls{"get 7 100", "delete 7"}));
}

TEST_F(SharedMemoryService, IsNotAskedOnceTheTableIsFull) {
    static char memory[TAVO_SHM_MAX_ACQUIRED + 1];
    TavoShmHandle handle = {7, 100};
    void* address = nullptr;
    for (int i = 0; i < TAVO_SHM_MAX_ACQUIRED; ++i) {
        service_->heap = new FakeHeap([i] { return &memory[i]; });
        ASSERT_EQ(tavo_shm_acquire(&handle, &address), TAVO_SUCCESS);
        EXPECT_EQ(address, &memory[i]);
    }
    service_->calls.clear();
    address = kUntouched;
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_NO_MEMORY);
    EXPECT_EQ(address, kUntouched);
    EXPECT_EQ(service_->calls, Calls{});
    for (char& base : memory) EXPECT_EQ(tavo_shm_release(&base), TAVO_SUCCESS);
}

// The places that are left belong to the acquisitions that have already begun.
TEST_F(SharedMemoryService, IsNotAskedForMoreBlocksThanThereWillBePlaces) {
    static char memory;
    service_->heap = new FakeHeap([] { return &memory; });
    TavoShmHandle handle = {7, 100};
    void* address = nullptr;
    for (int i = 0; i < TAVO_SHM_MAX_ACQUIRED - 1; ++i) ASSERT_EQ(tavo_shm_acquire(&handle, &address), TAVO_SUCCESS);
    TAVO_Status other = TAVO_SUCCESS;
    service_->meanwhile = [&other] {
        TavoShmHandle other_handle = {8, 100};
        void* other_address = nullptr;
        other = tavo_shm_acquire(&other_handle, &other_address);
    };
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_SUCCESS);
    EXPECT_EQ(other, TAVO_NO_MEMORY);

    // One that fails gives its place back.
    service_->meanwhile = nullptr;
    service_->heap = nullptr;
    EXPECT_EQ(tavo_shm_release(&memory), TAVO_SUCCESS);
    expect_failure(7, 100);
    service_->heap = new FakeHeap([] { return &memory; });
    EXPECT_EQ(tavo_shm_acquire(&handle, &address), TAVO_SUCCESS);
    for (int i = 0; i < TAVO_SHM_MAX_ACQUIRED; ++i) EXPECT_EQ(tavo_shm_release(&memory), TAVO_SUCCESS);
}

TEST_F(SharedMemoryService, IsNotTouchedByARelease) {
    static char memory;
    service_->heap = new FakeHeap([] { return &memory; });
    TavoShmHandle handle = {7, 100};
    void* address = nullptr;
    ASSERT_EQ(tavo_shm_acquire(&handle, &address), TAVO_SUCCESS);
    service_->calls.clear();
    const LogCapture log;
    EXPECT_EQ(tavo_shm_release(address), TAVO_SUCCESS);
    EXPECT_EQ(service_->calls, Calls{});
    EXPECT_TRUE(logged(log.lines(), {3, kCountTag, count_text("--", 0)}));
    // The reference is gone: nobody but the service has the heap.
    EXPECT_EQ(service_->heap->getStrongCount(), 1);
}

TEST_F(SharedMemoryService, HasItsResultReturnedByDelete) {
    for (const int result : {0, -1, static_cast<int>(TAVO_FAILURE), 12345}) {
        service_->result = result;
        EXPECT_EQ(tavo_shm_delete(make_handle(0xFFFFFFFBU, 100)), result);
    }
    EXPECT_EQ(service_->calls, (Calls{"delete -5", "delete -5", "delete -5", "delete -5"}));
}

}  // namespace
