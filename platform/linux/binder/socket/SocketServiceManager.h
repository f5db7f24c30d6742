// The service manager of a process that has no daemon to ask.
#pragma once

#include <binder/IServiceManager.h>

#include "Directory.h"

namespace android::socket_driver {

class SocketServiceManager : public BnServiceManager {
public:
    explicit SocketServiceManager(Directory& directory) : directory_(directory) {}

    sp<IBinder> getService(const String16& name) const override;
    sp<IBinder> checkService(const String16& name) const override;
    status_t addService(const String16& name, const sp<IBinder>& service, bool allowIsolated) override;
    Vector<String16> listServices() override;

private:
    Directory& directory_;
};

}  // namespace android::socket_driver
