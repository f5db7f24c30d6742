// Proxies: one per handle, and their calls.
#include <binder/BpBinder.h>
#include <binder/IPCThreadState.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <functional>
#include <thread>
#include <vector>

#include "support/log_capture.h"
#include "support/loopback_driver.h"

namespace {

using namespace android;
using tavo::test::LoopbackDriver;

// Does with a transaction what a test says.
class Scripted : public BBinder {
public:
    using Script = std::function<status_t(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags)>;
    explicit Scripted(Script script) : script_(std::move(script)) {}

    const String16& getInterfaceDescriptor() const override {
        static const String16& descriptor = *new String16("test.Scripted");
        return descriptor;
    }
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        if (code > LAST_CALL_TRANSACTION) return BBinder::onTransact(code, data, reply, flags);
        return script_(code, data, reply, flags);
    }
    status_t dump(int fd, const Vector<String16>& args) override {
        const String8 text(args[0]);
        return write(fd, text.string(), text.length()) > 0 ? NO_ERROR : UNKNOWN_ERROR;
    }

private:
    const Script script_;
};

sp<BBinder> plain_object() { return new BBinder; }

TEST(Proxy, IsOnePerHandleAndHoldsIt) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const int32_t handle = driver.publish(plain_object());
    {
        const sp<IBinder> first = ProcessState::self()->getStrongProxyForHandle(handle);
        const sp<IBinder> second = ProcessState::self()->getStrongProxyForHandle(handle);
        EXPECT_EQ(first, second);
        EXPECT_EQ(driver.references(handle), 1);
        EXPECT_EQ(first->remoteBinder()->handle(), handle);
        EXPECT_EQ(first->localBinder(), nullptr);
        EXPECT_NE(first, driver.proxy(plain_object()));
    }
    EXPECT_EQ(driver.counts().references, 0);
    const sp<IBinder> again = ProcessState::self()->getStrongProxyForHandle(handle);
    EXPECT_NE(again, nullptr);
    EXPECT_EQ(driver.references(handle), 1);
}

TEST(Proxy, OfAHandleThatCannotBeIsNull) {
    LoopbackDriver::open();
    EXPECT_EQ(ProcessState::self()->getStrongProxyForHandle(-1), nullptr);
    EXPECT_EQ(ProcessState::self()->getStrongProxyForHandle(INT32_MIN), nullptr);
}

TEST(Proxy, IsNotForgottenOnAnothersBehalf) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(plain_object());
    const int32_t handle = proxy->remoteBinder()->handle();
    ProcessState::self()->expungeHandle(handle, plain_object().get());
    EXPECT_EQ(ProcessState::self()->getStrongProxyForHandle(handle), proxy);
    ProcessState::self()->expungeHandle(handle + 1000, proxy.get());
    EXPECT_EQ(ProcessState::self()->getStrongProxyForHandle(handle), proxy);
}

TEST(Proxy, IsOneWhileThreadsTakeItAndLetItGo) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const int32_t handle = driver.publish(plain_object());
    std::atomic<int> wrong{0};
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([&] {
            for (int round = 0; round < 2000; ++round) {
                const sp<IBinder> first = ProcessState::self()->getStrongProxyForHandle(handle);
                const sp<IBinder> second = ProcessState::self()->getStrongProxyForHandle(handle);
                if (first != second || first->remoteBinder()->handle() != handle) ++wrong;
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(wrong, 0);
    EXPECT_EQ(driver.references(handle), 0);
}

TEST(ProxyCall, CarriesTheRequestAndTheReply) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(new Scripted([](uint32_t code, const Parcel& data, Parcel* reply, uint32_t) {
        return reply->writeInt32(static_cast<int32_t>(code) + data.readInt32());
    }));
    {
        Parcel data, reply;
        data.writeInt32(40);
        EXPECT_EQ(proxy->transact(2, data, &reply), NO_ERROR);
        EXPECT_EQ(reply.readInt32(), 42);
        EXPECT_EQ(proxy->transact(3, data, nullptr), NO_ERROR);
        EXPECT_EQ(driver.counts().buffers, 1) << "the reply";
        EXPECT_EQ(driver.counts().last_flags, 0U);
    }
    EXPECT_EQ(driver.counts().buffers, 0);
}

TEST(ProxyCall, CarriesObjectsBothWays) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<BBinder> mine = plain_object();
    const sp<BBinder> theirs = plain_object();
    sp<IBinder> received;
    const sp<IBinder> proxy = driver.proxy(new Scripted([&](uint32_t, const Parcel& data, Parcel* reply, uint32_t) {
        received = data.readStrongBinder();
        EXPECT_EQ(data.readStrongBinder(), theirs) << "sent home, an object is itself";
        EXPECT_EQ(data.readStrongBinder(), nullptr);
        return reply->writeStrongBinder(theirs);
    }));
    Parcel data, reply;
    data.writeStrongBinder(mine);
    data.writeStrongBinder(driver.proxy(theirs));
    data.writeStrongBinder(nullptr);
    EXPECT_EQ(proxy->transact(1, data, &reply), NO_ERROR);
    ASSERT_NE(received, nullptr);
    EXPECT_NE(received->remoteBinder(), nullptr);
    EXPECT_EQ(received, driver.proxy(mine));
    EXPECT_EQ(reply.readStrongBinder(), driver.proxy(theirs));
}

