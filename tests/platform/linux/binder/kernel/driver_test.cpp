// The kernel's driver, by what it is told and what it says: calls, references, deaths, the pool.
#include <binder/Binder.h>
#include <binder/BpBinder.h>
#include <binder/IPCThreadState.h>
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <string>
#include <thread>

#include "platform/linux/binder/kernel/CommandReader.h"
#include "support/fake_binder_device.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"

namespace {

using namespace android;
using namespace tavo::test;

constexpr int32_t kHandle = 7;
using Codes = std::vector<uint32_t>;

class Echo : public BBinder {
public:
    Echo() { ++count; }
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        ++calls;
        caller_pid = IPCThreadState::self()->getCallingPid();
        caller_uid = IPCThreadState::self()->getCallingUid();
        if (code == 1) return reply->appendFrom(&data, 0, data.dataSize());
        if (code == 2) return -4711;
        if (code == 3) return reply->writeFileDescriptor(data.readFileDescriptor());
        return BBinder::onTransact(code, data, reply, flags);
    }
    int calls = 0;
    pid_t caller_pid = 0;
    uid_t caller_uid = 0;
    static inline int count = 0;

protected:
    ~Echo() override { --count; }
};

class KernelDriver : public testing::Test {
protected:
    KernelDriver() {
        proxy_ = ProcessState::self()->getStrongProxyForHandle(kHandle);
        device_.forget_told();
        device_.reads = device_.writes_alone = 0;
    }

    status_t call(Parcel* reply = nullptr, uint32_t flags = 0) {
        Parcel data;
        data.writeInt32(42);
        return proxy_->transact(1, data, reply, flags);
    }
    // What the kernel says to a call, behind everything else that is given.
    void answer(int32_t value, Said said = Said()) {
        device_.say(said.add(BR_TRANSACTION_COMPLETE).add(BR_REPLY, device_.parcel(&value, sizeof value)));
    }
    // A call of somebody else's of an object of this process.
    binder_transaction_data incoming(const sp<BBinder>& target, uint32_t code, const Parcel& data, uint32_t flags = 0) {
        const auto* offsets = reinterpret_cast<const binder_size_t*>(data.ipcObjects());
        binder_transaction_data transaction =
            device_.parcel(data.data(), data.dataSize(), {offsets, offsets + data.objectsCount()});
        transaction.target.ptr = reinterpret_cast<uintptr_t>(target->getWeakRefs());
        transaction.cookie = reinterpret_cast<uintptr_t>(target.get());
        transaction.code = code;
        transaction.flags = flags;
        transaction.sender_pid = 4321;
        transaction.sender_euid = 8765;
        return transaction;
    }
    // As the kernel sees an object.
    static binder_ptr_cookie marks_of(BBinder* object) {
        return {reinterpret_cast<uintptr_t>(object->getWeakRefs()), reinterpret_cast<uintptr_t>(object)};
    }
    std::vector<Told> told(uint32_t code) const {
        std::vector<Told> found;
        for (const Told& one : device_.told()) {
            if (one.code == code) found.push_back(one);
        }
        return found;
    }

    FakeBinderDevice& device_ = FakeBinderDevice::install();
    const LogCapture log_;
    sp<IBinder> proxy_;
};

using KernelCall = KernelDriver;

TEST_F(KernelCall, IsToldInThePlatformsWords) {
    answer(43);
    Parcel data, reply;
    data.writeInterfaceToken(String16("ab"));
    ASSERT_EQ(proxy_->transact(5, data, &reply), OK);
    EXPECT_EQ(reply.readInt32(), 43);
    ASSERT_EQ(device_.told_codes(), Codes{BC_TRANSACTION});
    const Told told = device_.told()[0];
    const auto transaction = told.as<binder_transaction_data>();
    EXPECT_EQ(transaction.target.handle, static_cast<uint32_t>(kHandle));
    EXPECT_EQ(transaction.code, 5U);
    EXPECT_EQ(transaction.flags, static_cast<uint32_t>(TF_ACCEPT_FDS));
    EXPECT_EQ(transaction.offsets_size, 0U);
    const std::vector<uint8_t> bytes = {0, 0, 0x40, 0, 2, 0, 0, 0, 'a', 0, 'b', 0, 0, 0, 0, 0};
    EXPECT_EQ(told.data, bytes);
    EXPECT_EQ(device_.reads, 1);
}

