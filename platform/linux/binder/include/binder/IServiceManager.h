// Services by name.
#pragma once

#include <binder/IInterface.h>
#include <binder/Parcel.h>
#include <utils/String16.h>
#include <utils/Vector.h>

namespace android {

class LIBBINDER_EXPORT IServiceManager : public IInterface {
public:
    DECLARE_META_INTERFACE(ServiceManager)

    enum {
        GET_SERVICE_TRANSACTION = IBinder::FIRST_CALL_TRANSACTION,
        CHECK_SERVICE_TRANSACTION,
        ADD_SERVICE_TRANSACTION,
        LIST_SERVICES_TRANSACTION,
    };

    // Waits a few seconds for a service that is not there yet; null when it does not come.
    virtual sp<IBinder> getService(const String16& name) const = 0;
    // Null when there is no such service.
    virtual sp<IBinder> checkService(const String16& name) const = 0;
    // Publishes a service, in place of an earlier one of the name.
    virtual status_t addService(const String16& name, const sp<IBinder>& service, bool allowIsolated = false) = 0;
    virtual Vector<String16> listServices() = 0;
};

// Answers transactions by calling the four operations.
class LIBBINDER_EXPORT BnServiceManager : public BnInterface<IServiceManager> {
public:
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags = 0) override;
};

// Never null. Where there is no driver, it finds nothing and publishing fails with NO_INIT.
LIBBINDER_EXPORT sp<IServiceManager> defaultServiceManager();

// getService, as an interface; NAME_NOT_FOUND when there is no such service.
template <typename INTERFACE>
status_t getService(const String16& name, sp<INTERFACE>* outService) {
    const sp<IBinder> binder = defaultServiceManager()->getService(name);
    *outService = interface_cast<INTERFACE>(binder);
    return *outService != nullptr ? NO_ERROR : NAME_NOT_FOUND;
}

}  // namespace android
