// Objects of this process, their interfaces, and what is attached to them.
#include <binder/BpBinder.h>
#include <binder/IInterface.h>
#include <binder/IPCThreadState.h>
#include <binder/Parcel.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "support/log_capture.h"

namespace {

using namespace android;

class IGreeter : public IInterface {
public:
    DECLARE_META_INTERFACE(Greeter);
    virtual int32_t greet(int32_t number) = 0;
};

class BpGreeter : public BpInterface<IGreeter> {
public:
    explicit BpGreeter(const sp<IBinder>& remote) : BpInterface<IGreeter>(remote) {}
    int32_t greet(int32_t number) override {
        Parcel data, reply;
        data.writeInterfaceToken(descriptor);
        data.writeInt32(number);
        remote()->transact(IBinder::FIRST_CALL_TRANSACTION, data, &reply);
        return reply.readInt32();
    }
};

IMPLEMENT_META_INTERFACE(Greeter, "test.IGreeter");

class Greeter : public BnInterface<IGreeter> {
public:
    int32_t greet(int32_t number) override { return number + 1; }

    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        last_flags = flags;
        if (code != FIRST_CALL_TRANSACTION) return BBinder::onTransact(code, data, reply, flags);
        CHECK_INTERFACE(IGreeter, data, reply);
        return reply->writeInt32(greet(data.readInt32()));
    }

    status_t dump(int fd, const Vector<String16>& args) override {
        dump_args.assign(args.begin(), args.end());
        return write(fd, "dumped", 6) == 6 ? NO_ERROR : UNKNOWN_ERROR;
    }

    uint32_t last_flags = 99;
    std::vector<String16> dump_args;
};

// An object of this process that answers only through transact, as one of another process would.
class Elsewhere : public BBinder {
public:
    explicit Elsewhere(const sp<BBinder>& object) : object_(object) {}
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        return object_->transact(code, data, reply, flags);
    }

private:
    const sp<BBinder> object_;
};

TEST(Interface, OfAnObjectOfThisProcessIsTheObject) {
    const sp<Greeter> greeter = new Greeter;
    const sp<IBinder> binder = greeter;
    EXPECT_EQ(interface_cast<IGreeter>(binder).get(), static_cast<IGreeter*>(greeter.get()));
    EXPECT_EQ(IInterface::asBinder(sp<IGreeter>(greeter)), binder);
    EXPECT_EQ(binder->queryLocalInterface(String16("test.IGreeter")).get(), static_cast<IInterface*>(greeter.get()));
    EXPECT_EQ(binder->queryLocalInterface(String16("test.IGreete")), nullptr);
    EXPECT_EQ(binder->getInterfaceDescriptor(), String16("test.IGreeter"));
}

TEST(Interface, OfAnObjectElsewhereIsANewProxy) {
    const sp<IBinder> binder = new Elsewhere(new Greeter);
    const sp<IGreeter> first = interface_cast<IGreeter>(binder);
    const sp<IGreeter> second = interface_cast<IGreeter>(binder);
    ASSERT_NE(first, nullptr);
    EXPECT_NE(first, second);
    EXPECT_EQ(IInterface::asBinder(first), binder);
    EXPECT_EQ(first->greet(41), 42);
}

TEST(Interface, OfNothingIsNothing) {
    EXPECT_EQ(interface_cast<IGreeter>(nullptr), nullptr);
    EXPECT_EQ(IInterface::asBinder(sp<IInterface>()), nullptr);
    EXPECT_EQ(IInterface::asBinder(static_cast<const IInterface*>(nullptr)), nullptr);
}

TEST(Interface, AProxyKeepsItsObject) {
    sp<IBinder> binder = new Elsewhere(new Greeter);
    const wp<IBinder> watch = binder;
    sp<IGreeter> proxy = interface_cast<IGreeter>(binder);
    binder.clear();
    EXPECT_NE(watch.promote(), nullptr);
    proxy.clear();
    EXPECT_EQ(watch.promote(), nullptr);
}

TEST(Object, IsWhatItIs) {
    const sp<BBinder> object = new BBinder;
    EXPECT_EQ(object->localBinder(), object.get());
    EXPECT_EQ(object->remoteBinder(), nullptr);
    EXPECT_TRUE(object->isBinderAlive());
    EXPECT_EQ(object->pingBinder(), NO_ERROR);
    EXPECT_EQ(object->dump(-1, Vector<String16>()), NO_ERROR);
    EXPECT_EQ(object->getInterfaceDescriptor(), String16());
    EXPECT_EQ(object->queryLocalInterface(String16()), nullptr);
    EXPECT_FALSE(object->checkSubclass(nullptr));
}