TEST_F(KernelCall, TakesOneSystemCall) {
    for (int i = 0; i < 5; ++i) {
        answer(i);
        Parcel reply;
        ASSERT_EQ(call(&reply), OK);
    }
    EXPECT_EQ(device_.reads, 5);
    EXPECT_EQ(device_.writes_alone, 0);
    EXPECT_EQ(device_.buffers_in_use(), 1U) << "the last goes back with the next call";
    IPCThreadState::self()->flushCommands();
    EXPECT_EQ(device_.buffers_in_use(), 0U);
    IPCThreadState::self()->flushCommands();
    EXPECT_EQ(device_.writes_alone, 1) << "there was nothing more to say";
}

TEST_F(KernelCall, GivesBackTheReplyNobodyWants) {
    answer(1);
    EXPECT_EQ(call(nullptr), OK);
    IPCThreadState::self()->flushCommands();
    EXPECT_EQ(device_.buffers_in_use(), 0U);
}

TEST_F(KernelCall, GivesLargeRepliesBackAtOnce) {
    const std::vector<uint8_t> large(100000, 1);
    device_.say(Said().add(BR_REPLY, device_.parcel(large.data(), large.size())));
    Parcel reply;
    EXPECT_EQ(call(&reply), OK);
    EXPECT_EQ(reply.dataSize(), large.size());
    reply.freeData();
    EXPECT_EQ(device_.buffers_in_use(), 0U);
}

TEST_F(KernelCall, ClosesTheDescriptorsOfTheReply) {
    Parcel contents;
    contents.writeFileDescriptor(dup(STDIN_FILENO));
    device_.say(Said().add(BR_REPLY, device_.parcel(contents.data(), contents.dataSize(), {0})));
    const size_t before = count_descriptors();
    Parcel reply;
    EXPECT_EQ(call(&reply), OK);
    EXPECT_GE(reply.readFileDescriptor(), 0);
    EXPECT_EQ(count_descriptors(), before);
    reply.freeData();
    EXPECT_EQ(count_descriptors(), before - 1);
}

TEST_F(KernelCall, ReturnsTheStatusInsteadOfAReply) {
    binder_transaction_data transaction = {};
    for (const int32_t status : {-4711, 17, int32_t{DEAD_OBJECT}}) {
        transaction = device_.parcel(&status, sizeof status);
        transaction.flags = TF_STATUS_CODE;
        device_.say(Said().add(BR_REPLY, transaction));
        Parcel reply;
        EXPECT_EQ(IPCThreadState::self()->transact(kHandle, 1, Parcel(), &reply, 0), status);
        EXPECT_EQ(reply.dataSize(), 0U);
    }
    transaction = device_.parcel("ab", 2);
    transaction.flags = TF_STATUS_CODE;
    device_.say(Said().add(BR_REPLY, transaction));
    EXPECT_EQ(call(), FAILED_TRANSACTION) << "there is no status in two bytes";
    IPCThreadState::self()->flushCommands();
    EXPECT_EQ(device_.buffers_in_use(), 0U);
}

TEST_F(KernelCall, GivesAReplyBackThatNobodyWaitsFor) {
    const int32_t value = 43;
    device_.say(Said().add(BR_REPLY, device_.parcel(&value, sizeof value)).add(BR_TRANSACTION_COMPLETE));
    EXPECT_EQ(call(nullptr, IBinder::FLAG_ONEWAY), OK);
    IPCThreadState::self()->flushCommands();
    EXPECT_EQ(device_.buffers_in_use(), 0U);
}

TEST_F(KernelCall, OfADeadObjectFindsOut) {
    device_.say(Said().add(BR_NOOP).add(BR_DEAD_REPLY));
    EXPECT_EQ(call(), DEAD_OBJECT);
    EXPECT_FALSE(proxy_->isBinderAlive());
    class Recipient : public IBinder::DeathRecipient {
        void binderDied(const wp<IBinder>&) override {}
    };
    device_.forget_told();
    EXPECT_EQ(proxy_->linkToDeath(new Recipient), DEAD_OBJECT);
    EXPECT_TRUE(device_.told().empty());
}

