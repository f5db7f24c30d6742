// The service manager's names, by what processes may send it.
#include <binder/BpBinder.h>
#include <binder/Parcel.h>
#include <gtest/gtest.h>

#include <random>
#include <string>

#include "platform/linux/binder/servicemanager/ServiceRegistry.h"
#include "support/log_capture.h"
#include "support/loopback_driver.h"

namespace {

using namespace android;
using namespace tavo::test;

class Registry : public testing::Test {
protected:
    Registry() : driver_(LoopbackDriver::open()) {}

    status_t add(const std::string& name, const sp<IBinder>& service) {
        return registry_->addService(String16(name.c_str()), service, false);
    }
    sp<IBinder> find(const std::string& name) { return registry_->checkService(String16(name.c_str())); }
    size_t size() { return registry_->listServices().size(); }

    LoopbackDriver& driver_;
    const sp<ServiceRegistry> registry_ = new ServiceRegistry;
    const sp<BBinder> object_ = new BBinder, other_ = new BBinder;
};

TEST_F(Registry, KeepsAServiceByItsName) {
    const sp<IBinder> service = driver_.proxy(object_);
    EXPECT_EQ(find("a"), nullptr);
    ASSERT_EQ(add("a", service), OK);
    EXPECT_EQ(find("a"), service);
    EXPECT_EQ(registry_->getService(String16("a")), service);
    EXPECT_EQ(registry_->getService(String16("b")), nullptr) << "without waiting";
    EXPECT_EQ(driver_.counts().notifications, 1);
}

TEST_F(Registry, MayKeepAnObjectOfItsOwnProcess) {
    EXPECT_EQ(add("a", object_), OK);
    EXPECT_EQ(find("a"), object_);
}

TEST_F(Registry, GivesANameToWhoComesLast) {
    const sp<IBinder> first = driver_.proxy(object_), second = driver_.proxy(other_);
    ASSERT_EQ(add("a", first), OK);
    ASSERT_EQ(add("a", second), OK);
    EXPECT_EQ(find("a"), second);
    EXPECT_EQ(driver_.counts().notifications, 1) << "nobody asks after the first any more";
    driver_.kill(first->remoteBinder()->handle());
    EXPECT_EQ(find("a"), second);
    ASSERT_EQ(add("a", second), OK) << "once more";
    EXPECT_EQ(size(), 1U);
    driver_.kill(second->remoteBinder()->handle());
    EXPECT_EQ(find("a"), nullptr);
}

TEST_F(Registry, ForgetsTheDeadByAllTheirNames) {
    const sp<IBinder> service = driver_.proxy(object_), survivor = driver_.proxy(other_);
    ASSERT_EQ(add("a", service), OK);
    ASSERT_EQ(add("b", survivor), OK);
    ASSERT_EQ(add("c", service), OK);
    driver_.kill(service->remoteBinder()->handle());
    EXPECT_EQ(size(), 1U);
    EXPECT_EQ(find("b"), survivor);
    EXPECT_EQ(add("a", service), DEAD_OBJECT);
    EXPECT_EQ(size(), 1U);
}

TEST_F(Registry, RefusesWhatIsNoNameOrNoService) {
    const sp<IBinder> service = driver_.proxy(object_);
    EXPECT_EQ(add("", service), BAD_VALUE);
    EXPECT_EQ(add(std::string(128, 'n'), service), BAD_VALUE);
    EXPECT_EQ(add("a", nullptr), BAD_VALUE);
    EXPECT_EQ(size(), 0U);
    EXPECT_EQ(driver_.counts().notifications, 0);
    EXPECT_EQ(add(std::string(127, 'n'), service), OK);
}

TEST_F(Registry, HasRoomForManyButNotForAll) {
    for (size_t i = 0; i < ServiceRegistry::kMaxNames; ++i) ASSERT_EQ(add(std::to_string(i), object_), OK);
    EXPECT_EQ(add("one more", object_), NO_MEMORY);
    EXPECT_EQ(add("7", other_), OK) << "which is there already";
}

TEST_F(Registry, ListsNamesAlphabetically) {
    for (const char* name : {"b", "c", "a"}) ASSERT_EQ(add(name, object_), OK);
    const Vector<String16> names = registry_->listServices();
    ASSERT_EQ(names.size(), 3U);
    EXPECT_EQ(names[0], String16("a"));
    EXPECT_EQ(names[2], String16("c"));
}

TEST_F(Registry, AnswersThePlatformsRequests) {
    Parcel request, reply;
    request.writeInt32(0);
    request.writeString16(String16("android.os.IServiceManager"));
    request.writeString16(String16("a"));
    request.writeStrongBinder(object_);
    request.writeInt32(0);
    ASSERT_EQ(registry_->transact(3, request, &reply), OK);
    EXPECT_EQ(reply.readInt32(), 0);
    Parcel list, name;
    list.writeInterfaceToken(String16("android.os.IServiceManager"));
    list.writeInt32(0);
    ASSERT_EQ(registry_->transact(4, list, &name), OK);
    EXPECT_EQ(name.readString16(), String16("a"));
    list.setDataPosition(list.dataSize() - 4);
    list.writeInt32(1);
    EXPECT_NE(registry_->transact(4, list, &name), OK) << "the end of the list";
}

TEST_F(Registry, RefusesRequestsThatAreNotForIt) {
    const LogCapture log;
    Parcel wrong, reply;
    wrong.writeInterfaceToken(String16("android.os.ISomething"));
    for (uint32_t code = 1; code <= 4; ++code) {
        EXPECT_EQ(registry_->transact(code, Parcel(), &reply), PERMISSION_DENIED);
        EXPECT_EQ(registry_->transact(code, wrong, &reply), PERMISSION_DENIED);
    }
    EXPECT_EQ(registry_->transact(5, wrong, &reply), UNKNOWN_TRANSACTION);
    Parcel bare;
    bare.writeInterfaceToken(String16("android.os.IServiceManager"));
    ASSERT_EQ(registry_->transact(3, bare, &reply), OK);
    EXPECT_EQ(reply.readInt32(), BAD_VALUE) << "without a name";
}

TEST_F(Registry, SurvivesAnyBytes) {
    const LogCapture log;
    std::mt19937 random(11);
    for (int i = 0; i < 3000; ++i) {
        Parcel request, reply;
        if (random() % 4 != 0) request.writeInterfaceToken(String16("android.os.IServiceManager"));
        for (auto words = random() % 24; words > 0; --words) {
            request.writeInt32(static_cast<int32_t>(random() % 3 == 0 ? random() : random() % 8));
        }
        registry_->transact(static_cast<uint32_t>(random() % 7), request, &reply);
    }
    EXPECT_EQ(size(), 0U);
}

}  // namespace
