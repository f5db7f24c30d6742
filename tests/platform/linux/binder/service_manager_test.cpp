// The service manager's transactions, by their proxy and their stub.
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <gtest/gtest.h>

#include <chrono>
#include <map>
#include <string>
#include <vector>

#include "support/log_capture.h"
#include "support/loopback_driver.h"

namespace {

using namespace android;
using tavo::test::LogCapture;
using tavo::test::LoopbackDriver;

class Manager : public BnServiceManager {
public:
    sp<IBinder> getService(const String16& name) const override {
        ++gets;
        return checkService(name);
    }
    sp<IBinder> checkService(const String16& name) const override {
        if (++checks < checks_until_there) return nullptr;
        const auto found = services.find(name);
        return found != services.end() ? found->second : nullptr;
    }
    status_t addService(const String16& name, const sp<IBinder>& service, bool allowIsolated) override {
        if (service == nullptr) return BAD_VALUE;
        services[name] = service;
        allowed_isolated = allowIsolated;
        return NO_ERROR;
    }
    Vector<String16> listServices() override {
        Vector<String16> names;
        for (const auto& [name, service] : services) names.add(name);
        return names;
    }

    mutable int gets = 0;
    mutable int checks = 0;
    int checks_until_there = 0;
    bool allowed_isolated = false;
    std::map<String16, sp<IBinder>> services;
};

class ServiceManager : public testing::Test {
protected:
    ServiceManager() { LoopbackDriver::open().set_context_object(manager_); }

    const sp<Manager> manager_ = new Manager;
    const sp<BBinder> service_ = new BBinder;
};

TEST_F(ServiceManager, IsOnePerProcess) {
    EXPECT_NE(defaultServiceManager(), nullptr);
    EXPECT_EQ(defaultServiceManager(), defaultServiceManager());
}

TEST_F(ServiceManager, HasThePlatformsDescriptorAndCodes) {
    EXPECT_EQ(IServiceManager::descriptor, String16("android.os.IServiceManager"));
    EXPECT_EQ(IServiceManager::GET_SERVICE_TRANSACTION, 1);
    EXPECT_EQ(IServiceManager::CHECK_SERVICE_TRANSACTION, 2);
    EXPECT_EQ(IServiceManager::ADD_SERVICE_TRANSACTION, 3);
    EXPECT_EQ(IServiceManager::LIST_SERVICES_TRANSACTION, 4);
}

TEST_F(ServiceManager, PublishesAndFinds) {
    const sp<IServiceManager> manager = defaultServiceManager();
    EXPECT_EQ(manager->checkService(String16("a")), nullptr);
    EXPECT_EQ(manager->addService(String16("a"), service_, true), NO_ERROR);
    EXPECT_TRUE(manager_->allowed_isolated);
    EXPECT_EQ(manager->addService(String16("a"), service_), NO_ERROR);
    EXPECT_FALSE(manager_->allowed_isolated);
    EXPECT_EQ(manager->checkService(String16("a")), service_) << "sent home, it is itself";
    EXPECT_EQ(manager->getService(String16("a")), service_);
    EXPECT_EQ(manager_->gets, 0) << "the caller waits, not the service manager";
    EXPECT_EQ(manager->addService(String16("b"), nullptr), BAD_VALUE);
}

TEST_F(ServiceManager, ListsServicesOneByOne) {
    const sp<IServiceManager> manager = defaultServiceManager();
    EXPECT_TRUE(manager->listServices().isEmpty());
    for (const char* name : {"a", "b", "c"}) manager->addService(String16(name), service_);
    const Vector<String16> names = manager->listServices();
    ASSERT_EQ(names.size(), 3U);
    EXPECT_EQ(names[0], String16("a"));
    EXPECT_EQ(names[2], String16("c"));
}

TEST_F(ServiceManager, WaitsForAServiceThatIsOnItsWay) {
    const LogCapture log;
    manager_->services[String16("late")] = service_;
    manager_->checks_until_there = 4;
    EXPECT_EQ(defaultServiceManager()->getService(String16("late")), LoopbackDriver::open().proxy(service_));
    EXPECT_EQ(manager_->checks, 4);
    ASSERT_EQ(log.lines("ServiceManager").size(), 1U);
    EXPECT_EQ(log.lines("ServiceManager")[0].text, "Waiting for service late...");
}

TEST_F(ServiceManager, DoesNotWaitForEver) {
    const LogCapture log;
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(defaultServiceManager()->getService(String16("never")), nullptr);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
}

TEST_F(ServiceManager, GivesUpAtOnceWhenItCannotAsk) {
    const LogCapture log;
    LoopbackDriver::open().fail_with(DEAD_OBJECT);
    EXPECT_EQ(defaultServiceManager()->getService(String16("any")), nullptr);
    EXPECT_TRUE(log.lines("ServiceManager").empty());
}

TEST_F(ServiceManager, FindsServicesByInterface) {
    sp<IServiceManager> found;
    EXPECT_EQ(getService(String16("itself"), &found), NAME_NOT_FOUND);
    EXPECT_EQ(found, nullptr);
    defaultServiceManager()->addService(String16("itself"), manager_);
    EXPECT_EQ(getService(String16("itself"), &found), NO_ERROR);
    EXPECT_EQ(found.get(), manager_.get());
}

// What a process of the platform sends.
class ServiceManagerStub : public ServiceManager {
protected:
    ServiceManagerStub() { request_.writeInterfaceToken(IServiceManager::descriptor); }