TEST_F(KernelCall, MayBeRefused) {
    for (const uint32_t code : {BR_FAILED_REPLY, BR_FROZEN_REPLY}) {
        device_.say(Said().add(code));
        EXPECT_EQ(call(), FAILED_TRANSACTION);
    }
    device_.say(Said().add(BR_ERROR, int32_t{-5}));
    EXPECT_EQ(call(), FAILED_TRANSACTION);
    device_.say(Said().add(BR_FAILED_REPLY));
    EXPECT_EQ(IPCThreadState::self()->transact(99, 1, Parcel(), nullptr, 0), BAD_TYPE) << "nobody has such a handle";
    answer(1);
    EXPECT_EQ(call(), OK);
}

TEST_F(KernelCall, ThatIsOnewayEndsWhenItIsTaken) {
    const Codes ends = {BR_TRANSACTION_COMPLETE, BR_ONEWAY_SPAM_SUSPECT,
                        android::kernel_driver::kBrTransactionPendingFrozen};
    for (const uint32_t end : ends) {
        device_.say(Said().add(end));
        EXPECT_EQ(call(nullptr, IBinder::FLAG_ONEWAY), OK);
    }
    EXPECT_EQ(told(BC_TRANSACTION)[0].as<binder_transaction_data>().flags,
              static_cast<uint32_t>(TF_ACCEPT_FDS | TF_ONE_WAY));
    ASSERT_EQ(log_.lines("BinderKernel").size(), 1U);
    EXPECT_EQ(log_.lines("BinderKernel")[0].text, "This process sends more oneway calls than are served");
    EXPECT_EQ(log_.lines("BinderKernel")[0].priority, 5);
    device_.say(Said().add(BR_DEAD_REPLY));
    EXPECT_EQ(call(nullptr, IBinder::FLAG_ONEWAY), DEAD_OBJECT);
}

TEST_F(KernelCall, PassesOverWhatDoesNotConcernIt) {
    Said said;
    said.add(BR_OK).add(BR_FINISHED).add(BR_ACQUIRE_RESULT, int32_t{1});
    said.add(BR_ATTEMPT_ACQUIRE, binder_pri_ptr_cookie{}).add(BR_CLEAR_DEATH_NOTIFICATION_DONE, binder_uintptr_t{5});
    answer(1, said);
    EXPECT_EQ(call(), OK);
    EXPECT_TRUE(log_.lines().empty());
    answer(1, Said().add(_IOR('r', 99, uint64_t), uint64_t{1}));
    EXPECT_EQ(call(), OK);
    ASSERT_EQ(log_.lines("BinderKernel").size(), 1U);
    EXPECT_EQ(log_.lines("BinderKernel")[0].text, "The driver said something unknown: 0x80087263");
}

TEST_F(KernelCall, IsNotUndoneByAnInterruption) {
    device_.fail(EINTR, 0);
    device_.fail(EINTR);
    device_.fail(EINTR);
    device_.fail(EAGAIN);
    answer(43);
    Parcel reply;
    EXPECT_EQ(call(&reply), OK);
    EXPECT_EQ(reply.readInt32(), 43);
    EXPECT_EQ(told(BC_TRANSACTION).size(), 1U) << "it is told once";
}

TEST_F(KernelCall, FailsWithTheDevice) {
    for (const int error : {EBADF, ENODEV, ECONNREFUSED, ENOMEM, EINVAL}) {
        for (const size_t taken : {size_t{0}, SIZE_MAX}) {
            device_.forget_told();
            device_.threads_ended = 0;
            device_.fail(error, taken);
            EXPECT_EQ(call(), FAILED_TRANSACTION);
            EXPECT_EQ(device_.threads_ended, 1) << "what may still come is for nobody";
            answer(1);
            EXPECT_EQ(call(), OK);
            EXPECT_EQ(told(BC_TRANSACTION).size(), taken == 0 ? 1U : 2U) << "whose parcel is gone is not told";
        }
    }
    EXPECT_EQ(log_.lines("BinderKernel")[0].text, "BINDER_WRITE_READ failed: Bad file descriptor");
}

