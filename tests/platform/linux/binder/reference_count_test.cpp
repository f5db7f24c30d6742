// Objects whose last reference goes on another thread than the one that used them.
//
// There is nothing to see without a sanitizer: ThreadSanitizer has to know that everything done to an object
// before a reference to it was dropped comes before its destruction.
#include <binder/Binder.h>
#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include "support/loopback_driver.h"

namespace {

using namespace android;

// Plain members, written by whoever holds a reference and read by the destructor.
class Shared : public BBinder {
public:
    explicit Shared(std::atomic<int>& sum) : sum_(sum) {}
    ~Shared() override {
        for (const int value : values) sum_ += value;
    }
    int values[4] = {};

private:
    std::atomic<int>& sum_;
};

TEST(ReferenceCount, OrdersUseOnAnyThreadBeforeDestructionOnAnother) {
    constexpr int kRounds = 500;
    std::atomic<int> sum{0};
    std::atomic<int> round{-1};
    std::atomic<int> done{0};
    std::vector<sp<Shared>> references(4);
    std::vector<std::thread> threads;
    for (size_t i = 0; i < references.size(); ++i) {
        threads.emplace_back([&, i] {
            for (int r = 0; r < kRounds; ++r) {
                while (round.load() < r) std::this_thread::yield();
                references[i]->values[i] = 1;
                references[i].clear();
                // Relaxed, so that nothing but the reference count orders the write above.
                done.fetch_add(1, std::memory_order_relaxed);
            }
        });
    }
    for (int r = 0; r < kRounds; ++r) {
        const sp<Shared> object = new Shared(sum);
        for (sp<Shared>& reference : references) reference = object;
        round.store(r);
        // This thread's own reference goes at any time, so the destructor runs on any of five threads.
        if (r % 2 != 0) std::this_thread::yield();
        const_cast<sp<Shared>&>(object).clear();
        while (done.load(std::memory_order_relaxed) < 4 * (r + 1)) std::this_thread::yield();
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(sum, 4 * kRounds);
}

TEST(ReferenceCount, OrdersUseBeforeDestructionWhenAWeakReferenceIsPromoted) {
    std::atomic<int> sum{0};
    for (int r = 0; r < 200; ++r) {
        sp<Shared> object = new Shared(sum);
        const wp<Shared> weak = object;
        std::thread user([&weak] {
            const sp<Shared> promoted = weak.promote();
            if (promoted != nullptr) promoted->values[0] = 1;
        });
        object.clear();
        user.join();
    }
    EXPECT_LE(sum, 200);
}

TEST(ReferenceCount, OrdersProxiesThatComeAndGo) {
    auto& driver = tavo::test::LoopbackDriver::open();
    const sp<BBinder> object = new BBinder;
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([&] {
            for (int r = 0; r < 300; ++r) {
                const sp<IBinder> proxy = driver.proxy(object);
                EXPECT_EQ(proxy->pingBinder(), NO_ERROR);
                EXPECT_EQ(proxy->getInterfaceDescriptor(), String16());
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(driver.counts().references, 0);
}

}  // namespace
