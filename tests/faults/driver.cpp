#include "faults/driver.h"

#include <binder/Parcel.h>

#include <cstdlib>
#include <memory>

#include "faults/plan.h"
#include "platform/linux/binder/DriverRegistry.h"

namespace tavo::test::faults {
namespace {

using android::BBinder;
using android::Driver;
using android::IBinder;
using android::Parcel;
using android::sp;
using android::status_t;

class FailingDriver final : public Driver {
public:
    explicit FailingDriver(std::unique_ptr<Driver> driver) : driver_(std::move(driver)) {}

    status_t transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        const int error = arrive(g_driver_transact);
        if (error == 0) return driver_->transact(handle, code, data, reply, flags);
        if (reply != nullptr) reply->freeData();
        return -error;
    }
    void acquire(int32_t handle) override { driver_->acquire(handle); }
    void release(int32_t handle) override { driver_->release(handle); }
    status_t requestDeathNotification(int32_t handle, const android::wp<android::BpBinder>& proxy) override {
        return driver_->requestDeathNotification(handle, proxy);
    }
    status_t clearDeathNotification(int32_t handle) override { return driver_->clearDeathNotification(handle); }
    sp<IBinder> contextObject() override { return driver_->contextObject(); }
    status_t becomeContextManager(const sp<BBinder>& object) override { return driver_->becomeContextManager(object); }
    void setMaxThreads(size_t count) override { driver_->setMaxThreads(count); }
    void joinThreadPool(bool isMain) override { driver_->joinThreadPool(isMain); }
    void flushCommands() override { driver_->flushCommands(); }
    void quiesce() override { driver_->quiesce(); }

private:
    const std::unique_ptr<Driver> driver_;
};

std::unique_ptr<Driver> open_driver(Driver::Process& process) {
    if (arrive(g_driver_open) != 0) return nullptr;
    setenv("BINDER_DRIVER", "socket", 1);
    std::unique_ptr<Driver> driver = Driver::open(process);
    return driver != nullptr ? std::make_unique<FailingDriver>(std::move(driver)) : nullptr;
}

}  // namespace

int g_driver_transact = -1;
int g_driver_open = -1;

void use_failing_driver() {
    android::registerDriver("failing", open_driver);
    setenv("BINDER_DRIVER", "failing", 1);
}

}  // namespace tavo::test::faults