TEST_F(KernelCall, FailsWhenTheDeviceMakesNoSense) {
    const uint32_t reply = BR_REPLY;
    device_.say(Said().add(BR_NOOP).append(&reply, sizeof reply));
    EXPECT_EQ(call(), FAILED_TRANSACTION);
    device_.say(Said().append("abcdefgh", 8));
    EXPECT_EQ(call(), FAILED_TRANSACTION);
    device_.say(Said().append("a", 1));
    EXPECT_EQ(call(), FAILED_TRANSACTION);
    EXPECT_EQ(device_.threads_ended, 3);
    answer(1);
    EXPECT_EQ(call(), OK);
}

TEST_F(KernelCall, CarriesObjectsHandlesAndDescriptors) {
    const sp<Echo> own = new Echo;
    Parcel data;
    data.writeStrongBinder(own);
    data.writeStrongBinder(proxy_);
    data.writeFileDescriptor(STDIN_FILENO);
    data.writeStrongBinder(nullptr);
    answer(1);
    ASSERT_EQ(proxy_->transact(1, data, nullptr), OK);
    const Told told = this->told(BC_TRANSACTION)[0];
    EXPECT_EQ(told.offsets, (std::vector<binder_size_t>{0, 24, 48})) << "the null binder is not listed";
    flat_binder_object objects[3];
    memcpy(objects, told.data.data(), sizeof objects);
    EXPECT_EQ(objects[0].hdr.type, static_cast<uint32_t>(BINDER_TYPE_BINDER));
    EXPECT_EQ(objects[0].flags, 0x17fU);
    EXPECT_EQ(objects[0].binder, marks_of(own.get()).ptr);
    EXPECT_EQ(objects[0].cookie, marks_of(own.get()).cookie);
    EXPECT_EQ(objects[1].hdr.type, static_cast<uint32_t>(BINDER_TYPE_HANDLE));
    EXPECT_EQ(objects[1].handle, static_cast<uint32_t>(kHandle));
    EXPECT_EQ(objects[2].hdr.type, static_cast<uint32_t>(BINDER_TYPE_FD));
    EXPECT_EQ(objects[2].handle, static_cast<uint32_t>(STDIN_FILENO));
}

// -- References

using KernelReference = KernelDriver;

TEST_F(KernelReference, ToAHandleIsTakenAndGivenBackAtOnce) {
    sp<IBinder> other = ProcessState::self()->getStrongProxyForHandle(8);
    EXPECT_EQ(device_.told_codes(), (Codes{BC_INCREFS, BC_ACQUIRE}));
    EXPECT_EQ(device_.told()[1].as<uint32_t>(), 8U);
    sp<IBinder> same = ProcessState::self()->getStrongProxyForHandle(8);
    EXPECT_EQ(same, other);
    device_.forget_told();
    other = nullptr;
    EXPECT_TRUE(device_.told().empty());
    same = nullptr;
    EXPECT_EQ(device_.told_codes(), (Codes{BC_RELEASE, BC_DECREFS}));
    EXPECT_EQ(device_.told()[0].as<uint32_t>(), 8U);
}

TEST_F(KernelReference, OfTheKernelKeepsAnObjectAlive) {
    Echo* raw = new Echo;
    sp<Echo> own = raw;
    const binder_ptr_cookie marks = marks_of(raw);
    answer(1, Said().add(BR_NOOP).add(BR_INCREFS, marks).add(BR_ACQUIRE, marks));
    EXPECT_EQ(call(), OK);
    ASSERT_EQ(told(BC_INCREFS_DONE).size(), 1U) << "without waiting for the next call";
    ASSERT_EQ(told(BC_ACQUIRE_DONE).size(), 1U);
    EXPECT_EQ(told(BC_ACQUIRE_DONE)[0].as<binder_ptr_cookie>().cookie, marks.cookie);
    own = nullptr;
    EXPECT_EQ(Echo::count, 1);
    answer(1, Said().add(BR_RELEASE, marks).add(BR_DECREFS, marks));
    EXPECT_EQ(call(), OK);
    EXPECT_EQ(Echo::count, 0);
}

TEST_F(KernelReference, ToNothingIsAnswered) {
    const binder_ptr_cookie none = {0, 0};
    answer(1, Said().add(BR_INCREFS, none).add(BR_ACQUIRE, none).add(BR_RELEASE, none).add(BR_DECREFS, none));
    EXPECT_EQ(call(), OK);
    EXPECT_EQ(told(BC_INCREFS_DONE).size(), 1U);
    EXPECT_EQ(told(BC_ACQUIRE_DONE).size(), 1U);
}