TEST(Object, OfThisProcessCannotOutliveItSoNobodyIsTold) {
    class Recipient : public IBinder::DeathRecipient {
        void binderDied(const wp<IBinder>&) override {}
    };
    const sp<BBinder> object = new BBinder;
    const sp<IBinder::DeathRecipient> recipient = new Recipient;
    EXPECT_EQ(object->linkToDeath(recipient), INVALID_OPERATION);
    EXPECT_EQ(object->unlinkToDeath(recipient), INVALID_OPERATION);
}

TEST(Object, AnswersAPing) {
    Parcel data, reply;
    EXPECT_EQ(sp<BBinder>(new BBinder)->transact(IBinder::PING_TRANSACTION, data, &reply), NO_ERROR);
    EXPECT_EQ(reply.dataSize(), 4U);
    EXPECT_EQ(reply.readInt32(), NO_ERROR);
}

TEST(Object, AnswersWithItsDescriptor) {
    const sp<BBinder> object = new Greeter;
    Parcel data, reply;
    EXPECT_EQ(object->transact(IBinder::INTERFACE_TRANSACTION, data, &reply), NO_ERROR);
    EXPECT_EQ(reply.readString16(), String16("test.IGreeter"));
}

TEST(Object, DumpsWhereItIsAsked) {
    const sp<Greeter> object = new Greeter;
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    Parcel data, reply;
    data.writeFileDescriptor(ends[1]);
    data.writeInt32(2);
    data.writeString16(String16("-a"));
    data.writeString16(String16("b"));
    EXPECT_EQ(object->transact(IBinder::DUMP_TRANSACTION, data, &reply), NO_ERROR);
    char text[7] = {};
    EXPECT_EQ(read(ends[0], text, 6), 6);
    EXPECT_STREQ(text, "dumped");
    EXPECT_EQ(object->dump_args, (std::vector<String16>{String16("-a"), String16("b")}));
    close(ends[0]);
    close(ends[1]);
}

TEST(Object, RefusesADumpToNowhereAndCountsOnlyArgumentsThatAreThere) {
    const sp<Greeter> object = new Greeter;
    Parcel none, reply;
    EXPECT_EQ(object->transact(IBinder::DUMP_TRANSACTION, none, &reply), BAD_TYPE);
    Parcel invalid;
    invalid.writeFileDescriptor(-1);
    EXPECT_EQ(object->transact(IBinder::DUMP_TRANSACTION, invalid, &reply), BAD_TYPE);

    const int fd = dup(STDERR_FILENO);
    Parcel many;
    many.writeFileDescriptor(fd);
    many.writeInt32(INT32_MAX);
    many.writeString16(String16("only"));
    object->transact(IBinder::DUMP_TRANSACTION, many, &reply);
    EXPECT_EQ(object->dump_args, std::vector<String16>{String16("only")});
    Parcel negative;
    negative.writeFileDescriptor(fd);
    negative.writeInt32(-1);
    object->transact(IBinder::DUMP_TRANSACTION, negative, &reply);
    EXPECT_TRUE(object->dump_args.empty());
    close(fd);
}

TEST(Object, EndsReadingArgumentsThatAreNoStrings) {
    const sp<Greeter> object = new Greeter;
    const int fd = dup(STDERR_FILENO);
    Parcel data, reply;
    data.writeFileDescriptor(fd);
    data.writeInt32(INT32_MAX);
    data.writeInt32(INT32_MAX);  // a length that does not fit
    object->transact(IBinder::DUMP_TRANSACTION, data, &reply);
    EXPECT_TRUE(object->dump_args.empty());
    close(fd);
}

TEST(Object, RefusesWhatItDoesNotKnow) {
    Parcel data, reply;
    const sp<BBinder> object = new BBinder;
    for (const uint32_t code : {0U, 1U, 0x00ffffffU, 0xffffffffU}) {
        EXPECT_EQ(object->transact(code, data, &reply), UNKNOWN_TRANSACTION);
    }
    EXPECT_EQ(reply.dataSize(), 0U);
}

