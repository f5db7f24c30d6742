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

struct Named : public RefBase {
    explicit Named(const String16& text) : name(text) {}
    const String16 name;
};

TEST(ReferenceCount, OrdersUseOnAnyThreadBeforeDestructionOnAnother) {
    constexpr int kRounds = 300;
    std::atomic<int> sum{0};
    for (int r = 0; r < kRounds; ++r) {
        // Each thread has a reference of its own, so the destructor runs on whichever comes last.
        sp<Shared> object = new Shared(sum);
        std::vector<std::thread> threads;
        for (size_t i = 0; i < 3; ++i) {
            threads.emplace_back([reference = object, i]() mutable {
                reference->values[i] = 1;
                reference.clear();
            });
        }
        object->values[3] = 1;
        object.clear();
        for (std::thread& thread : threads) thread.join();
    }
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

TEST(ReferenceCount, OrdersTheReadersOfACopiedStringBeforeItGoes) {
    for (int r = 0; r < 200; ++r) {
        sp<Named> object = new Named(String16("a text of its own"));
        std::vector<std::thread> threads;
        for (size_t i = 0; i < 3; ++i) {
            threads.emplace_back([copy = object->name]() mutable {
                EXPECT_EQ(copy.string()[2], u't');
                copy.setTo(String16());
            });
        }
        object.clear();
        for (std::thread& thread : threads) thread.join();
    }
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