TEST_F(KernelReference, IsNotTakenOnTheServiceManager) {
    sp<IBinder> manager = ProcessState::self()->getContextObject(nullptr);
    ASSERT_NE(manager, nullptr);
    ASSERT_NE(manager->remoteBinder(), nullptr);
    EXPECT_EQ(manager->remoteBinder()->handle(), 0);
    device_.say(Said().add(BR_DEAD_REPLY));
    EXPECT_EQ(manager->pingBinder(), DEAD_OBJECT);
    EXPECT_TRUE(manager->isBinderAlive()) << "it may come yet";
    const int32_t value = 0;
    device_.say(Said().add(BR_REPLY, device_.parcel(&value, sizeof value)));
    EXPECT_EQ(manager->pingBinder(), OK);
    manager = nullptr;
    for (const uint32_t code : {BC_INCREFS, BC_ACQUIRE, BC_RELEASE, BC_DECREFS}) EXPECT_TRUE(told(code).empty());
}

// -- Deaths

class Recipient : public IBinder::DeathRecipient {
public:
    void binderDied(const wp<IBinder>&) override { ++deaths; }
    int deaths = 0;
};

using KernelDeath = KernelDriver;

TEST_F(KernelDeath, IsToldAndAnswered) {
    const sp<Recipient> recipient = new Recipient;
    ASSERT_EQ(proxy_->linkToDeath(recipient), OK);
    ASSERT_EQ(device_.told_codes(), Codes{BC_REQUEST_DEATH_NOTIFICATION});
    const auto request = device_.told()[0].as<binder_handle_cookie>();
    EXPECT_EQ(request.handle, static_cast<uint32_t>(kHandle));
    device_.forget_told();

    device_.say(Said().add(BR_DEAD_BINDER, binder_uintptr_t{request.cookie}));
    IPCThreadState::self()->joinThreadPool();
    EXPECT_EQ(recipient->deaths, 1);
    EXPECT_FALSE(proxy_->isBinderAlive());
    ASSERT_EQ(told(BC_CLEAR_DEATH_NOTIFICATION).size(), 1U);
    ASSERT_EQ(told(BC_DEAD_BINDER_DONE).size(), 1U);
    EXPECT_EQ(told(BC_DEAD_BINDER_DONE)[0].as<binder_uintptr_t>(), request.cookie);
    device_.say(Said().add(BR_CLEAR_DEATH_NOTIFICATION_DONE, binder_uintptr_t{request.cookie}));
    device_.say(Said().add(BR_DEAD_BINDER, binder_uintptr_t{request.cookie}));
    IPCThreadState::self()->joinThreadPool();
    EXPECT_EQ(recipient->deaths, 1);
}

TEST_F(KernelDeath, ThatIsOfNoInterestAnyMoreIsAnswered) {
    const sp<Recipient> recipient = new Recipient;
    ASSERT_EQ(proxy_->linkToDeath(recipient), OK);
    const auto request = device_.told()[0].as<binder_handle_cookie>();
    ASSERT_EQ(proxy_->unlinkToDeath(recipient), OK);
    ASSERT_EQ(told(BC_CLEAR_DEATH_NOTIFICATION).size(), 1U);
    EXPECT_EQ(told(BC_CLEAR_DEATH_NOTIFICATION)[0].as<binder_handle_cookie>().cookie, request.cookie);
    device_.forget_told();
    // It was on its way.
    device_.say(Said().add(BR_DEAD_BINDER, binder_uintptr_t{request.cookie}));
    IPCThreadState::self()->joinThreadPool();
    EXPECT_EQ(recipient->deaths, 0);
    EXPECT_EQ(told(BC_CLEAR_DEATH_NOTIFICATION).size(), 0U);
    EXPECT_EQ(told(BC_DEAD_BINDER_DONE).size(), 1U);
}

TEST_F(KernelDeath, IsOfNoInterestToAProxyThatGoes) {
    ASSERT_EQ(proxy_->linkToDeath(new Recipient), OK);
    device_.forget_told();
    proxy_ = nullptr;
    EXPECT_EQ(device_.told_codes(), (Codes{BC_CLEAR_DEATH_NOTIFICATION, BC_RELEASE, BC_DECREFS}));
}

