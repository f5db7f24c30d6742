// The service under many threads, as a binder thread pool runs it.
#include <atomic>
#include <functional>
#include <thread>
#include <vector>

#include "ipc/descriptors.h"
#include "ipc/osal_service_test.h"
#include "support/process.h"

namespace {

using android::IMemoryHeap;
using android::sp;
using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::is_open;

constexpr int kThreads = 8;
constexpr int kRounds = 200;
constexpr int kKeys = 3;

class OsalServiceThreads : public tavo::test::OsalServiceTest {
protected:
    OsalServiceThreads() { start(1, 1); }

    static void on_all_threads(const std::function<void(int thread)>& work) {
        std::vector<std::thread> threads;
        for (int i = 0; i < kThreads; ++i) threads.emplace_back(work, i);
        for (std::thread& thread : threads) thread.join();
    }
};

TEST_F(OsalServiceThreads, KeepAQueueForAsLongAsOneUsesIt) {
    const size_t descriptors = count_descriptors();
    std::atomic<int> failures{0};
    on_all_threads([&](int thread) {
        for (int round = 0; round < kRounds; ++round) {
            const int key = 1 + (thread + round) % kKeys;
            if (service_->create_message_queue(key) < 0) ++failures;
            const int read_end = service_->get_fd(key);
            if (!is_open(read_end) || service_->get_write_fd(key) < 0) ++failures;
            if (service_->get_fd(key) != read_end) ++failures;
            if (service_->delete_message_queue(key) != 0) ++failures;
        }
    });
    EXPECT_EQ(failures, 0);
    for (int key = 1; key <= kKeys; ++key) EXPECT_EQ(service_->delete_message_queue(key), -1);
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(service_->create_message_queue(9), 0);
}

TEST_F(OsalServiceThreads, LoseNoUseOfAQueue) {
    on_all_threads([&](int) {
        for (int round = 0; round < kRounds; ++round) service_->create_message_queue(1 + round % kKeys);
    });
    for (int key = 1; key <= kKeys; ++key) {
        int uses = kThreads * (kRounds / kKeys + (key <= kRounds % kKeys ? 1 : 0));
        const int read_end = service_->get_fd(key);
        for (; uses > 1; --uses) EXPECT_EQ(service_->delete_message_queue(key), 0);
        EXPECT_TRUE(is_open(read_end));
        EXPECT_EQ(service_->delete_message_queue(key), 0);
        EXPECT_FALSE(is_open(read_end));
    }
}

TEST_F(OsalServiceThreads, KeepABlockForAsLongAsOneUsesIt) {
    std::atomic<int> failures{0};
    on_all_threads([&](int thread) {
        for (int round = 0; round < kRounds; ++round) {
            const int key = 1 + (thread + round) % kKeys;
            const sp<IMemoryHeap> first = service_->get_shared_mem(key, 100);
            const sp<IMemoryHeap> second = service_->get_shared_mem(key, 200);
            if (first == nullptr || first != second) ++failures;
            if (service_->delete_shared_mem(key) != 0 || service_->delete_shared_mem(key) != 0) ++failures;
        }
    });
    EXPECT_EQ(failures, 0);
    EXPECT_EQ(count_mappings(0, "SharedMemory_"), 0U);
}

TEST_F(OsalServiceThreads, ShareTheHeapTableAmongServices) {
    const sp<android::TavoOsalService> other = new android::TavoOsalService;
    ASSERT_EQ(other->TavoOsalServiceInit(1, 1), 0);
    std::atomic<int> failures{0};
    on_all_threads([&](int thread) {
        const sp<android::TavoOsalService>& service = thread % 2 == 0 ? service_ : other;
        for (int round = 0; round < kRounds; ++round) {
            if (service->get_shared_mem(1 + thread, 100) == nullptr) ++failures;
            if (service->delete_shared_mem(1 + thread) != 0) ++failures;
        }
    });
    EXPECT_EQ(failures, 0);
    EXPECT_EQ(count_mappings(0, "SharedMemory_"), 0U);
}

TEST_F(OsalServiceThreads, AreAnsweredWhileTheTablesGo) {
    on_all_threads([&](int thread) {
        for (int round = 0; round < kRounds; ++round) {
            if (thread == 0 && round % 20 == 0) service_->TavoOsalServiceDeInit();
            if (thread == 0 && round % 20 == 10) service_->TavoOsalServiceInit(1, 1);
            service_->create_message_queue(1);
            service_->get_write_fd(1);
            service_->delete_message_queue(1);
            service_->get_shared_mem(1, 10);
            service_->delete_shared_mem(1);
        }
    });
    start();
    EXPECT_EQ(service_->create_message_queue(7), 0);
}

}  // namespace