TEST(ProxyCall, MakesTheCallerKnownForAsLongAsItLasts) {
    LoopbackDriver& driver = LoopbackDriver::open();
    IPCThreadState* thread = IPCThreadState::self();
    const sp<IBinder> inner = driver.proxy(new Scripted([&](uint32_t, const Parcel&, Parcel*, uint32_t) {
        thread->clearCallingIdentity();  // not restored: that is this call's own affair
        thread->setStrictModePolicy(0x77);
        return NO_ERROR;
    }));
    const sp<IBinder> proxy = driver.proxy(new Scripted([&](uint32_t, const Parcel&, Parcel*, uint32_t flags) {
        EXPECT_EQ(thread->getCallingPid(), LoopbackDriver::kCaller.pid);
        EXPECT_EQ(thread->getCallingUid(), LoopbackDriver::kCaller.uid);
        EXPECT_EQ(thread->getLastTransactionBinderFlags(), static_cast<int32_t>(flags));
        const int64_t token = thread->clearCallingIdentity();
        EXPECT_EQ(thread->getCallingPid(), getpid());
        EXPECT_EQ(thread->getCallingUid(), getuid());
        thread->restoreCallingIdentity(token);
        EXPECT_EQ(thread->getCallingPid(), LoopbackDriver::kCaller.pid);
        thread->setStrictModePolicy(0x3);
        Parcel data, reply;
        inner->transact(1, data, &reply);
        EXPECT_EQ(thread->getCallingPid(), LoopbackDriver::kCaller.pid);
        EXPECT_EQ(thread->getCallingUid(), LoopbackDriver::kCaller.uid);
        EXPECT_EQ(thread->getStrictModePolicy(), 0x3);
        EXPECT_EQ(thread->getLastTransactionBinderFlags(), static_cast<int32_t>(flags));
        return NO_ERROR;
    }));
    Parcel data, reply;
    EXPECT_EQ(proxy->transact(1, data, &reply, 0x20), NO_ERROR);
    EXPECT_EQ(thread->getCallingPid(), getpid());
    EXPECT_EQ(thread->getStrictModePolicy(), 0);
    EXPECT_EQ(thread->getLastTransactionBinderFlags(), 0);
}

TEST(ProxyCall, WithAParcelInErrorIsNotMade) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(plain_object());
    const int before = driver.counts().transactions;
    Parcel data, reply;
    data.setError(NO_MEMORY);
    EXPECT_EQ(proxy->transact(1, data, &reply), NO_MEMORY);
    EXPECT_EQ(driver.counts().transactions, before);
}

TEST(ProxyCall, ReturnsTheObjectsStatusAndTheDrivers) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(
        new Scripted([](uint32_t, const Parcel&, Parcel*, uint32_t) { return static_cast<status_t>(-1234); }));
    Parcel data, reply;
    EXPECT_EQ(proxy->transact(1, data, &reply), -1234);
    data.writeFileDescriptor(-1);
    EXPECT_EQ(proxy->transact(1, data, &reply), FAILED_TRANSACTION);
    EXPECT_EQ(reply.dataSize(), 0U);
    EXPECT_TRUE(proxy->isBinderAlive());
}