TEST_F(KernelDeath, OfTheServiceManagerIsNotForEver) {
    const sp<IBinder> manager = ProcessState::self()->getContextObject(nullptr);
    const sp<Recipient> recipient = new Recipient;
    ASSERT_EQ(manager->linkToDeath(recipient), OK);
    EXPECT_EQ(device_.told_codes(), (Codes{BC_INCREFS, BC_REQUEST_DEATH_NOTIFICATION}));
    const auto request = device_.told()[1].as<binder_handle_cookie>();
    device_.say(Said().add(BR_DEAD_BINDER, binder_uintptr_t{request.cookie}));
    device_.forget_told();
    IPCThreadState::self()->joinThreadPool();
    EXPECT_EQ(recipient->deaths, 1);
    EXPECT_EQ(told(BC_DECREFS).size(), 1U);
    EXPECT_TRUE(manager->isBinderAlive());
    EXPECT_EQ(manager->linkToDeath(recipient), OK) << "of the next one";
}

// -- Serving

using KernelService = KernelDriver;

TEST_F(KernelService, AnswersCallsThatComeWhileItWaits) {
    const sp<Echo> own = new Echo;
    Parcel request;
    request.writeInt32(99);
    device_.say(Said().add(BR_TRANSACTION_COMPLETE).add(BR_TRANSACTION, incoming(own, 1, request)));
    device_.say(Said().add(BR_TRANSACTION_COMPLETE));
    answer(43);
    Parcel reply;
    ASSERT_EQ(call(&reply), OK);
    EXPECT_EQ(reply.readInt32(), 43);
    EXPECT_EQ(own->calls, 1);
    EXPECT_EQ(own->caller_pid, 4321);
    EXPECT_EQ(own->caller_uid, 8765U);
    EXPECT_EQ(device_.told_codes(), (Codes{BC_TRANSACTION, BC_FREE_BUFFER, BC_REPLY}))
        << "room is made before the caller can send again";
    EXPECT_EQ(told(BC_REPLY)[0].data, (std::vector<uint8_t>{99, 0, 0, 0}));
    EXPECT_EQ(told(BC_REPLY)[0].as<binder_transaction_data>().flags, 0U);
    EXPECT_EQ(IPCThreadState::self()->getCallingPid(), getpid());
}

TEST_F(KernelService, AnswersWithAStatus) {
    const sp<Echo> own = new Echo;
    binder_transaction_data_secctx with_context = {incoming(own, 2, Parcel()), 0};
    device_.say(Said().add(BR_TRANSACTION_SEC_CTX, with_context));
    device_.say(Said().add(BR_TRANSACTION_COMPLETE));
    answer(1);
    ASSERT_EQ(call(), OK);
    EXPECT_EQ(told(BC_REPLY)[0].as<binder_transaction_data>().flags, static_cast<uint32_t>(TF_STATUS_CODE));
    int32_t status = 0;
    ASSERT_EQ(told(BC_REPLY)[0].data.size(), sizeof status);
    memcpy(&status, told(BC_REPLY)[0].data.data(), sizeof status);
    EXPECT_EQ(status, -4711);
}

TEST_F(KernelService, DoesNotAnswerOnewayCalls) {
    const sp<Echo> own = new Echo;
    device_.say(Said().add(BR_TRANSACTION, incoming(own, 1, Parcel(), TF_ONE_WAY)));
    answer(1);
    ASSERT_EQ(call(), OK);
    EXPECT_EQ(own->calls, 1);
    EXPECT_TRUE(told(BC_REPLY).empty());
    IPCThreadState::self()->flushCommands();
    EXPECT_EQ(device_.buffers_in_use(), 0U);
}