TEST(Object, RefusesATokenOfAnotherInterface) {
    const tavo::test::LogCapture log;
    Parcel data, reply;
    data.writeInterfaceToken(String16("other"));
    EXPECT_EQ(sp<BBinder>(new Greeter)->transact(IBinder::FIRST_CALL_TRANSACTION, data, &reply), PERMISSION_DENIED);
    EXPECT_EQ(reply.dataSize(), 0U);
}

TEST(Object, ReadsTheRequestAndLeavesTheReplyAtTheirBeginnings) {
    const sp<Greeter> object = new Greeter;
    Parcel data, reply;
    data.writeInterfaceToken(IGreeter::descriptor);
    data.writeInt32(7);
    EXPECT_EQ(object->transact(IBinder::FIRST_CALL_TRANSACTION, data, &reply, 0x10), NO_ERROR);
    EXPECT_EQ(object->last_flags, 0x10U);
    EXPECT_EQ(reply.dataPosition(), 0U);
    EXPECT_EQ(reply.readInt32(), 8);
}

TEST(Object, AlwaysHasAReplyToWriteTo) {
    const sp<Greeter> object = new Greeter;
    Parcel data;
    data.writeInterfaceToken(IGreeter::descriptor);
    data.writeInt32(7);
    EXPECT_EQ(object->transact(IBinder::FIRST_CALL_TRANSACTION, data, nullptr, IBinder::FLAG_ONEWAY), NO_ERROR);
    EXPECT_EQ(object->transact(IBinder::PING_TRANSACTION, data, nullptr), NO_ERROR);
}

struct Cleanup {
    const void* id;
    void* object;
    void* cookie;
};
std::vector<Cleanup> g_cleanups;

void clean_up(const void* id, void* object, void* cookie) { g_cleanups.push_back({id, object, cookie}); }

TEST(AttachedObjects, AreFoundAndCleanedUpWithTheirBinder) {
    g_cleanups.clear();
    int first = 0, second = 0, cookie = 0;
    sp<BBinder> object = new BBinder;
    EXPECT_EQ(object->findObject(&first), nullptr);
    object->detachObject(&first);
    object->attachObject(&first, &first, &cookie, clean_up);
    object->attachObject(&second, &second, nullptr, nullptr);
    EXPECT_EQ(object->findObject(&first), &first);
    EXPECT_EQ(object->findObject(&second), &second);
    EXPECT_EQ(object->findObject(&cookie), nullptr);
    object.clear();
    ASSERT_EQ(g_cleanups.size(), 1U);
    EXPECT_EQ(g_cleanups[0].id, &first);
    EXPECT_EQ(g_cleanups[0].object, &first);
    EXPECT_EQ(g_cleanups[0].cookie, &cookie);
}

TEST(AttachedObjects, AreNotCleanedUpWhenTheyAreDetached) {
    g_cleanups.clear();
    int id = 0;
    sp<BBinder> object = new BBinder;
    object->attachObject(&id, &id, nullptr, clean_up);
    object->detachObject(&id);
    EXPECT_EQ(object->findObject(&id), nullptr);
    object.clear();
    EXPECT_TRUE(g_cleanups.empty());
}

TEST(AttachedObjects, AreNotReplaced) {
    const tavo::test::LogCapture log;
    int id = 0, first = 0, second = 0;
    const sp<BBinder> object = new BBinder;
    object->attachObject(&id, &first, nullptr, nullptr);
    object->attachObject(&id, &second, nullptr, nullptr);
    EXPECT_EQ(object->findObject(&id), &first);
    EXPECT_EQ(log.lines("IBinder").size(), 1U);
}

TEST(ThreadState, OfAThreadThatServesNobodyIsTheProcessItself) {
    IPCThreadState* thread = IPCThreadState::self();
    EXPECT_EQ(IPCThreadState::selfOrNull(), thread);
    EXPECT_EQ(thread->getCallingPid(), getpid());
    EXPECT_EQ(thread->getCallingUid(), getuid());
    const int64_t token = thread->clearCallingIdentity();
    EXPECT_EQ(thread->getCallingPid(), getpid());
    thread->restoreCallingIdentity(token);
    EXPECT_EQ(thread->getCallingPid(), getpid());
    EXPECT_EQ(thread->getStrictModePolicy(), 0);
    EXPECT_EQ(thread->getLastTransactionBinderFlags(), 0);
    thread->flushCommands();
    IPCThreadState::disableBackgroundScheduling(true);
}

}  // namespace