    status_t call(uint32_t code) { return manager_->transact(code, request_, &reply_); }

    Parcel request_;
    Parcel reply_;
};

TEST_F(ServiceManagerStub, AnswersGet) {
    manager_->services[String16("a")] = service_;
    request_.writeString16(String16("a"));
    EXPECT_EQ(call(1), NO_ERROR);
    EXPECT_EQ(reply_.readStrongBinder(), service_);
    EXPECT_EQ(manager_->gets, 1);
}

TEST_F(ServiceManagerStub, AnswersCheckOfAnUnknownNameWithANullBinder) {
    request_.writeString16(String16("a"));
    EXPECT_EQ(call(2), NO_ERROR);
    EXPECT_EQ(reply_.dataSize(), 24U);
    EXPECT_EQ(reply_.readStrongBinder(), nullptr);
}

TEST_F(ServiceManagerStub, AnswersAddWithItsStatus) {
    request_.writeString16(String16("a"));
    request_.writeStrongBinder(service_);
    request_.writeInt32(1);
    EXPECT_EQ(call(3), NO_ERROR);
    EXPECT_EQ(reply_.readInt32(), NO_ERROR);
    EXPECT_EQ(manager_->services.at(String16("a")), service_);
}

TEST_F(ServiceManagerStub, AnswersListUntilTheIndexIsTooLarge) {
    manager_->services[String16("a")] = service_;
    request_.writeInt32(0);
    EXPECT_EQ(call(4), NO_ERROR);
    EXPECT_EQ(reply_.readString16(), String16("a"));
    for (const int32_t index : {1, INT32_MAX, -1}) {
        Parcel request, reply;
        request.writeInterfaceToken(IServiceManager::descriptor);
        request.writeInt32(index);
        EXPECT_EQ(manager_->transact(4, request, &reply), BAD_INDEX) << index;
    }
}

TEST_F(ServiceManagerStub, RefusesOtherInterfacesAndCodes) {
    const LogCapture log;
    Parcel wrong, reply;
    wrong.writeInterfaceToken(String16("other"));
    for (uint32_t code = 1; code <= 4; ++code) {
        EXPECT_EQ(manager_->transact(code, wrong, &reply), PERMISSION_DENIED) << code;
    }
    EXPECT_EQ(call(5), UNKNOWN_TRANSACTION);
    EXPECT_EQ(call(IBinder::PING_TRANSACTION), NO_ERROR);
}

}  // namespace