TEST_F(KernelService, RefusesCallsOfObjectsThatAreGone) {
    wp<Echo> gone;
    binder_transaction_data transaction = {};
    {
        const sp<Echo> own = new Echo;
        gone = own;
        transaction = incoming(own, 1, Parcel());
    }
    device_.say(Said().add(BR_TRANSACTION, transaction));
    answer(1, Said().add(BR_TRANSACTION_COMPLETE));
    transaction = device_.parcel("", 0);  // the service manager's, which this process is not
    device_.say(Said().add(BR_TRANSACTION, transaction));
    answer(1, Said().add(BR_FAILED_REPLY));
    for (int i = 0; i < 2; ++i) {
        device_.forget_told();
        ASSERT_EQ(call(), OK);
        int32_t status = 0;
        ASSERT_EQ(told(BC_REPLY).size(), 1U);
        memcpy(&status, told(BC_REPLY)[0].data.data(), sizeof status);
        EXPECT_EQ(status, FAILED_TRANSACTION);
    }
}

TEST_F(KernelService, KeepsDescriptorsOpenUntilTheReplyIsSent) {
    const sp<Echo> own = new Echo;
    Parcel request;
    const int descriptor = dup(STDIN_FILENO);
    request.writeFileDescriptor(descriptor);
    static int sent = -1;
    static bool was_replied_first = false;
    static const FakeBinderDevice* device = nullptr;
    sent = descriptor;
    device = &device_;
    device_.say(Said().add(BR_TRANSACTION, incoming(own, 3, request)));
    answer(1, Said().add(BR_TRANSACTION_COMPLETE));
    const PlatformHook hook(
        "libbinder.so", "close", +[](int fd) {
            if (fd == sent) was_replied_first = device->told_codes().back() == BC_REPLY;
            return close(fd);
        });
    ASSERT_EQ(call(), OK);
    flat_binder_object object;
    ASSERT_EQ(told(BC_REPLY)[0].data.size(), sizeof object);
    memcpy(&object, told(BC_REPLY)[0].data.data(), sizeof object);
    EXPECT_EQ(object.handle, static_cast<uint32_t>(descriptor));
    EXPECT_TRUE(was_replied_first);
    EXPECT_EQ(fcntl(descriptor, F_GETFD), -1) << "and closed in the end";
}

TEST_F(KernelService, GoesOnWhenTheCallerIsGone) {
    const sp<Echo> own = new Echo;
    device_.say(Said().add(BR_TRANSACTION, incoming(own, 1, Parcel())));
    answer(1, Said().add(BR_DEAD_REPLY));
    EXPECT_EQ(call(), OK);
}

TEST_F(KernelService, GivesUpTheOuterCallWithTheDevice) {
    const sp<Echo> own = new Echo;
    device_.say(Said().add(BR_TRANSACTION, incoming(own, 1, Parcel())));
    device_.fail(ENODEV);  // on the reply
    EXPECT_EQ(call(), FAILED_TRANSACTION) << "it will not be answered";
    EXPECT_EQ(device_.threads_ended, 1);
}

// -- The service manager's process

TEST_F(KernelService, MayBeTheServiceManager) {
    const sp<Echo> own = new Echo;
    EXPECT_EQ(ProcessState::self()->becomeContextManager(nullptr), BAD_VALUE);
    device_.context_manager_error = EBUSY;
    EXPECT_EQ(ProcessState::self()->becomeContextManager(own), ALREADY_EXISTS);
    device_.context_manager_error = EPERM;
    EXPECT_EQ(ProcessState::self()->becomeContextManager(own), PERMISSION_DENIED);
    device_.context_manager_error = 0;
    ASSERT_EQ(ProcessState::self()->becomeContextManager(own), OK);
    EXPECT_EQ(ProcessState::self()->becomeContextManager(own), ALREADY_EXISTS);
    EXPECT_EQ(ProcessState::self()->getContextObject(nullptr), own);
    binder_transaction_data transaction = device_.parcel("", 0);
    transaction.code = 1;
    device_.say(Said().add(BR_TRANSACTION, transaction));
    answer(1, Said().add(BR_TRANSACTION_COMPLETE));
    EXPECT_EQ(call(), OK);
    EXPECT_EQ(own->calls, 1);
}

// -- The pool

using KernelPool = KernelDriver;

TEST_F(KernelPool, IsEnteredAndLeft) {
    IPCThreadState::self()->joinThreadPool(true);
    EXPECT_EQ(device_.told_codes(), (Codes{BC_ENTER_LOOPER, BC_EXIT_LOOPER}));
    device_.forget_told();
    IPCThreadState::self()->joinThreadPool(false);
    EXPECT_EQ(device_.told_codes(), (Codes{BC_REGISTER_LOOPER, BC_EXIT_LOOPER}));
    EXPECT_EQ(log_.lines("BinderKernel")[0].text, "BINDER_WRITE_READ failed: No such device");
}

