// The news that an object's process died.
#include <binder/BpBinder.h>
#include <binder/ProcessState.h>
#include <gtest/gtest.h>

#include <functional>
#include <thread>
#include <vector>

#include "support/loopback_driver.h"

namespace {

using namespace android;
using tavo::test::LoopbackDriver;

sp<BBinder> plain_object() { return new BBinder; }

class Recipient : public IBinder::DeathRecipient {
public:
    void binderDied(const wp<IBinder>& who) override {
        ++told;
        last = who;
        if (on_death) on_death();
    }
    int told = 0;
    wp<IBinder> last;
    std::function<void()> on_death;
};

TEST(Death, IsToldToEveryRecipientOnce) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(plain_object());
    const int32_t handle = proxy->remoteBinder()->handle();
    const sp<Recipient> first = new Recipient;
    const sp<Recipient> second = new Recipient;
    EXPECT_EQ(proxy->linkToDeath(first), NO_ERROR);
    EXPECT_EQ(proxy->linkToDeath(second), NO_ERROR);
    EXPECT_EQ(driver.counts().requests, 1) << "one for all";
    driver.kill(handle);
    EXPECT_EQ(first->told, 1);
    EXPECT_EQ(second->told, 1);
    EXPECT_TRUE(first->last == proxy);
    EXPECT_FALSE(proxy->isBinderAlive());
    EXPECT_EQ(proxy->pingBinder(), DEAD_OBJECT);
    proxy->remoteBinder()->sendObituary();
    EXPECT_EQ(first->told, 1);
}

TEST(Death, CannotBeLinkedToAfterwards) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> told = driver.proxy(plain_object());
    const sp<IBinder> untold = driver.proxy(plain_object());
    const sp<Recipient> recipient = new Recipient;
    told->linkToDeath(recipient);
    driver.kill(told->remoteBinder()->handle());
    driver.kill(untold->remoteBinder()->handle());
    EXPECT_EQ(told->linkToDeath(recipient), DEAD_OBJECT);
    EXPECT_EQ(told->unlinkToDeath(recipient), DEAD_OBJECT);
    EXPECT_EQ(untold->linkToDeath(recipient), DEAD_OBJECT) << "the driver knows";
    EXPECT_EQ(untold->unlinkToDeath(recipient), NAME_NOT_FOUND) << "the failed link left nothing";
    EXPECT_EQ(recipient->told, 1);
}

TEST(Death, NeedsARecipient) {
    EXPECT_EQ(LoopbackDriver::open().proxy(plain_object())->linkToDeath(nullptr), BAD_VALUE);
}

TEST(Death, IsNotToldAfterUnlinking) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(plain_object());
    const sp<Recipient> first = new Recipient;
    const sp<Recipient> second = new Recipient;
    proxy->linkToDeath(first);
    proxy->linkToDeath(second);
    EXPECT_EQ(proxy->unlinkToDeath(first), NO_ERROR);
    EXPECT_EQ(driver.counts().notifications, 1);
    EXPECT_EQ(proxy->unlinkToDeath(first), NAME_NOT_FOUND);
    EXPECT_EQ(proxy->unlinkToDeath(second), NO_ERROR);
    EXPECT_EQ(driver.counts().notifications, 0) << "taken back with the last link";
    EXPECT_EQ(proxy->linkToDeath(second), NO_ERROR);
    EXPECT_EQ(driver.counts().requests, 2);
    driver.kill(proxy->remoteBinder()->handle());
    EXPECT_EQ(first->told, 0);
    EXPECT_EQ(second->told, 1);
}

TEST(Death, IsUnlinkedByRecipientOrByCookieAndByFlags) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(plain_object());
    const sp<Recipient> recipient = new Recipient;
    int first = 0, second = 0;
    proxy->linkToDeath(recipient, &first, 0);
    proxy->linkToDeath(recipient, &second, 5);
    wp<IBinder::DeathRecipient> found;
    EXPECT_EQ(proxy->unlinkToDeath(recipient, nullptr, 4), NAME_NOT_FOUND);
    EXPECT_EQ(proxy->unlinkToDeath(nullptr, &second, 0, &found), NAME_NOT_FOUND);
    EXPECT_EQ(found, nullptr);
    EXPECT_EQ(proxy->unlinkToDeath(nullptr, &second, 5, &found), NO_ERROR);
    EXPECT_TRUE(found == recipient);
    EXPECT_EQ(proxy->unlinkToDeath(recipient, &second, 0), NO_ERROR) << "with a recipient the cookie does not matter";
    EXPECT_EQ(driver.counts().notifications, 0);
}

TEST(Death, IsNotToldToARecipientThatIsGone) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(plain_object());
    sp<Recipient> gone = new Recipient;
    const sp<Recipient> stays = new Recipient;
    proxy->linkToDeath(gone);
    proxy->linkToDeath(stays);
    gone.clear();
    driver.kill(proxy->remoteBinder()->handle());
    EXPECT_EQ(stays->told, 1);
}

TEST(Death, IsToldWithoutALock) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(plain_object());
    const sp<Recipient> recipient = new Recipient;
    const sp<Recipient> other = new Recipient;
    recipient->on_death = [&] {
        EXPECT_EQ(proxy->linkToDeath(other), DEAD_OBJECT);
        EXPECT_EQ(proxy->unlinkToDeath(recipient), DEAD_OBJECT);
        EXPECT_EQ(proxy->getInterfaceDescriptor(), String16());
        EXPECT_NE(driver.proxy(plain_object()), nullptr);
    };
    proxy->linkToDeath(recipient);
    driver.kill(proxy->remoteBinder()->handle());
    EXPECT_EQ(recipient->told, 1);
}

TEST(Death, IsNoLongerAskedForWhenTheProxyGoes) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<Recipient> recipient = new Recipient;
    int32_t handle = 0;
    {
        const sp<IBinder> proxy = driver.proxy(plain_object());
        handle = proxy->remoteBinder()->handle();
        proxy->linkToDeath(recipient);
        EXPECT_EQ(driver.counts().notifications, 1);
    }
    EXPECT_EQ(driver.counts().notifications, 0);
    driver.kill(handle);
    EXPECT_EQ(recipient->told, 0);
}

TEST(Death, IsToldOnceWhileThreadsLinkAndUnlink) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(plain_object());
    const sp<Recipient> stays = new Recipient;
    proxy->linkToDeath(stays);
    std::vector<std::thread> threads;
    for (int i = 0; i < 3; ++i) {
        threads.emplace_back([&] {
            for (int round = 0; round < 500; ++round) {
                const sp<Recipient> passing = new Recipient;
                if (proxy->linkToDeath(passing) == NO_ERROR) proxy->unlinkToDeath(passing);
            }
        });
    }
    driver.kill(proxy->remoteBinder()->handle());
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(stays->told, 1);
    EXPECT_EQ(driver.counts().notifications, 0);
}

}  // namespace