TEST(ProxyCall, OnewayPassesTheFlag) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(new Scripted([](uint32_t, const Parcel&, Parcel* reply, uint32_t flags) {
        EXPECT_EQ(flags, uint32_t{IBinder::FLAG_ONEWAY});
        return reply->writeInt32(1);
    }));
    Parcel data;
    EXPECT_EQ(proxy->transact(1, data, nullptr, IBinder::FLAG_ONEWAY), NO_ERROR);
    EXPECT_EQ(driver.counts().last_flags, uint32_t{IBinder::FLAG_ONEWAY});
}

TEST(ProxyCall, AfterADeadObjectIsNotMadeAgain) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(plain_object());
    Parcel data, reply;
    driver.fail_with(FAILED_TRANSACTION);
    EXPECT_EQ(proxy->pingBinder(), FAILED_TRANSACTION);
    EXPECT_TRUE(proxy->isBinderAlive());
    driver.fail_with(DEAD_OBJECT);
    EXPECT_EQ(proxy->transact(1, data, &reply), DEAD_OBJECT);
    EXPECT_FALSE(proxy->isBinderAlive());
    driver.fail_with(NO_ERROR);
    const int before = driver.counts().transactions;
    EXPECT_EQ(proxy->pingBinder(), DEAD_OBJECT);
    EXPECT_EQ(driver.counts().transactions, before);
}

TEST(ProxyCall, Pings) {
    LoopbackDriver& driver = LoopbackDriver::open();
    EXPECT_EQ(driver.proxy(plain_object())->pingBinder(), NO_ERROR);
    class Sick : public BBinder {
        status_t pingBinder() override { return -77; }
    };
    EXPECT_EQ(driver.proxy(new Sick)->pingBinder(), -77);
    class Mute : public BBinder {
        status_t transact(uint32_t, const Parcel&, Parcel*, uint32_t) override { return NO_ERROR; }
    };
    EXPECT_EQ(driver.proxy(new Mute)->pingBinder(), NOT_ENOUGH_DATA);
}

TEST(ProxyCall, AsksForTheDescriptorOnce) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(new Scripted(nullptr));
    driver.fail_with(FAILED_TRANSACTION);
    EXPECT_EQ(proxy->getInterfaceDescriptor(), String16());
    driver.fail_with(NO_ERROR);
    const String16& descriptor = proxy->getInterfaceDescriptor();
    EXPECT_EQ(descriptor, String16("test.Scripted"));
    const int before = driver.counts().transactions;
    EXPECT_EQ(&proxy->getInterfaceDescriptor(), &descriptor);
    EXPECT_EQ(driver.counts().transactions, before);
}

TEST(ProxyCall, Dumps) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<IBinder> proxy = driver.proxy(new Scripted(nullptr));
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    Vector<String16> args;
    args.add(String16("hello"));
    EXPECT_EQ(proxy->dump(ends[1], args), NO_ERROR);
    char text[6] = {};
    EXPECT_EQ(read(ends[0], text, 5), 5);
    EXPECT_STREQ(text, "hello");
    close(ends[0]);
    close(ends[1]);
}

TEST(ProxyCall, KeepsWhatIsAttached) {
    static int cleaned = 0;
    LoopbackDriver& driver = LoopbackDriver::open();
    int id = 0;
    {
        const sp<IBinder> proxy = driver.proxy(plain_object());
        proxy->attachObject(&id, &id, nullptr, [](const void*, void*, void*) { ++cleaned; });
        EXPECT_EQ(proxy->findObject(&id), &id);
        proxy->detachObject(&id);
        EXPECT_EQ(proxy->findObject(&id), nullptr);
        proxy->attachObject(&id, &id, nullptr, [](const void*, void*, void*) { ++cleaned; });
    }
    EXPECT_EQ(cleaned, 1);
}

}  // namespace
