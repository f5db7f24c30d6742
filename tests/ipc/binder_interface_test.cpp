// What the interface class itself says: its descriptor, its virtual functions' order, and how binders become one.
#include <binder/IPCThreadState.h>
#include <gtest/gtest.h>

#include <cstring>

#include "ipc/ITavoBinder.h"
#include "ipc/fake_binders.h"
#include "ipc/log_lines.h"

namespace {

using android::BnTavoBinder;
using android::IBinder;
using android::IInterface;
using android::ITavoBinder;
using android::sp;
using android::String16;
using tavo::test::FakeRemote;
using tavo::test::FakeService;
using tavo::test::LogCapture;
using tavo::test::LogLine;

// Which of its class's virtual functions a pointer stands for, in the C++ ABI that both platforms have.
template <typename Function>
size_t slot_of(Function function) {
    uintptr_t words[2];
    static_assert(sizeof function == sizeof words);
    memcpy(words, &function, sizeof words);
#if defined(__arm__) || defined(__aarch64__)
    return words[0] / sizeof(void*);
#else
    return (words[0] - 1) / sizeof(void*);
#endif
}

class Opened : public ITavoBinder {
public:
    using ITavoBinder::onAsBinder;
};

class OtherInterface : public android::BBinder {
public:
    sp<IInterface> queryLocalInterface(const String16& requested) override {
        asked = requested;
        return nullptr;
    }
    String16 asked;
};

TEST(BinderInterface, HasADescriptorThatIsNotTheServiceName) {
    EXPECT_EQ(ITavoBinder::descriptor, String16("tavo.mq"));
    const sp<FakeService> service = new FakeService;
    EXPECT_EQ(&static_cast<ITavoBinder&>(*service).getInterfaceDescriptor(), &ITavoBinder::descriptor);
    EXPECT_EQ(static_cast<IBinder&>(*service).getInterfaceDescriptor(), String16("tavo.mq"));
}

TEST(BinderInterface, KeepsTheOrderOfItsVirtualFunctions) {
    // The two destructors come first.
    EXPECT_EQ(slot_of(&Opened::onAsBinder), 2U);
    EXPECT_EQ(slot_of(&ITavoBinder::getInterfaceDescriptor), 3U);
    EXPECT_EQ(slot_of(&ITavoBinder::get_fd), 4U);
    EXPECT_EQ(slot_of(&ITavoBinder::get_write_fd), 5U);
    EXPECT_EQ(slot_of(&ITavoBinder::create_message_queue), 6U);
    EXPECT_EQ(slot_of(&ITavoBinder::delete_message_queue), 7U);
    EXPECT_EQ(slot_of(&ITavoBinder::get_shared_mem), 8U);
    EXPECT_EQ(slot_of(&ITavoBinder::delete_shared_mem), 9U);
    EXPECT_EQ(slot_of(&BnTavoBinder::queryLocalInterface), 10U);
    EXPECT_EQ(slot_of(&BnTavoBinder::onTransact), 11U);
}

TEST(BinderInterface, AnswersALocalQueryForItsOwnDescriptorOnly) {
    const sp<FakeService> service = new FakeService;
    EXPECT_EQ(service->queryLocalInterface(String16("tavo.mq")).get(), static_cast<IInterface*>(service.get()));
    for (const char* other : {"tavo.m", "tavo.mq.", "tavo.mQ", "android.tavo.osal", ""}) {
        EXPECT_EQ(service->queryLocalInterface(String16(other)), nullptr) << other;
    }
}

TEST(BinderInterface, IsNullForANullBinder) {
    const LogCapture log;
    EXPECT_EQ(ITavoBinder::asInterface(nullptr), nullptr);
    EXPECT_TRUE(log.lines().empty());
}

TEST(BinderInterface, IsTheServiceItselfInItsOwnProcess) {
    const sp<FakeService> service = new FakeService;
    const LogCapture log;
    EXPECT_EQ(ITavoBinder::asInterface(service).get(), service.get());
    EXPECT_EQ(android::interface_cast<ITavoBinder>(service).get(), service.get());
    EXPECT_TRUE(log.lines().empty());
}

TEST(BinderInterface, IsANewProxyForAnotherBinder) {
    const sp<FakeRemote> remote = new FakeRemote;
    const LogCapture log;
    const sp<ITavoBinder> proxy = ITavoBinder::asInterface(remote);
    ASSERT_NE(proxy, nullptr);
    EXPECT_EQ(IInterface::asBinder(proxy).get(), remote.get());
    EXPECT_NE(ITavoBinder::asInterface(remote), proxy);
    EXPECT_TRUE(remote->requests.empty());
}

TEST(BinderInterface, SaysConstructorWithoutATagForEachProxy) {
    const sp<FakeRemote> remote = new FakeRemote;
    const LogCapture log(0);  // no filter of the library's applies
    const sp<ITavoBinder> proxy = ITavoBinder::asInterface(remote);
    ASSERT_EQ(log.lines().size(), 1U);
    const LogLine line = log.lines()[0];
    EXPECT_TRUE(line.by_print);
    EXPECT_EQ(line.priority, 3);
    EXPECT_EQ(line.tag, "(null)");
    EXPECT_EQ(line.text, "Constructor");
}

TEST(BinderInterface, AsksTheBinderForItsOwnDescriptor) {
    const sp<OtherInterface> other = new OtherInterface;
    EXPECT_NE(ITavoBinder::asInterface(other), nullptr);
    EXPECT_EQ(other->asked, String16("tavo.mq"));
}

TEST(BinderInterface, KeepsTheRemoteBinderForAsLongAsTheProxyLives) {
    const sp<FakeRemote> remote = new FakeRemote;
    const int32_t before = remote->getStrongCount();
    sp<ITavoBinder> proxy = ITavoBinder::asInterface(remote);
    EXPECT_EQ(remote->getStrongCount(), before + 1);
    proxy = nullptr;
    EXPECT_EQ(remote->getStrongCount(), before);
}

}  // namespace