TEST_F(KernelPool, GoesOnWhenTheDeviceMakesNoSense) {
    const sp<Echo> own = new Echo;
    device_.say(Said().append("abcdefgh", 8));
    device_.say(Said().add(BR_NOOP).add(BR_TRANSACTION, incoming(own, 1, Parcel())));
    device_.say(Said().add(BR_TRANSACTION_COMPLETE));
    device_.say(Said().add(BR_REPLY, device_.parcel("", 0)).add(BR_DEAD_REPLY).add(BR_FAILED_REPLY));
    IPCThreadState::self()->joinThreadPool(true);
    EXPECT_EQ(own->calls, 1);
    EXPECT_EQ(log_.lines("BinderKernel")[0].text, "Reading what the driver says failed: Protocol error");
    EXPECT_EQ(device_.buffers_in_use(), 0U) << "nor is anything left of a reply to nobody";
}

int g_started = 0, g_start_error = 0;

class KernelPoolGrowth : public KernelDriver {
protected:
    KernelPoolGrowth() { g_started = g_start_error = 0; }
    const PlatformHook hook_{"libbinder.so", "pthread_create",
                             +[](pthread_t*, const pthread_attr_t*, void* (*)(void*), void*) {
                                 g_started += g_start_error == 0;
                                 return g_start_error;
                             }};
};

TEST_F(KernelPoolGrowth, IsTheKernelsWish) {
    ProcessState::self()->startThreadPool();
    EXPECT_EQ(g_started, 1);
    device_.say(Said().add(BR_SPAWN_LOOPER));
    IPCThreadState::self()->joinThreadPool();
    EXPECT_EQ(g_started, 2);
}

TEST_F(KernelPoolGrowth, IsMadeUpForWhenThereWasNoThreadToBeHad) {
    ProcessState::self()->startThreadPool();
    g_start_error = EAGAIN;
    device_.say(Said().add(BR_SPAWN_LOOPER));
    device_.say(Said().add(BR_NOOP));
    IPCThreadState::self()->joinThreadPool();
    EXPECT_EQ(g_started, 1);
    EXPECT_EQ(log_.lines("ProcessState").size(), 1U) << "it is not tried all the time";
    g_start_error = 0;
    std::this_thread::sleep_for(std::chrono::milliseconds(120));
    IPCThreadState::self()->joinThreadPool();
    EXPECT_EQ(g_started, 2);
    IPCThreadState::self()->joinThreadPool();
    EXPECT_EQ(g_started, 2);
}

TEST_F(KernelPool, LosesThreadsInOrder) {
    std::thread([&] {
        answer(1);
        EXPECT_EQ(call(), OK);
    }).join();
    EXPECT_EQ(device_.threads_ended, 1);
    EXPECT_EQ(device_.buffers_in_use(), 0U) << "what it had to say has been said";
}

// -- fork

TEST_F(KernelDriver, SaysNothingInACopyOfTheProcess) {
    const sp<Echo> own = new Echo;
    // The kernel does not let a copy have the memory that it receives into.
    int32_t value = 1;
    device_.say(Said().add(BR_REPLY, device_.parcel(&value, sizeof value)));
    Parcel received;
    ASSERT_EQ(call(&received), OK);
    const pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        device_.forget_told();
        bool silent = call() == INVALID_OPERATION;
        const sp<IBinder> other = ProcessState::self()->getStrongProxyForHandle(9);
        silent = silent && other->linkToDeath(new Recipient) == INVALID_OPERATION;
        silent = silent && ProcessState::self()->becomeContextManager(own) == INVALID_OPERATION;
        silent = silent && ProcessState::self()->setThreadPoolMaxThreadCount(77) == OK && device_.max_threads != 77;
        IPCThreadState::self()->joinThreadPool();
        IPCThreadState::self()->flushCommands();
        received.freeData();
        proxy_ = nullptr;
        _exit(silent && device_.told().empty() ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    answer(2);
    EXPECT_EQ(call(), OK);
}

}  // namespace
