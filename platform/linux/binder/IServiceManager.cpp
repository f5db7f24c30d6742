#include <android/log.h>
#include <binder/BpBinder.h>
#include <binder/IServiceManager.h>
#include <binder/ProcessState.h>
#include <utils/String8.h>

#include <chrono>
#include <thread>

#include "ServiceWait.h"

namespace android {
namespace {

constexpr auto kServiceWait = std::chrono::seconds(5);
constexpr auto kServicePoll = std::chrono::milliseconds(50);

}  // namespace

sp<IBinder> waitForService(const String16& name, const std::function<status_t(sp<IBinder>* service)>& check) {
    const auto deadline = std::chrono::steady_clock::now() + kServiceWait;
    bool told = false;
    for (;;) {
        sp<IBinder> service;
        if (check(&service) != NO_ERROR || service != nullptr) return service;
        if (std::chrono::steady_clock::now() >= deadline) return nullptr;
        if (!told) {
            __android_log_print(ANDROID_LOG_INFO, "ServiceManager", "Waiting for service %s...",
                                String8(name).string());
        }
        told = true;
        std::this_thread::sleep_for(kServicePoll);
    }
}

class BpServiceManager : public BpInterface<IServiceManager> {
public:
    explicit BpServiceManager(const sp<IBinder>& remote) : BpInterface<IServiceManager>(remote) {}

    sp<IBinder> getService(const String16& name) const override {
        return waitForService(name, [this, &name](sp<IBinder>* service) { return check(name, service); });
    }

    sp<IBinder> checkService(const String16& name) const override {
        sp<IBinder> service;
        check(name, &service);
        return service;
    }

    status_t addService(const String16& name, const sp<IBinder>& service, bool allowIsolated) override {
        Parcel data, reply;
        data.writeInterfaceToken(descriptor);
        data.writeString16(name);
        data.writeStrongBinder(service);
        data.writeInt32(allowIsolated ? 1 : 0);
        const status_t status = remote()->transact(ADD_SERVICE_TRANSACTION, data, &reply);
        return status == NO_ERROR ? reply.readExceptionCode() : status;
    }

    // One name per call, until the index is one too many.
    Vector<String16> listServices() override {
        Vector<String16> names;
        for (int32_t index = 0;; ++index) {
            Parcel data, reply;
            data.writeInterfaceToken(descriptor);
            data.writeInt32(index);
            String16 name;
            if (remote()->transact(LIST_SERVICES_TRANSACTION, data, &reply) != NO_ERROR ||
                reply.readString16(&name) != NO_ERROR) {
                return names;
            }
            names.add(name);
        }
    }

private:
    status_t check(const String16& name, sp<IBinder>* service) const {
        Parcel data, reply;
        data.writeInterfaceToken(descriptor);
        data.writeString16(name);
        const status_t status = remote()->transact(CHECK_SERVICE_TRANSACTION, data, &reply);
        if (status == NO_ERROR) *service = reply.readStrongBinder();
        // A service manager that is not there may be on its way like any service.
        const BpBinder* manager = remote()->remoteBinder();
        const bool mayCome = status == DEAD_OBJECT && manager != nullptr && manager->handle() == 0;
        return mayCome ? status_t{NO_ERROR} : status;
    }
};

IMPLEMENT_META_INTERFACE(ServiceManager, "android.os.IServiceManager")

status_t BnServiceManager::onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    switch (code) {
        case GET_SERVICE_TRANSACTION:
            CHECK_INTERFACE(IServiceManager, data, reply);
            return reply->writeStrongBinder(getService(data.readString16()));
        case CHECK_SERVICE_TRANSACTION:
            CHECK_INTERFACE(IServiceManager, data, reply);
            return reply->writeStrongBinder(checkService(data.readString16()));
        case ADD_SERVICE_TRANSACTION: {
            CHECK_INTERFACE(IServiceManager, data, reply);
            const String16 name = data.readString16();
            const sp<IBinder> service = data.readStrongBinder();
            return reply->writeInt32(addService(name, service, data.readInt32() != 0));
        }
        case LIST_SERVICES_TRANSACTION: {
            CHECK_INTERFACE(IServiceManager, data, reply);
            const Vector<String16> names = listServices();
            const uint32_t index = data.readUint32();
            return index < names.size() ? reply->writeString16(names[index]) : BAD_INDEX;
        }
        default: return BBinder::onTransact(code, data, reply, flags);
    }
}

sp<IServiceManager> defaultServiceManager() {
    static const sp<IServiceManager>& manager = *new sp<IServiceManager>([] {
        sp<IBinder> context = ProcessState::self()->getContextObject(nullptr);
        // Without a driver, a proxy whose every call fails spares callers a null check that the platform's need not
        // make.
        if (context == nullptr) context = new BpBinder(0);
        return interface_cast<IServiceManager>(context);
    }());
    return manager;
}

}  // namespace android
